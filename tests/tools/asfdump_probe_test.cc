// asfdump probe through the shared library, as other tools call it: real ASF
// files answer 1, other containers 0, and the exit status follows the contract.
#include <gtest/gtest.h>
#include <stdlib.h>

#include <cstdlib>
#include <string>

#include "test_env.h"

namespace {

std::string quote(const std::string& s) { return "'" + s + "'"; }

int asfdump(const std::string& args, std::string* out) {
    return testenv::run_command(testenv::asfdump_path() + " " + args + " 2>/dev/null", out);
}

TEST(AsfdumpProbe, EveryCorpusFileProbesOne) {
    const auto files = testenv::corpus_files();
    if (files.empty()) GTEST_SKIP() << "no corpus in " << testenv::corpus_dir();
    for (const std::string& f : files) {
        std::string out;
        EXPECT_EQ(asfdump("probe " + quote(f), &out), 0) << f;
        EXPECT_EQ(out, "1\n") << f;
    }
}

TEST(AsfdumpProbe, OtherContainersMadeByFfmpegProbeZero) {
    if (testenv::run_command("command -v ffmpeg >/dev/null", nullptr) != 0)
        GTEST_SKIP() << "ffmpeg not installed";
    char dir[] = "/tmp/plimo_probe_XXXXXX";
    ASSERT_NE(::mkdtemp(dir), nullptr);
    const std::string d = dir;
    const std::string gen = "ffmpeg -v error -y -f lavfi -i sine=frequency=440:duration=0.3 ";
    const std::string vgen =
        "ffmpeg -v error -y -f lavfi -i testsrc=size=64x48:rate=5:duration=0.4 ";
    struct Case {
        std::string file;
        std::string cmd;
    };
    const Case cases[] = {
        {d + "/a.mp3", gen + "-c:a libmp3lame " + d + "/a.mp3"},
        {d + "/a.wav", gen + d + "/a.wav"},
        {d + "/v.mp4", vgen + "-c:v mpeg4 " + d + "/v.mp4"},
        {d + "/a.asf", gen + "-c:a wmav2 " + d + "/a.asf"},
    };
    for (const Case& c : cases) {
        if (testenv::run_command(c.cmd + " >/dev/null 2>&1", nullptr) != 0) {
            ADD_FAILURE() << "ffmpeg could not make " << c.file;
            continue;
        }
        std::string out;
        EXPECT_EQ(asfdump("probe " + c.file, &out), 0) << c.file;
        const bool is_asf = c.file.substr(c.file.size() - 4) == ".asf";
        EXPECT_EQ(out, is_asf ? "1\n" : "0\n") << c.file;
    }
    testenv::run_command("rm -rf " + d, nullptr);
}

TEST(AsfdumpProbe, ExitStatusFollowsTheContract) {
    std::string out;
    EXPECT_EQ(asfdump("", &out), 2) << "no command";
    EXPECT_EQ(asfdump("probe", &out), 2) << "no file";
    EXPECT_EQ(asfdump("explode /dev/null", &out), 2) << "unknown command";
    EXPECT_EQ(asfdump("probe /dev/null --buffer fancy", &out), 2) << "bad option value";
    EXPECT_EQ(asfdump("probe /dev/null --thread", &out), 2) << "--thread needs the ring";
    EXPECT_EQ(asfdump("probe /nonexistent/x.wmv", &out), 3) << "unreadable file";
    EXPECT_EQ(asfdump("probe /tmp", &out), 3) << "a directory is not a readable file";
    EXPECT_EQ(asfdump("probe /dev/null", &out), 3) << "not a regular file";
    EXPECT_EQ(asfdump("probe /dev/null --plugin /nonexistent.so", &out), 1) << "no plug-in";
    // Asking for help is no usage error: the usage goes to standard output.
    for (const char* help : {"--help", "-h", "info /nonexistent/x.wmv --help"}) {
        EXPECT_EQ(asfdump(help, &out), 0) << help;
        EXPECT_EQ(out.rfind("usage: asfdump probe FILE\n", 0), 0u) << help;
    }
}

}  // namespace
