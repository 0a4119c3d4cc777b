// Open, the header walk and the information queries on builder-made files:
// refused shapes, one file with every object the walk reads (its records'
// exact fields), the header cut at every byte and hostile size fields.
#include <gtest/gtest.h>

#include <cstring>
#include <functional>
#include <string>
#include <tuple>

#include "asf_open.h"
#include "test_env.h"

// Builder records are written with designated initializers, naming only what differs.
#pragma GCC diagnostic ignored "-Wmissing-field-initializers"

namespace {

using asfb::Bytes;
using testsupport::file_with;
using testsupport::Opened;

const hova_dmx_func_st& dmx = hova_asff_demuxer;
Bytes ext(std::vector<Bytes> children) { return asfb::header_extension(children); }

TEST(Open, RefusesMalformedHeaders) {
    const asfb::FileProps mismatch{.max_packet_size = 3201};
    const asfb::FileProps zero{.packet_count = 0, .min_packet_size = 0, .max_packet_size = 0};
    const asfb::File no_fp{.header_children = {asfb::audio_stream(1)}};
    const auto a1 = asfb::audio_stream(1);
    auto edited = [](auto f) { Bytes b = asfb::build(asfb::standard_file()); f(b); return b; };
    const struct {
        const char* what;
        Bytes bytes;
        int rc = HOVA_OpenFailed;
    } cases[] = {
        {"only stream hidden", asfb::build(file_with({ext({a1})}))},
        {"two file properties", asfb::build(file_with({asfb::file_properties({}), a1}))},
        {"no file properties", asfb::build(no_fp)},
        {"packet sizes differ", asfb::build(file_with({a1}, mismatch))},
        {"packet size 0", asfb::build(file_with({a1}, zero))},
        {"GUID", edited([](Bytes& b) { b[15] ^= 1; })},
        {"reserved1", edited([](Bytes& b) { b[28] = 0; })},
        {"reserved2", edited([](Bytes& b) { b[29] = 3; })},
        {"size 30", edited([](Bytes& b) { b[16] = 30, b[17] = 0; })},
        {"extension reserved 5", asfb::build(file_with({asfb::header_extension({}, {}, 5), a1}))},
        {"ext content size 0",
         asfb::build(file_with({asfb::extended_content_description({}, 0), a1}))},
        {"input ends in header", edited([](Bytes& b) { b.resize(200); }), HOVA_EndOfStream},
        {"empty input", Bytes{}, HOVA_EndOfStream},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        Opened o = testsupport::open_bytes(c.bytes);
        EXPECT_EQ(o.rc, c.rc);
        EXPECT_TRUE(o.close_clean());
    }
}

// WMV3 stream 2 and WMA2 stream 1 (hidden in the header extension) with
// bitrates and languages, descriptive
// metadata, a cover and an index behind an unknown object.
asfb::File rich_file() {
    const asfb::ExtStreamProps ea{.bitrate = 64040, .stream_num = 1, .language_index = 1};
    const asfb::ExtStreamProps ev{.bitrate = 100000, .stream_num = 2,
                                  .avg_time_per_frame = 333667, .names = {{0, "Main"}}};
    asfb::File f = asfb::standard_file();
    f.header_children = {
        asfb::file_properties({}),
        ext({asfb::language_list({"es", "en-US"}), asfb::extended_stream_properties(ea),
             asfb::extended_stream_properties(ev), asfb::audio_stream(1)}),
        asfb::video_stream(2, {.width = 208, .height = 160}),
        asfb::content_description({"T", "A", "C", "D", "R"}),
        asfb::extended_content_description(
            {{"WM/AlbumTitle", 0, asfb::string_value("Al")},
             {"WM/Year", 0, asfb::string_value("2001")},
             {"WM/Genre", 0, asfb::string_value("Rock")},
             {"WM/Picture", 1, asfb::picture_value(3, "image/png", "", Bytes(16, 2))}})};
    f.trailing = {asfb::object(asfb::guid_from_text("D6E229D3-35DA-11D1-9034-00A0C90349BE"),
                               Bytes(30, 0)),
                  asfb::simple_index(5000000, {{0, 1}, {1, 1}, {2, 1}})};
    return f;
}

TEST(Open, RichFileFillsEveryRecord) {
    const asfb::File f = rich_file();
    const Bytes bytes = asfb::build(f);
    testenv::LogCapture log;
    Opened o = testsupport::open_bytes(bytes);
    ASSERT_EQ(o.rc, HOVA_OK);
    EXPECT_TRUE(log.contains("[ASF] found hidden stream!\n"));
    asf_demuxer_st* d = o.ctx();
    EXPECT_EQ(d->first_packet, asfb::header_object(f.header_children).size() + 50);
    EXPECT_EQ(d->s.cbuffer.curpos, d->first_packet);
    EXPECT_EQ(std::tuple(d->index_count, d->index_time_interval), std::tuple(3u, 500000u));
    EXPECT_EQ(d->index_packet, bytes.size() - 3 * 6);
    EXPECT_EQ(o.session->input().counters().open_done_calls, 1u);
    // Reader, two configurations, cover, title, author, album, genre, index.
    EXPECT_EQ(o.session->blocks_outstanding(), 9u);

    hova_clip_info_st clip;
    std::memset(&clip, 0xFF, sizeof clip);
    for (int t : {int{HOVA_STREAM_SUBTITLE}, int{HOVA_STREAM_CLIP}, -1, 99})
        EXPECT_EQ(dmx.get_info(d, static_cast<hova_stream_type_et>(t), 0, &clip),
                  HOVA_InvalidParam);
    ASSERT_EQ(dmx.get_info(d, HOVA_STREAM_NONE, 0, &clip), HOVA_OK);
    EXPECT_EQ(std::tuple(clip.seekable, clip.num_program, clip.ts_type, clip.seek_without_index),
              std::tuple(1, 1, HOVA_TS_DTS, 0));

    hova_video_info_st v;
    std::memset(&v, 0xFF, sizeof v);
    ASSERT_EQ(dmx.get_info(d, HOVA_STREAM_VIDEO, -1, &v), HOVA_OK);
    EXPECT_EQ(std::tuple(v.codec, v.width, v.height, v.frame_rate_num, v.frame_rate_den,
                         v.bit_rate, v.hdr10_metadata.maxCLL),
              std::tuple(CLIP_VIDEO_TYPE_WMV3, 208, 160, 1000000, 33366, 100000, 0));

    hova_audio_info_st a;
    std::memset(&a, 0xFF, sizeof a);
    ASSERT_EQ(dmx.get_info(d, HOVA_STREAM_AUDIO, 0, &a), HOVA_OK);
    EXPECT_EQ(std::tuple(a.codec, a.sample_rate, a.bit_rate),
              std::tuple(CLIP_AUDIO_TYPE_WMA2, 44100, 64040));
    EXPECT_EQ(0, std::memcmp(a.language, "eng", 4));
    EXPECT_EQ(a.desc.payload, nullptr);

    hova_program_info_st p;
    std::memset(&p, 0xFF, sizeof p);
    ASSERT_EQ(dmx.get_info(d, HOVA_STREAM_PROG, 0, &p), HOVA_OK);
    EXPECT_EQ(std::tuple(p.duration, p.num_audio_streams, p.num_video_streams,
                         p.active_subtitle, p.year),
              std::tuple(2000000, 1, 1, -1, 2001));
    EXPECT_STREQ(p.genre, "Rock");
    EXPECT_EQ(std::tuple(p.title.size, p.artist.size, p.album.size), std::tuple(4u, 4u, 6u));
    ASSERT_EQ(p.cover.length, 16);
    EXPECT_EQ(Bytes(p.cover.payload, p.cover.payload + 16), Bytes(16, 2));
    EXPECT_EQ(static_cast<size_t>(p.pic_offset),
              asfb::header_object(f.header_children).size() - 16);
    EXPECT_TRUE(o.close_clean());
}

// Size fields that break naive arithmetic, on every object the walk reads,
// in a header of its own size and in an endless one: a size below the
// object's header never opens, one above the real size never opens.
TEST(Open, ObjectOfSizeZeroBehindTheDataEndsTheSearchForTheIndex) {
    asfb::File f = rich_file();
    f.trailing = {asfb::object(asfb::guid_from_text("D6E229D3-35DA-11D1-9034-00A0C90349BE"),
                               Bytes(30, 0), 0),
                  asfb::simple_index(5000000, {{0, 1}, {1, 1}, {2, 1}})};
    Opened o = testsupport::open_bytes(asfb::build(f));
    ASSERT_EQ(o.rc, HOVA_OK);
    EXPECT_EQ(o.ctx()->index_count, 0u) << "the index behind it is out of reach";
}

TEST(Open, HostileSizeFieldsNeverOpenOrLeak) {
    const uint64_t sizes[] = {0, 1, 23, 24, 25, 45, (1ull << 32) - 1, 1ull << 32,
                              (1ull << 32) + 24, 1ull << 63, ~0ull - 23, ~0ull};
    using S = std::optional<uint64_t>;
    const asfb::StreamProps sp{.type_specific = asfb::waveformatex({})};
    const auto other = asfb::guid_from_text("01020304-0506-0708-090A-0B0C0D0E0F10");
    const std::function<Bytes(S)> objects[] = {
        [](S s) { return asfb::file_properties({}, s); },
        [&](S s) { return asfb::stream_properties(sp, s); },
        [](S s) { return asfb::header_extension({}, s); },
        [](S s) { return asfb::content_description({"t", "a", "", "", ""}, s); },
        [](S s) {
            return asfb::extended_content_description({{"WM/Y", 0, asfb::string_value("1")}}, s);
        },
        [&](S s) { return asfb::object(other, Bytes(8, 0), s); },
        [](S s) { return ext({asfb::extended_stream_properties({}, s)}); },
        [](S s) { return ext({asfb::language_list({"en"}, s)}); },
        [](S s) {
            return ext({asfb::metadata_library({{0, 0, "WM/Picture", 1, Bytes(10, 1)}}, s)});
        },
    };
    for (const auto& make : objects) {
        const uint64_t real = make(std::nullopt).size();
        for (uint64_t size : sizes) {
            for (S hs : {S{}, S{~0ull}}) {
                SCOPED_TRACE(testing::Message() << "object of " << real << " bytes, size " << size
                                                << (hs ? ", endless header" : ""));
                Bytes bytes = asfb::header_object(
                    {asfb::file_properties({}), make(size), asfb::audio_stream(1)}, hs);
                const Bytes data = asfb::data_object({asfb::filler_packet(3200)});
                bytes.insert(bytes.end(), data.begin(), data.end());
                Opened o = testsupport::open_bytes(bytes);
                if (o.rc == HOVA_OK) {
                    EXPECT_TRUE(size >= 24 && size <= real);
                } else {
                    EXPECT_TRUE(o.rc == HOVA_OpenFailed || o.rc == HOVA_EndOfStream ||
                                o.rc == HOVA_NotEnoughMemory) << o.rc;
                }
                EXPECT_TRUE(o.close_clean());
            }
        }
    }
}

// More streams than the context has records: the last of each kind is kept.
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
                const int a = d->s.active_stream[k];
                return a < 0 ? 0 : d->stream_info[a].stream_num;
            };
            EXPECT_EQ(num_of(AUD), c.active_audio);
            EXPECT_EQ(num_of(VID), c.active_video);
        }
        EXPECT_TRUE(o.close_clean()) << "a replaced record's configuration block leaked";
    }
}

}  // namespace
