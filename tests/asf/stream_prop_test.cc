// Stream properties: record fields, error correction clamping, spread-audio
// parameters, unknown media types, and which records survive when the header
// holds more streams than the context has records.
#include <gtest/gtest.h>

#include <string>

#include "asf_open.h"
#include "test_env.h"

namespace {

using asfb::Bytes;
using testsupport::file_with;
using testsupport::open_file;
using testsupport::Opened;

TEST(StreamProps, RecordFieldsFromTheObject) {
    asfb::StreamProps sp;
    sp.stream_type = asf_audio_media;
    sp.flags = 0x8002;
    sp.time_offset = 10000000;
    sp.type_specific = asfb::waveformatex({});
    Opened o = open_file(file_with({asfb::stream_properties(sp)}));
    ASSERT_EQ(o.rc, HOVA_OK);
    const asf_stream_st& a = o.ctx()->stream_info[0];
    EXPECT_EQ(a.s.stream_type, HOVA_STREAM_AUDIO);
    EXPECT_EQ(a.stream_num, 2);
    EXPECT_EQ(a.time_offset, 1000000);
    EXPECT_EQ(a.object_num, -1);
    EXPECT_EQ(a.object_size, 0u);
    EXPECT_EQ(a.pts, -1) << "open resets the active streams' time";
    EXPECT_EQ(a.s.last_thumbnail_pts, -1);
    EXPECT_EQ(a.s.config_sent, 0);
    EXPECT_EQ(a.s.codec_type, CLIP_AUDIO_TYPE_WMA2);
    EXPECT_TRUE(o.close_clean());
}

TEST(StreamProps, ErrorCorrectionLengthIsClampedToTheObject) {
    asfb::StreamProps sp;
    sp.type_specific = asfb::waveformatex({});
    sp.ec_data_len = 0xFFFF;  // more than the object holds
    asfb::StreamProps after = sp;
    after.ec_data_len.reset();
    after.flags = 3;
    Opened o = open_file(file_with({asfb::stream_properties(sp), asfb::stream_properties(after)}));
    ASSERT_EQ(o.rc, HOVA_OK);
    const asf_stream_st& first = o.ctx()->stream_info[0];
    EXPECT_EQ(first.s.config_len, 0u) << "no type-specific bytes are left";
    EXPECT_EQ(first.s.codec_type, CLIP_AUDIO_TYPE_UNKNOWN);
    EXPECT_EQ(o.ctx()->stream_info[1].stream_num, 3) << "the walk went on at the object's end";
    EXPECT_EQ(o.ctx()->stream_info[1].s.codec_type, CLIP_AUDIO_TYPE_WMA2);
    EXPECT_TRUE(o.close_clean());
}

TEST(StreamProps, SpreadAudioParameters) {
    const struct {
        uint8_t span;
        uint16_t packet, chunk;
        uint8_t kept_span;
    } cases[] = {
        {8, 640, 64, 8}, {8, 640, 0, 0}, {8, 640, 640, 0}, {8, 640, 60, 0},
        {8, 640, 700, 0}, {1, 640, 0, 1}, {0, 640, 64, 0},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(std::to_string(c.span) + "/" + std::to_string(c.packet) + "/" +
                     std::to_string(c.chunk));
        asfb::StreamProps sp;
        sp.type_specific = asfb::waveformatex({});
        sp.ec_type = asf_spread_audio;
        sp.ec_data = asfb::spread_ec(c.span, c.packet, c.chunk);
        Opened o = open_file(file_with({asfb::stream_properties(sp), asfb::video_stream(2)}));
        ASSERT_EQ(o.rc, HOVA_OK);
        EXPECT_EQ(o.ctx()->a_spread_span, c.kept_span);
        EXPECT_EQ(o.ctx()->a_spread_packet_len, c.packet);
        EXPECT_EQ(o.ctx()->a_spread_chunk_len, c.chunk);
        EXPECT_EQ(o.ctx()->s.num_streams[VID], 1) << "the error correction bytes were consumed";
        EXPECT_TRUE(o.close_clean());
    }
}

TEST(StreamProps, UnknownMediaTypeIsConsumedAndRegistersNothing) {
    asfb::StreamProps cmd;
    cmd.stream_type = asfb::guid_from_text("59DACFC0-59E6-11D0-A3AC-00A0C90348F6");
    cmd.flags = 4;
    cmd.type_specific = Bytes(33, 0x5A);
    cmd.ec_data = Bytes(7, 1);
    Opened o = open_file(file_with({asfb::stream_properties(cmd), asfb::audio_stream(1)}));
    ASSERT_EQ(o.rc, HOVA_OK);
    EXPECT_EQ(o.ctx()->s.total_streams, 1);
    EXPECT_EQ(o.ctx()->stream_info[0].stream_num, 1);
    EXPECT_EQ(o.ctx()->a_spread_span, 0);
    EXPECT_TRUE(o.close_clean());

    Opened only = open_file(file_with({asfb::stream_properties(cmd)}));
    EXPECT_EQ(only.rc, HOVA_OK) << "a stream properties object was met, even if not used";
    EXPECT_EQ(only.ctx()->s.total_streams, 0);
    EXPECT_TRUE(only.close_clean());
}

TEST(StreamProps, AlternateGuidIsAStreamProperties) {
    asfb::StreamProps sp;
    sp.type_specific = asfb::waveformatex({});
    sp.alternate_guid = true;
    Opened o = open_file(file_with({asfb::stream_properties(sp)}));
    ASSERT_EQ(o.rc, HOVA_OK);
    EXPECT_EQ(o.ctx()->s.num_streams[AUD], 1);
    EXPECT_TRUE(o.close_clean());
}

TEST(StreamProps, VideoTooShortOrTooSmallObjects) {
    asfb::StreamProps tiny_video;
    tiny_video.stream_type = asf_video_media;
    tiny_video.type_specific = Bytes(5, 0);  // less than the 11-byte prefix
    asfb::StreamProps body_short;
    body_short.type_specific = {};
    const struct {
        const char* what;
        Bytes object;
        int rc;
        const char* log;
    } cases[] = {
        {"video data shorter than its prefix", asfb::stream_properties(tiny_video),
         HOVA_NotEnoughMemory, "[ASF] malloc video config fails!\n"},
        {"object of 77 bytes", asfb::stream_properties(body_short, 77), HOVA_OpenFailed, nullptr},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        testenv::LogCapture log;
        Opened o = open_file(file_with({c.object, asfb::audio_stream(1)}));
        EXPECT_EQ(o.rc, c.rc);
        if (c.log) {
            EXPECT_TRUE(log.contains(c.log));
        }
        EXPECT_TRUE(o.close_clean());
    }
}

// Each allocation of open refused in turn: the open fails with
// HOVA_NotEnoughMemory where the block was needed (metadata blocks are
// optional) and the host never holds a block afterwards.
TEST(StreamProps, EveryRefusedAllocationIsCleanedUp) {
    asfb::File f = asfb::standard_file();
    f.header_children.push_back(asfb::content_description({"Title", "Author", "", "", ""}));
    f.header_children.push_back(asfb::extended_content_description(
        {{"WM/AlbumTitle", 0, asfb::string_value("Album")},
         {"WM/Genre", 0, asfb::string_value("Jazz")},
         {"WM/Picture", 1, asfb::picture_value(3, "image/png", "", Bytes(64, 7))}}));
    const Bytes bytes = asfb::build(f);
    int refused_open = 0;
    for (uint64_t n = 1;; ++n) {
        SCOPED_TRACE("allocation " + std::to_string(n));
        auto s = host::Session::from_bytes(&hova_asff_demuxer, bytes);
        s->callbacks().fail_malloc_at(n);
        const int rc = s->open();
        const uint64_t calls = s->callbacks().malloc_calls();
        EXPECT_TRUE(rc == HOVA_OK || rc == HOVA_NotEnoughMemory) << host::errno_name(rc);
        refused_open += rc == HOVA_NotEnoughMemory;
        s->close();
        EXPECT_EQ(s->blocks_outstanding(), 0u);
        if (calls < n) break;  // no allocation was refused any more
    }
    EXPECT_GE(refused_open, 3) << "reader block and both configuration blocks are required";
}

struct Layout {
    const char* what;
    int records;                   // stream records the host buffer holds
    std::vector<Bytes> top;        // top-level streams in header order
    std::vector<Bytes> hidden;     // streams inside the header extension (after `top`)
    int rc;
    std::vector<int> kept;         // stream numbers of the records, in order
    int active_audio, active_video;  // stream numbers; 0 for none
};

TEST(StreamProps, MoreStreamsThanRecordsKeepTheLastOfEachKind) {
    using asfb::audio_stream;
    using asfb::video_stream;
    const Layout cases[] = {
        {"two audio languages and video, one audio hidden", 2,
         {audio_stream(1), video_stream(2)}, {audio_stream(3)}, HOVA_OK, {2, 3}, 3, 2},
        {"two audio before video", 2, {audio_stream(1), audio_stream(2), video_stream(3)}, {},
         HOVA_OK, {2, 3}, 2, 3},
        {"video first, then three audio", 2,
         {video_stream(1), audio_stream(2), audio_stream(3), audio_stream(4)}, {}, HOVA_OK,
         {1, 4}, 4, 1},
        {"two video", 2, {audio_stream(1), video_stream(2), video_stream(3)}, {}, HOVA_OK,
         {1, 3}, 1, 3},
        {"a larger buffer keeps every stream", 3,
         {audio_stream(1), video_stream(2), audio_stream(3)}, {}, HOVA_OK, {1, 2, 3}, 3, 2},
        {"a larger buffer, one record too few", 3,
         {audio_stream(1), audio_stream(2), audio_stream(3), video_stream(4)}, {}, HOVA_OK,
         {2, 3, 4}, 3, 4},
        {"one record, audio only", 1, {audio_stream(1), audio_stream(2)}, {}, HOVA_OK, {2}, 2, 0},
        {"one record cannot hold audio and video", 1, {audio_stream(1), video_stream(2)}, {},
         HOVA_NotEnoughMemory, {}, 0, 0},
        {"no record at all", 0, {audio_stream(1)}, {}, HOVA_NotEnoughMemory, {}, 0, 0},
    };
    for (const Layout& c : cases) {
        SCOPED_TRACE(c.what);
        std::vector<Bytes> children = c.top;
        if (!c.hidden.empty()) children.push_back(asfb::header_extension(c.hidden));
        host::SessionOptions so;
        so.context_size = static_cast<int>(sizeof(asf_demuxer_st) + 8 +
                                           c.records * sizeof(asf_stream_st));
        so.misalign = 1;  // the context starts 7 bytes in: exactly `records` fit
        Opened o = testsupport::open_file(file_with(children), so);
        ASSERT_EQ(o.rc, c.rc) << host::errno_name(o.rc);
        if (o.rc == HOVA_OK) {
            asf_demuxer_st* d = o.ctx();
            EXPECT_EQ(d->max_streams, c.records);
            ASSERT_EQ(d->s.total_streams, static_cast<int>(c.kept.size()));
            int audio = 0, video = 0;
            for (int i = 0; i < d->s.total_streams; ++i) {
                EXPECT_EQ(d->stream_info[i].stream_num, c.kept[i]) << "record " << i;
                (d->stream_info[i].s.stream_type == HOVA_STREAM_AUDIO ? audio : video)++;
            }
            EXPECT_EQ(d->s.num_streams[AUD], audio);
            EXPECT_EQ(d->s.num_streams[VID], video);
            auto num_of = [&](int k) {
                return d->s.active_stream[k] < 0 ? 0 : d->stream_info[d->s.active_stream[k]].stream_num;
            };
            EXPECT_EQ(num_of(AUD), c.active_audio);
            EXPECT_EQ(num_of(VID), c.active_video);
        }
        EXPECT_TRUE(o.close_clean()) << "a replaced record's configuration block leaked";
    }
}

}  // namespace
