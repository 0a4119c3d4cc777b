// The header walk: which headers open, which are refused and with what code,
// what the file properties, extended stream properties and language list
// leave in the context. Every case ends with the host holding no block.
#include <gtest/gtest.h>

#include <cstring>
#include <functional>

#include "asf_open.h"
#include "test_env.h"

namespace {

using asfb::Bytes;
using testsupport::file_with;
using testsupport::open_file;
using testsupport::Opened;

Bytes wrap_ext(std::vector<Bytes> children) { return asfb::header_extension(children); }

TEST(HeaderWalk, RefusesMalformedHeaders) {
    asfb::FileProps mismatch;
    mismatch.max_packet_size = 3201;
    asfb::FileProps zero_packet;
    zero_packet.min_packet_size = zero_packet.max_packet_size = 0;
    zero_packet.packet_count = 0;

    auto with_header = [](const asfb::File& f, std::function<void(Bytes&)> edit) {
        Bytes b = asfb::build(f);
        edit(b);
        return b;
    };
    const asfb::File good = asfb::standard_file();
    const struct {
        const char* what;
        Bytes bytes;
        int rc;
    } cases[] = {
        {"only stream lies in the header extension",
         asfb::build(file_with({wrap_ext({asfb::audio_stream(1)})})), HOVA_OpenFailed},
        {"two file properties objects",
         asfb::build(file_with({asfb::file_properties({}), asfb::audio_stream(1)})),
         HOVA_OpenFailed},
        {"no file properties object",
         asfb::build([] {
             asfb::File f;
             f.header_children = {asfb::audio_stream(1)};
             return f;
         }()),
         HOVA_OpenFailed},
        {"min and max packet size differ",
         asfb::build(file_with({asfb::audio_stream(1)}, mismatch)), HOVA_OpenFailed},
        {"packet size 0", asfb::build(file_with({asfb::audio_stream(1)}, zero_packet)),
         HOVA_OpenFailed},
        {"header GUID off by its last byte", with_header(good, [](Bytes& b) { b[15] ^= 1; }),
         HOVA_OpenFailed},
        {"header reserved1 not 1", with_header(good, [](Bytes& b) { b[28] = 0; }),
         HOVA_OpenFailed},
        {"header reserved2 not 2", with_header(good, [](Bytes& b) { b[29] = 3; }),
         HOVA_OpenFailed},
        {"header size 30", with_header(good, [](Bytes& b) { b[16] = 30, b[17] = 0; }),
         HOVA_OpenFailed},
        {"header extension reserved value 5",
         asfb::build(file_with({asfb::header_extension({}, {}, 5), asfb::audio_stream(1)})),
         HOVA_OpenFailed},
        {"extended content description of size 0 (loops a naive walk)",
         asfb::build(file_with({asfb::extended_content_description({}, 0), asfb::audio_stream(1)})),
         HOVA_OpenFailed},
        {"input ends inside the header", [&] {
             Bytes b = asfb::build(good);
             b.resize(200);
             return b;
         }(),
         HOVA_EndOfStream},
        {"empty input", Bytes{}, HOVA_EndOfStream},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        Opened o = testsupport::open_bytes(c.bytes);
        EXPECT_EQ(o.rc, c.rc);
        EXPECT_TRUE(o.close_clean());
    }
}

TEST(HeaderWalk, HiddenStreamIsParsedAndLogged) {
    testenv::LogCapture log;
    Opened o = open_file(file_with({asfb::audio_stream(1), wrap_ext({asfb::video_stream(2)})}));
    ASSERT_EQ(o.rc, HOVA_OK);
    EXPECT_TRUE(log.contains("[ASF] found hidden stream!\n"));
    EXPECT_EQ(o.ctx()->s.num_streams[VID], 1);
    EXPECT_EQ(o.ctx()->stream_info[o.ctx()->s.active_stream[VID]].stream_num, 2);
    EXPECT_TRUE(o.close_clean());
}

TEST(HeaderWalk, FilePropertiesGiveGeometryAndDuration) {
    const struct {
        const char* what;
        uint32_t flags;
        uint64_t play, preroll;
        int64_t duration;
        bool broadcast_logged;
    } cases[] = {
        {"ordinary", 0x2, 50000000, 3000, 2000000, false},
        {"preroll above 32 bits keeps its full value", 0x2, 50000000, (1ull << 32) + 1000,
         5000000 - static_cast<int64_t>(((1ull << 32) + 1000) * 1000), false},
        {"broadcast", 0x1, 50000000, 3000, 0, true},
        {"broadcast and seekable", 0x3, 90000000, 0, 0, true},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        testenv::LogCapture log;
        asfb::FileProps fp;
        fp.flags = c.flags;
        fp.play_duration = c.play;
        fp.preroll = c.preroll;
        fp.packet_count = 3;
        fp.min_packet_size = fp.max_packet_size = 1000;
        Opened o = open_file(file_with({asfb::audio_stream(1)}, fp));
        ASSERT_EQ(o.rc, HOVA_OK);
        EXPECT_EQ(o.ctx()->s.duration, c.duration);
        EXPECT_EQ(o.ctx()->preroll, static_cast<uint32_t>(c.preroll));
        EXPECT_EQ(o.ctx()->packet_size, 1000u);
        EXPECT_EQ(o.ctx()->num_packets, 3u);
        EXPECT_EQ(log.contains("[ASF] Broadcast flag is set!\n"), c.broadcast_logged);
        EXPECT_EQ(o.ctx()->s.num_streams[AUD], 1) << "the rest of the header is parsed";
        EXPECT_TRUE(o.close_clean());
    }
}

TEST(HeaderWalk, ExtendedStreamPropertiesFillPerStreamTables) {
    asfb::ExtStreamProps es;
    es.stream_num = 2;
    es.bitrate = 480000;
    es.language_index = 1;
    es.avg_time_per_frame = 333667;

    asfb::ExtStreamProps s200 = es;
    s200.stream_num = 200;

    asfb::ExtStreamProps named = es;
    named.names = {{0, "Fourteen chars"}};  // 2 + 2 + 30 bytes of name
    asfb::ExtStreamProps with_pes = es;
    with_pes.ext_systems = {{asfb::guid_from_text("399595EC-8667-4E2D-8FDB-98814CE76C1E"), 10, {}}};

    const Bytes langs = asfb::language_list({"es", "en-US"});
    const struct {
        const char* what;
        Bytes ext;
        uint32_t bitrate2, frame2;
        const char* lang;
    } cases[] = {
        {"fixed body only", wrap_ext({langs, asfb::extended_stream_properties(es)}), 480000, 33366,
         "eng"},
        {"stream 200 changes no table", wrap_ext({langs, asfb::extended_stream_properties(s200)}),
         0, 0, "spa"},
        {"30 bytes of stream names are skipped",
         wrap_ext({asfb::extended_stream_properties(named), langs}), 480000, 33366, "eng"},
        {"payload extension system skipped",
         wrap_ext({asfb::extended_stream_properties(with_pes), langs}), 480000, 33366, "eng"},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        Opened o = open_file(file_with({c.ext, asfb::video_stream(2)}));
        ASSERT_EQ(o.rc, HOVA_OK);
        asf_demuxer_st* d = o.ctx();
        EXPECT_EQ(d->stream_bitrate[2], c.bitrate2);
        EXPECT_EQ(d->time_per_frame[2], c.frame2);
        const asf_stream_st& v = d->stream_info[d->s.active_stream[VID]];
        EXPECT_EQ(v.bitrate, c.bitrate2);
        ASSERT_NE(v.lang, nullptr);
        EXPECT_STREQ(v.lang, c.lang);
        EXPECT_TRUE(o.close_clean());
    }
}

// The names and payload extension systems behind the fixed body are walked
// by their counts; a stream properties object behind them is a hidden stream,
// anything else (or counts that do not fit the object) is skipped with the
// rest of the object.
TEST(HeaderWalk, ExtendedPropertiesTailIsWalkedByItsCounts) {
    const asfb::PayloadExtSystem sys{asfb::guid_from_text("399595EC-8667-4E2D-8FDB-98814CE76C1E"),
                                     0xFFFF, {}};
    auto ext = [](std::vector<asfb::PayloadExtSystem> systems,
                  std::vector<std::pair<uint16_t, std::string>> names, Bytes embedded,
                  Bytes raw = {}) {
        asfb::ExtStreamProps es;
        es.stream_num = 3;
        es.bitrate = 64000;
        es.ext_systems = std::move(systems);
        es.names = std::move(names);
        es.embedded_stream = std::move(embedded);
        es.raw_tail = std::move(raw);
        return asfb::extended_stream_properties(es);
    };
    // The name count (at body offset 60) raised past what the object holds.
    auto overcounted = [](Bytes object) {
        object[24 + 60] = 200;
        return object;
    };
    const Bytes other_object =
        asfb::object(asfb::guid_from_text("01020304-0506-0708-090A-0B0C0D0E0F10"), Bytes(60, 7));
    const struct {
        const char* what;
        Bytes ext;
        int audio_streams;
    } cases[] = {
        {"embedded stream right behind the body", ext({}, {}, asfb::audio_stream(3)), 2},
        {"four extension systems (88 bytes), nothing behind", ext({sys, sys, sys, sys}, {}, {}), 1},
        {"a name and four extension systems, then an embedded stream",
         ext({sys, sys, sys, sys}, {{0, "Audio"}}, asfb::audio_stream(3)), 2},
        {"another object behind the entries", ext({sys}, {}, {}, other_object), 1},
        {"fewer than 78 bytes behind the entries", ext({sys}, {}, {}, Bytes(77, 0)), 1},
        {"counts that run past the object", overcounted(ext({}, {}, asfb::audio_stream(3))), 1},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        Opened o = open_file(file_with({asfb::audio_stream(1), wrap_ext({c.ext, asfb::language_list({"en"})})}));
        ASSERT_EQ(o.rc, HOVA_OK);
        asf_demuxer_st* d = o.ctx();
        EXPECT_EQ(d->s.num_streams[AUD], c.audio_streams);
        EXPECT_EQ(d->stream_info[d->s.active_stream[AUD]].stream_num, c.audio_streams == 2 ? 3 : 1)
            << "the later stream is active";
        EXPECT_EQ(d->stream_bitrate[3], 64000u);
        EXPECT_STREQ(d->language_list[0], "en") << "the walk goes on behind the object";
        EXPECT_TRUE(o.close_clean());
    }
}

TEST(HeaderWalk, LanguageListEntries) {
    std::vector<std::string> many;
    for (int i = 0; i < 130; ++i) many.push_back(i == 129 ? "de" : "fr");
    const struct {
        const char* what;
        Bytes list;
        uint16_t ext_lang_index;  // 0xFFFF: no extended stream properties
        const char* slot0;
        const char* lang;
    } cases[] = {
        {"en-US gives e and n", asfb::language_list({"en-US"}), 0xFFFF, "en", "eng"},
        {"a stream without extended properties takes entry 0", asfb::language_list({"de", "fr"}),
         0xFFFF, "de", "ger"},
        {"index into the list", asfb::language_list({"de", "fr"}), 1, "de", "fre"},
        {"index past the list", asfb::language_list({"de"}), 5, "de", nullptr},
        {"one-byte identifier", asfb::language_list({""}), 0xFFFF, "", nullptr},
        {"entries past 128 are read over", asfb::language_list(many), 129, "fr", nullptr},
        {"upper case is not a code", asfb::language_list({"EN"}), 0xFFFF, "EN", nullptr},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        std::vector<Bytes> children = {c.list};
        if (c.ext_lang_index != 0xFFFF) {
            asfb::ExtStreamProps es;
            es.stream_num = 1;
            es.language_index = c.ext_lang_index;
            children.push_back(asfb::extended_stream_properties(es));
        }
        Opened o = open_file(file_with({wrap_ext(children), asfb::audio_stream(1)}));
        ASSERT_EQ(o.rc, HOVA_OK);
        EXPECT_STREQ(o.ctx()->language_list[0], c.slot0);
        const asf_stream_st& a = o.ctx()->stream_info[0];
        if (c.lang) {
            ASSERT_NE(a.lang, nullptr);
            EXPECT_STREQ(a.lang, c.lang);
        } else {
            EXPECT_EQ(a.lang, nullptr);
        }
        EXPECT_TRUE(o.close_clean());
    }
}

TEST(HeaderWalk, NoLanguageListGivesNoLanguage) {
    Opened o = open_file(file_with({asfb::audio_stream(1)}));
    ASSERT_EQ(o.rc, HOVA_OK);
    EXPECT_EQ(o.ctx()->stream_info[0].lang, nullptr);
    EXPECT_TRUE(o.close_clean());
}

// Every object the walk reads, with its size field replaced by values that
// break naive arithmetic. None may crash, loop or leak. A size below the
// object's header never opens; a size above the real one fails (the walk
// runs out of header or of input, or the host cannot give a block that
// large); a smaller size that still covers a whole header may describe a
// well-formed shorter object, followed by bytes the walk steps over.
TEST(HeaderWalk, HostileSizeFieldsNeverOpenOrLeak) {
    asfb::ExtStreamProps es;
    const uint64_t sizes[] = {0, 1, 23, 24, 25, 45, (1ull << 32) - 1, 1ull << 32,
                              (1ull << 32) + 24, (1ull << 63), ~0ull - 23, ~0ull};
    using Make = std::function<Bytes(std::optional<uint64_t>)>;
    const struct {
        const char* what;
        Make object;
        bool in_extension;
    } objects[] = {
        {"file properties", [](auto s) { return asfb::file_properties({}, s); }, false},
        {"stream properties",
         [](auto s) {
             asfb::StreamProps sp;
             sp.type_specific = asfb::waveformatex({});
             return asfb::stream_properties(sp, s);
         },
         false},
        {"header extension", [](auto s) { return asfb::header_extension({}, s); }, false},
        {"content description",
         [](auto s) { return asfb::content_description({"t", "a", "", "", ""}, s); }, false},
        {"extended content description",
         [](auto s) {
             return asfb::extended_content_description({{"WM/Year", 0, asfb::string_value("1")}},
                                                       s);
         },
         false},
        {"unknown object",
         [](auto s) {
             return asfb::object(asfb::guid_from_text("01020304-0506-0708-090A-0B0C0D0E0F10"),
                                 Bytes(8, 0), s);
         },
         false},
        {"extended stream properties", [&](auto s) { return asfb::extended_stream_properties(es, s); },
         true},
        {"language list", [](auto s) { return asfb::language_list({"en"}, s); }, true},
        {"metadata library",
         [](auto s) { return asfb::metadata_library({{0, 0, "WM/Picture", 1, Bytes(10, 1)}}, s); },
         true},
        {"hidden stream properties",
         [](auto s) {
             asfb::StreamProps sp;
             sp.type_specific = asfb::waveformatex({});
             return asfb::stream_properties(sp, s);
         },
         true},
    };
    const std::optional<uint64_t> header_sizes[] = {std::nullopt, ~0ull};
    for (const auto& ob : objects) {
        for (uint64_t size : sizes) {
            for (const auto& hs : header_sizes) {
                SCOPED_TRACE(std::string(ob.what) + " size " + std::to_string(size) +
                             (hs ? " in an endless header" : ""));
                std::vector<Bytes> children = {asfb::file_properties({})};
                if (ob.in_extension) children.push_back(asfb::header_extension({ob.object(size)}));
                else children.push_back(ob.object(size));
                children.push_back(asfb::audio_stream(1));
                Bytes bytes = asfb::header_object(children, hs);
                const Bytes data = asfb::data_object({asfb::filler_packet(3200)});
                bytes.insert(bytes.end(), data.begin(), data.end());
                Opened o = testsupport::open_bytes(bytes);
                const uint64_t real = ob.object(std::nullopt).size();
                if (o.rc == HOVA_OK) {
                    EXPECT_GE(size, 24u);
                    EXPECT_LE(size, real);
                } else {
                    EXPECT_TRUE(o.rc == HOVA_OpenFailed || o.rc == HOVA_EndOfStream ||
                                o.rc == HOVA_NotEnoughMemory)
                        << host::errno_name(o.rc);
                }
                EXPECT_TRUE(o.close_clean());
            }
        }
    }
}

}  // namespace
