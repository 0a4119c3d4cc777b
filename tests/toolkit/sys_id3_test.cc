#include <gtest/gtest.h>

#include <climits>
#include <cstring>
#include <memory>
#include <string>
#include <tuple>
#include <vector>

#include "raw_input.h"
#include "streaming.h"
#include "sys_id3.h"
#include "test_env.h"
#include "toolkit_builders.h"
#include "toolkit_fixture.h"

namespace {

using tkb::Bytes;
using tkb::Id3Frame;
using tkb::text;
using tkb::text_frame;

std::string str(const hova_string_info_st& s) {
    return s.payload ? std::string(reinterpret_cast<const char*>(s.payload), s.size)
                     : std::string();
}

class Id3 : public HostedToolkit {
protected:
    // Opens the reader over `file`; the input reports its size as known.
    void open(const Bytes& file, const host::InputOptions& opts = {}) {
        close();
        input = host::RawInput::from_memory(file, opts);
        ASSERT_EQ(OpenURL(&reader, input->io(), opts.ring_size, host.table()), 0);
        opened = true;
        std::memset(&ctx, 0, sizeof ctx);
        ctx.file_size = file.size();
    }
    int parse() { return parse_ID3(&reader, host.table(), &ctx); }
    void close() {
        release(ctx.id3_info_buffer);
        if (opened) CloseURL(&reader, host.table());
        opened = false;
    }
    void TearDown() override {
        close();
        HostedToolkit::TearDown();
    }
    const ST_ID3_INFO& info() const { return ctx.id3_info; }
    hova_program_info_st program() const {
        hova_program_info_st p{};
        get_id3_info(&p, &ctx.id3_info);
        return p;
    }

