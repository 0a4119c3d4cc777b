// ID3 tags read through the reader: where the tag is, frame sizes (syncsafe or
// not), unsynchronisation, pictures, the ID3v1 block at the end, and numbers.
#include <climits>

#include "sys_id3.h"
#include "toolkit_fixture.h"

#pragma GCC diagnostic ignored "-Wmissing-field-initializers"

using namespace tkb;
using namespace std::string_literals;
Bytes bytes(const hova_string_info_st& s) { return Bytes(s.payload, s.payload + s.size); }
const Bytes kAudio = pattern(400, 3);

class Id3 : public HostedToolkit {
protected:
    // Parses `file`, the host refusing its `fail_at`th allocation of the parse.
    int parse(const Bytes& file, uint64_t fail_at = 0) {
        close();
        input = host::RawInput::from_memory(file);
        EXPECT_EQ(OpenURL(&reader, input->io(), 1 << 20, host.table()), 0);
        ctx = {};
        ctx.file_size = file.size();
        reader_blocks = host.outstanding_blocks();
        host.fail_malloc_at(fail_at);
        const int r = parse_ID3(&reader, host.table(), &ctx);
        return host.fail_malloc_at(0), get_id3_info(&program, &ctx.id3_info), r;
    }
    void close() {
        release(ctx.id3_info_buffer);
        if (input) CloseURL(&reader, host.table());
        input.reset(), program = {};
    }
    void TearDown() override { close(), HostedToolkit::TearDown(); }
    std::unique_ptr<host::RawInput> input;
    cb_buffer_st reader{};
    id3_context_st ctx{};
    const ST_ID3_INFO& info = ctx.id3_info;
    hova_program_info_st program{};
    size_t reader_blocks = 0;
};

