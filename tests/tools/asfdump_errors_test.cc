// asfdump's exit statuses and messages: usage errors, files that cannot be
// read, files that are not ASF (and what they look like), a header cut short,
// seeks the plug-in refuses, and probe's answer in its status (for the real
// files: the summary test).
#include <gtest/gtest.h>

#include <sys/stat.h>

#include "asf_builder.h"
#include "asfdump_cli.h"

namespace {

using cli::asfdump;
using cli::quoted;
using Bytes = std::vector<uint8_t>;

Bytes text_bytes(const std::string& s) { return Bytes(s.begin(), s.end()); }

TEST(AsfdumpErrors, StatusAndMessageNameTheCause) {
    const std::string sample = cli::write_temp("sample.asf", asfb::build(asfb::standard_file()));
    Bytes cut = testenv::read_file_or_empty(sample);
    cut.resize(200);  // inside the header object
    Bytes ts(376, 0);
    ts[0] = ts[188] = 0x47;
    const std::string bad_args = quoted(sample) + " --max-frames 1";
    const struct {
        std::string args;
        int status;
        std::string err;  // a part of the message on stderr
    } cases[] = {
        {"", 2, "missing file"},
        {"probe", 2, "missing file after probe"},
        {"explode " + quoted(sample), 2, "unknown command explode"},
        {"info /dev/null --buffer fancy", 2, "--buffer takes cache, none or ring"},
        {"info /dev/null --thread", 2, "--thread needs --buffer ring"},
        {"frames " + quoted(sample) + " --seek 30x", 2, "bad --seek 30x"},
        {"frames " + quoted(sample) + " --resync 1:75", 2, "bad --resync"},
        {"info " + quoted(sample) + " --streams 128", 2, "bad --streams"},
        {"/nonexistent/x.wmv", 3, "cannot read /nonexistent/x.wmv: no such file"},
        {"info " + testing::TempDir(), 3, "it is a directory"},
        {"probe /dev/null", 3, "not a regular file"},
        {"info " + quoted(sample) + " --plugin /nonexistent.so", 1, "nonexistent.so"},
        {quoted(cli::write_temp("empty.wmv", {})), 1, "HOVA_EndOfStream: " + testing::TempDir() + "empty.wmv: empty file"},
        {"info " + quoted(cli::write_temp("a.mp4", text_bytes(std::string("\0\0\0\x20" "ftypisom", 12) + std::string(64, 'x')))), 1,
         "not an ASF file: it looks like an MP4"},
        {quoted(cli::write_temp("a.mkv", text_bytes("\x1A\x45\xDF\xA3" + std::string(64, 'x')))), 1, "looks like a Matroska"},
        {"frames " + quoted(cli::write_temp("a.avi", text_bytes(std::string("RIFF\x10\0\0\0" "AVI LIST", 16) + std::string(64, 'x')))), 1,
         "looks like a RIFF file (AVI)"},
        {quoted(cli::write_temp("a.mpg", text_bytes(std::string("\0\0\x01\xBA", 4) + std::string(64, 'x')))), 1,
         "looks like an MPEG program stream"},
        {"stats " + quoted(cli::write_temp("a.ts", ts)), 1, "looks like an MPEG transport stream"},
        {quoted(cli::write_temp("a.txt", text_bytes("hello, world\n"))), 1, "not an ASF file (no ASF header object"},
        {"info " + quoted(cli::write_temp("cut.asf", cut)), 1, "truncated header: the header object needs"},
        {"frames " + bad_args + " --seek 1h", 4, "refused the seek"},
        {"frames " + bad_args + " --streams 0", 1, "HOVA_NotEnoughMemory"},
        {"probe " + quoted(cli::write_temp("b.mp4", text_bytes(std::string("\0\0\0\x20" "ftypisom", 12)))), 1, "looks like an MP4"},
        {"probe " + quoted(sample), 0, ""},
        {"--help", 0, ""},
        {"-h", 0, ""},
        {"info /nonexistent/x.wmv --help", 0, ""},  // help is no usage error: usage on stdout
    };
    for (const auto& c : cases) {
        const cli::Result r = asfdump(c.args);
        EXPECT_EQ(r.status, c.status) << c.args << "\n" << r.err;
        if (!c.err.empty()) { EXPECT_NE(r.err.find(c.err), std::string::npos) << c.args << "\n" << r.err; }
        if (c.status == 2) { EXPECT_NE(r.err.find("usage: asfdump FILE"), std::string::npos) << c.args; }
        if (c.args.rfind("probe ", 0) == 0 && c.status < 2) { EXPECT_EQ(r.out, c.status == 0 ? "1\n" : "0\n") << c.args; }
    }
    for (const char* help : {"--help", "-h"}) EXPECT_EQ(asfdump(help).out.rfind("usage: asfdump FILE", 0), 0u);
}

TEST(AsfdumpErrors, UnreadableFileIsSaidSo) {
    if (::geteuid() == 0) GTEST_SKIP() << "root reads every file";
    const std::string path = cli::write_temp("locked.asf", asfb::build(asfb::standard_file()));
    ::chmod(path.c_str(), 0);
    const cli::Result r = asfdump(quoted(path));
    EXPECT_EQ(r.status, 3);
    EXPECT_NE(r.err.find("permission denied"), std::string::npos) << r.err;
}

}  // namespace
