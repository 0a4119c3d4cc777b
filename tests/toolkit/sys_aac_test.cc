#include <gtest/gtest.h>

#include <vector>

#include "bit_reader.h"
#include "sys_aac.h"
#include "toolkit_builders.h"
#include "toolkit_fixture.h"

namespace {

using tkb::Bytes;

TEST(BitReader, ReadsMostSignificantBitFirstAndZerosPastTheEnd) {
    const Bytes data = {0xA5, 0x3C, 0xFF, 0x01, 0x80};
    struct Case {
        const char* name;
        std::vector<int> widths;
        std::vector<uint32_t> values;
    };
    const Case cases[] = {
        {"single bits", {1, 1, 1, 1}, {1, 0, 1, 0}},
        {"across a byte boundary", {4, 8, 4}, {0xA, 0x53, 0xC}},
        {"24 bits at once", {24, 16}, {0xA53CFF, 0x0180}},
        {"32 bits at once", {32, 8}, {0xA53CFF01, 0x80}},
        {"past the end reads zeros", {36, 8, 24}, {0x53CFF018, 0x00, 0}},
        {"zero width", {0, 8}, {0, 0xA5}},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.name);
        buffer_bitstream_st bs;
        buf_stream_init(&bs, data.data(), static_cast<int>(data.size()));
        for (size_t i = 0; i < c.widths.size(); ++i)
            EXPECT_EQ(buf_bit_read(&bs, c.widths[i]), c.values[i]) << "read " << i;
    }
}

TEST(BitReader, SkipsWithinAndBeyondTheBuffer) {
    const Bytes data = {0x12, 0x34, 0x56, 0x78};
    buffer_bitstream_st bs;
    buf_stream_init(&bs, data.data(), 4);
    EXPECT_EQ(buf_bit_read(&bs, 4), 0x1u);
    buf_bit_skip(&bs, 12);  // rest of the cache and one whole byte
    EXPECT_EQ(buf_bit_read(&bs, 8), 0x56u);
    buf_bit_skip(&bs, 0xFFFFFFFFu);
    EXPECT_EQ(buf_bit_read(&bs, 16), 0u);
    EXPECT_EQ(bs.buf_left, 0);

    buf_stream_init(&bs, nullptr, 10);  // no buffer: nothing but zeros
    EXPECT_EQ(buf_bit_read(&bs, 24), 0u);
}

TEST(LatmValue, ReadsOneToFourBytesAfterItsByteCount) {
    const uint32_t values[] = {0, 0x7F, 0x1234, 0xABCDEF, 0x89ABCDEF, 0xFFFFFFFF};
    for (uint32_t v : values) {
        tkb::BitWriter w;
        w.latm_value(v).put(0x5, 3);
        const Bytes b = w.bytes();
        buffer_bitstream_st bs;
        buf_stream_init(&bs, b.data(), static_cast<int>(b.size()));
        EXPECT_EQ(aac_parse_latm_get_value(&bs), v);
        EXPECT_EQ(buf_bit_read(&bs, 3), 0x5u) << "value " << v << " consumed a wrong width";
    }
}

TEST(AudioSpecificConfigChannels, AcceptsOnlyKnownObjectTypesRatesAndLayouts) {
    struct Case {
        const char* name;
        Bytes bytes;
        int result;
        int channels;
    };
    const Case cases[] = {
        {"LC stereo", tkb::asc_bytes({2, 4, 2}), 1, 2},
        {"main mono", tkb::asc_bytes({1, 3, 1}), 1, 1},
        {"LTP 5.1", tkb::asc_bytes({4, 3, 6}), 1, 6},
        {"SBR 7.1", tkb::asc_bytes({5, 6, 7}), 1, 8},
        {"PS stereo at 7350 Hz", tkb::asc_bytes({29, 12, 2}), 1, 2},
        {"SSR is not supported", tkb::asc_bytes({3, 4, 2}), 0, -1},
        {"object type 0", tkb::asc_bytes({0, 4, 2}), 0, -1},
        {"configuration 0 defers to a PCE", tkb::asc_bytes({2, 4, 0}), 0, 0},
        {"reserved rate index 13", tkb::asc_bytes({2, 13, 2}), 0, -1},
        {"rate index 15 (explicit rate)", tkb::asc_bytes({2, 15, 2}), 0, -1},
        {"configuration above 7", tkb::asc_bytes({2, 4, 9}), 0, -1},
        {"truncated after the object type", {0x10}, 0, 0},
        {"empty", {}, 0, -1},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.name);
        int channels = -1;
        EXPECT_EQ(sys_get_aac_audiospecificconfig_channel_count(
                      c.bytes.data(), static_cast<int>(c.bytes.size()), &channels),
                  c.result);
        EXPECT_EQ(channels, c.channels);
    }
}

