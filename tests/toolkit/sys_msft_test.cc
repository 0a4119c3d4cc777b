// Codec identification from WAVEFORMATEX / BITMAPINFOHEADER read through the
// reader, and the tag and FourCC tables.
#include <gtest/gtest.h>

#include <cstring>
#include <memory>
#include <vector>

#include "asf_builder.h"
#include "callbacks.h"
#include "raw_input.h"
#include "streaming.h"
#include "sys_msft.h"
#include "sys_output.h"

namespace {

using asfb::Bytes;

// A demuxer state whose reader stands at the start of `bytes`, and a stream
// with a configuration block of `config_len` bytes, as the ASF caller sets up.
class MsftParse : public ::testing::Test {
protected:
    void SetUp() override {
        std::memset(&d, 0, sizeof d);
        std::memset(&s, 0, sizeof s);
        d.callback = *host.table();
    }
    void TearDown() override {
        if (opened) CloseURL(&d.cbuffer, &d.callback);
        opened = false;
        sys_free(&d, s.config);
        EXPECT_EQ(host.outstanding_blocks(), 0u);
    }
    void load(const Bytes& bytes, uint32_t config_len) {
        host::InputOptions o;
        o.disable_cache = true;
        input = host::RawInput::from_memory(bytes, o);
        ASSERT_EQ(OpenURL(&d.cbuffer, input->io(), 0, host.table()), 0);
        opened = true;
        s.config = config_len ? static_cast<uint8_t*>(sys_malloc(&d, config_len)) : nullptr;
        s.config_len = config_len;
    }
    Bytes config() const { return Bytes(s.config, s.config + s.config_len); }

