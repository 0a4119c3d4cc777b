#include <gtest/gtest.h>

#include <vector>

#include "sys_ac3.h"
#include "test_env.h"
#include "toolkit_builders.h"

namespace {

using tkb::Bytes;

int count(const Bytes& b, int eac3, int* channels) {
    return sys_get_ac3_channel_count(b.data(), static_cast<int>(b.size()), eac3, channels);
}

TEST(Ac3Channels, FindsLfeAfterTheModeDependentFieldsOfEveryCodingMode) {
    // Full-range channels per coding mode: 1+1, 1/0, 2/0, 3/0, 2/1, 3/1, 2/2, 3/2.
    const int full_range[8] = {2, 1, 2, 3, 3, 4, 4, 5};
    for (int acmod = 0; acmod < 8; ++acmod) {
        for (int lfe = 0; lfe < 2; ++lfe) {
            SCOPED_TRACE(testing::Message() << "acmod " << acmod << " lfe " << lfe);
            int channels = -1;
            EXPECT_EQ(count(tkb::ac3_frame(acmod, lfe), 0, &channels), 1);
            EXPECT_EQ(channels, full_range[acmod] + lfe);
            channels = -1;
            EXPECT_EQ(count(tkb::eac3_frame(acmod, lfe), 1, &channels), 1);
            EXPECT_EQ(channels, full_range[acmod] + lfe);
        }
    }
}

TEST(Ac3Channels, ScansForAUsableHeaderInsideTheBuffer) {
    struct Case {
        const char* name;
        Bytes bytes;
        int eac3;
        int result;
        int channels;
    };
    const Bytes junk = {0x0B, 0x00, 0x77, 0x0B};
    const Case cases[] = {
        {"5.1 behind junk", tkb::cat({junk, tkb::ac3_frame(7, 1)}), 0, 1, 6},
        {"frame size code 38 passed over", tkb::cat({tkb::ac3_frame(7, 1, 38, 0), tkb::ac3_frame(2, 0)}), 0, 1, 2},
        {"frame size code 37 accepted", tkb::ac3_frame(2, 1, 37), 0, 1, 3},
        {"only bad frame size codes", tkb::ac3_frame(7, 1, 63), 0, -1, -1},
        {"E-AC-3 ignores the frame size code byte", tkb::eac3_frame(7, 1), 1, 1, 6},
        {"AC-3 header needs seven bytes", {0x0B, 0x77, 0, 0, 0x0A, 0x40}, 0, -1, -1},
        {"AC-3 header of exactly seven bytes", {0x0B, 0x77, 0, 0, 0x0A, 0x40, 0x40}, 0, 1, 2},
        {"E-AC-3 header of exactly five bytes", {0x0B, 0x77, 0, 0, 0x0F}, 1, 1, 6},
        {"E-AC-3 header cut at four bytes", {0x0B, 0x77, 0, 0}, 1, -1, -1},
        {"sync word in the last byte", {0, 0, 0, 0, 0, 0, 0x0B}, 0, -1, -1},
        {"no sync word", Bytes(64, 0x77), 0, -1, -1},
        {"empty", {}, 0, -1, -1},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.name);
        // Exact-size heap copies so that any read past the end is caught.
        const Bytes copy = c.bytes;
        int channels = -1;
        EXPECT_EQ(count(copy, c.eac3, &channels), c.result);
        EXPECT_EQ(channels, c.channels);
    }
    const Bytes ok = tkb::ac3_frame(2, 0);
    EXPECT_EQ(sys_get_ac3_channel_count(ok.data(), static_cast<int>(ok.size()), 0, nullptr), -1);
}

TEST(Ac4Header, WritesSyncWordSizeEscapeAndTwentyFourBitSize) {
    const std::pair<uint32_t, Bytes> cases[] = {
        {0x012345, {0xAC, 0x40, 0xFF, 0xFF, 0x01, 0x23, 0x45}},
        {0, {0xAC, 0x40, 0xFF, 0xFF, 0x00, 0x00, 0x00}},
        {0xAB123456, {0xAC, 0x40, 0xFF, 0xFF, 0x12, 0x34, 0x56}},  // only 24 bits fit
    };
    for (const auto& [size, expected] : cases) {
        Bytes header(8, 0xEE);
        sys_update_ac4_header(header.data(), size);
        Bytes want = expected;
        want.push_back(0xEE);
        EXPECT_EQ(header, want) << size;
    }
    testenv::LogCapture log;
    sys_update_ac4_header(nullptr, 5);
    ASSERT_EQ(log.lines().size(), 1u);
    EXPECT_EQ(log.lines()[0].text, "[SYS]Error! Input bffer is NULL\n");
}

}  // namespace
