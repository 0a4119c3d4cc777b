// asfdump frames as scripts read it: one JSON line per host event, frames with
// ffprobe's times, sizes and CRC-32s, play options that cut the list short.
#include <gtest/gtest.h>

#include <fstream>
#include <nlohmann/json.hpp>
#include <sstream>

#include "test_env.h"

namespace {

using nlohmann::json;

// The events of `asfdump frames FILE ARGS`, one JSON object a line.
std::vector<json> frames(const std::string& file, const std::string& args) {
    std::string out;
    EXPECT_EQ(testenv::run_command(testenv::asfdump_path() + " frames '" + file + "' " + args + " 2>/dev/null", &out), 0);
    std::vector<json> events;
    std::istringstream lines(out);
    for (std::string line; std::getline(lines, line);) events.push_back(json::parse(line));
    return events;
}

TEST(AsfdumpFrames, PrintsTheHostsEventsAsTheContractSays) {
    REQUIRE_CORPUS_FILE(path, "moon-timecode-short.wmv");  // one WMV2 stream, no compressed payloads
    const json ref = json::parse(std::ifstream(path + ".ffprobe.json"));
    const std::vector<json> all = frames(path, ""), five = frames(path, "--max-frames 5"),
                            none = frames(path, "--no-video --buffer ring --thread");
    ASSERT_GE(all.size(), 3u);
    EXPECT_EQ(all[0]["event"], "config");
    EXPECT_EQ(all[0]["codec_name"], "WMV2");
    std::vector<json> got;
    for (const json& e : all)
        if (e["event"] == "frame") got.push_back({e["pts"], e["size"], e["crc32"], e["call"] > 0});
    const json& packets = ref["packets"];
    ASSERT_EQ(got.size() + 1, packets.size()) << "every packet but the pending last";
    for (size_t i = 0; i < got.size(); ++i)
        EXPECT_EQ(got[i], json({packets[i]["pts_ms"].get<int64_t>() * 1000, packets[i]["size"], packets[i]["crc32"], true})) << i;
    for (const auto* list : {&all, &five, &none}) {
        EXPECT_EQ(list->back()["event"], "end");
        EXPECT_EQ(list->back()["blocks_outstanding"], 0);
    }
    EXPECT_EQ(std::count_if(five.begin(), five.end(), [](const json& e) { return e["event"] == "frame"; }), 5);
    EXPECT_EQ(std::count_if(none.begin(), none.end(), [](const json& e) { return e["event"] == "frame"; }), 0);
}

}  // namespace