    host::HostCallbacks host;
    std::unique_ptr<host::RawInput> input;
    sys_demuxer_st d;
    sys_stream_st s;
    bool opened = false;
};

TEST(MsftTables, MapFormatTagsAndFourccsToCodecs) {
    // A representative of each codec family, neighbours of the WMA run, and
    // tags outside the table.
    const std::pair<int, HOVAAudioType> tags[] = {
        {0x0001, CLIP_AUDIO_TYPE_LPCM},     {0x0002, CLIP_AUDIO_TYPE_ADPCM},
        {0x0006, CLIP_AUDIO_TYPE_PCM},      {0x0055, CLIP_AUDIO_TYPE_MP3},
        {0x2000, CLIP_AUDIO_TYPE_AC3},      {0x706D, CLIP_AUDIO_TYPE_AAC},
        {0x0160, CLIP_AUDIO_TYPE_WMA1},     {0x0161, CLIP_AUDIO_TYPE_WMA2},
        {0x0162, CLIP_AUDIO_TYPE_WMA3},     {0x0163, CLIP_AUDIO_TYPE_WMA_LOSSLESS},
        {0x0164, CLIP_AUDIO_TYPE_UNKNOWN},  {0x0000, CLIP_AUDIO_TYPE_UNKNOWN},
        {0xFFFE, CLIP_AUDIO_TYPE_UNKNOWN},  {0x10161, CLIP_AUDIO_TYPE_UNKNOWN},
    };
    for (const auto& [tag, codec] : tags) EXPECT_EQ(sys_msft_format_tag_to_acodec(tag), codec) << std::hex << tag;
    // Case matters; reversed byte order is no code.
    const std::pair<const char*, HOVAVideoType> fourccs[] = {
        {"WVC1", CLIP_VIDEO_TYPE_WVC1}, {"wvc1", CLIP_VIDEO_TYPE_UNKNOWN},
        {"WMV3", CLIP_VIDEO_TYPE_WMV3}, {"MP43", CLIP_VIDEO_TYPE_DIV3},
        {"div3", CLIP_VIDEO_TYPE_DIV3}, {"Div3", CLIP_VIDEO_TYPE_UNKNOWN},
        {"xvid", CLIP_VIDEO_TYPE_M4V},  {"XviD", CLIP_VIDEO_TYPE_UNKNOWN},
        {"flv\0", CLIP_VIDEO_TYPE_FLV1}, {"flv1", CLIP_VIDEO_TYPE_UNKNOWN},
        {"avc1", CLIP_VIDEO_TYPE_AVC1}, {"AVC1", CLIP_VIDEO_TYPE_UNKNOWN},
        {"hevc", CLIP_VIDEO_TYPE_HEVC}, {"1CVW", CLIP_VIDEO_TYPE_UNKNOWN},
    };
    for (const auto& [cc, codec] : fourccs) {
        uint32_t v = 0;
        std::memcpy(&v, cc, 4);
        EXPECT_EQ(sys_msft_fourcc_to_vcodec(v), codec) << std::string(cc, 4);
    }
    sys_stream_st s{};
    for (const auto& [codec, pcm] : {std::pair{CLIP_AUDIO_TYPE_ADPCM, 1}, {CLIP_AUDIO_TYPE_LPCM, 1},
                                     {CLIP_AUDIO_TYPE_PCM, 1}, {CLIP_AUDIO_TYPE_WMA2, 0}, {CLIP_AUDIO_TYPE_AAC, 0}}) {
        s.codec_type = codec;
        EXPECT_EQ(sys_is_codec_PCM(&s), pcm) << codec;
    }
}

TEST_F(MsftParse, AudioConfigKeepsWholeHeaderOrOnlyCodecData) {
    asfb::WaveFormat wma2;
    wma2.extra = Bytes(10, 0xAB);
    asfb::WaveFormat aac;
    aac.format_tag = 0x00FF;
    aac.channels = 2;
    aac.bits_per_sample = 16;
    aac.block_align = 4;
    aac.extra = {0x12, 0x10};
    asfb::WaveFormat aac_vbr = aac;
    aac_vbr.block_align = 1;
    asfb::WaveFormat mp3;
    mp3.format_tag = 0x0055;
    asfb::WaveFormat pcm;
    pcm.format_tag = 0x0001;
    const Bytes pcm_ext = asfb::waveformat_extensible(pcm, asfb::tag_subformat(0x0001));
    const Bytes ac3_ext = asfb::waveformat_extensible(pcm, ac3_guid);
    const Bytes eac3_tail = asfb::waveformat_extensible(pcm, eac3_guid, {1, 2, 3});
    const Bytes wma2_ext = asfb::waveformat_extensible(pcm, asfb::tag_subformat(0x0161));
    const Bytes aac_ext = asfb::waveformat_extensible(pcm, asfb::tag_subformat(0x00FF), {9, 8});
    Bytes short_ext = asfb::waveformat_extensible(pcm, ac3_guid);
    short_ext.resize(30);

    const struct {
        const char* what;
        Bytes wave;
        HOVAAudioType codec;
        Bytes config;
        uint32_t sample_size;
    } cases[] = {
        {"WMA2 keeps the whole structure", asfb::waveformatex(wma2), CLIP_AUDIO_TYPE_WMA2,
         asfb::waveformatex(wma2), 1485},
        {"AAC keeps only the AudioSpecificConfig", asfb::waveformatex(aac), CLIP_AUDIO_TYPE_AAC,
         {0x12, 0x10}, 0},
        {"AAC block align not the frame size", asfb::waveformatex(aac_vbr), CLIP_AUDIO_TYPE_AAC,
         {0x12, 0x10}, 1},
        {"MP3 without extra bytes", asfb::waveformatex(mp3), CLIP_AUDIO_TYPE_MP3, {}, 1485},
        {"extensible PCM keeps 40 bytes", pcm_ext, CLIP_AUDIO_TYPE_LPCM, pcm_ext, 1485},
        {"extensible WMA2 keeps 40 bytes", wma2_ext, CLIP_AUDIO_TYPE_WMA2, wma2_ext, 1485},
        {"extensible AC-3 with nothing behind", ac3_ext, CLIP_AUDIO_TYPE_AC3, {}, 1485},
        {"extensible E-AC-3 keeps what follows", eac3_tail, CLIP_AUDIO_TYPE_EAC3, {1, 2, 3}, 1485},
        {"extensible AAC tag form is trimmed", aac_ext, CLIP_AUDIO_TYPE_AAC, {9, 8}, 1485},
        {"extensible cut at 30 bytes", short_ext, CLIP_AUDIO_TYPE_UNKNOWN, {}, 1485},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        TearDown();
        SetUp();
        Bytes file = c.wave;
        file.push_back(0xEE);  // the byte after the structure must stay unread
        load(file, static_cast<uint32_t>(c.wave.size()));
        uint32_t unread = static_cast<uint32_t>(c.wave.size());
        ASSERT_EQ(sys_msft_parse_audio_header(&d, &s, &unread), HOVA_OK);
        EXPECT_EQ(unread, 0u);
        EXPECT_EQ(s.codec_type, c.codec);
        EXPECT_EQ(config(), c.config);
        EXPECT_EQ(s.info.aud.sample_size, c.sample_size);
        EXPECT_EQ(s.info.aud.sample_rate, 44100u);
        EXPECT_EQ(s.info.aud.bit_rate, 16000u * 8);
        EXPECT_EQ(s.info.aud.ch_num, 2u);
        EXPECT_EQ(s.info.aud.sample_depth, 16u);
        EXPECT_EQ(cb_tell64(&d.cbuffer), c.wave.size());
    }
}

TEST_F(MsftParse, AudioShortInputIsEndOfStream) {
    asfb::WaveFormat wma2;
    wma2.extra = Bytes(10, 1);
    const Bytes wave = asfb::waveformatex(wma2);
    {
        SCOPED_TRACE("fewer than 16 bytes announced");
        load(wave, 15);
        uint32_t unread = 15;
        EXPECT_EQ(sys_msft_parse_audio_header(&d, &s, &unread), HOVA_EndOfStream);
        EXPECT_EQ(unread, 15u);
    }
    TearDown();
    SetUp();
    {
        SCOPED_TRACE("the input ends inside the extra bytes");
        load(Bytes(wave.begin(), wave.begin() + 20), 28);
        uint32_t unread = 28;
        EXPECT_EQ(sys_msft_parse_audio_header(&d, &s, &unread), HOVA_EndOfStream);
        EXPECT_EQ(s.info.aud.sample_rate, 44100u) << "what was read stays filled";
        EXPECT_EQ(unread, 8u);
    }
}

TEST_F(MsftParse, VideoHeaderTakesLow16BitsAndPrivateData) {
    const struct {
        int32_t width, height;
        Bytes priv;
        uint32_t block, unread;
        uint16_t want_w, want_h;
        uint32_t want_config;
    } cases[] = {
        {640, 480, {1, 2, 3, 4}, 4, 44, 640, 480, 4},
        {640, -480, {}, 0, 40, 640, 65056, 0},
        {0x12345, 0x10010, {5, 6}, 2, 42, 0x2345, 0x0010, 2},
        {320, 240, {7, 7, 7}, 8, 43, 320, 240, 3},  // block larger than what is left
    };
    for (const auto& c : cases) {
        TearDown();
        SetUp();
        asfb::BitmapInfo bi;
        bi.width = c.width;
        bi.height = c.height;
        bi.fourcc = "WVC1";
        bi.codec_private = c.priv;
        load(asfb::bitmapinfoheader(bi), c.block);
        uint32_t unread = c.unread, fourcc = 0;
        ASSERT_EQ(sys_msft_parse_video_header(&d, &s, &unread, &fourcc), HOVA_OK);
        EXPECT_EQ(s.codec_type, CLIP_VIDEO_TYPE_WVC1);
        EXPECT_EQ(fourcc, 0x31435657u);
        EXPECT_EQ(s.info.vid.width, c.want_w);
        EXPECT_EQ(s.info.vid.height, c.want_h);
        EXPECT_EQ(s.config_len, c.want_config);
        EXPECT_EQ(config(), Bytes(c.priv.begin(), c.priv.begin() + c.want_config));
        EXPECT_EQ(unread, 0u);
    }
    TearDown();
    SetUp();
    load(Bytes(39, 0), 0);
    uint32_t unread = 39, fourcc = 0;
    EXPECT_EQ(sys_msft_parse_video_header(&d, &s, &unread, &fourcc), HOVA_EndOfStream);
}

}  // namespace
