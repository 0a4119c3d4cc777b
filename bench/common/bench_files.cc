#include "bench_files.h"

#include <dirent.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <algorithm>
#include <cstdlib>

namespace plimo_bench {

std::string default_cache_dir() {
    if (const char* x = std::getenv("XDG_CACHE_HOME")) return std::string(x) + "/plimo-bench";
    if (const char* h = std::getenv("HOME")) return std::string(h) + "/.cache/plimo-bench";
    return "/tmp/plimo-bench";
}

std::string big_file(const std::string& cache) {
    const std::string path = cache + "/big.wmv";
    struct stat st;
    if (stat(path.c_str(), &st) == 0 && st.st_size > 0) return path;
    const std::string mk = "mkdir -p '" + cache + "'";
    if (std::system(mk.c_str()) != 0) return "";
    // Written aside and renamed, so that an interrupted run leaves no half file.
    const std::string cmd =
        "ffmpeg -v error -y -f lavfi -i testsrc2=size=1280x720:rate=25 -f lavfi -i sine=sample_rate=48000 "
        "-t 60 -c:v wmv2 -b:v 30M -g 50 -c:a wmav2 '" + path + ".tmp.wmv' && mv '" + path + ".tmp.wmv' '" +
        path + "'";
    std::fprintf(stderr, "making %s with ffmpeg...\n", path.c_str());
    if (std::system(cmd.c_str()) != 0) return "";
    return path;
}

std::string default_corpus_dir() {
    if (const char* c = std::getenv("ASF_CORPUS")) return c;
    char self[4096];
    const ssize_t n = readlink("/proc/self/exe", self, sizeof self - 1);
    const std::string exe = n > 0 ? std::string(self, static_cast<size_t>(n)) : std::string("./x");
    return exe.substr(0, exe.find_last_of('/')) + "/../../../shared/corpus";
}

std::vector<std::string> corpus_files(const std::string& dir) {
    std::vector<std::string> out;
    if (DIR* d = opendir(dir.c_str())) {
        while (dirent* e = readdir(d)) {
            const std::string n = e->d_name;
            if (n.size() > 4 && (n.ends_with(".wmv") || n.ends_with(".wma") || n.ends_with(".asf")))
                out.push_back(dir + "/" + n);
        }
        closedir(d);
    }
    std::sort(out.begin(), out.end());
    return out;
}

bool read_file(const std::string& path, std::vector<uint8_t>* out) {
    FILE* f = std::fopen(path.c_str(), "rb");
    if (!f) return false;
    std::fseek(f, 0, SEEK_END);
    const long size = std::ftell(f);
    std::fseek(f, 0, SEEK_SET);
    out->resize(size > 0 ? static_cast<size_t>(size) : 0);
    const bool ok = size >= 0 && std::fread(out->data(), 1, out->size(), f) == out->size();
    std::fclose(f);
    return ok;
}

}  // namespace plimo_bench
