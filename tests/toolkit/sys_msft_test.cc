// Codec identification from WAVEFORMATEX / BITMAPINFOHEADER read through the
// reader, and the tag and FourCC tables.
#include <cstring>
#include <memory>

#include "asf_builder.h"
#include "raw_input.h"
#include "streaming.h"
#include "sys_msft.h"
#include "toolkit_fixture.h"

namespace {

using asfb::Bytes;

// A reader standing at the start of `bytes`, and a stream with a configuration
// block of `config_len` bytes, as the ASF caller sets them up.
class MsftParse : public HostedToolkit {
protected:
    void load(const Bytes& bytes, uint32_t config_len) {
        close();
        host::InputOptions o;
        o.disable_cache = true;
        input = host::RawInput::from_memory(bytes, o);
        ASSERT_EQ(OpenURL(&d.cbuffer, input->io(), 0, host.table()), 0);
        s = {};
        s.config = config_len ? static_cast<uint8_t*>(sys_malloc(&d, config_len)) : nullptr;
        s.config_len = config_len;
    }
    void close() {
        if (input) CloseURL(&d.cbuffer, &d.callback);
        input.reset();
        release(s.config);
    }
    void TearDown() override {
        close();
        HostedToolkit::TearDown();
    }
    Bytes config() const { return Bytes(s.config, s.config + s.config_len); }
    std::unique_ptr<host::RawInput> input;
    sys_stream_st s{};
};

TEST(MsftTables, MapFormatTagsAndFourccsToCodecs) {
    // Ends of the table, the WMA run and its neighbours, tags outside the table.
    const std::pair<int, HOVAAudioType> tags[] = {
        {0x0001, CLIP_AUDIO_TYPE_LPCM},         {0x0002, CLIP_AUDIO_TYPE_ADPCM},
        {0x0055, CLIP_AUDIO_TYPE_MP3},          {0x0160, CLIP_AUDIO_TYPE_WMA1},
        {0x0163, CLIP_AUDIO_TYPE_WMA_LOSSLESS}, {0x0164, CLIP_AUDIO_TYPE_UNKNOWN},
        {0x7657, CLIP_AUDIO_TYPE_ADPCM},        {0x0000, CLIP_AUDIO_TYPE_UNKNOWN},
        {0x10161, CLIP_AUDIO_TYPE_UNKNOWN}};
    for (const auto& [tag, codec] : tags)
        EXPECT_EQ(sys_msft_format_tag_to_acodec(tag), codec) << tag;
    // Case matters; reversed byte order is no code.
    const std::pair<const char*, HOVAVideoType> fourccs[] = {
        {"MP4S", CLIP_VIDEO_TYPE_MP4S},    {"WVC1", CLIP_VIDEO_TYPE_WVC1},
        {"wvc1", CLIP_VIDEO_TYPE_UNKNOWN}, {"div3", CLIP_VIDEO_TYPE_DIV3},
        {"Div3", CLIP_VIDEO_TYPE_UNKNOWN}, {"flv\0", CLIP_VIDEO_TYPE_FLV1},
        {"flv1", CLIP_VIDEO_TYPE_UNKNOWN}, {"hevc", CLIP_VIDEO_TYPE_HEVC},
        {"1CVW", CLIP_VIDEO_TYPE_UNKNOWN}};
    for (const auto& [cc, codec] : fourccs) {
        uint32_t v = 0;
        std::memcpy(&v, cc, 4);
        EXPECT_EQ(sys_msft_fourcc_to_vcodec(v), codec) << cc;
    }
    sys_stream_st s{};
    for (const auto& [codec, pcm] : {std::pair{CLIP_AUDIO_TYPE_ADPCM, 1}, {CLIP_AUDIO_TYPE_LPCM, 1},
                                     {CLIP_AUDIO_TYPE_PCM, 1}, {CLIP_AUDIO_TYPE_WMA2, 0}}) {
        s.codec_type = codec;
        EXPECT_EQ(sys_is_codec_PCM(&s), pcm) << codec;
    }
}

TEST_F(MsftParse, AudioConfigKeepsWholeHeaderOrOnlyCodecDataAndStopsAtShortInput) {
    asfb::WaveFormat wma2, aac, mp3, pcm;
    wma2.extra = Bytes(10, 0xAB);
    aac.format_tag = 0x00FF;
    aac.block_align = 4;
    aac.extra = {0x12, 0x10};
    asfb::WaveFormat aac_vbr = aac;
    aac_vbr.block_align = 1;
    mp3.format_tag = 0x0055;
    pcm.format_tag = 0x0001;
    auto ext = [&pcm](const guid_st& g, const Bytes& tail) {
        return asfb::waveformat_extensible(pcm, g, tail);
    };
    Bytes short_ext = ext(ac3_guid, {});
    short_ext.resize(30);
    const Bytes wma2_hdr = asfb::waveformatex(wma2), pcm_ext = ext(asfb::tag_subformat(1), {}),
                wma2_ext = ext(asfb::tag_subformat(0x0161), {});
    const struct {
        Bytes wave;
        HOVAAudioType codec;
        Bytes config;
        uint32_t sample_size;
    } cases[] = {
        {wma2_hdr, CLIP_AUDIO_TYPE_WMA2, wma2_hdr, 1485},
        {asfb::waveformatex(aac), CLIP_AUDIO_TYPE_AAC, {0x12, 0x10}, 0},  // block = frame size
        {asfb::waveformatex(aac_vbr), CLIP_AUDIO_TYPE_AAC, {0x12, 0x10}, 1},
        {asfb::waveformatex(mp3), CLIP_AUDIO_TYPE_MP3, {}, 1485},
        {pcm_ext, CLIP_AUDIO_TYPE_LPCM, pcm_ext, 1485},
        {wma2_ext, CLIP_AUDIO_TYPE_WMA2, wma2_ext, 1485},
        {ext(ac3_guid, {}), CLIP_AUDIO_TYPE_AC3, {}, 1485},
        {ext(eac3_guid, {1, 2, 3}), CLIP_AUDIO_TYPE_EAC3, {1, 2, 3}, 1485},
        {ext(asfb::tag_subformat(0x00FF), {9, 8}), CLIP_AUDIO_TYPE_AAC, {9, 8}, 1485},
        {ext(mp2_guid, {}), CLIP_AUDIO_TYPE_MP3, {}, 1485},
        {short_ext, CLIP_AUDIO_TYPE_UNKNOWN, {}, 1485}};
    for (const auto& c : cases) {
        load(tkb::padded(c.wave, 1, 0xEE), static_cast<uint32_t>(c.wave.size()));  // 0xEE unread
        uint32_t unread = static_cast<uint32_t>(c.wave.size());
        ASSERT_EQ(sys_msft_parse_audio_header(&d, &s, &unread), HOVA_OK) << (&c - cases);
        EXPECT_EQ(std::make_tuple(unread, s.codec_type, config(), s.info.aud.sample_size),
                  std::make_tuple(0u, c.codec, c.config, c.sample_size)) << (&c - cases);
        EXPECT_EQ(std::make_tuple(s.info.aud.sample_rate, s.info.aud.bit_rate, s.info.aud.ch_num,
                                  s.info.aud.sample_depth),
                  std::make_tuple(44100u, 128000u, 2u, 16u));
        EXPECT_EQ(cb_tell64(&d.cbuffer), c.wave.size());
    }
    load(wma2_hdr, 15);  // fewer than 16 bytes announced
    uint32_t unread = 15;
    EXPECT_EQ(sys_msft_parse_audio_header(&d, &s, &unread), HOVA_EndOfStream);
    EXPECT_EQ(unread, 15u);
    load(Bytes(wma2_hdr.begin(), wma2_hdr.begin() + 20), 28);  // the input ends in the extra bytes
    unread = 28;
    EXPECT_EQ(sys_msft_parse_audio_header(&d, &s, &unread), HOVA_EndOfStream);
    EXPECT_EQ(s.info.aud.sample_rate, 44100u) << "what was read stays filled";
    EXPECT_EQ(unread, 8u);
}

TEST_F(MsftParse, VideoHeaderTakesLow16BitsAndPrivateData) {
    const struct {
        int32_t width, height;
        Bytes priv;
        uint32_t block, unread;
        uint16_t want_w, want_h;
        uint32_t want_config;
    } cases[] = {{640, 480, {1, 2, 3, 4}, 4, 44, 640, 480, 4},
                 {640, -480, {}, 0, 40, 640, 65056, 0},
                 {0x12345, 0x10010, {5, 6}, 2, 42, 0x2345, 0x0010, 2},
                 {320, 240, {7, 7, 7}, 8, 43, 320, 240, 3}};  // block larger than what is left
    for (const auto& c : cases) {
        load(asfb::bitmapinfoheader({c.width, c.height, "WVC1", c.priv}), c.block);
        uint32_t unread = c.unread, fourcc = 0;
        ASSERT_EQ(sys_msft_parse_video_header(&d, &s, &unread, &fourcc), HOVA_OK);
        EXPECT_EQ(
            std::make_tuple(s.codec_type, fourcc, s.info.vid.width, s.info.vid.height, unread),
            std::make_tuple(CLIP_VIDEO_TYPE_WVC1, 0x31435657u, c.want_w, c.want_h, 0u));
        EXPECT_EQ(config(), Bytes(c.priv.begin(), c.priv.begin() + c.want_config));
    }
    load(Bytes(39, 0), 0);
    uint32_t unread = 39, fourcc = 0;
    EXPECT_EQ(sys_msft_parse_video_header(&d, &s, &unread, &fourcc), HOVA_EndOfStream);
    unread = 40;
    EXPECT_EQ(sys_msft_parse_video_header(&d, &s, &unread, &fourcc), HOVA_EndOfStream);
}

}  // namespace