    std::unique_ptr<host::RawInput> input;
    cb_buffer_st reader{};
    id3_context_st ctx{};
    bool opened = false;
};

const Bytes kAudio = tkb::pattern(400, 3);

TEST_F(Id3, DecodesTheTextFramesOfEveryVersionAndLaterFramesReplaceEarlierOnes) {
    using I = ST_ID3_INFO;
    struct Item {
        const char* id3;
        const char* id2;
        hova_string_info_st ST_ID3_INFO::*item;
        uint32_t flag;
    };
    const Item items[] = {
        {"TIT2", "TT2", &I::Title, ID3_TITLE}, {"TPE1", "TP1", &I::Artist, ID3_ARTIST},
        {"TALB", "TAL", &I::Album, ID3_ALBUM}, {"TYER", "TYE", &I::Year, ID3_YEAR},
        {"COMM", "COM", &I::Comment, ID3_COMMENT}, {"TCON", "TCO", &I::Genre, ID3_GENRE},
        {"TCMP", "TCP", &I::Compilation, ID3_COMPILATION},
        {"TCOM", "TCM", &I::Composer, ID3_COMPOSER},
        {"TPE2", "TP2", &I::AlbumArtist, ID3_ALBUMARTIST},
        {"TPOS", "TPA", &I::DiscNumber, ID3_DISCNUMBER},
        {"TRCK", "TRK", &I::CDTrackNumber, ID3_CDTRACKNUMBER},
        {"TIT1", "TT1", &I::Grouping, ID3_GROUPING}, {"TEXT", "TXT", &I::Lyricist, ID3_LYRICIST}};
    const hova_string_format_et formats[] = {HOVA_STRING_FORMAT_ASCII, HOVA_STRING_FORMAT_UCS2,
                                             HOVA_STRING_FORMAT_UTF16BE, HOVA_STRING_FORMAT_UTF8};
    for (int version : {2, 3, 4}) {
        SCOPED_TRACE(testing::Message() << "version " << version);
        std::vector<Id3Frame> frames;
        for (size_t i = 0; i < std::size(items); ++i)
            frames.push_back(text_frame(version == 2 ? items[i].id2 : items[i].id3,
                                        static_cast<uint8_t>(i % 4),
                                        text(std::string("value ") + items[i].id3)));
        open(tkb::cat({tkb::id3_tag(version, tkb::id3_frames(version, frames), 20), kAudio}));
        ASSERT_EQ(parse(), 1);
        uint32_t all = 0;
        for (size_t i = 0; i < std::size(items); ++i) {
            const hova_string_info_st& s = info().*(items[i].item);
            EXPECT_EQ(str(s), std::string("value ") + items[i].id3);
            EXPECT_EQ(s.payload[s.size], 0) << "text ends with a NUL";
            EXPECT_EQ(s.stringformat, formats[i % 4]);
            all |= items[i].flag;
        }
        EXPECT_EQ(info().eID3TagFlags, all);
        EXPECT_EQ(cb_tell64(&reader), static_cast<cb_fpos>(ctx.id3_v2_size))
            << "reader stands after the tag";
    }
    const std::vector<Id3Frame> frames = {text_frame("TIT2", 0, text("first")),
                                          text_frame("TDRC", 0, text("2004-05")),
                                          text_frame("TIT2", 3, text("second"))};
    open(tkb::cat({tkb::id3_tag(4, tkb::id3_frames(4, frames)), kAudio}));
    ASSERT_EQ(parse(), 1);
    EXPECT_EQ(program().year, 2004);
    EXPECT_EQ(str(program().title), "second");
    EXPECT_EQ(info().Title.stringformat, HOVA_STRING_FORMAT_UTF8);
}

TEST_F(Id3, FindsTheTagInTheFirst257PositionsWithEveryBuffering) {
    for (const auto& [at, found] : {std::pair<size_t, int>{0, 1}, {1, 1}, {256, 1}, {257, 0}}) {
        Bytes probe(266, 0);
        const Bytes tag = tkb::id3_tag(3, Bytes(100, 0));
        std::copy(tag.begin(), tag.begin() + static_cast<long>(std::min<size_t>(10, 266 - at)),
                  probe.begin() + static_cast<long>(at));
        int pos = -1, size = -1;
        EXPECT_EQ(find_ID3v2(probe.data(), 266, &pos, &size), found) << at;
        if (found) {
            EXPECT_EQ(std::make_pair(pos, size), std::make_pair(static_cast<int>(at), 110));
        }
    }
    {
        testenv::LogCapture log;
        int pos = 0, size = 0;
        EXPECT_EQ(find_ID3v2(reinterpret_cast<const uint8_t*>("ID3\3\0\0\0\0\0"), 9, &pos, &size),
                  0);
        EXPECT_TRUE(log.contains("findID3v2 : Not enough input data\n"));
    }
    host::InputOptions none, small_cache, ring;
    none.disable_cache = true;
    small_cache.block_size = 100;
    ring.rbuf_mode = CBIO_APPLY_RBUF;
    ring.use_thread = true;
    ring.block_size = 1024;
    ring.ring_size = 8192;
    // A tag larger than the probe, read in two parts, behind 256 bytes of other data.
    const Bytes picture = tkb::pattern(39000, 0x11);
    const Bytes body = tkb::id3_frames(
        3, {{"APIC", tkb::cat({Bytes{0}, text("image/png"), Bytes{0, 3, 0}, picture})},
            text_frame("TALB", 0, text("tail"))});
    const Bytes v2 = tkb::id3_tag(3, body, 40000 - 10 - body.size());
    const Bytes v1 = tkb::id3v1("one", "a", "b", "1999", "c", 2);
    for (const host::InputOptions& opts : {host::InputOptions{}, none, small_cache, ring}) {
        SCOPED_TRACE(testing::Message() << "cache off " << opts.disable_cache << ", block "
                                        << opts.block_size << ", ring " << opts.rbuf_mode);
        open(tkb::cat({Bytes(256, 0xEE), v2, kAudio}), opts);
        ASSERT_EQ(parse(), 1);
        EXPECT_EQ(ctx.id3_v2_size, 40000);
        EXPECT_EQ(cb_tell64(&reader), 256u + 40000u);
        EXPECT_EQ(str(info().Album), "tail");
        ASSERT_EQ(info().Pic.length, 39000);
        EXPECT_EQ(Bytes(info().Pic.payload, info().Pic.payload + 39000), picture);
        EXPECT_EQ(info().pic_offset, 10u + 10u + 1u + 10u + 2u);
        uint8_t next = 0;
        ASSERT_EQ(reader.cb_read(&reader, &next, 1), 1);
        EXPECT_EQ(next, kAudio[0]);

        open(tkb::cat({kAudio, v1}), opts);
        ASSERT_EQ(parse(), 1);
        EXPECT_EQ(info().Title.size, 4u);
        EXPECT_EQ(cb_tell64(&reader), 0u) << "the end block is read and the reader put back";
        ASSERT_EQ(reader.cb_read(&reader, &next, 1), 1);
        EXPECT_EQ(next, kAudio[0]);
    }
}

TEST_F(Id3, PicturesFindTheirDataBehindTypeAndDescription) {
    const Bytes data = tkb::pattern(50, 0x40), jpeg = text("image/jpeg");
    using tkb::cat;
    const struct {
        int version;
        Id3Frame frame;
        int length;
        uint32_t data_at;  // offset of the picture data in the frame body
        bool taken = true;
    } cases[] = {
        {3, {"APIC", cat({{0}, jpeg, {0, 3}, text("front"), {0}, data})}, 50, 1 + 11 + 1 + 6},
        {3, {"APIC", cat({{1}, jpeg, {0, 3, 0xFF, 0xFE, 'x', 0, 0, 0}, data})}, 50, 1 + 11 + 1 + 6},
        {4, {"APIC", cat({{3}, text("image/png"), {0, 0, 0}, data})}, 50, 1 + 10 + 1 + 1},
        {2, {"PIC", cat({{0}, text("PNG"), {3}, text("d"), {0}, data})}, 50, 1 + 3 + 1 + 2},
        {3, {"APIC", cat({{0}, jpeg})}, 0, 0, false},  // MIME type without terminator
        {3, {"APIC", cat({{0}, text("image"), {0}})}, 0, 0, false},  // no picture type
        {3, {"APIC", cat({{0}, text("i"), {0, 3}, text("no end")})}, 0, 1 + 2 + 1 + 6}};
    for (const auto& c : cases) {
        SCOPED_TRACE(&c - cases);
        testenv::LogCapture log;
        open(cat({tkb::id3_tag(c.version, tkb::id3_frames(c.version, {c.frame}), 4), kAudio}));
        ASSERT_EQ(parse(), 1);
        EXPECT_EQ(info().Pic.length, c.length);
        EXPECT_EQ((info().eID3TagFlags & ID3_APIC) != 0, c.taken);
        EXPECT_EQ(log.contains("[Pic] u32FrameSize error\n"), !c.taken);
        if (!c.taken) continue;
        EXPECT_EQ(info().pic_offset, 10 + (c.version == 2 ? 6u : 10u) + c.data_at);
        EXPECT_EQ(info().Pic.payload, ctx.id3_info_buffer + info().pic_offset);
        EXPECT_EQ(Bytes(info().Pic.payload, info().Pic.payload + c.length),
                  Bytes(data.begin(), data.begin() + c.length));
        EXPECT_EQ(std::make_pair(program().cover.length, program().pic_offset),
                  std::make_pair(c.length, static_cast<int>(info().pic_offset)));
    }
}

// The frame walk: unsynchronisation undone on the stored bytes, version 4's
// two readings of a frame size, and what ends the walk.
TEST_F(Id3, WalksTheFramesUntilPaddingOrABadSize) {
    using tkb::cat;
    using tkb::id3_tag;
    auto unsync = [](const Bytes& stored, size_t text_len) {  // size counts the bytes after
        return id3_tag(3, cat({{'T', 'I', 'T', '2', 0, 0, 0, uint8_t(1 + text_len), 0, 0, 0},
                               stored}), 0, 0x80);
    };
    const Id3Frame plain{"TIT2", cat({{0}, tkb::pattern(255, 0x30)}), 256, true};
    const Id3Frame syncsafe{"TIT2", cat({{0}, tkb::pattern(127, 0x30)}), 128, false};
    const Id3Frame talb = text_frame("TALB", 0, text("x"));
    const Bytes t = text("t"), title = tkb::id3_frames(3, {text_frame("TIT2", 0, t)});
    const Bytes album = tkb::id3_frames(3, {talb}), pad(12, 0);
    auto v4 = [](std::vector<Id3Frame> f) { return id3_tag(4, tkb::id3_frames(4, f), 64); };
    const struct {
        Bytes tag;
        uint32_t flags;
        Bytes title;  // when ID3_TITLE is among the flags
        const char* log_line;
    } cases[] = {
        {unsync({0xFF, 0x00, 0x00}, 2), ID3_TITLE, {0xFF, 0x00},
         "[parseID3v2] parse unsynchronization\n"},
        {unsync({0xFF, 0x00, 0xE0}, 2), ID3_TITLE, {0xFF, 0xE0}, nullptr},
        {unsync({0xFF, 0xFF, 0x00, 0x00}, 3), ID3_TITLE, {0xFF, 0xFF, 0x00}, nullptr},
        {unsync({0x00, 0xFF}, 2), ID3_TITLE, {0x00, 0xFF}, nullptr},
        {v4({plain, talb}), ID3_TITLE | ID3_ALBUM, tkb::pattern(255, 0x30), nullptr},
        {v4({syncsafe, talb}), ID3_TITLE | ID3_ALBUM, tkb::pattern(127, 0x30), nullptr},
        {v4({plain, text_frame("talb", 0, text("x"))}), 0, {}, "[parseID3v2] check tag fail\n"},
        {id3_tag(3, cat({title, Bytes(20, 0), album})), ID3_TITLE, t, nullptr},  // padding ends
        {id3_tag(3, cat({tkb::id3_frames(3, {{"TPE1", {}}}), title, pad})), ID3_TITLE, t, nullptr},
        {id3_tag(3, cat({title, {0, 0, 0, 0, 0, 0, 0, 2, 0, 0, 'x', 'y'}, album, pad})), ID3_TITLE,
         t, nullptr},  // a size without an ID ends the walk, and so does one past the tag:
        {id3_tag(3, cat({title, tkb::id3_frames(3, {{"TALB", text("big"), 5000}}), pad})),
         ID3_TITLE, t, nullptr},
        {id3_tag(3, cat({tkb::id3_frames(3, {{"PRIV", text("owner")}}), album, pad})), ID3_ALBUM,
         {}, "[parseID3v2] unsupported TAG 50524956\n"}};
    for (const auto& c : cases) {
        SCOPED_TRACE(&c - cases);
        testenv::LogCapture log;
        open(cat({c.tag, kAudio}));
        ASSERT_EQ(parse(), 1);
        EXPECT_EQ(info().eID3TagFlags, c.flags);
        const auto& s = info().Title;
        if (c.flags & ID3_TITLE) { EXPECT_EQ(Bytes(s.payload, s.payload + s.size), c.title); }
        if (c.log_line) { EXPECT_TRUE(log.contains(c.log_line)); }
        if (c.tag[5] & 0x80) { EXPECT_EQ(info().u32ID3TagSize, 11 + c.title.size()); }
    }
}

TEST_F(Id3, FallsBackToTheId3v1BlockAtTheEnd) {
    const struct {
        const char* name;
        Bytes head;
        const char* log_line;
    } cases[] = {
        {"no ID3v2 tag", kAudio, "[parse_ID3] find_ID3v2 fail\n"},
        {"ID3v2 version 5",
         tkb::cat(
             {tkb::id3_tag(5, tkb::id3_frames(3, {text_frame("TIT2", 0, text("v5"))})), kAudio}),
         "[parseID3v2] unsupport ID3v2 version\n"},
        {"ID3v2 tag longer than the input",
         tkb::cat({Bytes{'I', 'D', '3', 3, 0, 0, 0x7F, 0x7F, 0x7F, 0x7F}, kAudio}),
         "[parse_ID3] cb_read fail\n"},
    };
    const Bytes v1 = tkb::id3v1("Song", "Band", "Record", "1987", "fine", 17);
    for (const auto& c : cases) {
        SCOPED_TRACE(c.name);
        testenv::LogCapture log;
        open(tkb::cat({c.head, v1}));
        ASSERT_EQ(parse(), 1);
        EXPECT_TRUE(log.contains(c.log_line));
        EXPECT_TRUE(log.contains("[parseID3v1]Parse OK\n"));
        EXPECT_EQ(info().eID3TagFlags, 63u);
        EXPECT_EQ(str(info().Title), std::string("Song") + '\0');  // size counts the NUL
        const hova_string_info_st* fields[] = {&info().Artist, &info().Album, &info().Year,
                                               &info().Comment, &info().Genre};
        const int at[] = {31, 62, 93, 98, 129};
        for (int i = 0; i < 5; ++i) EXPECT_EQ(fields[i]->payload, ctx.id3_info_buffer + at[i]);
        EXPECT_EQ(std::make_tuple(info().Year.stringformat, ctx.id3_v1_size, cb_tell64(&reader),
                                  input->counters().open_done_calls),
                  std::make_tuple(HOVA_STRING_FORMAT_ASCII, 128, cb_fpos{0}, uint64_t{1}));
        EXPECT_EQ(program().year, 1987);
        EXPECT_STREQ(program().genre, "Rock");
    }
    // The genre byte selects the genre name; 0 is an empty text.
    for (const auto& [genre, size, name] :
         {std::tuple<uint8_t, unsigned, const char*>{0, 1, nullptr},
          {147, 2, "Synthpop"},
          {148, 2, ""},
          {149, 2, nullptr},
          {255, 2, nullptr}}) {
        open(tkb::cat({kAudio, tkb::id3v1("t", "a", "b", "2000", "c", genre)}));
        ASSERT_EQ(parse(), 1);
        EXPECT_EQ(info().Genre.size, size) << int{genre};
        const char* got = program().genre;
        EXPECT_STREQ(got ? got : "(none)", name ? name : "(none)") << int{genre};
    }
}

TEST_F(Id3, LooksNoFurtherWhenThereIsNoTagToBeFound) {
    const Bytes v1 = tkb::cat({kAudio, tkb::id3v1("t", "a", "b", "y", "c", 1)});
    const struct {
        const char* name;
        Bytes file;
        bool seekable;
        bool size_known;
        uint64_t open_done;
        const char* log_line;
    } cases[] = {
        {"127 bytes", tkb::pattern(127, 1), true, true, 0, "[parse_ID3] cb_read fail\n"},
        {"not seekable", v1, false, true, 0, nullptr},
        {"size unknown", v1, true, false, 0, nullptr},
        {"no ID3v1 block", kAudio, true, true, 1, "[parseID3v1]No ID3v1 tag\n"},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.name);
        testenv::LogCapture log;
        host::InputOptions opts;
        opts.seekable = c.seekable;
        open(c.file, opts);
        const size_t reader_blocks = host.outstanding_blocks();
        if (!c.size_known) ctx.file_size = ~cb_fpos{0};
        const uint64_t read_before = input->counters().bytes_read;
        EXPECT_EQ(parse(), 0);
        EXPECT_EQ(std::make_tuple(ctx.id3_info_buffer, host.outstanding_blocks(),
                                  cb_tell64(&reader), input->counters().open_done_calls),
                  std::make_tuple(nullptr, reader_blocks, cb_fpos{0}, c.open_done));
        if (c.log_line) { EXPECT_TRUE(log.contains(c.log_line)); }
        if (c.open_done == 0) {
            EXPECT_LE(input->counters().bytes_read - read_before, c.file.size());
        }
    }
}

