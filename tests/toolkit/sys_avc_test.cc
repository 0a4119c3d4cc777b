#include <gtest/gtest.h>

#include <vector>

#include "sys_avc.h"
#include "sys_config.h"
#include "test_env.h"
#include "toolkit_builders.h"
#include "toolkit_fixture.h"

namespace {

using tkb::Bytes;

class AvcConfig : public HostedToolkit {
protected:
    int parse(const Bytes& record) {
        return parse_avc_video_config(&d, record.data(), static_cast<int>(record.size()), &out,
                                      &out_size, &nal);
    }
    Bytes output() const { return out ? Bytes(out, out + out_size) : Bytes(); }
    void TearDown() override {
        release(out);
        HostedToolkit::TearDown();
    }
    uint8_t* out = nullptr;
    uint32_t out_size = 0;
    int nal = 0;
};

TEST_F(AvcConfig, PrefixesEveryParameterSetWithAStartCode) {
    struct Case {
        const char* name;
        std::vector<Bytes> sps, pps;
        int nal_length_size;
    };
    const Case cases[] = {
        {"one SPS of 10 bytes, one PPS of 4", {tkb::pattern(10, 1)}, {tkb::pattern(4, 2)}, 4},
        {"two of each, 2-byte lengths",
         {tkb::pattern(12, 3), tkb::pattern(9, 4)}, {tkb::pattern(3, 5), tkb::pattern(1, 6)}, 2},
        {"empty sets, 1-byte lengths", {Bytes{}}, {Bytes{}}, 1},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.name);
        ASSERT_EQ(parse(tkb::avcc(c.sps, c.pps, c.nal_length_size)), HOVA_OK);
        Bytes expected;
        for (const auto* list : {&c.sps, &c.pps}) {
            for (const auto& set : *list) {
                expected.insert(expected.end(), {0, 0, 0, 1});
                expected.insert(expected.end(), set.begin(), set.end());
            }
        }
        EXPECT_EQ(output(), expected);
        EXPECT_EQ(nal, c.nal_length_size);
    }
}

TEST_F(AvcConfig, RejectsRecordsThatRunShortAndLeavesTheOutputAlone) {
    const Bytes good = tkb::avcc({tkb::pattern(10, 1)}, {tkb::pattern(4, 2)});
    ASSERT_EQ(parse(good), HOVA_OK);
    const Bytes before = output();
    const uint64_t mallocs = host.malloc_calls();

    // Every proper prefix of the record is too short somewhere.
    for (size_t n = 0; n < good.size(); ++n) {
        SCOPED_TRACE(n);
        const Bytes cut(good.begin(), good.begin() + static_cast<long>(n));
        EXPECT_EQ(parse(cut), HOVA_EndOfStream);
        EXPECT_EQ(output(), before);
    }
    Bytes oversize = good;
    oversize[7] = 0x20;  // SPS claims 32 bytes
    EXPECT_EQ(parse(oversize), HOVA_EndOfStream);
    EXPECT_EQ(host.malloc_calls(), mallocs) << "nothing is allocated for a bad record";
    EXPECT_EQ(output(), before);
}

TEST_F(AvcConfig, MasksTheReservedBitsOfBothCounts) {
    Bytes record = tkb::avcc({tkb::pattern(2, 1)}, {tkb::pattern(2, 2)});
    record[5] = 0xE1;                  // reserved bits set around one SPS
    record[5 + 1 + 2 + 2] = 0xE1;      // and around one PPS
    ASSERT_EQ(parse(record), HOVA_OK);
    EXPECT_EQ(out_size, 12u);
}

TEST_F(AvcConfig, WithoutParameterSetsGivesAnEmptyConfigWithoutAllocating) {
    ASSERT_EQ(parse(tkb::avcc({}, {})), HOVA_OK);
    EXPECT_EQ(out_size, 0u);
    EXPECT_EQ(host.malloc_calls(), 0u);
}

TEST_F(AvcConfig, ReusesAnOutputBlockThatIsLargeEnough) {
    ASSERT_EQ(parse(tkb::avcc({tkb::pattern(30, 1)}, {tkb::pattern(4, 2)})), HOVA_OK);
    uint8_t* first = out;
    ASSERT_EQ(parse(tkb::avcc({tkb::pattern(10, 1)}, {tkb::pattern(4, 2)})), HOVA_OK);
    EXPECT_EQ(out, first);
    EXPECT_EQ(out_size, 22u);
    ASSERT_EQ(parse(tkb::avcc({tkb::pattern(40, 1)}, {tkb::pattern(4, 2)})), HOVA_OK);
    EXPECT_EQ(out_size, 52u);
    EXPECT_EQ(host.outstanding_blocks(), 1u) << "the old block went back";
}

TEST_F(AvcConfig, SurvivesEachAllocationFailing) {
    const Bytes record = tkb::avcc({tkb::pattern(10, 1)}, {tkb::pattern(4, 2)});
    testenv::LogCapture log;
    // First allocation: the work block.
    host.fail_malloc_at(1);
    EXPECT_EQ(parse(record), HOVA_NotEnoughMemory);
    EXPECT_EQ(out, nullptr);
    EXPECT_TRUE(log.contains("[SYS] malloc config fail in parse_avc_video_config\n"));
    EXPECT_EQ(host.outstanding_blocks(), 0u);
    // Second: the output block. The conversion succeeds but nothing fits.
    host.fail_malloc_at(2);
    EXPECT_EQ(parse(record), HOVA_OK);
    EXPECT_EQ(out, nullptr);
    EXPECT_EQ(out_size, 0u);
    EXPECT_EQ(host.outstanding_blocks(), 0u);
}

class ConfigAssign : public HostedToolkit {};

TEST_F(ConfigAssign, ReplacesTheContentGrowingOnlyWhenNeeded) {
    uint8_t* config = nullptr;
    uint32_t len = 0;
    const Bytes a = tkb::pattern(8, 1), b = tkb::pattern(3, 2), c = tkb::pattern(12, 3);

    sys_assign_config_with_realloc(&d, &config, &len, a.data(), 8);
    ASSERT_NE(config, nullptr);
    EXPECT_EQ(Bytes(config, config + len), a);
    uint8_t* block = config;

    sys_assign_config_with_realloc(&d, &config, &len, b.data(), 3);
    EXPECT_EQ(config, block);
    EXPECT_EQ(Bytes(config, config + len), b);

    // The length now says 3: growing back to 8 needs a new block.
    sys_assign_config_with_realloc(&d, &config, &len, c.data(), 12);
    EXPECT_EQ(Bytes(config, config + len), c);
    EXPECT_EQ(host.outstanding_blocks(), 1u);

    // A refused block keeps the old one and its length, with as much as fits.
    host.fail_malloc_at(1);
    const Bytes big = tkb::pattern(20, 9);
    sys_assign_config_with_realloc(&d, &config, &len, big.data(), 20);
    EXPECT_EQ(len, 12u);
    EXPECT_EQ(Bytes(config, config + len), Bytes(big.begin(), big.begin() + 12));

    sys_assign_config_with_realloc(&d, &config, &len, nullptr, 0);
    EXPECT_EQ(len, 0u);
    release(config);
}

TEST_F(ConfigAssign, TreatsALengthWithoutABlockAsNoRoom) {
    uint8_t* config = nullptr;
    uint32_t len = 16;  // stale length, no block
    const Bytes a = tkb::pattern(4, 1);
    sys_assign_config_with_realloc(&d, &config, &len, a.data(), 4);
    ASSERT_NE(config, nullptr);
    EXPECT_EQ(Bytes(config, config + len), a);
    release(config);
}

}  // namespace
