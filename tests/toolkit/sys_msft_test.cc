// Codec identification and configuration from WAVEFORMATEX(TENSIBLE) and
// BITMAPINFOHEADER read through the reader: what is kept, and short inputs.

#include "asf_builder.h"
#include "sys_msft.h"
#include "toolkit_fixture.h"

using asfb::Bytes;

// A reader standing at the start of `bytes`, and a stream with a configuration
// block of `config_len` bytes, as the ASF caller sets them up.
class MsftParse : public HostedToolkit {
protected:
    void load(const Bytes& bytes, uint32_t config_len) {
        close();
        input = host::RawInput::from_memory(bytes, {.disable_cache = true});
        ASSERT_EQ(OpenURL(&d.cbuffer, input->io(), 0, host.table()), 0);
        s = {}, s.config_len = config_len;
        s.config = config_len ? static_cast<uint8_t*>(sys_malloc(&d, config_len)) : nullptr;
    }
    void close() {
        if (input) CloseURL(&d.cbuffer, &d.callback);
        input.reset(), release(s.config);
    }
    void TearDown() override { close(), HostedToolkit::TearDown(); }
    Bytes config() const { return Bytes(s.config, s.config + s.config_len); }
    std::unique_ptr<host::RawInput> input;
    sys_stream_st s{};
};

// What the corpus cannot show: AAC's frame-size block, the extensible forms,
// a header cut short.
TEST_F(MsftParse, AudioConfigKeepsWholeHeaderOrOnlyCodecDataAndStopsAtShortInput) {
    asfb::WaveFormat wma2, aac, pcm;
    wma2.extra = Bytes(10, 0xAB);
    aac.format_tag = 0x00FF, aac.block_align = 4, aac.extra = {0x12, 0x10};
    pcm.format_tag = 0x0001;
    const Bytes ext = asfb::waveformat_extensible(pcm, ac3_guid), short_ext(ext.begin(), ext.begin() + 30);
    const Bytes wma2_hdr = asfb::waveformatex(wma2), pcm_ext = asfb::waveformat_extensible(pcm, asfb::tag_subformat(1));
    const struct { Bytes wave; HOVAAudioType codec; Bytes config; uint32_t sample_size; } cases[] = {
        {wma2_hdr, CLIP_AUDIO_TYPE_WMA2, wma2_hdr, 1485}, {pcm_ext, CLIP_AUDIO_TYPE_LPCM, pcm_ext, 1485},
        {asfb::waveformatex(aac), CLIP_AUDIO_TYPE_AAC, {0x12, 0x10}, 0},  // block = frame size
        {asfb::waveformat_extensible(pcm, eac3_guid, {1, 2, 3}), CLIP_AUDIO_TYPE_EAC3, {1, 2, 3}, 1485},
        {asfb::waveformat_extensible(pcm, asfb::tag_subformat(0xFF), {9}), CLIP_AUDIO_TYPE_AAC, {9}, 1485},
        {short_ext, CLIP_AUDIO_TYPE_UNKNOWN, {}, 1485}};
    for (const auto& c : cases) {
        load(tkb::padded(c.wave, 1, 0xEE), uint32_t(c.wave.size()));  // 0xEE stays unread
        uint32_t unread = uint32_t(c.wave.size());
        ASSERT_EQ(sys_msft_parse_audio_header(&d, &s, &unread), HOVA_OK) << (&c - cases);
        EXPECT_EQ(std::make_tuple(unread, s.codec_type, config(), s.info.aud.sample_size, s.info.aud.ch_num,
                                  cb_tell64(&d.cbuffer)),
                  std::make_tuple(0u, c.codec, c.config, c.sample_size, 2u, c.wave.size())) << (&c - cases);
    }
    load(wma2_hdr, 0);  // no configuration block: nothing kept
    uint32_t all = uint32_t(wma2_hdr.size());
    ASSERT_EQ(sys_msft_parse_audio_header(&d, &s, &all), HOVA_OK);
    EXPECT_EQ(std::make_pair(s.config_len, all), std::make_pair(0u, 12u));
    // Fewer than 16 bytes announced; the input ends in the extra bytes.
    for (const auto& [w, n, left] : {std::tuple{wma2_hdr, 15u, 15u}, {Bytes(&wma2_hdr[0], &wma2_hdr[20]), 28u, 8u}}) {
        load(w, n);
        uint32_t unread = n;
        const int r = sys_msft_parse_audio_header(&d, &s, &unread);
        EXPECT_EQ(std::make_pair(r, unread), std::make_pair(int(HOVA_EndOfStream), left));
    }
    EXPECT_EQ(s.info.aud.sample_rate, 44100u);
}

TEST_F(MsftParse, VideoHeaderTakesLow16BitsAndPrivateData) {
    const struct { int32_t width, height; Bytes priv; uint32_t block, unread; uint16_t w, h;
                   uint32_t kept; } cases[] = {
        {640, -480, {}, 0, 40, 640, 65056, 0}, {0x12345, 0x10010, {5, 6}, 2, 42, 0x2345, 0x0010, 2},
        {320, 240, {7, 7, 7}, 8, 43, 320, 240, 3}};  // block larger than what is left
    for (const auto& c : cases) {
        load(asfb::bitmapinfoheader({c.width, c.height, "WVC1", c.priv}), c.block);
        uint32_t unread = c.unread, fourcc = 0;
        ASSERT_EQ(sys_msft_parse_video_header(&d, &s, &unread, &fourcc), HOVA_OK);
        EXPECT_EQ(std::make_tuple(s.codec_type, fourcc, s.info.vid.width, s.info.vid.height, unread,
                                  config()),
                  std::make_tuple(CLIP_VIDEO_TYPE_WVC1, 0x31435657u, c.w, c.h, 0u,
                                  Bytes(c.priv.begin(), c.priv.begin() + c.kept)));
    }
}
