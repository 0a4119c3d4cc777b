// The plain-C example host (examples/plimo_play.c) against the reference
// host: the same frames (times, sizes, CRC-32), configuration records,
// discards and ends, before and after a seek, in the cached and the threaded
// buffering; and the context size rule it applies for more than two streams.
#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include <algorithm>
#include <cstdio>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include "asf_builder.h"
#include "kit_env.h"
#include "test_env.h"

namespace {

using Events = std::vector<std::string>;

// One comparable line per event of the example's output; info and end lines
// are the example's own and are left out.
Events example_events(const std::string& out) {
    Events ev;
    std::istringstream in(out);
    for (std::string line; std::getline(in, line);) {
        std::istringstream w(line);
        std::string kind, type, key, a, b, c;
        w >> kind;
        if (kind == "frame") {  // frame TYPE pts P size S crc32 C
            std::string pts, size, crc;
            w >> type >> key >> pts >> key >> size >> key >> crc;
            ev.push_back("frame " + type + " " + pts + " " + size + " " + crc);
        } else if (kind == "config") {  // config TYPE codec N size S crc32 C
            std::string codec, size, crc;
            w >> type >> key >> codec >> key >> size >> key >> crc;
            ev.push_back("config " + type + " " + codec + " " + size + " " + crc);
        } else if (kind == "discard" || kind == "eos") {
            w >> type;
            ev.push_back(kind + " " + type);
        } else if (kind == "seek") {  // seek result R pts P
            w >> key >> a >> key >> b;
            ev.push_back("seek " + a + " " + b);
        }
    }
    return ev;
}

// The same lines from asfdump's JSON; configuration records are dropped when
// asked (the example seeks after playing, when they have been sent).
Events asfdump_events(const std::string& out, bool configs) {
    Events ev;
    std::istringstream in(out);
    for (std::string line; std::getline(in, line);) {
        const auto j = nlohmann::json::parse(line);
        const std::string e = j["event"];
        if (e == "frame") {
            ev.push_back("frame " + j["type"].get<std::string>() + " " + std::to_string(j["pts"].get<int64_t>()) +
                         " " + std::to_string(j["size"].get<int>()) + " " + j["crc32"].get<std::string>());
        } else if (e == "config" && configs) {
            ev.push_back("config " + j["type"].get<std::string>() + " " + std::to_string(j["codec"].get<int>()) +
                         " " + std::to_string(j["size"].get<int>()) + " " + j["crc32"].get<std::string>());
        } else if (e == "discard" || e == "eos") {
            ev.push_back(e + " " + j["type"].get<std::string>());
        } else if (e == "seek") {
            ev.push_back("seek " + std::to_string(j["result"].get<int>()) + " " +
                         std::to_string(j["pts"].get<int64_t>()));
        }
    }
    return ev;
}

std::string run(const std::string& cmd) {
    std::string out;
    EXPECT_EQ(testenv::run_command(cmd, &out), 0) << cmd;
    return out;
}

struct Case {
    const char* name;
    std::string file;
    int64_t seek_us;
};

void expect_same_play(const Case& c, bool thread) {
    SCOPED_TRACE(std::string(c.name) + (thread ? " thread" : " cache"));
    const std::string file = " '" + c.file + "'";
    const std::string buffering = thread ? " --buffer ring --thread" : "";
    const std::string example =
        run(kitenv::example_path() + (thread ? " --thread " : " ") + testenv::plugin_path() + file + " " +
            std::to_string(c.seek_us) + " 2>/dev/null");
    Events expected = asfdump_events(run(testenv::asfdump_path() + " frames" + file + buffering), true);
    const Events after = asfdump_events(
        run(testenv::asfdump_path() + " frames" + file + buffering + " --seek " + std::to_string(c.seek_us)),
        false);
    ASSERT_GT(expected.size(), 4u);
    ASSERT_GT(after.size(), 2u);
    // At the end of the stream the last object of each stream is still a
    // pending frame at the host (nothing told that it was complete); the
    // seek gives it back, audio first.
    for (const char* type : {"audio", "video"})
        if (std::find(expected.begin(), expected.end(), std::string("eos ") + type) != expected.end())
            expected.push_back(std::string("discard ") + type);
    expected.insert(expected.end(), after.begin(), after.end());
    EXPECT_EQ(example_events(example), expected);
    EXPECT_NE(example.find("\nend result 8 blocks 0\n"), std::string::npos) << example.substr(example.size() - 200);
}

TEST(ExampleHost, DeliversWhatTheReferenceHostDeliversBeforeAndAfterASeek) {
    const std::string sample = kitenv::temp_dir() + "/sample.asf";
    ASSERT_EQ(testenv::run_command(kitenv::make_sample_path() + " " + sample, nullptr), 0);
    std::vector<Case> cases = {{"builder sample", sample, 1000000}};
    const std::string corpus = testenv::corpus_file("moon-timecode-long-with-audio.wmv");
    if (!corpus.empty()) cases.push_back({"corpus", corpus, 20000000});
    else std::printf("corpus file absent: the example runs on the builder sample only\n");
    for (const Case& c : cases)
        for (bool thread : {false, true}) expect_same_play(c, thread);
}

// min_context_size holds two stream records. A file with two audio streams
// and a video stream keeps one audio stream in it and both in twice that,
// the size the example allocates for three streams.
TEST(ExampleHost, ContextOfTwiceTheMinimumHoldsThreeStreams) {
    asfb::File f = asfb::standard_file();
    f.header_children.insert(f.header_children.begin() + 2, asfb::audio_stream(3));
    const std::string path = kitenv::temp_dir() + "/two_audio.asf";
    const asfb::Bytes bytes = asfb::build(f);
    std::ofstream(path, std::ios::binary).write(reinterpret_cast<const char*>(bytes.data()),
                                                static_cast<std::streamsize>(bytes.size()));
    for (const auto& [streams, audio] : {std::pair{2, 1}, std::pair{3, 2}, std::pair{4, 2}}) {
        const std::string out = run(kitenv::example_path() + " --streams " + std::to_string(streams) + " " +
                                    testenv::plugin_path() + " " + path + " 2>/dev/null");
        EXPECT_EQ(out.substr(0, out.find('\n')),
                  "info audio " + std::to_string(audio) + " video 1 duration 2000000 seekable 1")
            << streams << " streams";
    }
}

}  // namespace