TEST(AudioSpecificConfigChannels, FillsTheParsedRecord) {
    const Bytes b = tkb::asc_bytes({2, 11, 1});
    buffer_bitstream_st bs;
    buf_stream_init(&bs, b.data(), static_cast<int>(b.size()));
    audioSpecificConfig_st asc;
    int channels = 0;
    ASSERT_EQ(AudioSpecificConfig(0, &asc, &bs, &channels), 1);
    EXPECT_EQ(asc.objectTypeIndex, 2);
    EXPECT_EQ(asc.samplingFrequencyIndex, 11u);
    EXPECT_EQ(asc.samplingFrequency, 8000u);
    EXPECT_EQ(asc.channelsConfiguration, 1u);
    EXPECT_EQ(asc.sbr_present_flag, 0);
    EXPECT_EQ(buf_bit_read(&bs, 3), 0u) << "reads nothing after the channel configuration";
    EXPECT_EQ(bs.buf_left, 0);
}

TEST(AdtsChannels, FindsTheFirstHeaderWithAValidRate) {
    struct Case {
        const char* name;
        Bytes bytes;
        int result;
        int channels;
    };
    const Bytes junk = {0x00, 0xFF, 0x12, 0xFF};
    const Case cases[] = {
        {"stereo at the start", tkb::adts_frame(4, 2, 8), 1, 2},
        {"behind junk", tkb::cat({junk, tkb::adts_frame(3, 6, 8)}), 1, 6},
        {"configuration 7 reported unmapped", tkb::adts_frame(4, 7, 8), 1, 7},
        {"configuration 0", tkb::adts_frame(4, 0, 8), 1, 0},
        {"MPEG-2 ID bit and CRC flag are free",
         [] { Bytes b = tkb::adts_frame(4, 1, 8); b[1] = 0xF8; return b; }(), 1, 1},
        {"rate index 12 rejected, scan goes on",
         tkb::cat({tkb::adts_frame(12, 5, 2), tkb::adts_frame(7, 1, 2)}), 1, 1},
        {"only a rejected candidate keeps its configuration", tkb::adts_frame(12, 5, 8), 0, 5},
        {"layer bits set", tkb::adts_frame(4, 2, 8, 1, 1), 0, -1},
        {"exactly six bytes", {0xFF, 0xF1, 0x50, 0x80, 0x00, 0x1F}, 0, -1},
        {"header cut after three bytes", {0, 0, 0, 0, 0xFF, 0xF1, 0x50}, 0, -1},
        {"header whose fourth byte is the last", {0, 0, 0, 0xFF, 0xF1, 0x50, 0x80}, 1, 2},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.name);
        int channels = -1;
        EXPECT_EQ(sys_get_aac_adts_channel_count(c.bytes.data(), static_cast<int>(c.bytes.size()),
                                                 &channels),
                  c.result);
        EXPECT_EQ(channels, c.channels);
    }
    const Bytes ok = tkb::adts_frame(4, 2, 8);
    EXPECT_EQ(sys_get_aac_adts_channel_count(ok.data(), static_cast<int>(ok.size()), nullptr), 0);
}

TEST(LatmChannels, ReadsTheFirstUsableStreamMuxConfig) {
    using tkb::LoasConfig;
    using tkb::LoasLayer;
    LoasConfig v0;
    LoasConfig v1;
    v1.mux_version = 1;
    v1.programs = {{LoasLayer{false, {2, 3, 6}, 16}}};
    LoasConfig same_mux;
    same_mux.use_same_stream_mux = true;
    LoasConfig second_layer;
    second_layer.mux_version = 1;
    second_layer.programs = {{LoasLayer{false, {3, 4, 2}, 19}, LoasLayer{false, {2, 4, 1}, 0}}};
    LoasConfig shared_layer;
    shared_layer.programs = {{LoasLayer{false, {2, 4, 0}, 0}, LoasLayer{true, {}, 0},
                              LoasLayer{false, {5, 6, 7}, 0}}};
    LoasConfig second_program;
    second_program.programs = {{LoasLayer{false, {3, 4, 2}, 0}}, {LoasLayer{false, {2, 4, 2}, 0}}};
    LoasConfig none_usable;
    none_usable.programs = {{LoasLayer{false, {3, 4, 2}, 0}}};

    struct Case {
        const char* name;
        Bytes bytes;
        int result;
        int channels;
    };
    const Bytes junk = {0x56, 0x00, 0x12};
    const Case cases[] = {
        {"version 0", tkb::loas_frame(v0), 1, 2},
        {"version 1 with config length", tkb::loas_frame(v1), 1, 6},
        {"behind junk and a lone sync byte", tkb::cat({junk, tkb::loas_frame(v0)}), 1, 2},
        {"same stream mux, then a config", tkb::cat({tkb::loas_frame(same_mux), tkb::loas_frame(v1)}), 1, 6},
        {"only same stream mux", tkb::loas_frame(same_mux), -1, -1},
        {"second layer after an unusable one", tkb::loas_frame(second_layer), 1, 1},
        {"layer sharing the config is skipped", tkb::loas_frame(shared_layer), 1, 8},
        {"second program", tkb::loas_frame(second_program), 1, 2},
        {"no usable config", tkb::loas_frame(none_usable), -1, -1},
        {"sync word only", {0x56, 0xE0}, -1, -1},
        {"sync in the last byte", {0x00, 0x56}, -1, -1},
        {"empty", {}, -1, -1},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.name);
        int channels = -1;
        EXPECT_EQ(sys_get_aac_latm_channel_count(c.bytes.data(), static_cast<int>(c.bytes.size()),
                                                 &channels),
                  c.result);
        if (c.result == 1) {
            EXPECT_EQ(channels, c.channels);
        }
    }
}