// Each host allocation fails in turn, and the input is cut at every length:
// the parse degrades (to the ID3v1 block, or to nothing), never overreads,
// and keeps a block only when it took a tag.
TEST_F(Id3, RefusedBlocksAndTruncatedInputsNeverLeakOrOverread) {
    const Bytes v2 = tkb::id3_tag(3, tkb::id3_frames(3, {text_frame("TIT2", 0, text("two"))}));
    const Bytes v1 = tkb::id3v1("one", "a", "b", "1999", "c", 2);
    for (const Bytes& file : {tkb::cat({v2, kAudio, v1}), tkb::cat({kAudio, v1})}) {
        for (uint64_t n = 1; n <= 3; ++n) {
            SCOPED_TRACE(n);
            open(file);
            const size_t reader_blocks = host.outstanding_blocks();
            host.fail_malloc_at(n);
            const int r = parse();
            host.fail_malloc_at(0);
            EXPECT_EQ(host.outstanding_blocks(), reader_blocks + (r == 1));
            if (r == 1) {
                EXPECT_TRUE(str(info().Title) == "two" ||
                            str(info().Title) == std::string("one") + '\0');
            }
            close();
        }
    }
    const Bytes tag = tkb::id3_tag(
        4, tkb::id3_frames(4, {text_frame("TIT2", 0, text("title")),
                               {"APIC", tkb::cat({Bytes{0}, text("a/b"), Bytes{0, 3, 0},
                                                  tkb::pattern(300, 1)})}}));
    const Bytes file = tkb::cat({tag, tkb::pattern(100, 2)});
    for (size_t n = 0; n <= file.size(); n += 7) {
        SCOPED_TRACE(n);
        open(Bytes(file.begin(), file.begin() + static_cast<long>(n)));
        const int r = parse();
        EXPECT_EQ(r == 1, n >= tag.size() && n >= 266);
        EXPECT_EQ(ctx.id3_info_buffer != nullptr, r == 1);
    }
}

