#include <gtest/gtest.h>

#include <vector>

#include "bit_reader.h"
#include "sys_aac.h"
#include "toolkit_builders.h"
#include "toolkit_fixture.h"

namespace {

using tkb::Bytes;

struct ChannelCase {
    const char* name;
    Bytes bytes;
    int result;
    int channels;  // -1: left alone
};

TEST(BitReader, ReadsMostSignificantBitFirstSkipsAndGivesZerosPastTheEnd) {
    const Bytes data = {0xA5, 0x3C, 0xFF, 0x01, 0x80};
    // (width, value); a negative width skips that many bits.
    const std::vector<std::pair<int64_t, uint32_t>> cases[] = {
        {{1, 1}, {1, 0}, {1, 1}, {1, 0}},
        {{4, 0xA}, {8, 0x53}, {4, 0xC}},
        {{24, 0xA53CFF}, {16, 0x0180}},
        {{32, 0xA53CFF01}, {8, 0x80}},
        {{36, 0x53CFF018}, {8, 0}, {24, 0}},
        {{0, 0}, {8, 0xA5}},
        {{4, 0xA}, {-12, 0}, {8, 0xFF}, {-0xFFFFFFFFll, 0}, {16, 0}},
    };
    for (const auto& ops : cases) {
        buffer_bitstream_st bs;
        buf_stream_init(&bs, data.data(), static_cast<int>(data.size()));
        for (size_t i = 0; i < ops.size(); ++i) {
            if (ops[i].first < 0) {
                buf_bit_skip(&bs, static_cast<uint32_t>(-ops[i].first));
                continue;
            }
            EXPECT_EQ(buf_bit_read(&bs, static_cast<int>(ops[i].first)), ops[i].second)
                << "case " << (&ops - cases) << " read " << i;
        }
    }
    buffer_bitstream_st bs;
    buf_stream_init(&bs, nullptr, 10);  // no buffer: nothing but zeros
    EXPECT_EQ(buf_bit_read(&bs, 24), 0u);
}

TEST(LatmValue, ReadsOneToFourBytesAfterItsByteCount) {
    for (uint32_t v : {0u, 0x7Fu, 0x1234u, 0xABCDEFu, 0x89ABCDEFu, 0xFFFFFFFFu}) {
        tkb::BitWriter w;
        w.latm_value(v).put(0x5, 3);
        const Bytes b = w.bytes();
        buffer_bitstream_st bs;
        buf_stream_init(&bs, b.data(), static_cast<int>(b.size()));
        EXPECT_EQ(aac_parse_latm_get_value(&bs), v);
        EXPECT_EQ(buf_bit_read(&bs, 3), 0x5u) << "value " << v << " consumed a wrong width";
    }
}

TEST(AacChannels, AudioSpecificConfigAcceptsOnlyKnownObjectTypesRatesAndLayouts) {
    const ChannelCase cases[] = {
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
        int channels = -1;
        EXPECT_EQ(sys_get_aac_audiospecificconfig_channel_count(
                      c.bytes.data(), static_cast<int>(c.bytes.size()), &channels),
                  c.result) << c.name;
        EXPECT_EQ(channels, c.channels) << c.name;
    }
    // The parsed record, and nothing read after the channel configuration.
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
    EXPECT_EQ(bs.buf_left, 0);
}

TEST(AacChannels, AdtsTakesTheFirstHeaderWithAValidRate) {
    const Bytes junk = {0x00, 0xFF, 0x12, 0xFF};
    Bytes mpeg2 = tkb::adts_frame(4, 1, 8);
    mpeg2[1] = 0xF8;  // MPEG-2 ID bit and CRC flag are free
    const ChannelCase cases[] = {
        {"stereo at the start", tkb::adts_frame(4, 2, 8), 1, 2},
        {"behind junk", tkb::cat({junk, tkb::adts_frame(3, 6, 8)}), 1, 6},
        {"configuration 7 reported unmapped", tkb::adts_frame(4, 7, 8), 1, 7},
        {"configuration 0", tkb::adts_frame(4, 0, 8), 1, 0},
        {"MPEG-2", mpeg2, 1, 1},
        {"rate index 12 rejected, scan goes on",
         tkb::cat({tkb::adts_frame(12, 5, 2), tkb::adts_frame(7, 1, 2)}), 1, 1},
        {"only a rejected candidate keeps its configuration", tkb::adts_frame(12, 5, 8), 0, 5},
        {"layer bits set", tkb::adts_frame(4, 2, 8, 1, 1), 0, -1},
        {"exactly six bytes", {0xFF, 0xF1, 0x50, 0x80, 0x00, 0x1F}, 0, -1},
        {"header cut after three bytes", {0, 0, 0, 0, 0xFF, 0xF1, 0x50}, 0, -1},
        {"header whose fourth byte is the last", {0, 0, 0, 0xFF, 0xF1, 0x50, 0x80}, 1, 2},
    };
    for (const auto& c : cases) {
        int channels = -1;
        EXPECT_EQ(sys_get_aac_adts_channel_count(c.bytes.data(), static_cast<int>(c.bytes.size()),
                                                 &channels),
                  c.result) << c.name;
        EXPECT_EQ(channels, c.channels) << c.name;
    }
    EXPECT_EQ(sys_get_aac_adts_channel_count(cases[0].bytes.data(), 15, nullptr), 0);
}

TEST(AacChannels, LatmReadsTheFirstUsableStreamMuxConfigAndNeverOverreads) {
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
    const ChannelCase cases[] = {
        {"version 0", tkb::loas_frame(v0), 1, 2},
        {"version 1 with config length", tkb::loas_frame(v1), 1, 6},
        {"behind junk and a lone sync byte", tkb::cat({Bytes{0x56, 0x00, 0x12}, tkb::loas_frame(v0)}), 1, 2},
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
        int channels = -1;
        EXPECT_EQ(sys_get_aac_latm_channel_count(c.bytes.data(), static_cast<int>(c.bytes.size()),
                                                 &channels),
                  c.result) << c.name;
        if (c.result == 1) { EXPECT_EQ(channels, c.channels) << c.name; }
    }
    const Bytes full = tkb::loas_frame(v1, 0);
    for (size_t n = 0; n <= full.size(); ++n) {
        // An exact-size heap copy, so that AddressSanitizer sees any overread.
        const Bytes cut(full.begin(), full.begin() + static_cast<long>(n));
        int channels = 0;
        const int r = sys_get_aac_latm_channel_count(cut.data(), static_cast<int>(n), &channels);
        EXPECT_TRUE(r == 1 || r == -1);
    }
}

class AacConfigWriter : public HostedToolkit {};

TEST_F(AacConfigWriter, WritesTwoOrFiveByteConfigsIntoANewBlockOrTheCallersBuffer) {
    const struct {
        const char* name;
        aac_parameter_st param;
        Bytes expected;
    } cases[] = {
        {"LC 44.1 kHz stereo", {2, 44100, 2, 0, 0, 0}, {0x12, 0x10}},
        {"LC 48 kHz 5.1", {2, 48000, 6, 0, 0, 0}, {0x11, 0xB0}},
        {"HE-AAC 22.05 kHz to 44.1 kHz", {2, 22050, 2, 1, 5, 44100}, {0x13, 0x90, 0x56, 0xE5, 0xA0}},
        {"SBR rate outside the table", {2, 24000, 1, 1, 5, 44000}, {0x13, 0x08, 0x56, 0xE5, 0x80}},
        {"rate outside the table takes index 0", {2, 44000, 2, 0, 0, 0}, {0x10, 0x10}},
        {"fields wider than their slots are cut", {0x1F, 7350, 0x1F, 0, 0, 0}, {0xFE, 0xF8}},
    };
    for (const auto& c : cases) {
        uint8_t* config = nullptr;
        uint32_t len = 0;
        sys_update_aac_config(&d, &config, &len, &c.param);
        ASSERT_NE(config, nullptr) << c.name;
        EXPECT_EQ(Bytes(config, config + len), c.expected) << c.name;
        release(config);
    }
    // A buffer the caller provides is written only as far as it reaches.
    const uint64_t mallocs = host.malloc_calls();
    const std::pair<uint32_t, uint32_t> room[] = {{0, 0}, {1, 0}, {2, 2}, {4, 2}, {5, 5}};
    for (const auto& [len_in, written] : room) {
        Bytes buf(8, 0xEE);
        uint8_t* p = buf.data();
        uint32_t len = len_in;
        sys_update_aac_config(&d, &p, &len, &cases[2].param);
        EXPECT_EQ(len, written ? len_in : 0u) << len_in;
        Bytes expected(cases[2].expected.begin(), cases[2].expected.begin() + written);
        expected.resize(8, 0xEE);
        EXPECT_EQ(buf, expected) << len_in;
        EXPECT_EQ(p, buf.data());
    }
    EXPECT_EQ(host.malloc_calls(), mallocs);
    // No block to be had: no config.
    uint8_t* config = nullptr;
    uint32_t len = 7;
    sys_update_aac_config(nullptr, &config, &len, &cases[0].param);
    EXPECT_EQ(config, nullptr);
    EXPECT_EQ(len, 0u);
    host.fail_malloc_at(1);
    len = 7;
    sys_update_aac_config(&d, &config, &len, &cases[0].param);
    EXPECT_EQ(config, nullptr);
    EXPECT_EQ(len, 0u);
}

}  // namespace
