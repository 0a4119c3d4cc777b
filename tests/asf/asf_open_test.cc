// Open, the header walk and the information queries on builder-made files:
// refused shapes, hostile size fields, one file with every object the walk
// reads (its records' exact fields) and more streams than the context holds.
#include <gtest/gtest.h>

#include <algorithm>
#include <cctype>
#include <cstring>
#include <tuple>

#include "asf_open.h"
#include "test_env.h"

// Builder records are written with designated initializers, naming only what differs.
#pragma GCC diagnostic ignored "-Wmissing-field-initializers"

namespace {

using namespace asfb;
using namespace testsupport;

const hova_dmx_func_st& dmx = hova_asff_demuxer;
Bytes ext(std::vector<Bytes> children) { return header_extension(children); }
// Refused shapes and hostile size fields: a size below the object's header or
// above the real one never opens, nor leaks, also in a header of size ~0.
TEST(Open, RefusesMalformedHeadersAndHostileSizes) {
    const Bytes a1 = audio_stream(1);
    auto edited = [](auto f) { Bytes b = build(standard_file()); f(b); return b; };
    auto with = [&](Bytes b) { return build(file_with({b, a1})); };
    auto endless = [&](Bytes b) {  // a header of size ~0 around `b`
        return Writer().bytes(header_object({file_properties({}), b, a1}, ~0ull)).bytes(data_object({})).out;
    };
    const struct { const char* what; Bytes bytes; int rc = HOVA_OpenFailed; } cases[] = {
        {"only stream hidden", build(file_with({ext({a1})}))},
        {"two file properties", with(file_properties({}))},
        {"no file properties", build({.header_children = {a1}})},
        {"packet sizes differ", build(file_with({a1}, {.max_packet_size = 3201}))},
        {"packet size 0", build(file_with({a1}, {.packet_count = 0, .min_packet_size = 0,
                                                 .max_packet_size = 0}))},
        {"GUID", edited([](Bytes& b) { b[15] ^= 1; })},
        {"reserved1", edited([](Bytes& b) { b[28] = 0; })},
        {"reserved2", edited([](Bytes& b) { b[29] = 3; })},
        {"size 30", edited([](Bytes& b) { b[16] = 30, b[17] = 0; })},
        {"extension reserved 5", with(header_extension({}, {}, 5))},
        {"ext content size 0", with(extended_content_description({}, 0))},
        {"input ends in header", edited([](Bytes& b) { b.resize(200); }), HOVA_EndOfStream},
        {"empty input", Bytes{}, HOVA_EndOfStream},
        {"file props size 23", build({.header_children = {file_properties({}, 23), a1}, .packets = {{}}})},
        {"stream size 2^63", with(stream_properties({.type_specific = waveformatex({})}, 1ull << 63))},
        {"description size 2^32+24", with(content_description({"t", "a"}, (1ull << 32) + 24))},
        {"hidden language list size 1", with(ext({language_list({"en"}, 1)}))},
        {"hidden ext. stream size ~0", with(ext({extended_stream_properties({}, ~0ull)}))},
        {"endless, ext content 2^32-1", endless(extended_content_description({{"WM/Y"}}, (1ull << 32) - 1)),
         HOVA_EndOfStream},  // reaches past the input's end
        {"endless, unknown size ~0-23", endless(object(asf_reserved_1, Bytes(8, 0), ~0ull - 23))},
        {"endless, extension size 45", endless(header_extension({}, 45))},
    };
    for (const auto& c : cases) {
        Opened o = open_bytes(c.bytes);
        EXPECT_EQ(o.rc, c.rc) << c.what;
        EXPECT_TRUE(o.close_clean()) << c.what;
    }
}

// WMV3 stream 2 and WMA2 stream 1 (hidden in the header extension) with
// bitrates and languages, descriptive metadata (a later genre replacing the
// first), a cover and an index behind an unknown object of `unknown_size`
// (empty: its real size).
Bytes rich_file(Size unknown_size = {}, Bytes* header = nullptr) {
    // The longest genre converted to UTF-8: "€" and 498 "é", 1000 bytes with
    // the terminator in either form.
    Writer genre = Writer().u16(0x20AC);
    for (int i = 0; i < 498; ++i) genre.u16(0xE9);
    auto cover = [](uint8_t n) {
        return Writer().u8(3).u32(16).utf16("image/png").utf16("").bytes(Bytes(16, n)).out;
    };
    File f = standard_file();
    f.header_children = {
        file_properties({}),
        ext({language_list({"es", "en-US"}),
             extended_stream_properties({.bitrate = 64040, .stream_num = 1, .language_index = 1}),
             extended_stream_properties(
                 {.bitrate = 100000, .stream_num = 2, .avg_time_per_frame = 333667, .names = {{0, "Main"}}}),
             audio_stream(1)}),
        video_stream(2, {.width = 208, .height = 160}),
        content_description({"T", "A", "C", "D", "R"}),
        extended_content_description({{"WM/AlbumTitle", 0, string_value("Al")},
                                      {"WM/Genre", 0, string_value("Rock")},
                                      {"WM/Genre", 0, genre.u16(0).out}, {"WM/Picture", 1, cover(2)},
                                      {"WM/Picture", 1, cover(3)}, {"WM/Year", 0, string_value("2001")}})};
    f.trailing = {object(guid_from_text("D6E229D3-35DA-11D1-9034-00A0C90349BE"), Bytes(30, 0), unknown_size),
                  simple_index(5000000, {{0, 1}, {1, 1}, {2, 1}})};
    if (header) *header = header_object(f.header_children);
    return build(f);
}

// An information record of the open file, filled over 0xFF bytes.
template <class T> T info(void* d, hova_stream_type_et type, int index = 0) {
    T t;
    std::memset(&t, 0xFF, sizeof t);
    EXPECT_EQ(dmx.get_info(d, type, index, &t), HOVA_OK) << type;
    return t;
}

TEST(Open, RichFileFillsEveryRecord) {
    Bytes header;
    const Bytes bytes = rich_file({}, &header);
    testenv::LogCapture log;
    Opened o = open_bytes(bytes);
    ASSERT_EQ(o.rc, HOVA_OK);
    EXPECT_TRUE(log.contains("[ASF] found hidden stream!\n"));
    asf_demuxer_st* d = o.ctx();
    EXPECT_EQ(std::tuple(d->first_packet, d->s.cbuffer.curpos, d->index_count, d->index_time_interval,
                         d->index_packet, d->index_start_offset),
              std::tuple(header.size() + 50, header.size() + 50, 3u, 500000u, bytes.size() - 3 * 6, -1));
    EXPECT_EQ(o.session->input().counters().open_done_calls, 1u);
    // Reader, two configurations, cover, title, author, album, genre, index.
    EXPECT_EQ(o.session->blocks_outstanding(), 9u);

    hova_clip_info_st clip;
    for (int t : {int{HOVA_STREAM_SUBTITLE}, int{HOVA_STREAM_CLIP}, -1, 99})
        EXPECT_EQ(dmx.get_info(d, static_cast<hova_stream_type_et>(t), 0, &clip), HOVA_InvalidParam);
    clip = info<hova_clip_info_st>(d, HOVA_STREAM_NONE);
    EXPECT_EQ(std::tuple(clip.seekable, clip.num_program, clip.ts_type, clip.seek_without_index),
              std::tuple(1, 1, HOVA_TS_DTS, 0));

    const auto v = info<hova_video_info_st>(d, HOVA_STREAM_VIDEO, -1);
    EXPECT_EQ(std::tuple(v.codec, v.width, v.height, v.frame_rate_num, v.frame_rate_den, v.bit_rate,
                         v.hdr10_metadata.maxCLL),
              std::tuple(CLIP_VIDEO_TYPE_WMV3, 208, 160, 1000000, 33366, 100000, 0));

    const auto a = info<hova_audio_info_st>(d, HOVA_STREAM_AUDIO);
    EXPECT_EQ(std::tuple(a.codec, a.sample_rate, a.bit_rate, std::string(a.language), a.desc.payload),
              std::tuple(CLIP_AUDIO_TYPE_WMA2, 44100, 64040, "eng", nullptr));

    const auto p = info<hova_program_info_st>(d, HOVA_STREAM_PROG);
    std::string genre = "\xE2\x82\xAC";
    for (int i = 0; i < 498; ++i) genre += "\xC3\xA9";
    EXPECT_EQ(std::tuple(p.duration, p.num_audio_streams, p.num_video_streams, p.active_audio,
                         p.active_video, p.active_subtitle, p.year, std::string(p.genre)),
              std::tuple(2000000, 1, 1, 0, 0, -1, 2001, genre));
    EXPECT_EQ(std::tuple(p.title.size, p.artist.size, p.album.size), std::tuple(4u, 4u, 6u));
    const Bytes kept(16, 2);  // the second is ignored
    ASSERT_EQ(p.cover.length, 16);
    EXPECT_EQ(Bytes(p.cover.payload, p.cover.payload + 16), kept);
    EXPECT_EQ(p.pic_offset, std::search(bytes.begin(), bytes.end(), kept.begin(), kept.end()) - bytes.begin());
    EXPECT_TRUE(o.close_clean());
}

TEST(Open, ObjectOfSizeZeroBehindTheDataEndsTheSearchForTheIndex) {
    Opened o = open_bytes(rich_file(0));
    ASSERT_EQ(o.rc, HOVA_OK);
    EXPECT_EQ(o.ctx()->index_count, 0u) << "the index behind it is out of reach";
    EXPECT_TRUE(o.close_clean());
}

// With no packet count in the file properties, the count comes from the data
// object's size, else from the input's size (two packets' worth of bytes
// follow the data): given by a streaming input, measured on a seekable one,
// unknown on an input that is neither.
TEST(Open, PacketCountFromTheDataObjectElseTheInputSize) {
    const uint64_t unbounded = (uint64_t{INT64_MAX} - UINT32_MAX) / 3200;
    const struct { Size data_size; host::InputOptions in; uint64_t packets; } cases[] = {
        {{}, {}, 3}, {50, {}, 5}, {50, {.seekable = false, .streaming = true}, 5},
        {50, {.seekable = false}, unbounded}};
    for (const auto& c : cases) {
        const File f{.header_children = {file_properties({.packet_count = 0}), audio_stream(1)},
                     .packets = std::vector<Bytes>(3, Bytes(3200, 0)), .trailing = {Bytes(6400, 0)},
                     .data_object_size = c.data_size};
        Opened o = open_file(f, {.input = c.in});
        ASSERT_EQ(o.rc, HOVA_OK);
        EXPECT_EQ(o.ctx()->num_packets, c.packets) << "case " << &c - cases;
        EXPECT_TRUE(o.close_clean());
    }
}

// More streams than the context has records: the last of each kind is kept.
// Streams are written as kind and number in header order ("a1v2"), upper
// case when hidden in the header extension (behind the others).
TEST(StreamProps, MoreStreamsThanRecordsKeepTheLastOfEachKind) {
    // Records: stream records the host buffer holds; kept: stream numbers of the records ("": refused);
    // active: stream numbers, 0 for none.
    const struct { const char* streams; int records; std::string kept; int audio, video; } cases[] = {
        {"a1v2A3", 2, "23", 3, 2},     {"a1a2v3", 2, "23", 2, 3},   {"v1a2a3a4", 2, "14", 4, 1},
        {"a1v2v3", 2, "13", 1, 3},     {"a1v2a3", 3, "123", 3, 2},  {"a1a2a3v4", 3, "234", 3, 4},
        {"a1a2", 1, "2", 2, 0},        {"a1v2", 1, "", 0, 0},       {"a1", 0, "", 0, 0},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.streams);
        std::vector<Bytes> top, hidden;
        for (const char* s = c.streams; *s; s += 2) {
            const Bytes b = std::tolower(*s) == 'a' ? audio_stream(s[1] - '0') : video_stream(s[1] - '0');
            (std::isupper(*s) ? hidden : top).push_back(b);
        }
        if (!hidden.empty()) top.push_back(ext(hidden));
        host::SessionOptions so;
        so.context_size = static_cast<int>(sizeof(asf_demuxer_st) + 8 + c.records * sizeof(asf_stream_st));
        so.misalign = 1;  // the context starts 7 bytes in: exactly `records` fit
        Opened o = open_file(file_with(top), so);
        ASSERT_EQ(o.rc, c.kept.empty() ? HOVA_NotEnoughMemory : HOVA_OK) << host::errno_name(o.rc);
        if (o.rc == HOVA_OK) {
            asf_demuxer_st* d = o.ctx();
            std::string kept;
            int count[2] = {};
            for (int i = 0; i < d->s.total_streams; ++i) {
                kept += static_cast<char>('0' + d->stream_info[i].stream_num);
                ++count[d->stream_info[i].s.stream_type == HOVA_STREAM_AUDIO ? AUD : VID];
            }
            auto num_of = [&](int k) {
                const int a = d->s.active_stream[k];
                return a < 0 ? 0 : d->stream_info[a].stream_num;
            };
            EXPECT_EQ(std::tuple(d->max_streams, kept, d->s.num_streams[AUD], d->s.num_streams[VID],
                                 num_of(AUD), num_of(VID)),
                      std::tuple(c.records, c.kept, count[AUD], count[VID], c.audio, c.video));
        }
        EXPECT_TRUE(o.close_clean()) << "a replaced record's configuration block leaked";
    }
}

}  // namespace
