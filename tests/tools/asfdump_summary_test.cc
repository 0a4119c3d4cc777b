// The summary for a person (asfdump FILE) against the JSON record of
// `asfdump info` and the file's own description: every value it prints, on a
// builder file with two audio tracks and on every real file; one screen. On
// the real files the record itself against ffprobe and the file's header.
#include <gtest/gtest.h>

#include <regex>

#include "asf_builder.h"
#include "asf_packets.h"
#include "asfdump_cli.h"
#include "byte_reader.h"
#include "../../tools/asfdump/time_arg.h"

// Builder descriptions name only the fields that matter.
#pragma GCC diagnostic ignored "-Wmissing-field-initializers"

namespace {

using cli::json;
using cli::quoted;
using namespace asfb;

// The summary's rows, by label; stream and note rows in order.
struct Summary {
    size_t lines = 0;
    std::map<std::string, std::string> row;
    std::vector<std::string> streams, notes;
};

Summary summary(const std::string& path) {
    const cli::Result r = cli::asfdump(quoted(path));
    EXPECT_EQ(r.status, 0) << path << "\n" << r.err;
    Summary s;
    std::istringstream in(r.out);
    std::string line;
    std::getline(in, line);
    EXPECT_EQ(line, path);
    s.lines = 1;
    const std::regex row("  (\\w+) +(.*)");
    for (std::smatch m; std::getline(in, line); ++s.lines) {
        EXPECT_TRUE(std::regex_match(line, m, row)) << line;
        if (m[1] == "stream") s.streams.push_back(m[2]);
        else if (m[1] == "note") s.notes.push_back(m[2]);
        else s.row[m[1]] = m[2];
    }
    return s;
}

json info(const std::string& path) {
    const cli::Result r = cli::asfdump("info " + quoted(path) + " --streams 127");
    EXPECT_EQ(r.status, 0) << r.err;
    return json::parse(r.out);
}

std::string text_or_empty(const json& j) { return j.is_string() ? j.get<std::string>() : ""; }

// What every summary must agree on with the record; returns per stream
// (audio first) the channels and bit rate it printed, for the callers'
// own checks.
std::vector<std::pair<int, double>> check_against_record(const std::string& path, const Summary& s, const json& j) {
    const json& p = j["program"];
    EXPECT_LE(s.lines, 30u) << path;
    int64_t duration = -1;
    if (p["duration"] != 0) {
        EXPECT_TRUE(asfdump::parse_time_us(s.row.at("duration").c_str(), &duration)) << s.row.at("duration");
        EXPECT_NEAR(double(duration), p["duration"].get<double>(), 500) << path;
    }
    EXPECT_EQ(s.row.at("seekable").rfind(j["clip"]["seekable"] == 1 ? "yes" : "no", 0), 0u) << path;
    std::ifstream f(path, std::ios::binary | std::ios::ate);
    EXPECT_EQ(s.row.at("container").rfind("ASF, " + std::to_string(f.tellg()) + " bytes", 0), 0u);
    for (const char* tag : {"title", "artist", "album", "genre"})
        EXPECT_EQ(s.row.count(tag) ? s.row.at(tag) : "", text_or_empty(p[tag])) << tag << " " << path;
    EXPECT_EQ(s.row.count("year") ? s.row.at("year") : "0", std::to_string(p["year"].get<int>())) << path;
    const int cover = p["cover"]["length"];
    EXPECT_EQ(s.row.count("cover") ? s.row.at("cover").substr(s.row.at("cover").find(", ") + 2) : "",
              cover ? std::to_string(cover) + " bytes" + (cover >= 1024 ? s.row.at("cover").substr(s.row.at("cover").find(" (")) : "") : "");

    const std::regex audio("audio (\\d+): (\\w+), (\\d+) Hz, (\\d+) channels?, (?:([\\d.]+) kb/s|bit rate unknown)(?:, (\\w{3}))?, (active|not active.*) \\[ASF stream \\d+\\]");
    const std::regex video("video (\\d+): (\\w+), (\\d+)x(\\d+)(?:, ([\\d.]+) fps)?, (?:([\\d.]+) kb/s|bit rate unknown), (active|not active.*) \\[ASF stream \\d+\\]");
    std::vector<std::pair<int, double>> printed;
    size_t a = 0, v = 0;
    int active = 0;
    for (const std::string& line : s.streams) {
        std::smatch m;
        const bool is_audio = std::regex_match(line, m, audio);
        ASSERT_TRUE(is_audio || std::regex_match(line, m, video)) << line, printed;
        const json& rec = j[is_audio ? "audio" : "video"][is_audio ? a++ : v++];
        const double kbps = m[is_audio ? 5 : 6].matched ? std::stod(m[is_audio ? 5 : 6]) : 0;
        const bool on = m[7] == "active";
        EXPECT_EQ(std::stoi(m[1]), rec["index"]) << line;
        EXPECT_EQ(m[2], rec["codec_name"]) << line;
        if (is_audio) {
            EXPECT_EQ(std::stoi(m[3]), rec["sample_rate"]) << line;
            EXPECT_EQ(m[6].str(), rec["language"]) << line;
            printed.push_back({std::stoi(m[4]), kbps});
        } else {
            EXPECT_EQ(json({std::stoi(m[3]), std::stoi(m[4])}), json({rec["width"], rec["height"]})) << line;
            printed.push_back({0, kbps});
        }
        if (!on) continue;
        ++active;
        // The record's bit rate and frame rate are the active stream's.
        const json& act = j[is_audio ? "active_audio" : "active_video"];
        EXPECT_EQ(json({rec["codec"], rec[is_audio ? "sample_rate" : "width"]}),
                  json({act["codec"], act[is_audio ? "sample_rate" : "width"]})) << line;
        EXPECT_NEAR(kbps * 1000, act["bit_rate"].get<double>(), 50) << line;
        if (!is_audio && act["frame_rate_den"] != 0) {
            EXPECT_NEAR(std::stod(m[5]), act["frame_rate_num"].get<double>() / act["frame_rate_den"].get<double>(), 0.0005) << line;
        }
    }
    EXPECT_EQ(a, j["audio"].size()) << path;
    EXPECT_EQ(v, j["video"].size()) << path;
    EXPECT_EQ(active, int(!j["active_audio"].is_null()) + int(!j["active_video"].is_null())) << path;
    return printed;
}

// Two WMA2 tracks (English stereo, Spanish mono) and a WMV3 stream, tags, a
// JPEG cover and a simple index of 3 entries.
Bytes two_audio_tracks() {
    std::vector<Object> objects;
    for (uint32_t ms = 0, n = 0; ms < 3000; ms += 100, ++n) {
        objects.push_back({1, 3000 + ms, pattern(300, n), true});
        objects.push_back({2, 3000 + ms, pattern(200, 50 + n), true});
        objects.push_back({3, 3000 + ms, pattern(n % 10 ? 500 : 2000, 100 + n), n % 10 == 0});
    }
    File file;
    file.packets = mux(objects, 2048);
    FileProps fp;
    fp.packet_count = file.packets.size();
    fp.min_packet_size = fp.max_packet_size = 2048;
    fp.play_duration = 6000 * 10000ull;
    const Bytes jpeg = {0xFF, 0xD8, 0xFF, 0xE0, 1, 2, 3, 4, 5, 6};
    file.header_children = {
        file_properties(fp),
        header_extension({language_list({"en-US", "es"}),
                          extended_stream_properties({.bitrate = 64000, .stream_num = 1, .language_index = 0}),
                          extended_stream_properties({.bitrate = 32000, .stream_num = 2, .language_index = 1}),
                          extended_stream_properties({.bitrate = 250000, .stream_num = 3, .avg_time_per_frame = 400000})}),
        audio_stream(1, {.channels = 2, .sample_rate = 44100}),
        audio_stream(2, {.channels = 1, .sample_rate = 22050}),
        video_stream(3, {.width = 320, .height = 240}),
        content_description({"Two tracks", "The builder", "", "", ""}),
        extended_content_description({{"WM/AlbumTitle", 0, string_value("Tests")},
                                      {"WM/Year", 0, string_value("2007")},
                                      {"WM/Genre", 0, string_value("Jazz")},
                                      {"WM/Picture", 1, Writer().u8(3).u32(10).utf16("image/jpeg").utf16("").bytes(jpeg).out}})};
    file.trailing = {simple_index(10000000, {{0, 1}, {3, 1}, {6, 1}})};
    return build(file);
}

TEST(AsfdumpSummary, ShowsBothAudioTracksOfABuilderFile) {
    const std::string path = cli::write_temp("two_audio.asf", two_audio_tracks());
    const Summary s = summary(path);
    const auto printed = check_against_record(path, s, info(path));
    // Both tracks, with what the record does not carry: channels, each
    // stream's own bit rate; the last audio stream of the header is active.
    EXPECT_EQ(printed, (std::vector<std::pair<int, double>>{{2, 64.0}, {1, 32.0}, {0, 250.0}}));
    ASSERT_EQ(s.streams.size(), 3u);
    EXPECT_NE(s.streams[0].find(", eng, not active"), std::string::npos) << s.streams[0];
    EXPECT_NE(s.streams[1].find(", spa, active"), std::string::npos) << s.streams[1];
    EXPECT_EQ(s.row.at("cover"), "JPEG, 10 bytes");
    EXPECT_EQ(s.row.at("seekable"), "yes, through the simple index (3 entries, one every 0:00:01.000)");
    EXPECT_EQ(s.notes, std::vector<std::string>{"the plug-in plays the last audio and the last video stream of the header only"});
    // The framework's context holds two records: info shows what it holds.
    const json j = json::parse(cli::asfdump("info " + quoted(path)).out);
    EXPECT_EQ(json({j["audio"].size(), j["video"].size()}), json({1, 1}));
}

// Audio and video times more than 2 s apart anywhere in file order, as the
// plug-in's interleave check sees them (ffprobe's packet list).
bool badly_interleaved(const json& ref) {
    std::map<int, std::string> type;
    for (const json& st : ref["streams"]) type[st["index"]] = st["codec_type"];
    int64_t last[2] = {-1, -1};
    for (const json& p : ref["packets"]) {
        const std::string& t = type[p["stream"]];
        if ((t != "audio" && t != "video") || !p["pts_ms"].is_number()) continue;
        last[t == "video"] = p["pts_ms"];
        if (last[0] >= 0 && last[1] >= 0 && std::llabs(last[0] - last[1]) > 2000) return true;
    }
    return false;
}

// probe's yes, the record's streams, codecs, rates, sizes, languages and duration as
// ffprobe and the file properties have them, the summary's channels and notes
// as ffprobe's streams and packets show them; the damaged file fails to open,
// cleanly.
TEST(AsfdumpSummary, RecordAndSummaryAgreeWithFfprobeOnEveryRealFile) {
    static const std::map<std::string, std::string> kCodecs = {
        {"wmav1", "WMA1"}, {"wmav2", "WMA2"}, {"wmapro", "WMA3"}, {"wmalossless", "WMA_LOSSLESS"},
        {"wmavoice", "WMA_VOICE"}, {"mp3", "MP3"}, {"aac", "AAC"}, {"ac3", "AC3"}, {"vc1", "WVC1"},
        {"wmv1", "WMV1"}, {"wmv2", "WMV2"}, {"wmv3", "WMV3"}, {"msmpeg4v3", "DIV3"},
        {"msmpeg4v2", "MP42"}, {"mpeg4", "M4V"}};
    const auto files = testenv::corpus_files();
    if (files.empty()) GTEST_SKIP() << "no corpus in " << testenv::corpus_dir();
    for (const std::string& path : files) {
        SCOPED_TRACE(path);
        const cli::Result probe = cli::asfdump("probe " + quoted(path));
        EXPECT_EQ(std::make_pair(probe.status, probe.out), std::make_pair(0, std::string("1\n")));
        const json ref = cli::ffprobe(path);
        if (ref.is_null()) {  // the damaged file
            const cli::Result r = cli::asfdump("info " + quoted(path));
            EXPECT_EQ(r.status, 1);
            EXPECT_NE(r.err.find("HOVA_OpenFailed"), std::string::npos) << r.err;
            EXPECT_EQ(r.err.find("blocks still held"), std::string::npos) << r.err;
            continue;
        }
        const json j = info(path);
        std::map<std::string, std::vector<json>> streams;
        for (const json& st : ref["streams"])  // a cover picture is a video stream without a FourCC
            if (st.value("codec_tag_string", "") != "[0][0][0][0]") streams[st["codec_type"]].push_back(st);
        for (const char* kind : {"audio", "video"}) {
            const std::vector<json>& theirs = streams[kind];
            ASSERT_EQ(j[kind].size(), theirs.size()) << kind;
            EXPECT_EQ(j[std::string("active_") + kind].is_null(), theirs.empty()) << kind;
            for (size_t i = 0; i < theirs.size(); ++i) {
                const json& ours = j[kind][i];
                EXPECT_EQ(ours["codec_name"], kCodecs.at(theirs[i]["codec_name"])) << kind << i;
                if (theirs[i].contains("sample_rate"))
                    EXPECT_EQ(json({ours["sample_rate"], ours["language"]}),
                              json({std::stoi(theirs[i]["sample_rate"].get<std::string>()), theirs[i].value("language", "")})) << i;
                else
                    EXPECT_EQ(json({ours["width"], ours["height"]}), json({theirs[i]["width"], theirs[i]["height"]})) << i;
            }
        }
        // The announced duration: play duration less preroll, 0 for broadcast content.
        const std::vector<uint8_t> bytes = testenv::read_file_or_empty(path);
        const uint8_t* fp = bytes.data() + file_properties_body(bytes);
        const int64_t duration = j["program"]["duration"];
        EXPECT_EQ(duration, fp[64] & 1 ? 0 : int64_t(plimo::load_le<uint64_t>(fp + 40) / 10) - int64_t(plimo::load_le<uint64_t>(fp + 56) * 1000));
        const json& ff = ref["format"]["duration"];
        if (ff.is_null()) EXPECT_EQ(duration, 0) << "ffprobe sees no duration only in broadcast content";
        else EXPECT_GE(std::stod(ff.get<std::string>()) * 1e6 + 1000, double(duration)) << "ffprobe counts from each stream's first packet";

        const Summary s = summary(path);
        const auto printed = check_against_record(path, s, j);
        for (size_t i = 0; i < streams["audio"].size() && i < printed.size(); ++i)
            EXPECT_EQ(printed[i].first, streams["audio"][i]["channels"]) << "channels";
        auto noted = [&](const char* start) {
            return std::count_if(s.notes.begin(), s.notes.end(), [&](const std::string& n) { return n.rfind(start, 0) == 0; });
        };
        EXPECT_EQ(noted("broadcast capture without a packet count"), path.find("broadcast") != std::string::npos ? 1 : 0);
        EXPECT_EQ(noted("badly interleaved"), badly_interleaved(ref) ? 1 : 0);
    }
}

}  // namespace
