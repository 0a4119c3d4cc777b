// Shared helpers for the tests: where the real files are, reading files,
// running commands and capturing the plug-in's log.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace testenv {

// The corpus folder: $ASF_CORPUS, else ../shared/corpus beside the source tree.
std::string corpus_dir();
// Path of a corpus file, or "" when it is absent.
std::string corpus_file(const std::string& name);
// Every ASF file of the corpus (not the .json references), sorted.
std::vector<std::string> corpus_files();
bool read_file(const std::string& path, std::vector<uint8_t>* out);
std::vector<uint8_t> read_file_or_empty(const std::string& path);
// Path of the built plug-in and of asfdump.
std::string plugin_path();
std::string asfdump_path();
// Runs a shell command, returning its exit status and standard output.
int run_command(const std::string& cmd, std::string* out);

// While alive, every log message of the plug-in is recorded here instead of
// being written to stderr.
class LogCapture {
public:
    struct Line { int priority; std::string tag, text; };
    LogCapture();
    ~LogCapture();
    LogCapture(const LogCapture&) = delete;
    const std::vector<Line>& lines() const { return lines_; }
    bool contains(const std::string& text) const;
    void clear() { lines_.clear(); }

private:
    std::vector<Line> lines_;
};

}  // namespace testenv

// Skips the current test with a message when a corpus file is missing.
#define REQUIRE_CORPUS_FILE(var, name)                  \
    const std::string var = testenv::corpus_file(name); \
    if (var.empty()) GTEST_SKIP() << "corpus file " << (name) << " not found in " << testenv::corpus_dir()
