// asfdump frames as scripts read it: one JSON line per host event, frames with
// ffprobe's times, sizes and CRC-32s, play options that cut the list short.
#include <gtest/gtest.h>

#include <fstream>
#include <nlohmann/json.hpp>
#include <sstream>

#include "test_env.h"

namespace {

using nlohmann::json;

// The events of `asfdump frames FILE ARGS`, one JSON object a line, and how many are frames.
std::pair<std::vector<json>, long> frames(const std::string& file, const std::string& args) {
    std::string out;
    EXPECT_EQ(testenv::run_command(testenv::asfdump_path() + " frames '" + file + "' " + args + " 2>/dev/null", &out), 0);
    std::vector<json> events;
    std::istringstream lines(out);
    for (std::string line; std::getline(lines, line);) events.push_back(json::parse(line));
    return {events, std::count_if(events.begin(), events.end(), [](const json& e) { return e["event"] == "frame"; })};
}

TEST(AsfdumpFrames, PrintsTheHostsEventsAsTheContractSays) {
    REQUIRE_CORPUS_FILE(path, "moon-timecode-short.wmv");  // one WMV2 stream, no compressed payloads
    const json packets = json::parse(std::ifstream(path + ".ffprobe.json"))["packets"];
    const auto [all, count] = frames(path, "");
    ASSERT_EQ(size_t(count) + 1, packets.size()) << "every packet but the pending last";
    EXPECT_EQ(json({all[0]["event"], all[0]["codec_name"]}), json({"config", "WMV2"}));
    for (size_t i = 1; i <= size_t(count); ++i)
        EXPECT_EQ(json({all[i]["pts"], all[i]["size"], all[i]["crc32"]}),
                  json({packets[i - 1]["pts_ms"].get<int64_t>() * 1000, packets[i - 1]["size"], packets[i - 1]["crc32"]})) << i;
    for (const auto& [args, want] : {std::pair{"", count}, {"--max-frames 5", 5L}, {"--no-video --buffer ring --thread", 0L}}) {
        const auto [events, n] = frames(path, args);
        EXPECT_EQ(n, want) << args;
        EXPECT_EQ(json({events.back()["event"], events.back()["blocks_outstanding"]}), json({"end", 0})) << args;
    }
}

}  // namespace
