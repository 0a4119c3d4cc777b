// Running asfdump from the tests: its exit status, standard output and
// standard error, its JSON lines, files written for it, and ffprobe's
// reference beside a corpus file.
#pragma once

#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdio>
#include <fstream>
#include <map>
#include <nlohmann/json.hpp>
#include <sstream>
#include <string>
#include <vector>

#include "test_env.h"

namespace cli {

using nlohmann::json;

struct Result {
    int status;
    std::string out, err;
};

inline std::string quoted(const std::string& path) { return "'" + path + "'"; }

inline Result asfdump(const std::string& args) {
    const std::string err_path = testing::TempDir() + "asfdump_stderr_" + std::to_string(::getpid());
    Result r{};
    r.status = testenv::run_command(testenv::asfdump_path() + " " + args + " 2>" + quoted(err_path), &r.out);
    std::ifstream f(err_path);
    r.err.assign(std::istreambuf_iterator<char>(f), std::istreambuf_iterator<char>());
    std::remove(err_path.c_str());
    return r;
}

// One JSON object a line of `asfdump ARGS` (frames: its events), which must succeed.
inline std::vector<json> json_lines(const std::string& args) {
    const Result r = asfdump(args);
    EXPECT_EQ(r.status, 0) << args << "\n" << r.err;
    std::vector<json> out;
    std::istringstream lines(r.out);
    for (std::string line; std::getline(lines, line);) out.push_back(json::parse(line));
    return out;
}

// The times of the frame events among `events`.
inline std::vector<int64_t> frame_times(const std::vector<json>& events) {
    std::vector<int64_t> times;
    for (const json& e : events)
        if (e["event"] == "frame") times.push_back(e["pts"]);
    return times;
}

// Writes `bytes` to a file in the test's temporary folder and returns its path.
inline std::string write_temp(const std::string& name, const std::vector<uint8_t>& bytes) {
    const std::string path = testing::TempDir() + name;
    std::ofstream(path, std::ios::binary).write(reinterpret_cast<const char*>(bytes.data()),
                                                static_cast<std::streamsize>(bytes.size()));
    return path;
}

// ffprobe's streams and packets beside a corpus file; null where there is none.
inline json ffprobe(const std::string& path) {
    std::ifstream f(path + ".ffprobe.json");
    return f ? json::parse(f) : json();
}

// ffprobe's packets by codec type, in file order, without the last of each
// stream (the plug-in keeps it pending at the end of the data).
inline std::map<std::string, std::vector<json>> delivered_packets(const json& ref) {
    std::map<int, std::string> type;
    for (const json& st : ref["streams"]) type[st["index"]] = st["codec_type"];
    std::map<std::string, std::vector<json>> out;
    for (const json& p : ref["packets"]) out[type[p["stream"]]].push_back(p);
    for (auto& [t, list] : out) list.pop_back();
    return out;
}

}  // namespace cli