// Text frames of every version, unsynchronisation undone on the stored bytes,
// version 4's two readings of a frame size, what ends the walk, and pictures.
TEST_F(Id3, WalksTheFramesOfEveryVersion) {
    auto unsync = [](const Bytes& stored, uint8_t text_len) {
        return id3_tag(3, cat({{'T', 'I', 'T', '2', 0, 0, 0, uint8_t(1 + text_len), 0, 0, 0}, stored}), 0, 0x80);
    };
    const Id3Frame plain{"TIT2", cat({{0}, pattern(255, 0x30)}), 256, true},
        safe{"TIT2", cat({{0}, pattern(127, 0x30)}), 128, false}, talb = text_frame("TALB", 0, text("x"));
    const Bytes t = text("t"), title = id3_frames(3, {text_frame("TIT2", 0, t)});
    const Bytes album = id3_frames(3, {talb}), pic = pattern(50, 0x40), jpeg = text("image/jpeg");
    auto tag = [](int v, std::vector<Id3Frame> f) { return id3_tag(v, id3_frames(v, f), 64); };
    auto apic = [&](int v, const Bytes& body) { return tag(v, {{v == 2 ? "PIC" : "APIC", body}}); };
    // data: the title, or the picture data with ID3_APIC at pic_at in the tag.
    const struct { Bytes tag; uint32_t flags; Bytes data; uint32_t pic_at; const char* log_line; } cases[] = {
        {tag(2, {text_frame("TT2", 1, t), text_frame("TP1", 0, t)}), ID3_TITLE | ID3_ARTIST, t},
        {tag(4, {text_frame("TIT2", 0, t), text_frame("TIT2", 3, text("2nd"))}), ID3_TITLE, text("2nd")},
        {unsync({0xFF, 0x00, 0x00}, 2), ID3_TITLE, {0xFF, 0x00}, 0, "[parseID3v2] parse unsynchronization\n"},
        {unsync({0xFF, 0x00, 0xE0}, 2), ID3_TITLE, {0xFF, 0xE0}},
        {unsync({0xFF, 0xFF, 0x00, 0x00}, 3), ID3_TITLE, {0xFF, 0xFF, 0x00}},
        {tag(4, {plain, talb}), ID3_TITLE | ID3_ALBUM, pattern(255, 0x30)},
        {tag(4, {safe, talb}), ID3_TITLE | ID3_ALBUM, pattern(127, 0x30)},
        {tag(4, {plain, text_frame("talb", 0, text("x"))}), 0, {}, 0, "[parseID3v2] check tag fail\n"},
        {id3_tag(3, cat({title, Bytes(20, 0), album})), ID3_TITLE, t},  // padding ends the walk
        {id3_tag(3, cat({title, {0, 0, 0, 0, 0, 0, 0, 2, 0, 0, 'x', 'y'}, album})), ID3_TITLE, t},
        {tag(3, {{"TPE1", {}}, text_frame("TIT2", 0, t), {"TALB", text("big"), 5000}}), ID3_TITLE, t},
        {tag(3, {{"PRIV", text("owner")}, talb}), ID3_ALBUM, {}, 0, "[parseID3v2] unsupported TAG 50524956\n"},
        {apic(3, cat({{0}, jpeg, {0, 3}, text("front"), {0}, pic})), ID3_APIC, pic, 39},
        {apic(3, cat({{1}, jpeg, {0, 3, 0xFF, 0xFE, 'x', 0, 0, 0}, pic})), ID3_APIC, pic, 39},
        {apic(2, cat({{0}, text("PNG"), {3}, text("d"), {0}, pic})), ID3_APIC, pic, 23},
        {apic(3, cat({{0}, jpeg})), 0, {}, 0, "[Pic] u32FrameSize error\n"},  // MIME unterminated
        {apic(3, cat({{0}, text("image"), {0}})), 0, {}, 0, "[Pic] u32FrameSize error\n"},
        {apic(3, cat({{0}, text("i"), {0, 3}, text("no end")})), ID3_APIC, {}, 30}};
    for (const auto& c : cases) {
        SCOPED_TRACE(&c - cases);
        testenv::LogCapture log;
        ASSERT_EQ(parse(cat({c.tag, kAudio})), 1);
        EXPECT_EQ(std::make_pair(info.eID3TagFlags, cb_tell64(&reader)),
                  std::make_pair(c.flags, cb_fpos(ctx.id3_v2_size))) << "reader stands after the tag";
        EXPECT_TRUE(!(c.flags & ID3_TITLE) || (bytes(info.Title) == c.data && !info.Title.payload[c.data.size()]))
            << "the title, then a NUL";
        EXPECT_TRUE(!c.log_line || log.contains(c.log_line)) << c.log_line;
        if (c.tag[5] & 0x80) { EXPECT_EQ(info.u32ID3TagSize, 11 + c.data.size()); }
        if (c.flags & ID3_APIC) {
            const auto& pic = program.cover;
            EXPECT_EQ(std::make_tuple(Bytes(pic.payload, pic.payload + pic.length), pic.payload, program.pic_offset),
                      std::make_tuple(c.data, ctx.id3_info_buffer + c.pic_at, int(c.pic_at)));
        }
    }
}

