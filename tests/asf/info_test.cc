// Information queries: which record answers, and what each field carries.
#include <gtest/gtest.h>

#include <cstring>

#include "asf_open.h"

namespace {

using asfb::Bytes;
using testsupport::file_with;
using testsupport::Opened;

const hova_dmx_func_st& dmx = hova_asff_demuxer;

// WMV3 as stream 2 at 333667 x 100 ns per frame, WMA2 as stream 1, with
// bitrates and languages from the header extension.
asfb::File wmv3_wma2_file() {
    asfb::ExtStreamProps ea, ev;
    ea.stream_num = 1;
    ea.bitrate = 64040;
    ea.language_index = 1;
    ev.stream_num = 2;
    ev.bitrate = 100000;
    ev.avg_time_per_frame = 333667;
    asfb::BitmapInfo bi;
    bi.width = 208;
    bi.height = 160;
    bi.fourcc = "WMV3";
    return file_with({asfb::header_extension({asfb::language_list({"es", "en-US"}),
                                              asfb::extended_stream_properties(ea),
                                              asfb::extended_stream_properties(ev)}),
                      asfb::video_stream(2, bi), asfb::audio_stream(1)});
}

TEST(Info, RefusesUnknownTypes) {
    Opened o = testsupport::open_file(wmv3_wma2_file());
    ASSERT_EQ(o.rc, HOVA_OK);
    hova_clip_info_st clip;
    std::memset(&clip, 0xFF, sizeof clip);
    for (int type : {int{HOVA_STREAM_SUBTITLE}, int{HOVA_STREAM_CLIP}, int{HOVA_STREAM_ID3_METADATA}, -1, 99})
        EXPECT_EQ(dmx.get_info(o.ctx(), static_cast<hova_stream_type_et>(type), 0, &clip),
                  HOVA_InvalidParam)
            << type;
    ASSERT_EQ(dmx.get_info(o.ctx(), HOVA_STREAM_NONE, 0, &clip), HOVA_OK);
    EXPECT_EQ(clip.seekable, 1);
    EXPECT_EQ(clip.num_program, 1);
    EXPECT_EQ(clip.active_program, 0);
    EXPECT_EQ(clip.ts_type, HOVA_TS_DTS);
    EXPECT_EQ(clip.tee_path, 0);
    EXPECT_EQ(clip.seek_without_index, 0);
    EXPECT_TRUE(o.close_clean());
}

TEST(Info, VideoAndAudioOfTheActiveStreams) {
    Opened o = testsupport::open_file(wmv3_wma2_file());
    ASSERT_EQ(o.rc, HOVA_OK);
    hova_video_info_st v;
    std::memset(&v, 0xFF, sizeof v);
    ASSERT_EQ(dmx.get_info(o.ctx(), HOVA_STREAM_VIDEO, -1, &v), HOVA_OK);
    EXPECT_EQ(v.codec, CLIP_VIDEO_TYPE_WMV3);
    EXPECT_EQ(v.width, 208);
    EXPECT_EQ(v.height, 160);
    EXPECT_EQ(v.frame_rate_num, 1000000);
    EXPECT_EQ(v.frame_rate_den, 33366);
    EXPECT_EQ(v.bit_rate, 100000);
    EXPECT_EQ(v.hdr10_metadata.maxCLL, 0) << "the record is zeroed first";

    hova_audio_info_st a;
    std::memset(&a, 0xFF, sizeof a);
    ASSERT_EQ(dmx.get_info(o.ctx(), HOVA_STREAM_AUDIO, 0, &a), HOVA_OK);
    EXPECT_EQ(a.codec, CLIP_AUDIO_TYPE_WMA2);
    EXPECT_EQ(a.sample_rate, 44100);
    EXPECT_EQ(a.bit_rate, 64040);
    EXPECT_EQ(0, std::memcmp(a.language, "eng", 4)) << "en-US gives eng and its NUL";
    EXPECT_EQ(a.desc.payload, nullptr) << "the record is zeroed first";
    EXPECT_TRUE(o.close_clean());
}

TEST(Info, RecordSelectionByIndex) {
    // Records: video 2 (record 0), audio 1 (record 1), audio 3 (record 2).
    host::SessionOptions so;
    so.context_size = dmx.min_context_size + static_cast<int>(sizeof(asf_stream_st));
    asfb::WaveFormat mp3;
    mp3.format_tag = 0x55;
    mp3.sample_rate = 22050;
    Opened o = testsupport::open_file(
        file_with({asfb::video_stream(2), asfb::audio_stream(1), asfb::audio_stream(3, mp3)}), so);
    ASSERT_EQ(o.rc, HOVA_OK);
    const struct {
        int index;
        int codec;
        int sample_rate;
    } cases[] = {
        {-1, CLIP_AUDIO_TYPE_MP3, 22050},  // the active (last) audio stream
        {0, CLIP_AUDIO_TYPE_WMA2, 44100},
        {1, CLIP_AUDIO_TYPE_MP3, 22050},
        // No such record: record 0 answers, a video record read as audio
        // (its width and height share the sample rate's bytes).
        {2, CLIP_VIDEO_TYPE_WMV3, 320 | 240 << 16},
        {7, CLIP_VIDEO_TYPE_WMV3, 320 | 240 << 16},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.index);
        hova_audio_info_st a{};
        ASSERT_EQ(dmx.get_info(o.ctx(), HOVA_STREAM_AUDIO, c.index, &a), HOVA_OK);
        EXPECT_EQ(a.codec, c.codec);
        EXPECT_EQ(a.sample_rate, c.sample_rate);
    }
    hova_program_info_st p{};
    ASSERT_EQ(dmx.get_info(o.ctx(), HOVA_STREAM_PROG, 0, &p), HOVA_OK);
    EXPECT_EQ(p.num_audio_streams, 2);
    EXPECT_EQ(p.num_video_streams, 1);
    EXPECT_TRUE(o.close_clean());
}

