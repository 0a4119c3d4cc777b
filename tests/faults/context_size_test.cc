// The host's context buffer is the tightest resource of all: on the device
// (32-bit ARM) the host allocates exactly 2536 bytes, room for the fixed
// record and two stream records. Run there by scripts/test-arm, where the
// fault sweeps open audio and video in a buffer of exactly that size.
#include <gtest/gtest.h>

#include "asf_open.h"

namespace {

TEST(DeviceContext, MinContextSizeIs2536BytesOn32BitArm) {
    if (sizeof(void*) != 4) GTEST_SKIP() << "a 64-bit build has its own sizes";
    EXPECT_EQ(hova_asff_demuxer.min_context_size, 2536);
    EXPECT_EQ(sizeof(asf_demuxer_st) + 2 * sizeof(asf_stream_st), 2536u);
}

}  // namespace