TEST(LatmChannels, NeverReadsPastATruncatedFrame) {
    tkb::LoasConfig v1;
    v1.mux_version = 1;
    v1.programs = {{tkb::LoasLayer{false, {2, 3, 6}, 16}}};
    const Bytes full = tkb::loas_frame(v1, 0);
    for (size_t n = 0; n <= full.size(); ++n) {
        // An exact-size heap copy, so that AddressSanitizer sees any overread.
        std::vector<uint8_t> cut(full.begin(), full.begin() + static_cast<long>(n));
        int channels = 0;
        const int r = sys_get_aac_latm_channel_count(cut.data(), static_cast<int>(n), &channels);
        EXPECT_TRUE(r == 1 || r == -1);
    }
}

class AacConfigWriter : public HostedToolkit {};

TEST_F(AacConfigWriter, WritesTwoOrFiveByteConfigs) {
    struct Case {
        const char* name;
        aac_parameter_st param;
        Bytes expected;
    };
    const Case cases[] = {
        {"LC 44.1 kHz stereo", {2, 44100, 2, 0, 0, 0}, {0x12, 0x10}},
        {"LC 48 kHz 5.1", {2, 48000, 6, 0, 0, 0}, {0x11, 0xB0}},
        {"HE-AAC 22.05 kHz to 44.1 kHz", {2, 22050, 2, 1, 5, 44100}, {0x13, 0x90, 0x56, 0xE5, 0xA0}},
        {"SBR rate outside the table", {2, 24000, 1, 1, 5, 44000}, {0x13, 0x08, 0x56, 0xE5, 0x80}},
        {"rate outside the table takes index 0", {2, 44000, 2, 0, 0, 0}, {0x10, 0x10}},
        {"fields wider than their slots are cut", {0x1F, 7350, 0x1F, 0, 0, 0}, {0xFE, 0xF8}},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.name);
        uint8_t* config = nullptr;
        uint32_t len = 0;
        sys_update_aac_config(&d, &config, &len, &c.param);
        ASSERT_NE(config, nullptr);
        EXPECT_EQ(Bytes(config, config + len), c.expected);
        release(config);
    }
}

TEST_F(AacConfigWriter, StaysInsideABufferTheCallerProvides) {
    const aac_parameter_st he = {2, 22050, 2, 1, 5, 44100};
    struct Case {
        uint32_t len;
        uint32_t len_after;
        Bytes written;
    };
    const Case cases[] = {
        {0, 0, {}}, {1, 0, {}}, {2, 2, {0x13, 0x90}}, {4, 4, {0x13, 0x90}},
        {5, 5, {0x13, 0x90, 0x56, 0xE5, 0xA0}},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.len);
        Bytes buf(8, 0xEE);
        uint8_t* p = buf.data();
        uint32_t len = c.len;
        sys_update_aac_config(&d, &p, &len, &he);
        EXPECT_EQ(len, c.len_after);
        Bytes expected = c.written;
        expected.resize(8, 0xEE);
        EXPECT_EQ(buf, expected);
        EXPECT_EQ(p, buf.data());
    }
    EXPECT_EQ(host.malloc_calls(), 0u);
}

TEST_F(AacConfigWriter, LeavesNoConfigWhenNoBlockCanBeHad) {
    const aac_parameter_st lc = {2, 44100, 2, 0, 0, 0};
    uint8_t* config = nullptr;
    uint32_t len = 7;
    sys_update_aac_config(nullptr, &config, &len, &lc);  // no state: no host to ask
    EXPECT_EQ(config, nullptr);
    EXPECT_EQ(len, 0u);

    host.fail_malloc_at(1);
    len = 7;
    sys_update_aac_config(&d, &config, &len, &lc);
    EXPECT_EQ(config, nullptr);
    EXPECT_EQ(len, 0u);
}

}  // namespace
