// The version the plug-in carries (its note, its SONAME, asfdump --version)
// agrees with the project's, and an install into a fresh prefix is enough to
// build and run the example host with pkg-config alone.
#include <gtest/gtest.h>

#include <filesystem>
#include <string>

#include "kit_env.h"
#include "test_env.h"

namespace {

namespace fs = std::filesystem;

std::string output_of(const std::string& cmd) {
    std::string out;
    EXPECT_EQ(testenv::run_command(cmd, &out), 0) << cmd;
    while (!out.empty() && out.back() == '\n') out.pop_back();
    return out;
}

TEST(Version, NoteSonameAndAsfdumpAgreeWithTheProjectVersion) {
    const std::string so = testenv::plugin_path();
    const std::string note = "{\"name\":\"plimo_asf\",\"version\":\"" PLIMO_PROJECT_VERSION "\"}";
    EXPECT_EQ(output_of("readelf -nW " + so + " | sed -n 's/.*Packaging Metadata: //p'"), note);
    EXPECT_EQ(output_of("strings " + so + " | grep -F '\"version\":'"), note);
    EXPECT_EQ(output_of("readelf -dW " + so + " | sed -n 's/.*Library soname: \\[\\(.*\\)\\]/\\1/p'"),
              "libplimo_asf.so." PLIMO_VERSION_MAJOR);
    EXPECT_EQ(output_of(testenv::asfdump_path() + " --version --plugin " + so),
              "asfdump " PLIMO_PROJECT_VERSION "\nlibplimo_asf " PLIMO_PROJECT_VERSION " (" + so + ")");
}

TEST(Install, LibraryHeadersAndPkgConfigAreEnoughToBuildTheExample) {
    const std::string prefix = kitenv::temp_dir() + "/prefix";
    ASSERT_EQ(testenv::run_command(std::string(PLIMO_CMAKE) + " --install " PLIMO_BINARY_DIR " --prefix " +
                                       prefix + " >/dev/null",
                                   nullptr),
              0);
    // pkg-config finds the prefix from where its file is: nothing else is set.
    std::string pc;
    for (const auto& e : fs::recursive_directory_iterator(prefix))
        if (e.path().filename() == "plimo_asf.pc") pc = e.path().parent_path().string();
    ASSERT_FALSE(pc.empty()) << "no plimo_asf.pc under " << prefix;
    const std::string pkg = "PKG_CONFIG_PATH=" + pc + " pkg-config ";
    EXPECT_EQ(output_of(pkg + "--modversion plimo_asf"), PLIMO_PROJECT_VERSION);

    const fs::path plugin = output_of(pkg + "--variable=plugin plimo_asf");
    const fs::path include = output_of(pkg + "--variable=includedir plimo_asf");
    EXPECT_EQ(include.filename(), "plimo_asf");
    for (const char* h : {"hova_dmx.h", "hova_codec.h", "cb_io.h", "asf_demuxer.h", "sys_demuxer.h", "cb_buffer.h"})
        EXPECT_TRUE(fs::is_regular_file(include / h)) << h;
    // The framework's name, the SONAME link and the versioned file.
    EXPECT_TRUE(fs::is_symlink(plugin));
    EXPECT_TRUE(fs::is_symlink(plugin.string() + "." PLIMO_VERSION_MAJOR));
    EXPECT_TRUE(fs::is_regular_file(plugin.string() + "." PLIMO_PROJECT_VERSION));

    // The example, compiled as plain C11 against the installed headers,
    // plays the sample through the installed plug-in as it does through the
    // built one.
    const std::string exe = kitenv::temp_dir() + "/plimo_play_installed";
    ASSERT_EQ(testenv::run_command(std::string(PLIMO_KIT_CC) + " -std=c11 -pedantic -Wall -Werror " PLIMO_KIT_CFLAGS
                                       " " PLIMO_SOURCE_DIR "/examples/plimo_play.c -o " + exe + " $(" + pkg +
                                       "--cflags --libs plimo_asf)",
                                   nullptr),
              0);
    const std::string sample = kitenv::temp_dir() + "/install_sample.asf";
    ASSERT_EQ(testenv::run_command(kitenv::make_sample_path() + " " + sample, nullptr), 0);
    const std::string built = output_of(kitenv::example_path() + " " + testenv::plugin_path() + " " + sample +
                                        " 1000000 2>/dev/null");
    EXPECT_EQ(output_of(exe + " " + plugin.string() + " " + sample + " 1000000 2>/dev/null"), built);
    EXPECT_NE(built.find("\nend result 8 blocks 0"), std::string::npos);
}

}  // namespace
