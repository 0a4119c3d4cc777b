// Codec configuration parsers: the bit reader, AAC (AudioSpecificConfig, ADTS,
// LOAS/LATM, config writer), AC-3/E-AC-3 channel counts, the AC-4 header, avcC.
#include <vector>

#include "bit_reader.h"
#include "sys_aac.h"
#include "sys_ac3.h"
#include "sys_avc.h"
#include "sys_config.h"
#include "test_env.h"
#include "toolkit_fixture.h"

namespace {

using tkb::Bytes;
using tkb::cat;
using tkb::pattern;

TEST(BitReader, ReadsMostSignificantBitFirstSkipsAndGivesZerosPastTheEnd) {
    const Bytes data = {0xA5, 0x3C, 0xFF, 0x01, 0x80};
    // (width, value); a negative width skips that many bits.
    const std::vector<std::pair<int64_t, uint32_t>> cases[] = {
        {{1, 1}, {1, 0}, {1, 1}, {1, 0}}, {{4, 0xA}, {8, 0x53}, {4, 0xC}},
        {{24, 0xA53CFF}, {16, 0x0180}}, {{32, 0xA53CFF01}, {8, 0x80}},
        {{36, 0x53CFF018}, {8, 0}, {24, 0}}, {{0, 0}, {8, 0xA5}},
        {{4, 0xA}, {-12, 0}, {8, 0xFF}, {-0xFFFFFFFFll, 0}, {16, 0}}};
    for (const auto& ops : cases) {
        buffer_bitstream_st bs;
        buf_stream_init(&bs, data.data(), static_cast<int>(data.size()));
        for (size_t i = 0; i < ops.size(); ++i) {
            if (ops[i].first < 0) buf_bit_skip(&bs, static_cast<uint32_t>(-ops[i].first));
            else EXPECT_EQ(buf_bit_read(&bs, static_cast<int>(ops[i].first)), ops[i].second)
                << "case " << (&ops - cases) << " read " << i;
        }
    }
    buffer_bitstream_st bs;
    buf_stream_init(&bs, nullptr, 10);  // no buffer: nothing but zeros
    EXPECT_EQ(buf_bit_read(&bs, 24), 0u);
    for (uint32_t v : {0u, 0x7Fu, 0x1234u, 0xABCDEFu, 0x89ABCDEFu, 0xFFFFFFFFu}) {
        const Bytes b = tkb::BitWriter().latm_value(v).put(0x5, 3).bytes();
        buf_stream_init(&bs, b.data(), static_cast<int>(b.size()));
        EXPECT_EQ(aac_parse_latm_get_value(&bs), v);
        EXPECT_EQ(buf_bit_read(&bs, 3), 0x5u) << "LATM value " << v << " read a wrong width";
    }
}

using CountFn = int (*)(const uint8_t*, int, int*);
const CountFn kAsc = sys_get_aac_audiospecificconfig_channel_count;
const CountFn kAdts = sys_get_aac_adts_channel_count;
const CountFn kLatm = sys_get_aac_latm_channel_count;

TEST(AacChannels, AscAdtsAndLatmFindTheFirstUsableConfigWithoutOverreading) {
    using tkb::LoasLayer;
    tkb::LoasConfig v0, v1, same_mux, second_layer, shared, second_program, none_usable;
    v1.mux_version = second_layer.mux_version = 1;
    v1.programs = {{LoasLayer{false, {2, 3, 6}, 16}}};
    same_mux.use_same_stream_mux = true;
    second_layer.programs = {{LoasLayer{false, {3, 4, 2}, 19}, LoasLayer{false, {2, 4, 1}, 0}}};
    shared.programs = {{LoasLayer{false, {2, 4, 0}, 0}, LoasLayer{true, {}, 0},
                        LoasLayer{false, {5, 6, 7}, 0}}};
    second_program.programs = {{LoasLayer{false, {3, 4, 2}, 0}}, {LoasLayer{false, {2, 4, 2}, 0}}};
    none_usable.programs = {{LoasLayer{false, {3, 4, 2}, 0}}};
    Bytes mpeg2 = tkb::adts_frame(4, 1, 8);
    mpeg2[1] = 0xF8;  // MPEG-2 ID bit and CRC flag are free
    const struct {
        CountFn fn;
        Bytes bytes;
        int result, channels;  // channels -1: left alone
    } cases[] = {
        {kAsc, tkb::asc_bytes({2, 4, 2}), 1, 2}, {kAsc, tkb::asc_bytes({1, 3, 1}), 1, 1},
        {kAsc, tkb::asc_bytes({4, 3, 6}), 1, 6}, {kAsc, tkb::asc_bytes({5, 6, 7}), 1, 8},
        {kAsc, tkb::asc_bytes({29, 12, 2}), 1, 2}, {kAsc, tkb::asc_bytes({3, 4, 2}), 0, -1},
        {kAsc, tkb::asc_bytes({0, 4, 2}), 0, -1}, {kAsc, tkb::asc_bytes({2, 4, 0}), 0, 0},
        {kAsc, tkb::asc_bytes({2, 13, 2}), 0, -1}, {kAsc, tkb::asc_bytes({2, 15, 2}), 0, -1},
        {kAsc, tkb::asc_bytes({2, 4, 8}), 0, -1}, {kAsc, {0x10}, 0, 0}, {kAsc, {}, 0, -1},
        {kAdts, tkb::adts_frame(4, 2, 8), 1, 2}, {kAdts, tkb::adts_frame(4, 7, 8), 1, 7},
        {kAdts, cat({{0x00, 0xFF, 0x12, 0xFF}, tkb::adts_frame(3, 6, 8)}), 1, 6},
        {kAdts, tkb::adts_frame(4, 0, 8), 1, 0}, {kAdts, mpeg2, 1, 1},
        {kAdts, cat({tkb::adts_frame(12, 5, 2), tkb::adts_frame(11, 1, 2)}), 1, 1},
        {kAdts, tkb::adts_frame(12, 5, 8), 0, 5}, {kAdts, tkb::adts_frame(4, 2, 8, 1, 1), 0, -1},
        {kAdts, {0xFF, 0xF1, 0x50, 0x80, 0x00, 0x1F}, 0, -1},
        {kAdts, {0, 0, 0, 0, 0xFF, 0xF1, 0x50}, 0, -1},
        {kAdts, {0, 0, 0, 0xFF, 0xF1, 0x50, 0x80}, 1, 2},
        {kLatm, tkb::loas_frame(v0), 1, 2}, {kLatm, tkb::loas_frame(v1), 1, 6},
        {kLatm, cat({{0x56, 0x00, 0x12}, tkb::loas_frame(v0)}), 1, 2},
        {kLatm, cat({tkb::loas_frame(same_mux), tkb::loas_frame(v1)}), 1, 6},
        {kLatm, tkb::loas_frame(same_mux), -1, -1}, {kLatm, tkb::loas_frame(second_layer), 1, 1},
        {kLatm, tkb::loas_frame(shared), 1, 8}, {kLatm, tkb::loas_frame(second_program), 1, 2},
        {kLatm, tkb::loas_frame(none_usable), -1, -1}, {kLatm, {0x56, 0xE0}, -1, -1},
        {kLatm, {0x00, 0x56}, -1, -1}, {kLatm, {}, -1, -1}};
    for (const auto& c : cases) {
        int channels = -1;
        EXPECT_EQ(c.fn(c.bytes.data(), static_cast<int>(c.bytes.size()), &channels), c.result)
            << "row " << (&c - cases);
        EXPECT_EQ(channels, c.channels) << "row " << (&c - cases);
    }
    EXPECT_EQ(kAdts(cases[13].bytes.data(), 15, nullptr), 0);
    EXPECT_EQ(kAsc(cases[0].bytes.data(), 2, nullptr), 0);
    EXPECT_EQ(kLatm(cases[24].bytes.data(), 9, nullptr), -1);
    const Bytes full = tkb::loas_frame(v1, 0);
    for (size_t n = 0; n <= full.size(); ++n) {  // exact-size copies: ASan sees any overread
        const Bytes cut(full.begin(), full.begin() + static_cast<long>(n));
        int channels = 0;
        EXPECT_EQ(kLatm(cut.data(), static_cast<int>(n), &channels), n + 4 >= full.size() ? 1 : -1);
    }
    const Bytes b = tkb::asc_bytes({2, 11, 1});  // the record, nothing read after the layout
    buffer_bitstream_st bs;
    buf_stream_init(&bs, b.data(), static_cast<int>(b.size()));
    audioSpecificConfig_st asc;
    int channels = 0;
    ASSERT_EQ(AudioSpecificConfig(0, &asc, &bs, &channels), 1);
    EXPECT_EQ(std::make_tuple(asc.objectTypeIndex, asc.samplingFrequencyIndex,
                              asc.samplingFrequency, asc.channelsConfiguration, bs.buf_left),
              std::make_tuple(2, 11u, 8000u, 1u, 0));
    EXPECT_EQ(aac_get_loas_sample_rate(12), 7350u);
    EXPECT_EQ(aac_get_loas_sample_rate(0) + aac_get_loas_sample_rate(-1), 96000u);
    EXPECT_EQ(aac_get_loas_sample_rate(13) + aac_get_loas_sample_rate(16), 0u);
}

class AacConfigWriter : public HostedToolkit {};

TEST_F(AacConfigWriter, WritesTwoOrFiveByteConfigsIntoANewBlockOrTheCallersBuffer) {
    const std::pair<aac_parameter_st, Bytes> cases[] = {
        {{2, 44100, 2, 0, 0, 0}, {0x12, 0x10}}, {{2, 48000, 6, 0, 0, 0}, {0x11, 0xB0}},
        {{2, 22050, 2, 1, 5, 44100}, {0x13, 0x90, 0x56, 0xE5, 0xA0}},
        {{2, 24000, 1, 1, 5, 44000}, {0x13, 0x08, 0x56, 0xE5, 0x80}},  // SBR rate not listed
        {{2, 44000, 2, 0, 0, 0}, {0x10, 0x10}},  // rate not listed: index 0
        {{0x1F, 7350, 0x1F, 0, 0, 0}, {0xFE, 0xF8}}};  // fields wider than their slots are cut
    for (const auto& [param, expected] : cases) {
        uint8_t* config = nullptr;
        uint32_t len = 0;
        sys_update_aac_config(&d, &config, &len, &param);
        ASSERT_NE(config, nullptr);
        EXPECT_EQ(Bytes(config, config + len), expected);
        release(config);
    }
    // A buffer the caller provides is written only as far as it reaches.
    const uint64_t mallocs = host.malloc_calls();
    for (const auto& [len_in, written] : {std::pair{0u, 0}, {1u, 0}, {2u, 2}, {4u, 2}, {5u, 5}}) {
        Bytes buf(8, 0xEE);
        uint8_t* p = buf.data();
        uint32_t len = len_in;
        sys_update_aac_config(&d, &p, &len, &cases[2].first);
        EXPECT_EQ(len, written ? len_in : 0u) << len_in;
        Bytes expected(cases[2].second.begin(), cases[2].second.begin() + written);
        EXPECT_EQ(buf, tkb::padded(expected, 8 - static_cast<size_t>(written), 0xEE)) << len_in;
        EXPECT_EQ(p, buf.data());
    }
    EXPECT_EQ(host.malloc_calls(), mallocs);
    uint8_t* config = nullptr;  // no block to be had: no config
    uint32_t len = 7;
    sys_update_aac_config(nullptr, &config, &len, &cases[0].first);
    EXPECT_EQ(std::make_pair(config, len), std::make_pair(static_cast<uint8_t*>(nullptr), 0u));
    host.fail_malloc_at(1);
    len = 7;
    sys_update_aac_config(&d, &config, &len, &cases[0].first);
    EXPECT_EQ(std::make_pair(config, len), std::make_pair(static_cast<uint8_t*>(nullptr), 0u));
}

TEST(Ac3Channels, FindsLfeAfterTheModeFieldsAndScansForAUsableHeader) {
    const int full_range[8] = {2, 1, 2, 3, 3, 4, 4, 5};  // 1+1, 1/0, 2/0, 3/0, 2/1, 3/1, 2/2, 3/2
    for (int acmod = 0; acmod < 16; ++acmod) {
        int ac3 = -1, eac3 = -1, lfe = acmod / 8;
        EXPECT_EQ(sys_get_ac3_channel_count(tkb::ac3_frame(acmod % 8, lfe).data(), 16, 0, &ac3), 1);
        EXPECT_EQ(sys_get_ac3_channel_count(tkb::eac3_frame(acmod % 8, lfe).data(), 13, 1, &eac3),
                  1);
        EXPECT_EQ(std::make_pair(ac3, eac3), std::make_pair(full_range[acmod % 8] + lfe,
                                                            full_range[acmod % 8] + lfe)) << acmod;
    }
    const struct {
        Bytes bytes;
        int eac3, result, channels;
    } cases[] = {{cat({{0x0B, 0x00, 0x77, 0x0B}, tkb::ac3_frame(7, 1)}), 0, 1, 6},
                 {cat({tkb::ac3_frame(7, 1, 38, 0), tkb::ac3_frame(2, 0)}), 0, 1, 2},
                 {tkb::ac3_frame(2, 1, 37), 0, 1, 3},
                 {tkb::ac3_frame(7, 1, 63), 0, -1, -1},
                 {{0x0B, 0x77, 0, 0, 0x0A, 0x40}, 0, -1, -1},
                 {{0x0B, 0x77, 0, 0, 0x0A, 0x40, 0x40}, 0, 1, 2},
                 {{0x0B, 0x77, 0, 0, 0x0F}, 1, 1, 6},
                 {{0x0B, 0x77, 0, 0}, 1, -1, -1},
                 {{0, 0, 0, 0, 0, 0, 0x0B}, 0, -1, -1},
                 {Bytes(64, 0x77), 0, -1, -1},
                 {{}, 0, -1, -1}};
    for (const auto& c : cases) {
        int channels = -1;
        EXPECT_EQ(sys_get_ac3_channel_count(c.bytes.data(), static_cast<int>(c.bytes.size()),
                                            c.eac3, &channels), c.result) << (&c - cases);
        EXPECT_EQ(channels, c.channels) << (&c - cases);
    }
    EXPECT_EQ(sys_get_ac3_channel_count(cases[1].bytes.data(), 30, 0, nullptr), -1);
    for (const auto& [size, tail] : {std::pair{0x012345u, Bytes{1, 0x23, 0x45}}, {0u, {0, 0, 0}},
                                     {0xAB123456u, {0x12, 0x34, 0x56}}}) {  // only 24 bits fit
        Bytes header(8, 0xEE);
        sys_update_ac4_header(header.data(), size);
        EXPECT_EQ(header, cat({{0xAC, 0x40, 0xFF, 0xFF}, tail, {0xEE}})) << size;
    }
    testenv::LogCapture log;
    sys_update_ac4_header(nullptr, 5);
    ASSERT_EQ(log.lines().size(), 1u);
    EXPECT_EQ(log.lines()[0].text, "[SYS]Error! Input bffer is NULL\n");
}

class AvcConfig : public HostedToolkit {
protected:
    int parse(const Bytes& r) {
        return parse_avc_video_config(&d, r.data(), static_cast<int>(r.size()), &out, &size, &nal);
    }
    Bytes output() const { return out ? Bytes(out, out + size) : Bytes(); }
    void TearDown() override {
        release(out);
        HostedToolkit::TearDown();
    }
    uint8_t* out = nullptr;
    uint32_t size = 0;
    int nal = 0;
};

TEST_F(AvcConfig, PrefixesEveryParameterSetWithAStartCodeAndRejectsShortRecords) {
    Bytes masked = tkb::avcc({pattern(2, 1)}, {pattern(2, 2)});
    masked[5] = masked[10] = 0xE1;  // reserved bits set around both counts
    const Bytes p1 = pattern(12, 3), p2 = pattern(9, 4), p3 = pattern(3, 5), p4 = pattern(1, 6);
    const struct {
        Bytes record;
        std::vector<Bytes> sets;
        int nal_length_size;
    } cases[] = {
        {tkb::avcc({pattern(30, 1)}, {pattern(4, 2)}), {pattern(30, 1), pattern(4, 2)}, 4},
        {tkb::avcc({p1, p2}, {p3, p4}, 2), {p1, p2, p3, p4}, 2},
        {masked, {pattern(2, 1), pattern(2, 2)}, 4}, {tkb::avcc({{}}, {{}}, 1), {{}, {}}, 1}};
    uint8_t* first = nullptr;
    for (const auto& c : cases) {
        ASSERT_EQ(parse(c.record), HOVA_OK);
        Bytes expected;
        for (const auto& set : c.sets) expected = cat({expected, {0, 0, 0, 1}, set});
        EXPECT_EQ(output(), expected);
        EXPECT_EQ(nal, c.nal_length_size);
        if (!first) first = out;
        EXPECT_EQ(out, first) << "each block is large enough for the next";
    }
    const Bytes good = tkb::avcc({pattern(40, 1)}, {pattern(4, 2)});
    ASSERT_EQ(parse(good), HOVA_OK);
    EXPECT_EQ(size, 52u);
    EXPECT_EQ(host.outstanding_blocks(), 1u) << "the old block went back";
    const uint64_t mallocs = host.malloc_calls();
    Bytes oversize = good;
    oversize[7] = 0x40;  // SPS claims 64 bytes
    std::vector<Bytes> bad = {oversize};
    for (size_t n = 0; n < good.size(); ++n) bad.emplace_back(good.begin(), good.begin() + long(n));
    for (const Bytes& record : bad) {
        EXPECT_EQ(parse(record), HOVA_EndOfStream) << record.size();
        EXPECT_EQ(size, 52u);
    }
    EXPECT_EQ(host.malloc_calls(), mallocs) << "nothing is allocated for a bad record";
    release(out);
    ASSERT_EQ(parse(tkb::avcc({}, {})), HOVA_OK);
    EXPECT_EQ(std::make_pair(out, size), std::make_pair(static_cast<uint8_t*>(nullptr), 0u));
    EXPECT_EQ(host.malloc_calls(), mallocs) << "no parameter sets: nothing allocated";
    testenv::LogCapture log;
    host.fail_malloc_at(1);  // the work block
    EXPECT_EQ(parse(good), HOVA_NotEnoughMemory);
    EXPECT_TRUE(log.contains("[SYS] malloc config fail in parse_avc_video_config\n"));
    host.fail_malloc_at(2);  // the output block: converted, but nothing kept
    EXPECT_EQ(parse(good), HOVA_OK);
    EXPECT_EQ(std::make_pair(out, size), std::make_pair(static_cast<uint8_t*>(nullptr), 0u));
}

TEST_F(AvcConfig, ConfigAssignReplacesTheContentGrowingOnlyWhenNeeded) {
    size = 16;  // a stale length without a block is no room
    const Bytes a = pattern(8, 1), b = pattern(3, 2), c = pattern(12, 3), big = pattern(20, 9);
    sys_assign_config_with_realloc(&d, &out, &size, a.data(), 8);
    EXPECT_EQ(output(), a);
    uint8_t* block = out;
    sys_assign_config_with_realloc(&d, &out, &size, b.data(), 3);
    EXPECT_EQ(out, block);
    EXPECT_EQ(output(), b);
    sys_assign_config_with_realloc(&d, &out, &size, c.data(), 12);  // 3 < 12: a new block
    EXPECT_EQ(output(), c);
    EXPECT_EQ(host.outstanding_blocks(), 1u);
    host.fail_malloc_at(1);  // refused: the old block and length, with as much as fits
    sys_assign_config_with_realloc(&d, &out, &size, big.data(), 20);
    EXPECT_EQ(output(), Bytes(big.begin(), big.begin() + 12));
    sys_assign_config_with_realloc(&d, &out, &size, nullptr, 0);
    EXPECT_EQ(size, 0u);
}

}  // namespace
