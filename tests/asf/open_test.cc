// Open and close: context placement, the data object, the simple index and
// what the raw input is told, seekability of network input, truncation at
// every header byte, and the host holding nothing after close.
#include <gtest/gtest.h>

#include <string>

#include "asf_internal.h"
#include "asf_open.h"
#include "test_env.h"

namespace {

using asfb::Bytes;
using testsupport::file_with;
using testsupport::Opened;

size_t header_size(const asfb::File& f) { return asfb::header_object(f.header_children).size(); }

TEST(Open, BufferTooSmallForTheFixedContext) {
    const int fixed = static_cast<int>(sizeof(asf_demuxer_st)) + 8;
    for (int size : {fixed - 1, 0, 1}) {
        SCOPED_TRACE(size);
        host::SessionOptions so;
        so.context_size = size > 0 ? size : 1;
        auto s = host::Session::from_bytes(&hova_asff_demuxer, asfb::build(asfb::standard_file()), so);
        EXPECT_EQ(s->open(), HOVA_NotEnoughMemory);
        EXPECT_EQ(s->callbacks().malloc_calls(), 0u) << "the reader was never opened";
        EXPECT_EQ(s->input().counters().reads, 0u);
    }
}

// The context starts at the first 8-byte boundary of the buffer. A buffer of
// exactly min_context_size that is not aligned has room for one record only:
// a file with audio and video is refused rather than written past the buffer.
TEST(Open, ContextIsAlignedInsideTheBuffer) {
    const int min_size = hova_asff_demuxer.min_context_size;
    const struct {
        size_t misalign;
        int extra;
        bool video;
        int records;
        int rc;
    } cases[] = {
        {0, 0, true, 2, HOVA_OK},  {1, 0, true, 1, HOVA_NotEnoughMemory},
        {7, 0, true, 1, HOVA_NotEnoughMemory}, {3, 0, false, 1, HOVA_OK},
        {5, 8, true, 2, HOVA_OK},  {0, 8, true, 2, HOVA_OK},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE("misalign " + std::to_string(c.misalign) + " extra " + std::to_string(c.extra));
        host::SessionOptions so;
        so.misalign = c.misalign;
        so.context_size = min_size + c.extra;
        auto s = host::Session::from_bytes(&hova_asff_demuxer,
                                           asfb::build(asfb::standard_file(true, c.video)), so);
        EXPECT_EQ(s->open(), c.rc);
        const auto at = reinterpret_cast<uintptr_t>(s->context());
        EXPECT_EQ(at % 8, 0u);
        if (c.rc == HOVA_OK) {
            EXPECT_EQ(static_cast<asf_demuxer_st*>(s->context())->max_streams, c.records);
        }
        s->close();
        EXPECT_EQ(s->blocks_outstanding(), 0u);
    }
}

TEST(Open, AudioOnlyFileNeedsNoIndex) {
    for (bool seekable : {true, false}) {
        SCOPED_TRACE(seekable);
        asfb::File f = asfb::standard_file(true, false);
        f.trailing.push_back(asfb::simple_index(10000000, {{0, 1}, {1, 1}, {2, 1}}));
        host::SessionOptions so;
        so.input.seekable = seekable;
        Opened o = testsupport::open_file(f, so);
        ASSERT_EQ(o.rc, HOVA_OK);
        EXPECT_EQ(o.session->input().counters().open_done_calls, 0u);
        EXPECT_EQ(o.ctx()->index_packet, 0u);
        EXPECT_EQ(o.ctx()->index_count, 0u);
        EXPECT_EQ(o.ctx()->s.seekable, seekable ? 1 : 0);
        EXPECT_EQ(o.ctx()->first_packet, header_size(f) + 50);
        EXPECT_EQ(o.ctx()->s.cbuffer.curpos, o.ctx()->first_packet);
        EXPECT_EQ(o.ctx()->s.thumbnail_interval, -1);
        EXPECT_EQ(o.ctx()->seeked, 1);
        EXPECT_TRUE(o.close_clean());
    }
}

TEST(Open, VideoFileLocatesTheIndexAndTellsTheInput) {
    asfb::File f = asfb::standard_file(true, true, 3);
    asfb::ExtStreamProps ea, ev;
    ea.stream_num = 1;
    ea.bitrate = 64000;
    ev.stream_num = 2;
    ev.bitrate = 500000;
    f.header_children.push_back(asfb::header_extension(
        {asfb::extended_stream_properties(ea), asfb::extended_stream_properties(ev)}));
    f.trailing.clear();
    f.trailing.push_back(asfb::object(asfb::guid_from_text("D6E229D3-35DA-11D1-9034-00A0C90349BE"),
                                      Bytes(30, 0)));
    f.trailing.push_back(asfb::simple_index(5000000, {{0, 1}, {1, 1}, {2, 1}}));
    f.trailing.push_back(asfb::simple_index(7000000, {{0, 1}}));  // only the first counts
    const Bytes bytes = asfb::build(f);
    Opened o = testsupport::open_bytes(bytes);
    ASSERT_EQ(o.rc, HOVA_OK);
    asf_demuxer_st* d = o.ctx();
    const auto& c = o.session->input().counters();
    ASSERT_EQ(c.open_done_calls, 1u);
    EXPECT_EQ(c.open_done_args[0], 2000u) << "duration in milliseconds";
    EXPECT_EQ(d->index_count, 3u);
    EXPECT_EQ(d->index_time_interval, 500000u);
    const size_t index_at = bytes.size() - asfb::simple_index(7000000, {{0, 1}}).size() -
                            (56 + 3 * 6) + 56;
    EXPECT_EQ(d->index_packet, index_at);
    EXPECT_EQ(d->index_start_offset, -1);
    EXPECT_EQ(d->s.cbuffer.curpos, d->first_packet) << "left on the first data packet";
    EXPECT_EQ(asf_get_bitrate(d, HOVA_STREAM_AUDIO), 64000);
    EXPECT_EQ(asf_get_bitrate(d, HOVA_STREAM_VIDEO), 500000);
    EXPECT_TRUE(o.close_clean());
}

TEST(Open, NetworkInputIsSeekableOnlyWithAUsableIndex) {
    const struct {
        const char* what;
        bool streaming;
        std::vector<asfb::IndexEntry> entries;  // empty: no index object
        uint64_t interval;
        int seekable;
    } cases[] = {
        {"network, one entry", true, {{0, 1}}, 10000000, 0},
        {"network, two entries", true, {{0, 1}, {1, 1}}, 10000000, 1},
        {"network, interval 0", true, {{0, 1}, {1, 1}}, 0, 0},
        {"network, no index", true, {}, 10000000, 0},
        {"local, one entry", false, {{0, 1}}, 10000000, 1},
        {"local, no index", false, {}, 10000000, 1},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        asfb::File f = asfb::standard_file(true, true, 2);
        f.trailing.clear();
        if (!c.entries.empty()) f.trailing.push_back(asfb::simple_index(c.interval, c.entries));
        host::SessionOptions so;
        so.input.streaming = c.streaming;
        Opened o = testsupport::open_file(f, so);
        ASSERT_EQ(o.rc, HOVA_OK);
        EXPECT_EQ(o.ctx()->s.seekable, c.seekable);
        hova_clip_info_st clip{};
        ASSERT_EQ(hova_asff_demuxer.get_info(o.ctx(), HOVA_STREAM_NONE, 0, &clip), HOVA_OK);
        EXPECT_EQ(clip.seekable, c.seekable);
        EXPECT_TRUE(o.close_clean());
    }
}

TEST(Open, DataObjectShapes) {
    const asfb::File f = asfb::standard_file(true, true, 4);
    const Bytes whole = asfb::build(f);
    const size_t hdr = header_size(f);
    auto cut = [&](size_t n) { return Bytes(whole.begin(), whole.begin() + n); };
    Bytes zero_size = whole;
    for (int i = 0; i < 8; ++i) zero_size[hdr + 16 + i] = 0;
    const struct {
        const char* what;
        Bytes bytes;
        int rc;
    } cases[] = {
        {"data object header cut short", cut(hdr + 49), HOVA_OpenFailed},
        {"packets cut short: no index", cut(hdr + 50 + 3200), HOVA_OK},
        {"data object declares size 0", zero_size, HOVA_OK},
        {"no packets at all", cut(hdr + 50), HOVA_OK},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        Opened o = testsupport::open_bytes(c.bytes);
        EXPECT_EQ(o.rc, c.rc);
        if (o.rc == HOVA_OK) {
            EXPECT_EQ(o.ctx()->index_packet, 0u);
            EXPECT_EQ(o.ctx()->first_packet, hdr + 50);
            EXPECT_EQ(o.ctx()->s.cbuffer.curpos, hdr + 50);
        }
        EXPECT_TRUE(o.close_clean());
    }
}

// Size fields of the data object and of the objects behind it, as the index
// search reads them: open always succeeds, with or without the index.
TEST(Open, HostileSizesBehindTheHeader) {
    const uint64_t near32 = (1ull << 32) + 10, near64 = ~0ull - 10;
    const asfb::Bytes unknown_body(40, 0);
    const auto unknown = [&](std::optional<uint64_t> size) {
        return asfb::object(asfb::guid_from_text("D6E229D3-35DA-11D1-9034-00A0C90349BE"),
                            unknown_body, size);
    };
    const struct {
        const char* what;
        std::optional<uint64_t> data_size;
        std::vector<Bytes> trailing;
        bool index_found;
    } cases[] = {
        {"data object size 49", 49, {}, false},
        {"data object size near 2^32", near32, {}, false},
        {"data object size near 2^64", near64, {}, false},
        {"object of size 0 before the index", std::nullopt, {unknown(0)}, false},
        {"object of size 1 before the index", std::nullopt, {unknown(1)}, false},
        {"object of size near 2^32 before the index", std::nullopt, {unknown(near32)}, false},
        {"object of size near 2^64 before the index", std::nullopt, {unknown(near64)}, false},
        {"well-formed object before the index", std::nullopt, {unknown(std::nullopt)}, true},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        asfb::File f = asfb::standard_file(true, true, 2);
        const Bytes header = asfb::header_object(f.header_children);
        Bytes bytes = header;
        const Bytes data = asfb::data_object(f.packets, c.data_size);
        bytes.insert(bytes.end(), data.begin(), data.end());
        for (const Bytes& t : c.trailing) bytes.insert(bytes.end(), t.begin(), t.end());
        const Bytes index = asfb::simple_index(10000000, {{0, 1}, {1, 1}});
        bytes.insert(bytes.end(), index.begin(), index.end());
        Opened o = testsupport::open_bytes(bytes);
        ASSERT_EQ(o.rc, HOVA_OK);
        EXPECT_EQ(o.ctx()->index_packet != 0, c.index_found);
        EXPECT_EQ(o.ctx()->index_count, c.index_found ? 2u : 0u);
        EXPECT_EQ(o.ctx()->s.cbuffer.curpos, header.size() + 50) << "back at the first packet";
        EXPECT_TRUE(o.close_clean());
    }
}

TEST(Open, SkipsALeadingId3Tag) {
    for (uint32_t payload : {259u, 4096u}) {
        SCOPED_TRACE(payload);
        asfb::File f = asfb::standard_file();
        f.id3_payload = payload;
        Opened o = testsupport::open_file(f);
        ASSERT_EQ(o.rc, HOVA_OK);
        EXPECT_EQ(o.ctx()->first_packet, payload + 10 + header_size(f) + 50);
        EXPECT_GT(o.ctx()->index_count, 0u);
        EXPECT_TRUE(o.close_clean());
    }
}

TEST(Open, EveryBufferingOpensTheSameWay) {
    const Bytes bytes = asfb::build(asfb::standard_file());
    const struct {
        const char* what;
        bool disable_cache;
        uint8_t rbuf_mode;
        bool thread;
    } modes[] = {{"none", true, CBIO_NO_RBUF, false},
                 {"cache", false, CBIO_NO_RBUF, false},
                 {"ring with thread", false, CBIO_APPLY_RBUF, true}};
    for (const auto& m : modes) {
        SCOPED_TRACE(m.what);
        host::SessionOptions so;
        so.input.disable_cache = m.disable_cache;
        so.input.rbuf_mode = m.rbuf_mode;
        so.input.use_thread = m.thread;
        so.input.block_size = 4096;
        so.ring_size = 65536;
        Opened o = testsupport::open_bytes(bytes, so);
        ASSERT_EQ(o.rc, HOVA_OK);
        EXPECT_EQ(o.ctx()->index_count, 4u);
        EXPECT_EQ(o.ctx()->s.total_streams, 2);
        EXPECT_EQ(o.ctx()->s.cbuffer.curpos, o.ctx()->first_packet);
        EXPECT_TRUE(o.close_clean());
    }
}

// A file with every object the walk reads, cut after each byte of its header
// and data object header: never opens, never leaks.
TEST(Open, TruncatedAtEveryHeaderByte) {
    asfb::File f = asfb::standard_file();
    asfb::ExtStreamProps es;
    es.stream_num = 2;
    es.avg_time_per_frame = 333667;
    es.names = {{0, "Main"}};
    f.header_children.push_back(asfb::header_extension(
        {asfb::language_list({"en-US", "fr"}), asfb::extended_stream_properties(es),
         asfb::metadata_library({{0, 0, "WM/Picture", 1,
                                  asfb::picture_value(3, "image/png", "", Bytes(16, 2))}})}));
    f.header_children.push_back(asfb::content_description({"T", "A", "C", "D", "R"}));
    f.header_children.push_back(asfb::extended_content_description(
        {{"WM/Year", 0, asfb::string_value("2001")}, {"WM/Genre", 0, asfb::string_value("Rock")}}));
    const Bytes whole = asfb::build(f);
    const size_t end = header_size(f) + 50;
    for (size_t n = 0; n < end; ++n) {
        Opened o = testsupport::open_bytes(Bytes(whole.begin(), whole.begin() + n));
        EXPECT_TRUE(o.rc == HOVA_EndOfStream || o.rc == HOVA_OpenFailed)
            << "cut at " << n << ": " << host::errno_name(o.rc);
        EXPECT_TRUE(o.close_clean()) << "cut at " << n;
    }
    Opened whole_file = testsupport::open_bytes(Bytes(whole.begin(), whole.begin() + end));
    EXPECT_EQ(whole_file.rc, HOVA_OK);
    EXPECT_TRUE(whole_file.close_clean());
}

TEST(Open, CloseReleasesEveryBlock) {
    asfb::File f = asfb::standard_file();
    f.header_children.push_back(asfb::content_description({"T", "A", "", "", ""}));
    f.header_children.push_back(asfb::extended_content_description(
        {{"WM/AlbumTitle", 0, asfb::string_value("Al")},
         {"WM/Genre", 0, asfb::string_value("Rock")},
         {"WM/Picture", 1, asfb::picture_value(3, "image/png", "", Bytes(16, 2))}}));
    Opened o = testsupport::open_file(f);
    ASSERT_EQ(o.rc, HOVA_OK);
    // Reader block, two configurations, cover, title, author, album, genre,
    // simple index entries.
    EXPECT_EQ(o.session->blocks_outstanding(), 9u);
    EXPECT_EQ(hova_asff_demuxer.close_file(o.ctx()), HOVA_OK);
    EXPECT_EQ(o.session->blocks_outstanding(), 0u);
    EXPECT_EQ(o.session->callbacks().foreign_frees(), 0u);
    o.session.reset();
}

}  // namespace
