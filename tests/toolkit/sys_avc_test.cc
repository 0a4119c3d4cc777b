#include <gtest/gtest.h>

#include <vector>

#include "sys_avc.h"
#include "sys_config.h"
#include "test_env.h"
#include "toolkit_builders.h"
#include "toolkit_fixture.h"

namespace {

using tkb::Bytes;
using tkb::pattern;

class AvcConfig : public HostedToolkit {
protected:
    int parse(const Bytes& record) {
        return parse_avc_video_config(&d, record.data(), static_cast<int>(record.size()), &out,
                                      &out_size, &nal);
    }
    Bytes output() const { return out ? Bytes(out, out + out_size) : Bytes(); }
    void drop() {
        release(out);
        out = nullptr;
        out_size = 0;
    }
    void TearDown() override {
        drop();
        HostedToolkit::TearDown();
    }
    uint8_t* out = nullptr;
    uint32_t out_size = 0;
    int nal = 0;
};

TEST_F(AvcConfig, PrefixesEveryParameterSetWithAStartCodeReusingALargeEnoughBlock) {
    Bytes masked = tkb::avcc({pattern(2, 1)}, {pattern(2, 2)});
    masked[5] = masked[10] = 0xE1;  // reserved bits set around both counts
    const struct {
        const char* name;
        Bytes record;
        std::vector<Bytes> sets;
        int nal_length_size;
    } cases[] = {
        {"one SPS, one PPS", tkb::avcc({pattern(30, 1)}, {pattern(4, 2)}), {pattern(30, 1), pattern(4, 2)}, 4},
        {"two of each, 2-byte lengths",
         tkb::avcc({pattern(12, 3), pattern(9, 4)}, {pattern(3, 5), pattern(1, 6)}, 2),
         {pattern(12, 3), pattern(9, 4), pattern(3, 5), pattern(1, 6)}, 2},
        {"reserved count bits masked", masked, {pattern(2, 1), pattern(2, 2)}, 4},
        {"empty sets, 1-byte lengths", tkb::avcc({Bytes{}}, {Bytes{}}, 1), {Bytes{}, Bytes{}}, 1},
    };
    uint8_t* first = nullptr;
    for (const auto& c : cases) {
        ASSERT_EQ(parse(c.record), HOVA_OK) << c.name;
        Bytes expected;
        for (const auto& set : c.sets) expected = tkb::cat({expected, {0, 0, 0, 1}, set});
        EXPECT_EQ(output(), expected) << c.name;
        EXPECT_EQ(nal, c.nal_length_size) << c.name;
        if (!first) first = out;
        EXPECT_EQ(out, first) << "each block is large enough for the next";
    }
    ASSERT_EQ(parse(tkb::avcc({pattern(40, 1)}, {pattern(4, 2)})), HOVA_OK);
    EXPECT_EQ(out_size, 52u);
    EXPECT_EQ(host.outstanding_blocks(), 1u) << "the old block went back";
    drop();
    const uint64_t mallocs = host.malloc_calls();
    ASSERT_EQ(parse(tkb::avcc({}, {})), HOVA_OK);
    EXPECT_EQ(out_size, 0u);
    EXPECT_EQ(host.malloc_calls(), mallocs) << "no parameter sets: nothing allocated";
}

TEST_F(AvcConfig, ShortRecordsAndRefusedBlocksLeaveNothingBehind) {
    const Bytes good = tkb::avcc({pattern(10, 1)}, {pattern(4, 2)});
    ASSERT_EQ(parse(good), HOVA_OK);
    const Bytes before = output();
    const uint64_t mallocs = host.malloc_calls();
    Bytes oversize = good;
    oversize[7] = 0x20;  // SPS claims 32 bytes
    std::vector<Bytes> bad = {oversize};
    for (size_t n = 0; n < good.size(); ++n) bad.emplace_back(good.begin(), good.begin() + static_cast<long>(n));
    for (const Bytes& record : bad) {
        EXPECT_EQ(parse(record), HOVA_EndOfStream) << record.size();
        EXPECT_EQ(output(), before);
    }
    EXPECT_EQ(host.malloc_calls(), mallocs) << "nothing is allocated for a bad record";
    drop();

    testenv::LogCapture log;
    host.fail_malloc_at(1);  // the work block
    EXPECT_EQ(parse(good), HOVA_NotEnoughMemory);
    EXPECT_TRUE(log.contains("[SYS] malloc config fail in parse_avc_video_config\n"));
    host.fail_malloc_at(2);  // the output block: converted, but nothing kept
    EXPECT_EQ(parse(good), HOVA_OK);
    EXPECT_EQ(out, nullptr);
    EXPECT_EQ(out_size, 0u);
    EXPECT_EQ(host.outstanding_blocks(), 0u);
}

class ConfigAssign : public HostedToolkit {};

TEST_F(ConfigAssign, ReplacesTheContentGrowingOnlyWhenNeeded) {
    uint8_t* config = nullptr;
    uint32_t len = 16;  // a stale length without a block is no room
    const Bytes a = pattern(8, 1), b = pattern(3, 2), c = pattern(12, 3), big = pattern(20, 9);

    sys_assign_config_with_realloc(&d, &config, &len, a.data(), 8);
    ASSERT_NE(config, nullptr);
    EXPECT_EQ(Bytes(config, config + len), a);
    uint8_t* block = config;
    sys_assign_config_with_realloc(&d, &config, &len, b.data(), 3);
    EXPECT_EQ(config, block);
    EXPECT_EQ(Bytes(config, config + len), b);
    // The length now says 3: growing back to 12 needs a new block.
    sys_assign_config_with_realloc(&d, &config, &len, c.data(), 12);
    EXPECT_EQ(Bytes(config, config + len), c);
    EXPECT_EQ(host.outstanding_blocks(), 1u);
    // A refused block keeps the old one and its length, with as much as fits.
    host.fail_malloc_at(1);
    sys_assign_config_with_realloc(&d, &config, &len, big.data(), 20);
    EXPECT_EQ(Bytes(config, config + len), Bytes(big.begin(), big.begin() + 12));
    sys_assign_config_with_realloc(&d, &config, &len, nullptr, 0);
    EXPECT_EQ(len, 0u);
    release(config);
}

}  // namespace
