// The plain-C example host (examples/plimo_play.c) against the reference
// host: the same frames (times, sizes, CRC-32), configuration records,
// discards and ends, before and after a seek, in the cached and the threaded
// buffering; and the context size rule it applies for more than two streams.
#include <gtest/gtest.h>

#include <algorithm>

#include "asf_builder.h"
#include "asfdump_cli.h"
#include "kit_env.h"

namespace {

using Events = std::vector<std::string>;

// The example's lines for the host's events; its info and end lines are its own.
Events example_events(const std::string& out) {
    Events ev;
    std::istringstream in(out);
    for (std::string line; std::getline(in, line);)
        if (line.rfind("info ", 0) != 0 && line.rfind("end ", 0) != 0) ev.push_back(line);
    return ev;
}

// The same lines from asfdump's JSON; configuration records are dropped when
// asked (the example seeks after playing, when they have been sent).
Events asfdump_events(const std::string& args, bool configs) {
    Events ev;
    for (const cli::json& j : cli::json_lines(args)) {
        const std::string e = j["event"], type = j.value("type", "");
        if (e == "frame" || (e == "config" && configs))
            ev.push_back(e + " " + type + (e == "frame" ? " pts " + std::to_string(j["pts"].get<int64_t>()) : " codec " + std::to_string(j["codec"].get<int>())) +
                         " size " + std::to_string(j["size"].get<int>()) + " crc32 " + j["crc32"].get<std::string>());
        else if (e == "discard" || e == "eos")
            ev.push_back(e + " " + type);
        else if (e == "seek")
            ev.push_back("seek result " + std::to_string(j["result"].get<int>()) + " pts " + std::to_string(j["pts"].get<int64_t>()));
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
    Events expected = asfdump_events("frames" + file + buffering, true);
    const Events after = asfdump_events("frames" + file + buffering + " --seek " + std::to_string(c.seek_us), false);
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
    const std::string path = cli::write_temp("two_audio.asf", asfb::build(f));
    for (const auto& [streams, audio] : {std::pair{2, 1}, std::pair{3, 2}, std::pair{4, 2}}) {
        const std::string out = run(kitenv::example_path() + " --streams " + std::to_string(streams) + " " +
                                    testenv::plugin_path() + " " + path + " 2>/dev/null");
        EXPECT_EQ(out.substr(0, out.find('\n')),
                  "info audio " + std::to_string(audio) + " video 1 duration 2000000 seekable 1")
            << streams << " streams";
    }
}

}  // namespace
