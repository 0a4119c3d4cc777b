#include "bench_files.h"

#include <sys/stat.h>

#include <cstdio>
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

}  // namespace plimo_bench
