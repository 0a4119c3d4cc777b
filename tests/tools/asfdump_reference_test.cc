// asfdump frames and stats against ffprobe's packet lists: frames with
// ffprobe's times, sizes and CRC-32s and play options that cut the list
// short; per stream the frame count, first and last time, largest gap, the
// key frames (found through thumbnail mode) and the simple index checked by
// seeking.
#include <gtest/gtest.h>

#include <regex>
#include <set>

#include "asfdump_cli.h"
#include "../../tools/asfdump/time_arg.h"

namespace {

using cli::json;

TEST(AsfdumpFrames, PrintsTheHostsEventsAsTheContractSays) {
    REQUIRE_CORPUS_FILE(path, "moon-timecode-short.wmv");  // one WMV2 stream, no compressed payloads
    const std::vector<json> packets = cli::delivered_packets(cli::ffprobe(path))["video"];
    const std::vector<json> all = cli::json_lines("frames " + cli::quoted(path));
    ASSERT_EQ(cli::frame_times(all).size(), packets.size());
    EXPECT_EQ(json({all[0]["event"], all[0]["codec_name"]}), json({"config", "WMV2"}));
    for (size_t i = 1; i <= packets.size(); ++i)
        EXPECT_EQ(json({all[i]["pts"], all[i]["size"], all[i]["crc32"]}),
                  json({packets[i - 1]["pts_ms"].get<int64_t>() * 1000, packets[i - 1]["size"], packets[i - 1]["crc32"]})) << i;
    for (const auto& [args, want] : {std::pair{"", packets.size()}, {"--max-frames 5", 5ul}, {"--no-video --buffer ring --thread", 0ul}}) {
        const std::vector<json> events = cli::json_lines("frames " + cli::quoted(path) + " " + args);
        EXPECT_EQ(cli::frame_times(events).size(), want) << args;
        EXPECT_EQ(json({events.back()["event"], events.back()["blocks_outstanding"]}), json({"end", 0})) << args;
    }
}

int64_t us(const std::string& text) {
    int64_t v = -1;
    EXPECT_TRUE(asfdump::parse_time_us(text.c_str(), &v)) << text;
    return v;
}

TEST(AsfdumpStats, AgreesWithFfprobesPackets) {
    // Files without compressed payloads: one delivered frame per ffprobe packet.
    const std::pair<const char*, bool> files[] = {  // name, whether every index entry must check out
        {"moon-timecode-long-with-audio.wmv", true}, {"moon-timecode-short-vc1-adv.wmv", true},
        {"moon-elephants-dream-first-minute.wmv", false}, {"moon-miguel.wma", true}};
    const std::regex track("(audio|video) \\w+: (\\d+) frames, ([\\d:.]+) to ([\\d:.]+), [\\d.]+ kb/s, largest gap ([\\d:.]+) .*");
    const std::regex keys("  key frames: (\\d+).*");
    const std::regex index("index: (\\d+) entries, .*; (\\d+) lead to .*");
    for (const auto& [name, index_clean] : files) {
        const std::string path = testenv::corpus_file(name);
        if (path.empty()) continue;
        auto packets = cli::delivered_packets(cli::ffprobe(path));
        const cli::Result r = cli::asfdump("stats " + cli::quoted(path));
        ASSERT_EQ(r.status, 0) << r.err;
        std::istringstream lines(r.out);
        int tracks = 0;
        for (std::string line; std::getline(lines, line);) {
            std::smatch m;
            if (std::regex_match(line, m, track)) {
                ++tracks;
                const auto& list = packets[m[1]];
                std::vector<int64_t> pts;
                for (const json& p : list) pts.push_back(p["pts_ms"].get<int64_t>() * 1000);
                std::sort(pts.begin(), pts.end());
                int64_t gap = 0;
                for (size_t i = 1; i < pts.size(); ++i) gap = std::max(gap, pts[i] - pts[i - 1]);
                EXPECT_EQ(std::stoul(m[2]), list.size()) << line;
                EXPECT_EQ(json({us(m[3]), us(m[4]), us(m[5])}), json({pts.front(), pts.back(), gap})) << line;
            } else if (std::regex_match(line, m, keys)) {
                std::set<int64_t> want;
                for (const json& p : packets["video"])
                    if (p["key"] == true || p["key"] == 1) want.insert(p["pts_ms"].get<int64_t>());
                EXPECT_EQ(std::stoul(m[1]), want.size()) << name;
            } else if (std::regex_match(line, m, index)) {
                EXPECT_GT(std::stoi(m[1]), 0) << line;
                if (index_clean) { EXPECT_EQ(m[2], m[1]) << line; }
            }
        }
        EXPECT_EQ(tracks, int(packets.count("audio") + packets.count("video"))) << name << "\n" << r.out;
    }
}

}  // namespace
