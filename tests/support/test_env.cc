#include "test_env.h"

#include <sys/wait.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>

#include "android/log.h"

namespace testenv {

std::string corpus_dir() {
    const char* env = std::getenv("ASF_CORPUS");
    return (env && *env) ? env : PLIMO_DEFAULT_CORPUS;
}

std::string corpus_file(const std::string& name) {
    const std::string path = corpus_dir() + "/" + name;
    return std::filesystem::exists(path) ? path : "";
}

std::vector<std::string> corpus_files() {
    std::vector<std::string> out;
    std::error_code ec;
    for (const auto& e : std::filesystem::directory_iterator(corpus_dir(), ec))
        if (const std::string x = e.path().extension().string(); x == ".asf" || x == ".wmv" || x == ".wma")
            out.push_back(corpus_dir() + "/" + e.path().filename().string());
    std::sort(out.begin(), out.end());
    return out;
}

bool read_file(const std::string& path, std::vector<uint8_t>* out) {
    std::ifstream f(path, std::ios::binary);
    if (f) out->assign(std::istreambuf_iterator<char>(f), std::istreambuf_iterator<char>());
    return static_cast<bool>(f);
}

std::vector<uint8_t> read_file_or_empty(const std::string& path) {
    std::vector<uint8_t> v;
    return read_file(path, &v), v;
}

std::string plugin_path() { return PLIMO_BINARY_DIR "/libplimo_asf.so"; }
std::string asfdump_path() { return PLIMO_BINARY_DIR "/asfdump"; }

int run_command(const std::string& cmd, std::string* out) {
    FILE* p = ::popen(cmd.c_str(), "r");
    if (!p) return -1;
    char buf[4096];
    if (out) out->clear();
    for (size_t n; (n = std::fread(buf, 1, sizeof buf, p)) > 0;) if (out) out->append(buf, n);
    const int status = ::pclose(p);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

LogCapture::LogCapture() {
    plimo_log_set_hook([](int prio, const char* tag, const char* text, void* user) {
        static_cast<LogCapture*>(user)->lines_.push_back({prio, tag ? tag : "", text ? text : ""});
    }, this);
}
LogCapture::~LogCapture() { plimo_log_set_hook(nullptr, nullptr); }

bool LogCapture::contains(const std::string& text) const {
    return std::any_of(lines_.begin(), lines_.end(),
                       [&](const Line& l) { return l.text.find(text) != std::string::npos; });
}

}  // namespace testenv
