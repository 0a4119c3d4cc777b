// The host's context buffer is the tightest resource of all: on the device
// (32-bit ARM) the host allocates exactly 2536 bytes, room for the fixed
// record and two stream records. Run there by scripts/test-arm.
#include <gtest/gtest.h>

#include "asf_open.h"
#include "asf_packets.h"

namespace {

TEST(DeviceContext, MinContextSizeIs2536BytesOn32BitArm) {
    if (sizeof(void*) != 4) GTEST_SKIP() << "a 64-bit build has its own sizes";
    EXPECT_EQ(hova_asff_demuxer.min_context_size, 2536);
    EXPECT_EQ(sizeof(asf_demuxer_st) + 2 * sizeof(asf_stream_st), 2536u);
}

// A buffer of exactly that size, aligned, holds a file with audio and video.
TEST(DeviceContext, ExactBufferOpensAudioAndVideoAndReleasesAll) {
    host::SessionOptions so;
    so.context_size = hova_asff_demuxer.min_context_size;
    auto o = testsupport::open_file(asfb::standard_file(true, true, 4), so);
    ASSERT_EQ(o.rc, HOVA_OK);
    EXPECT_EQ(o.ctx()->s.active_stream[0], 0);
    EXPECT_EQ(o.ctx()->s.active_stream[1], 1);
    EXPECT_TRUE(o.close_clean());
}

}  // namespace