TEST(Id3Helpers, FrameIdsAtTheEdgeAndNumbersFromLeadingDigits) {
    const uint8_t ids[] = {'T', 'I', 'T', '2', 'a', 'B', 'C', 'D', '9', '0', 'Z', 'A'};
    EXPECT_EQ(check_tag(ids, sizeof ids, 4), 0);  // lower case
    EXPECT_EQ(check_tag(ids, sizeof ids, 8), 1);
    EXPECT_EQ(check_tag(ids, sizeof ids, 9), -1);  // past the end
    EXPECT_EQ(check_tag(ids, sizeof ids, UINT32_MAX - 1), -1);
    const uint8_t high_bits[] = {0x80, 0x81, 0x80, 0x80};
    EXPECT_EQ(calc_ID3v2_size(high_bits), 1u << 14);

    const std::pair<std::string, int> cases[] = {
        {"1999", 1999}, {"7/10", 7}, {"  -12abc", -12}, {"+7", 7}, {"", 0},
        {"x12", 0}, {"99999999999", INT_MAX}, {"-99999999999", INT_MIN},
    };
    for (const auto& [textv, value] : cases) {
        std::string buf = textv;
        ST_ID3_INFO id3{};
        id3.eID3TagFlags = ID3_YEAR | ID3_DISCNUMBER | ID3_CDTRACKNUMBER;
        id3.Year = {static_cast<unsigned>(buf.size()), reinterpret_cast<unsigned char*>(buf.data()),
                    HOVA_STRING_FORMAT_ASCII};
        id3.DiscNumber = id3.CDTrackNumber = id3.Compilation = id3.Year;
        hova_program_info_st program{};
        get_id3_info(&program, &id3);
        EXPECT_EQ(std::make_tuple(program.year, program.disc_number, program.track_number),
                  std::make_tuple(value, value, value)) << textv;
        EXPECT_EQ(program.compilation, 0) << "not flagged, not touched";
    }
}

}  // namespace
