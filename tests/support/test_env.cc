#include "test_env.h"

#include <dirent.h>
#include <sys/stat.h>
#include <sys/wait.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <iterator>

#include "android/log.h"

namespace testenv {

std::string corpus_dir() {
    const char* env = std::getenv("ASF_CORPUS");
    return (env && *env) ? env : PLIMO_DEFAULT_CORPUS;
}

std::string corpus_file(const std::string& name) {
    std::string path = corpus_dir() + "/" + name;
    struct stat st {};
    return ::stat(path.c_str(), &st) == 0 ? path : "";
}

std::vector<std::string> corpus_files() {
    std::vector<std::string> out;
    DIR* d = ::opendir(corpus_dir().c_str());
    if (!d) return out;
    while (dirent* e = ::readdir(d)) {
        std::string n = e->d_name;
        auto ends = [&](const char* s) {
            std::string x(s);
            return n.size() > x.size() && n.compare(n.size() - x.size(), x.size(), x) == 0;
        };
        if (ends(".asf") || ends(".wmv") || ends(".wma")) out.push_back(corpus_dir() + "/" + n);
    }
    ::closedir(d);
    std::sort(out.begin(), out.end());
    return out;
}

bool read_file(const std::string& path, std::vector<uint8_t>* out) {
    std::ifstream f(path, std::ios::binary);
    if (!f) return false;
    out->assign(std::istreambuf_iterator<char>(f), std::istreambuf_iterator<char>());
    return true;
}

std::vector<uint8_t> read_file_or_empty(const std::string& path) {
    std::vector<uint8_t> v;
    read_file(path, &v);
    return v;
}

std::string plugin_path() { return std::string(PLIMO_BINARY_DIR) + "/libplimo_asf.so"; }
std::string asfdump_path() { return std::string(PLIMO_BINARY_DIR) + "/asfdump"; }

int run_command(const std::string& cmd, std::string* out) {
    FILE* p = ::popen(cmd.c_str(), "r");
    if (!p) return -1;
    char buf[4096];
    size_t n;
    if (out) out->clear();
    while ((n = std::fread(buf, 1, sizeof buf, p)) > 0)
        if (out) out->append(buf, n);
    int status = ::pclose(p);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

LogCapture::LogCapture() { plimo_log_set_hook(&LogCapture::hook, this); }
LogCapture::~LogCapture() { plimo_log_set_hook(nullptr, nullptr); }

void LogCapture::hook(int prio, const char* tag, const char* text, void* user) {
    static_cast<LogCapture*>(user)->lines_.push_back({prio, tag ? tag : "", text ? text : ""});
}

bool LogCapture::contains(const std::string& text) const {
    return std::any_of(lines_.begin(), lines_.end(),
                       [&](const Line& l) { return l.text.find(text) != std::string::npos; });
}

}  // namespace testenv
