// asfdump frames: the JSON-lines contract other tools read.
#include <nlohmann/json.hpp>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <sstream>

#include "delivery_fixture.h"
#include "test_env.h"

namespace delivery {
namespace {

using json = nlohmann::ordered_json;  // keeps the field order of each line

std::string hex(uint32_t v) {
    char b[9];
    std::snprintf(b, sizeof b, "%08x", v);
    return b;
}

struct Dump {
    int status = -1;
    std::vector<json> lines;
};

class TempDir {
public:
    TempDir() {
        char tmpl[] = "/tmp/asfdump-frames-XXXXXX";
        path_ = mkdtemp(tmpl);
    }
    ~TempDir() { std::filesystem::remove_all(path_); }
    const std::string& path() const { return path_; }

private:
    std::string path_;
};

Dump run(const std::string& args) {
    std::string out;
    Dump d;
    const int rc = testenv::run_command(testenv::asfdump_path() + " frames " + args + " 2>/dev/null", &out);
    d.status = rc;
    std::istringstream in(out);
    for (std::string line; std::getline(in, line);) d.lines.push_back(json::parse(line));
    return d;
}

std::vector<asfb::Object> objects() {
    std::vector<asfb::Object> objs;
    for (uint32_t k = 0; k < 6; ++k) {
        objs.push_back({1, 1000 + 40 * k, asfb::pattern(100 + k, k)});
        objs.push_back({2, 1000 + 40 * k, asfb::pattern(900 + k, 50 + k), k % 3 == 0});
    }
    return objs;
}

TEST(AsfdumpFrames, PrintsEveryHostEventThenTheEnd) {
    TempDir dir;
    const auto objs = objects();
    const std::string file = dir.path() + "/a.asf";
    const Bytes bytes = av_file(asfb::mux(objs, 1024), 1024, 500);
    std::ofstream(file, std::ios::binary).write(reinterpret_cast<const char*>(bytes.data()),
                                                static_cast<std::streamsize>(bytes.size()));
    const Dump d = run(file);
    ASSERT_EQ(d.status, 0);
    ASSERT_GE(d.lines.size(), 5u);
    EXPECT_EQ(d.lines[0]["event"], "config");
    EXPECT_EQ(d.lines[0]["type"], "audio");
    EXPECT_EQ(d.lines[0]["call"], 1);
    EXPECT_EQ(d.lines[0]["codec_name"], "WMA2");
    EXPECT_EQ(d.lines[1]["type"], "video");
    EXPECT_EQ(d.lines[1]["codec_name"], "WMV3");
    std::vector<std::string> want_keys = {"call", "event", "type", "pts", "size", "crc32"};
    size_t audio = 0, video = 0;
    for (const json& j : d.lines) {
        if (j["event"] != "frame") continue;
        std::vector<std::string> keys;
        for (auto it = j.begin(); it != j.end(); ++it) keys.push_back(it.key());
        EXPECT_EQ(keys, want_keys);
        const size_t index = j["type"] == "audio" ? audio++ : video++;
        const asfb::Object& o = objs[2 * index + (j["type"] == "audio" ? 0 : 1)];
        EXPECT_EQ(j["pts"], (int64_t(o.pts_ms) - 500) * 1000);
        EXPECT_EQ(j["size"], o.data.size());
        EXPECT_EQ(j["crc32"], hex(crc(o.data)));
    }
    EXPECT_EQ(audio, 5u);
    EXPECT_EQ(video, 5u);
    const json& eos_a = d.lines[d.lines.size() - 3];
    const json& eos_v = d.lines[d.lines.size() - 2];
    EXPECT_EQ(eos_a["event"], "eos");
    EXPECT_EQ(eos_a["type"], "audio");
    EXPECT_EQ(eos_v["type"], "video");
    const json& end = d.lines.back();
    EXPECT_EQ(end["event"], "end");
    EXPECT_EQ(end["result"], HOVA_EndOfStream);
    EXPECT_EQ(end["blocks_outstanding"], 0);
    EXPECT_EQ(end["calls"], eos_a["call"]);
    EXPECT_EQ(end.size(), 4u);
}

TEST(AsfdumpFrames, PlayOptionsReachThePlugIn) {
    TempDir dir;
    const auto objs = objects();
    const std::string file = dir.path() + "/a.asf";
    const Bytes bytes = av_file(asfb::mux(objs, 1024), 1024);
    std::ofstream(file, std::ios::binary).write(reinterpret_cast<const char*>(bytes.data()),
                                                static_cast<std::streamsize>(bytes.size()));
    auto count = [](const Dump& d, const char* event, const char* type) {
        size_t n = 0;
        for (const json& j : d.lines)
            if (j["event"] == event && (!type || j["type"] == type)) ++n;
        return n;
    };
    // The input options are parsed by the setup info shares (asfdump_info_test.cc).
    const Dump no_audio = run(file + " --no-audio");
    EXPECT_EQ(count(no_audio, "frame", "audio"), 0u);
    EXPECT_EQ(count(no_audio, "config", "audio"), 0u);
    EXPECT_EQ(count(no_audio, "frame", "video"), 5u);
    const Dump no_video = run(file + " --no-video");
    EXPECT_EQ(count(no_video, "frame", "video"), 0u);
    EXPECT_EQ(count(no_video, "eos", "video"), 0u);

    const Dump three = run(file + " --max-frames 3");
    EXPECT_EQ(three.status, 0);
    EXPECT_EQ(count(three, "frame", nullptr), 3u);
    EXPECT_EQ(count(three, "eos", nullptr), 0u);
    EXPECT_EQ(three.lines.back()["result"], HOVA_OK);
    EXPECT_EQ(three.lines.back()["blocks_outstanding"], 0);

    // Key frames are objects 0 and 3 (1000 and 1120 ms); with a 100 ms
    // interval only the first and the next key frame 100 ms on are delivered.
    const Dump thumbs = run(file + " --thumbnail 100000");
    std::vector<int64_t> pts;
    for (const json& j : thumbs.lines)
        if (j["event"] == "frame" && j["type"] == "video") pts.push_back(j["pts"]);
    EXPECT_EQ(pts, (std::vector<int64_t>{1000000, 1120000}));

    // --dump-streams writes each stream's frames back to back.
    const Dump dumped = run(file + " --dump-streams " + dir.path());
    ASSERT_EQ(dumped.status, 0);
    Bytes want_audio;
    for (size_t k = 0; k + 1 < 6; ++k) want_audio.insert(want_audio.end(), objs[2 * k].data.begin(), objs[2 * k].data.end());
    EXPECT_EQ(testenv::read_file_or_empty(dir.path() + "/audio.bin"), want_audio);
    EXPECT_EQ(testenv::read_file_or_empty(dir.path() + "/video.bin").size(), 900u * 5 + 10);
}

// Open failures and unreadable files share the setup of asfdump info, whose
// exit statuses asfdump_info_test.cc checks; here the frames options.
TEST(AsfdumpFrames, AnOptionWithoutItsValueIsAUsageError) {
    TempDir dir;
    const std::string file = dir.path() + "/a.asf";
    std::ofstream(file) << "any bytes";
    EXPECT_EQ(run(file + " --max-frames").status, 2);
}

}  // namespace
}  // namespace delivery
