// Descriptive metadata: title and author, album, year, genre, cover picture
// from the extended content description and the metadata library.
#include <gtest/gtest.h>

#include <algorithm>
#include <string>

#include "asf_open.h"
#include "test_env.h"

namespace {

using asfb::Bytes;
using asfb::Descriptor;
using testsupport::file_with;
using testsupport::Opened;

Bytes picture_bytes(size_t n, uint8_t seed) {
    Bytes b(n);
    for (size_t i = 0; i < n; ++i) b[i] = static_cast<uint8_t>(seed + i * 7 + (i >> 8));
    return b;
}

// File offset of the first occurrence of `needle`.
size_t find(const Bytes& hay, const Bytes& needle) {
    auto it = std::search(hay.begin(), hay.end(), needle.begin(), needle.end());
    return it == hay.end() ? SIZE_MAX : static_cast<size_t>(it - hay.begin());
}

std::string utf16_payload(const hova_string_info_st& s) {
    std::string out;
    for (unsigned i = 0; i + 1 < s.size; i += 2) {
        if (!s.payload[i] && !s.payload[i + 1]) break;
        out += static_cast<char>(s.payload[i]);
    }
    return out;
}

struct Opening {
    Bytes bytes;
    Opened o;
    explicit Opening(const asfb::File& f) : bytes(asfb::build(f)), o(testsupport::open_bytes(bytes)) {}
    asf_demuxer_st* d() { return o.ctx(); }
};

TEST(Metadata, CoverPicture) {
    const Bytes first = picture_bytes(5000, 1), second = picture_bytes(300, 99);
    const Bytes tiny = picture_bytes(1, 5);
    const struct {
        const char* what;
        std::vector<Bytes> objects;
        Bytes cover;  // expected cover bytes; empty: no cover
    } cases[] = {
        {"one jpeg with empty description",
         {asfb::extended_content_description(
             {{"WM/Picture", 1, asfb::picture_value(3, "image/jpeg", "", first)}})},
         first},
        {"the first of two pictures wins",
         {asfb::extended_content_description(
             {{"WM/Picture", 1, asfb::picture_value(3, "image/jpeg", "", first)},
              {"WM/Picture", 1, asfb::picture_value(3, "image/png", "x", second)}})},
         first},
        {"a picture of string type is skipped",
         {asfb::extended_content_description(
             {{"WM/Picture", 0, asfb::picture_value(3, "image/jpeg", "", second)},
              {"WM/Picture", 1, asfb::picture_value(3, "image/jpeg", "", first)}})},
         first},
        {"from the metadata library",
         {asfb::header_extension({asfb::metadata_library(
             {{0, 0, "WM/Year", 0, asfb::string_value("1")},
              {0, 0, "WM/Picture", 1, asfb::picture_value(3, "image/jpeg", "front", second)}})})},
         second},
        {"metadata library picture of the wrong type",
         {asfb::header_extension({asfb::metadata_library(
             {{0, 0, "WM/Picture", 3, asfb::picture_value(3, "image/jpeg", "", second)}})})},
         {}},
        {"a value without picture bytes", 
         {asfb::extended_content_description(
             {{"WM/Picture", 1, asfb::picture_value(3, "image/jpeg", "", {})}})},
         {}},
        {"a one-byte picture", 
         {asfb::extended_content_description(
             {{"WM/Picture", 1, asfb::picture_value(3, "", "", tiny)}})},
         tiny},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        std::vector<Bytes> children = c.objects;
        children.push_back(asfb::audio_stream(1));
        Opening op(file_with(children));
        ASSERT_EQ(op.o.rc, HOVA_OK);
        hova_program_info_st p{};
        ASSERT_EQ(hova_asff_demuxer.get_info(op.d(), HOVA_STREAM_PROG, 0, &p), HOVA_OK);
        ASSERT_EQ(p.cover.length, static_cast<int>(c.cover.size()));
        if (!c.cover.empty()) {
            EXPECT_EQ(Bytes(p.cover.payload, p.cover.payload + p.cover.length), c.cover);
            EXPECT_EQ(static_cast<size_t>(p.pic_offset), find(op.bytes, c.cover));
        } else {
            EXPECT_EQ(p.cover.payload, nullptr);
        }
        EXPECT_EQ(op.d()->s.num_streams[AUD], 1) << "the walk went on behind the metadata";
        EXPECT_TRUE(op.o.close_clean());
    }
}

TEST(Metadata, AlbumYearAndGenre) {
    const struct {
        const char* what;
        std::vector<Descriptor> descriptors;
        const char* album;
        int year;
        const char* genre;  // nullptr: none
    } cases[] = {
        {"all four",
         {{"WM/AlbumTitle", 0, asfb::string_value("Californication")},
          {"WM/Year", 0, asfb::string_value("2007")},
          {"WM/Genre", 0, asfb::string_value("Rock")}},
         "Californication", 2007, "Rock"},
        {"year as a DWORD is skipped", {{"WM/Year", 3, asfb::dword_value(2007)}}, "", 0, nullptr},
        {"a later year replaces the earlier",
         {{"WM/Year", 0, asfb::string_value("1999")}, {"WM/Year", 0, asfb::string_value("2001")}},
         "", 2001, nullptr},
        {"a later genre replaces the earlier",
         {{"WM/Genre", 0, asfb::string_value("Pop")}, {"WM/Genre", 0, asfb::string_value("Jazz")}},
         "", 0, "Jazz"},
        {"the first album title stays",
         {{"WM/AlbumTitle", 0, asfb::string_value("One")},
          {"WM/AlbumTitle", 0, asfb::string_value("Two")}},
         "One", 0, nullptr},
        {"names compare case-sensitively", {{"wm/year", 0, asfb::string_value("1999")}}, "", 0,
         nullptr},
        {"a 120-byte name is skipped and the next is read",
         {{std::string(59, 'N'), 0, asfb::string_value("x")},
          {"WM/Year", 0, asfb::string_value("1984")}},
         "", 1984, nullptr},
        {"an album of 0 bytes has no block", {{"WM/AlbumTitle", 0, {}}}, "", 0, nullptr},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        Opening op(file_with({asfb::extended_content_description(c.descriptors),
                              asfb::audio_stream(1)}));
        ASSERT_EQ(op.o.rc, HOVA_OK);
        EXPECT_EQ(utf16_payload(op.d()->albumTitle), c.album);
        if (!*c.album) {
            EXPECT_EQ(op.d()->albumTitle.payload, nullptr);
        }
        EXPECT_EQ(op.d()->year, c.year);
        if (c.genre) {
            ASSERT_NE(op.d()->genre, nullptr);
            EXPECT_STREQ(op.d()->genre, c.genre);
        } else {
            EXPECT_EQ(op.d()->genre, nullptr);
        }
        EXPECT_TRUE(op.o.close_clean());
    }
}

TEST(Metadata, GenreConversionLimits) {
    const std::string e_acute = "\xC3\xA9";    // U+00E9: 2 bytes in UTF-8
    const std::string euro = "\xE2\x82\xAC";   // U+20AC: 3 bytes in UTF-8
    auto repeat = [](const std::string& s, int n) {
        std::string out;
        for (int i = 0; i < n; ++i) out += s;
        return out;
    };
    const struct {
        const char* what;
        Bytes value;
        bool converted;
        std::string utf8;
    } cases[] = {
        {"600 ASCII characters fit", asfb::string_value(repeat("a", 600)), true, repeat("a", 600)},
        {"499 two-byte characters fit", asfb::string_value(repeat(e_acute, 499)), true,
         repeat(e_acute, 499)},
        {"500 two-byte characters need 1001 bytes", asfb::string_value(repeat(e_acute, 500)), false,
         ""},
        {"a euro sign needs more than its UTF-16 size", asfb::utf16le(euro, false), false, ""},
        {"a terminated euro sign fits", asfb::string_value(euro), true, euro},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        testenv::LogCapture log;
        Opening op(file_with({asfb::extended_content_description({{"WM/Genre", 0, c.value}}),
                              asfb::audio_stream(1)}));
        ASSERT_EQ(op.o.rc, HOVA_OK);
        ASSERT_NE(op.d()->genre, nullptr);
        const bool logged = log.contains("can't not convert");
        EXPECT_EQ(logged, !c.converted);
        if (c.converted) {
            EXPECT_EQ(std::string(op.d()->genre), c.utf8);
        } else {
            EXPECT_EQ(0, std::memcmp(op.d()->genre, c.value.data(), c.value.size()))
                << "left as UTF-16LE";
        }
        EXPECT_TRUE(op.o.close_clean());
    }
}

TEST(Metadata, ContentDescription) {
    const uint16_t both_fit[5] = {12, 4, 0, 0, 0};
    const Bytes strings = [] {
        Bytes b = asfb::utf16le("Hello");
        const Bytes a = asfb::utf16le("A");
        b.insert(b.end(), a.begin(), a.end());
        return b;
    }();
    const uint16_t too_long[5] = {36, 0, 0, 0, 0};  // the whole object's size
    const uint16_t sum_too_long[5] = {20, 20, 0, 0, 0};
    const struct {
        const char* what;
        Bytes object;
        const char* title;
        const char* author;
    } cases[] = {
        {"title and author", asfb::content_description({"Song", "Band", "(c)", "desc", "PG"}),
         "Song", "Band"},
        {"raw lengths", asfb::content_description_raw(both_fit, strings), "Hello", "A"},
        {"title of 0 bytes", asfb::content_description({"", "Band", "", "", ""}), nullptr, "Band"},
        {"title length equal to the object size",
         asfb::content_description_raw(too_long, Bytes(2, 0)), nullptr, nullptr},
        {"title and author together longer than the object",
         asfb::content_description_raw(sum_too_long, Bytes(24, 0x41)), nullptr, nullptr},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        testenv::LogCapture log;
        Opening op(file_with({c.object, asfb::audio_stream(1)}));
        ASSERT_EQ(op.o.rc, HOVA_OK);
        EXPECT_TRUE(log.contains("[ASF] length for title "));
        hova_program_info_st p{};
        ASSERT_EQ(hova_asff_demuxer.get_info(op.d(), HOVA_STREAM_PROG, 0, &p), HOVA_OK);
        for (auto [info, want] : {std::pair{&p.title, c.title}, std::pair{&p.artist, c.author}}) {
            if (want) {
                EXPECT_EQ(utf16_payload(*info), want);
                EXPECT_EQ(info->stringformat, HOVA_STRING_FORMAT_UTF16LE);
            } else {
                EXPECT_EQ(info->payload, nullptr);
                EXPECT_EQ(info->size, 0u);
            }
        }
        EXPECT_EQ(op.d()->s.num_streams[AUD], 1) << "the walk went on at the object's end";
        EXPECT_TRUE(op.o.close_clean());
    }
}

// Entries whose lengths run past their object end that object's walk; the
// header walk goes on behind the object.
TEST(Metadata, EntriesRunningPastTheirObject) {
    Descriptor overrun("WM/AlbumTitle", 0, asfb::string_value("Album"));
    Bytes ecd = asfb::extended_content_description({overrun, {"WM/Year", 0, asfb::string_value("2000")}});
    // Value length of the first descriptor: after count(2), name length(2),
    // name (28 bytes), type(2).
    // A length below the object's size but beyond what is left of it.
    const size_t vlen_at = 24 + 2 + 2 + 28 + 2;
    const size_t v = ecd.size() - 10;
    ecd[vlen_at] = static_cast<uint8_t>(v);
    ecd[vlen_at + 1] = static_cast<uint8_t>(v >> 8);
    Bytes lib = asfb::metadata_library({{0, 0, "WM/Picture", 1, asfb::picture_value(3, "", "", Bytes(40, 1))}});
    lib[24 + 2 + 8] = 0xFF;  // data length far beyond the object
    const struct {
        const char* what;
        Bytes object;
    } cases[] = {
        {"extended content description value", ecd},
        {"metadata library record", asfb::header_extension({lib})},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        Opening op(file_with({c.object, asfb::audio_stream(1)}));
        ASSERT_EQ(op.o.rc, HOVA_OK);
        EXPECT_EQ(op.d()->albumTitle.payload, nullptr);
        EXPECT_EQ(op.d()->year, 0);
        EXPECT_EQ(op.d()->cover.payload, nullptr);
        EXPECT_EQ(op.d()->s.num_streams[AUD], 1);
        EXPECT_TRUE(op.o.close_clean());
    }
}

}  // namespace