TEST(Info, KindWithoutActiveStream) {
    Opened o = testsupport::open_file(asfb::standard_file(false, true));
    ASSERT_EQ(o.rc, HOVA_OK);
    hova_audio_info_st a;
    std::memset(&a, 0xFF, sizeof a);
    EXPECT_EQ(dmx.get_info(o.ctx(), HOVA_STREAM_AUDIO, -1, &a), HOVA_InvalidParam);
    EXPECT_EQ(a.codec, 0) << "the record is zeroed first";
    EXPECT_EQ(a.language[0], 0);
    hova_program_info_st p{};
    ASSERT_EQ(dmx.get_info(o.ctx(), HOVA_STREAM_PROG, 0, &p), HOVA_OK);
    EXPECT_EQ(p.active_audio, -1);
    EXPECT_EQ(p.active_video, 0);
    EXPECT_EQ(p.active_subtitle, -1);
    EXPECT_TRUE(o.close_clean());

    Opened audio_only = testsupport::open_file(asfb::standard_file(true, false));
    ASSERT_EQ(audio_only.rc, HOVA_OK);
    hova_video_info_st v{};
    EXPECT_EQ(dmx.get_info(audio_only.ctx(), HOVA_STREAM_VIDEO, -1, &v), HOVA_InvalidParam);
    hova_audio_info_st aa{};
    ASSERT_EQ(dmx.get_info(audio_only.ctx(), HOVA_STREAM_AUDIO, -1, &aa), HOVA_OK);
    EXPECT_EQ(aa.bit_rate, 0) << "no extended stream properties: no bitrate";
    EXPECT_TRUE(audio_only.close_clean());
}

TEST(Info, ProgramWithoutMetadataIsEmpty) {
    Opened bare = testsupport::open_file(asfb::standard_file());
    ASSERT_EQ(bare.rc, HOVA_OK);
    hova_program_info_st p;
    std::memset(&p, 0xFF, sizeof p);
    ASSERT_EQ(dmx.get_info(bare.ctx(), HOVA_STREAM_PROG, 0, &p), HOVA_OK);
    EXPECT_EQ(p.duration, 2000000);
    for (const hova_string_info_st* s : {&p.title, &p.artist, &p.album}) {
        EXPECT_EQ(s->size, 0u);
        EXPECT_EQ(s->payload, nullptr);
    }
    EXPECT_EQ(p.genre, nullptr);
    EXPECT_EQ(p.cover.length, 0);
    EXPECT_EQ(p.cover.payload, nullptr);
    EXPECT_EQ(p.year, 0);
    EXPECT_EQ(p.base_pts, 0);
    EXPECT_EQ(p.comment.payload, nullptr);
    EXPECT_EQ(p.date, nullptr);
    EXPECT_TRUE(bare.close_clean());
    // Filled fields are checked through asfdump info (asfdump_info_test.cc).
}

}  // namespace
