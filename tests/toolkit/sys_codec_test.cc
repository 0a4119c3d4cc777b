// AAC configuration parsers: LATM values, AudioSpecificConfig, ADTS, LOAS/LATM
// and the config writer.
#include "bit_reader.h"
#include "sys_aac.h"
#include "toolkit_fixture.h"

using namespace tkb;

// LatmGetValue's widths: one to four bytes.
TEST(BitReader, ReadsLatmValuesOfEveryWidth) {
    for (uint32_t v : {0x7Fu, 0x1234u, 0xABCDEFu, 0x89ABCDEFu}) {
        const Bytes b = BitWriter().latm_value(v).put(0x5, 3).bytes();
        buffer_bitstream_st bs;
        buf_stream_init(&bs, b.data(), int(b.size()));
        EXPECT_EQ(aac_parse_latm_get_value(&bs), v);
        EXPECT_EQ(buf_bit_read(&bs, 3), 5u) << "LATM value " << v << " read a wrong width";
    }
}

using CountFn = int (*)(const uint8_t*, int, int*);
const CountFn kAsc = sys_get_aac_audiospecificconfig_channel_count;
const CountFn kAdts = sys_get_aac_adts_channel_count, kLatm = sys_get_aac_latm_channel_count;

TEST(AacChannels, AscAdtsAndLatmFindTheFirstUsableConfigWithoutOverreading) {
    LoasConfig v1, same_mux, layers, programs;
    v1.mux_version = layers.mux_version = 1;
    v1.programs = {{LoasLayer{false, {2, 3, 6}, 16}}};
    same_mux.use_same_stream_mux = true;
    layers.programs = {{{false, {3, 4, 2}, 19}, {false, {2, 4, 0}, 0}, {true, {}, 0}, {false, {2, 4, 1}, 0}}};
    programs.programs = {{{false, {3, 4, 2}, 0}}, {{false, {5, 6, 7}, 0}}};
    const struct { CountFn fn; Bytes bytes; int result, channels; } cases[] = {
        {kAsc, asc_bytes({2, 4, 2}), 1, 2}, {kAsc, asc_bytes({5, 6, 7}), 1, 8},
        {kAsc, asc_bytes({3, 4, 2}), 0, -1}, {kAsc, asc_bytes({2, 4, 0}), 0, 0},
        {kAsc, asc_bytes({2, 13, 2}), 0, -1}, {kAsc, asc_bytes({2, 4, 8}), 0, -1},
        {kAdts, cat({{0xFF, 0x12, 0xFF}, adts_frame(3, 6, 8)}), 1, 6},
        {kAdts, cat({adts_frame(12, 5, 2), adts_frame(11, 1, 2)}), 1, 1},
        {kAdts, {0xFF, 0xF9, 0x50, 0x40, 0, 0, 0}, 1, 1}, {kAdts, {0xFF, 0xF3, 0x50, 0x80, 0, 0, 0}, 0, -1},
        {kAdts, {0xFF, 0xF1, 0x50, 0x80, 0x00, 0x1F}, 0, -1}, {kAdts, {0, 0, 0, 0xFF, 0xF1, 0x50, 0x80}, 1, 2},
        {kLatm, cat({{0x56, 0x00, 0x12}, loas_frame(v1)}), 1, 6},
        {kLatm, cat({loas_frame(same_mux), loas_frame({})}), 1, 2}, {kLatm, loas_frame(same_mux), -1, -1},
        {kLatm, loas_frame(layers), 1, 1}, {kLatm, loas_frame(programs), 1, 8}, {kLatm, {0x56, 0xE0}, -1, -1}};
    for (const auto& c : cases) {
        int channels = -1;
        EXPECT_EQ(std::make_pair(c.fn(c.bytes.data(), int(c.bytes.size()), &channels), channels),
                  std::make_pair(c.result, c.channels)) << "row " << (&c - cases);
    }
    const Bytes full = loas_frame(v1, 0);
    for (size_t n = 0; n <= full.size(); ++n) {  // exact-size copies: ASan sees any overread
        const Bytes cut(full.begin(), full.begin() + long(n));
        int channels = 0;
        EXPECT_EQ(kLatm(cut.data(), int(n), &channels), n + 4 >= full.size() ? 1 : -1) << n;
    }
    EXPECT_EQ(aac_get_loas_sample_rate(12) + aac_get_loas_sample_rate(13) + aac_get_loas_sample_rate(-1), 7350u);
}

class Config : public HostedToolkit {};

TEST_F(Config, AacWritesTwoOrFiveBytesIntoANewBlockOrTheCallersBuffer) {
    const std::pair<aac_parameter_st, Bytes> cases[] = {
        {{2, 48000, 6, 0, 0, 0}, {0x11, 0xB0}}, {{2, 22050, 2, 1, 5, 44100}, {0x13, 0x90, 0x56, 0xE5, 0xA0}},
        {{2, 24000, 1, 1, 5, 44000}, {0x13, 0x08, 0x56, 0xE5, 0x80}},  // SBR rate not listed
        {{0x1F, 44000, 0x1F, 0, 0, 0}, {0xF8, 0xF8}}};  // not listed: index 0; fields are cut
    for (const auto& [param, expected] : cases) {
        uint8_t* config = nullptr;
        uint32_t len = 0;
        sys_update_aac_config(&d, &config, &len, &param);
        EXPECT_EQ(Bytes(config, config + len), expected);
        release(config);
    }
    Bytes buf(8, 0xEE);  // the caller's buffer, written only as far as it reaches
    uint8_t* p = buf.data();
    uint32_t len = 4;
    sys_update_aac_config(&d, &p, &len, &cases[1].first);
    EXPECT_EQ(std::make_pair(buf, len), std::make_pair(Bytes{0x13, 0x90, 0xEE, 0xEE, 0xEE, 0xEE, 0xEE, 0xEE}, 4u));
    p = nullptr, host.fail_malloc_at(1);  // no block to be had: no config
    sys_update_aac_config(&d, &p, &len, &cases[0].first);
    EXPECT_EQ(std::make_pair(p, len), std::make_pair(static_cast<uint8_t*>(nullptr), 0u));
}