TEST_F(Id3, FindsTheTagInTheFirst257PositionsOrFallsBackToTheId3v1Block) {
    for (const auto& [at, found] : {std::pair<size_t, int>{0, 1}, {256, 1}, {257, 0}}) {
        Bytes probe(266, 0);
        const Bytes tag = id3_tag(3, Bytes(100, 0));
        std::copy_n(tag.begin(), std::min<size_t>(10, 266 - at), probe.begin() + long(at));
        int pos = -1, size = -1;
        EXPECT_EQ(find_ID3v2(probe.data(), 266, &pos, &size), found) << at;
        if (found) { EXPECT_EQ(std::make_pair(pos, size), std::make_pair(int(at), 110)); }
    }
    for (const auto& [before, value, padding] : {std::tuple<size_t, Bytes, size_t>{
             256, pattern(39000, 0x11), 990}, {100, text("s"), 100}}) {  // two reads, or a seek
        const Bytes tag = id3_tag(3, id3_frames(3, {text_frame("TALB", 0, value)}), padding);
        ASSERT_EQ(parse(cat({Bytes(before, 0xEE), tag, kAudio})), 1);
        EXPECT_EQ(std::make_tuple(ctx.id3_v2_size, cb_tell64(&reader), bytes(info.Album)),
                  std::make_tuple(int(tag.size()), before + tag.size(), value));
    }
    const Bytes v1 = id3v1("Song", "Band", "Record", "1987", "fine", 17);
    for (const auto& [head, log_line] : {std::pair<Bytes, const char*>{kAudio, "[parse_ID3] find_ID3v2 fail\n"},
             {cat({id3_tag(5, Bytes(20, 0)), kAudio}), "[parseID3v2] unsupport ID3v2 version\n"},
             {cat({{'I', 'D', '3', 3, 0, 0, 0x7F, 0x7F, 0x7F, 0x7F}, kAudio}), "[parse_ID3] cb_read fail\n"}}) {
        testenv::LogCapture log;  // the last tag is longer than the input of known size
        ASSERT_EQ(parse(cat({head, v1})), 1);
        EXPECT_TRUE(log.contains(log_line) && log.contains("[parseID3v1]Parse OK\n"));
        EXPECT_EQ(std::make_tuple(info.eID3TagFlags, bytes(info.Title), ctx.id3_v1_size, cb_tell64(&reader),
                                  program.year, std::string(program.genre)),
                  std::make_tuple(63u, text("Song"s + '\0'), 128, cb_fpos{0}, 1987, "Rock"s));
        for (const auto& [field, at] : {std::pair{&info.Artist, 31}, {&info.Album, 62}, {&info.Year, 93},
                                        {&info.Comment, 98}, {&info.Genre, 129}})
            EXPECT_EQ(field->payload, ctx.id3_info_buffer + at);
    }
}

// Each host allocation refused: the parse degrades, and keeps a block only
// with a tag.
TEST_F(Id3, NeverLeaks) {
    const Bytes v1 = cat({kAudio, id3v1("one", "a", "b", "1999", "c", 2)});
    const Bytes v2 = id3_tag(3, id3_frames(3, {text_frame("TIT2", 0, text("two"))}));
    for (const auto& [file, n, title] : {std::tuple<Bytes, uint64_t, std::string>{
             cat({v2, v1}), 1, "one"s + '\0'}, {cat({v2, v1}), 2, "two"}, {v1, 1, ""}}) {
        const int r = parse(file, n);
        EXPECT_EQ(std::make_tuple(r, host.outstanding_blocks(), bytes(info.Title)),
                  std::make_tuple(int(!title.empty()), reader_blocks + !title.empty(), text(title)));
    }
}

TEST(Id3Helpers, FrameIdsAtTheEdgeSyncsafeSizesAndNumbersFromLeadingDigits) {
    const uint8_t ids[] = {'T', 'I', 'T', '2', 'a', 'B', 'C', 'D', '9', '0', 'Z', 'A'};
    EXPECT_EQ(std::make_tuple(check_tag(ids, 12, 4), check_tag(ids, 12, 8), check_tag(ids, 12, 9),
                              check_tag(ids, 12, UINT32_MAX - 1)), std::make_tuple(0, 1, -1, -1));
    EXPECT_EQ(calc_ID3v2_size(reinterpret_cast<const uint8_t*>("\x80\x81\x80\x80")), 1u << 14) << "high bits";
    for (const auto& [textv, value] : std::initializer_list<std::pair<std::string, int>>{
             {"7/10", 7}, {"  -12abc", -12}, {"+7", 7}, {"x12", 0}, {"99999999999", INT_MAX},
             {"-99999999999", INT_MIN}}) {
        std::string buf = textv;
        ST_ID3_INFO id3{};
        id3.eID3TagFlags = ID3_YEAR | ID3_CDTRACKNUMBER;  // items not flagged are not read
        id3.Year = {unsigned(buf.size()), reinterpret_cast<unsigned char*>(buf.data()), HOVA_STRING_FORMAT_ASCII};
        id3.DiscNumber = id3.CDTrackNumber = id3.Compilation = id3.Year;
        id3.Genre = {2, reinterpret_cast<unsigned char*>(const_cast<char*>("\x11")), HOVA_STRING_FORMAT_ASCII};
        hova_program_info_st p{};
        get_id3_info(&p, &id3);
        EXPECT_EQ(std::make_tuple(p.year, p.disc_number, p.track_number, p.compilation, p.genre),
                  std::make_tuple(value, 0, value, 0, nullptr)) << textv;
    }
}
