// Time per thumbnail: `asfdump thumb FILE --at T -o OUT.png` for random times
// on the large ffmpeg WMV (or the given file), beside
// `ffmpeg -ss T -i FILE -frames:v 1 OUT.png` for the same times, each a whole
// command as a person runs it (process start and the plug-in's load
// included); then `asfdump thumb --every 10s --sheet` over the file, per tile.
// Best of three passes; the median of each pass's per-picture times.
//
// usage: thumb_bench [--big FILE] [--cache DIR] [--asfdump PATH] [--count N]
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <random>
#include <string>
#include <vector>

#include "bench_files.h"

namespace {

using Clock = std::chrono::steady_clock;

std::string beside_self(const std::string& name) {
    char self[4096];
    const ssize_t n = readlink("/proc/self/exe", self, sizeof self - 1);
    const std::string exe = n > 0 ? std::string(self, static_cast<size_t>(n)) : std::string("./x");
    return exe.substr(0, exe.find_last_of('/')) + "/" + name;
}

// Wall time of a shell command in ms; negative when it fails.
double run_ms(const std::string& cmd) {
    const auto t0 = Clock::now();
    const int rc = std::system((cmd + " >/dev/null 2>&1").c_str());
    const double ms = std::chrono::duration<double, std::milli>(Clock::now() - t0).count();
    return rc == 0 ? ms : -1;
}

double median(std::vector<double> v) {
    std::sort(v.begin(), v.end());
    return v.empty() ? -1 : v[v.size() / 2];
}

// Median ms per picture over `times` for the command `make(t)`; best of three passes.
template <typename Make>
double per_picture(const std::vector<double>& times, Make make, int* failures) {
    double best = -1;
    for (int pass = 0; pass < 3; ++pass) {
        std::vector<double> ms;
        for (double t : times) {
            const double m = run_ms(make(t));
            if (m < 0) ++*failures; else ms.push_back(m);
        }
        const double med = median(ms);
        if (med >= 0 && (best < 0 || med < best)) best = med;
    }
    return best;
}

}  // namespace

int main(int argc, char** argv) {
    std::string big, cache = plimo_bench::default_cache_dir(), asfdump = beside_self("../asfdump");
    int count = 20;
    for (int i = 1; i + 1 < argc; i += 2) {
        if (!std::strcmp(argv[i], "--big")) big = argv[i + 1];
        else if (!std::strcmp(argv[i], "--cache")) cache = argv[i + 1];
        else if (!std::strcmp(argv[i], "--asfdump")) asfdump = argv[i + 1];
        else if (!std::strcmp(argv[i], "--count")) count = std::atoi(argv[i + 1]);
    }
    if (big.empty()) big = plimo_bench::big_file(cache);
    if (big.empty()) {
        std::fprintf(stderr, "thumb_bench: no input (ffmpeg is needed to make the large file)\n");
        return 1;
    }
    const std::string out = "/tmp/thumb_bench_" + std::to_string(getpid());
    if (run_ms(asfdump + " thumb '" + big + "' --at 0 -o " + out + ".png") < 0) {
        std::fprintf(stderr, "thumb_bench: %s cannot make pictures (built without libavcodec?)\n", asfdump.c_str());
        return 1;
    }
    // Random times over the first 58 s of the 60 s file, the same for both.
    std::mt19937 rng(27);
    std::uniform_real_distribution<double> pick(0.0, 58.0);
    std::vector<double> times;
    for (int i = 0; i < count; ++i) times.push_back(pick(rng));

    char t_arg[32];
    int ours_failed = 0, ffmpeg_failed = 0;
    const double ours = per_picture(times, [&](double t) {
        std::snprintf(t_arg, sizeof t_arg, "%.3fs", t);
        return asfdump + " thumb '" + big + "' --at " + t_arg + " -o " + out + ".png";
    }, &ours_failed);
    const double theirs = per_picture(times, [&](double t) {
        std::snprintf(t_arg, sizeof t_arg, "%.3f", t);
        return std::string("ffmpeg -v error -y -ss ") + t_arg + " -i '" + big + "' -frames:v 1 " + out + "-ff.png";
    }, &ffmpeg_failed);
    std::printf("%s: thumb --at, %d random times: %.1f ms per picture (%d failed); ffmpeg -ss: %.1f ms (%d failed); "
                "ratio %.2f\n", big.c_str(), count, ours, ours_failed, theirs, ffmpeg_failed,
                theirs > 0 ? ours / theirs : 0.0);

    // The sheet: its tiles are counted from its listing.
    const std::string sheet_cmd = asfdump + " thumb '" + big + "' --every 10s --sheet " + out + "-sheet.png";
    int tiles = 0;
    if (FILE* p = popen(sheet_cmd.c_str(), "r")) {
        char line[256];
        while (std::fgets(line, sizeof line, p)) tiles += std::strncmp(line, "tile ", 5) == 0;
        pclose(p);
    }
    double sheet = -1;
    for (int pass = 0; pass < 3; ++pass) {
        const double ms = run_ms(sheet_cmd);
        if (ms >= 0 && (sheet < 0 || ms < sheet)) sheet = ms;
    }
    std::printf("%s: thumb --every 10s --sheet: %.1f ms for %d tiles, %.1f ms per tile (best of 3)\n", big.c_str(),
                sheet, tiles, tiles > 0 ? sheet / tiles : 0.0);
    std::remove((out + ".png").c_str());
    std::remove((out + "-ff.png").c_str());
    std::remove((out + "-sheet.png").c_str());
    return 0;
}
