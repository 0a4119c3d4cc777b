// Full frame delivery of every corpus file and of a large WMV made with
// ffmpeg, from memory, through the reference host (which records every
// commit and computes its CRC-32) and through a lean host that only hands
// out frame buffers, in cache mode and with no buffering; beside
// libavformat's ASF demuxer reading the same bytes from memory (an
// av_read_frame loop over a custom AVIOContext) and a memcpy of the file.
//
// usage: demux_bench [--corpus DIR] [--cache DIR] [--big FILE] [--min-time S]
//                    [--only LABEL] [--block-size N]
// The large file is made once into the cache directory
// ($XDG_CACHE_HOME/plimo-bench or ~/.cache/plimo-bench).
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <climits>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <dirent.h>
#include <fstream>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "asf_api.h"
#include "bench_files.h"
#include "callbacks.h"
#include "lean_host.h"
#include "loader.h"
#include "raw_input.h"

#ifdef PLIMO_HAVE_LIBAV
extern "C" {
#include <libavformat/avformat.h>
}
#endif

namespace {

using Clock = std::chrono::steady_clock;
using Bytes = std::vector<uint8_t>;

double g_min_time = 0.5;
std::string g_only;
int g_block_size = 32768;  // the raw input's block_size (cache block)  // run only the plug-in rows whose label contains this (profiling)

struct Result {
    double seconds = 0;  // per run
    uint64_t frames = 0;
    bool ok = false;
};

// Repeats `run` until the total passes the minimum time; keeps the fastest.
Result measure(const std::function<Result()>& run) {
    Result best;
    best.seconds = 1e300;
    double total = 0;
    int runs = 0;
    while (total < g_min_time || runs < 3) {
        const auto t0 = Clock::now();
        Result r = run();
        const double s = std::chrono::duration<double>(Clock::now() - t0).count();
        total += s;
        ++runs;
        if (!r.ok) return r;
        if (s < best.seconds) {
            best = r;
            best.seconds = s;
        }
    }
    return best;
}

// ---- the plug-in ----

using plimo_bench::LeanHost;

template <typename Host>
Result play_plugin(const Bytes& file, bool cache, Host& host, const hova_callback_st* table,
                   uint64_t* commits) {
    host::InputOptions in;
    in.disable_cache = !cache;
    in.block_size = g_block_size;
    auto input = host::RawInput::borrow_memory(file.data(), file.size(), in);
    host::ContextBuffer buf(static_cast<size_t>(hova_asff_demuxer.min_context_size));
    void* ctx = nullptr;
    Result r;
    if (hova_asff_demuxer.open_file(&ctx, input->io(), buf.data(), buf.size(), 1 << 20, table) != HOVA_OK)
        return r;
    const uint64_t before = *commits;
    for (;;) {
        hova_stream_type_et t;
        int bs;
        int64_t pts;
        const int rc = hova_asff_demuxer.get_data(ctx, &t, &bs, &pts);
        if (rc != HOVA_OK && rc != HOVA_TryAgain) break;
    }
    hova_asff_demuxer.close_file(ctx);
    (void)host;
    r.frames = *commits - before;
    r.ok = true;
    return r;
}

Result plugin_lean(const Bytes& file, bool cache) {
    LeanHost h;
    Result r = play_plugin(file, cache, h, h.table(), &h.commits);
    if (h.blocks != 0) r.ok = false;
    return r;
}

Result plugin_reference(const Bytes& file, bool cache) {
    host::HostCallbacks h;
    uint64_t commits = 0;
    h.on_commit = [&](const host::HostEvent&, const uint8_t*) { commits++; };
    Result r = play_plugin(file, cache, h, h.table(), &commits);
    if (h.outstanding_blocks() != 0) r.ok = false;
    return r;
}

// ---- libavformat ----

#ifdef PLIMO_HAVE_LIBAV
struct MemIo {
    const uint8_t* data;
    size_t size;
    size_t pos;
};

int mem_read(void* opaque, uint8_t* buf, int n) {
    MemIo* m = static_cast<MemIo*>(opaque);
    const size_t left = m->size - m->pos;
    if (left == 0) return AVERROR_EOF;
    const size_t k = std::min(left, static_cast<size_t>(n));
    std::memcpy(buf, m->data + m->pos, k);
    m->pos += k;
    return static_cast<int>(k);
}

int64_t mem_seek(void* opaque, int64_t off, int whence) {
    MemIo* m = static_cast<MemIo*>(opaque);
    if (whence == AVSEEK_SIZE) return static_cast<int64_t>(m->size);
    int64_t base = whence == SEEK_CUR ? static_cast<int64_t>(m->pos) : whence == SEEK_END ? static_cast<int64_t>(m->size) : 0;
    const int64_t p = base + off;
    if (p < 0 || p > static_cast<int64_t>(m->size)) return -1;
    m->pos = static_cast<size_t>(p);
    return p;
}

Result libav(const Bytes& file) {
    Result r;
    MemIo m{file.data(), file.size(), 0};
    const int io_size = 32768;
    auto* iobuf = static_cast<uint8_t*>(av_malloc(io_size));
    AVIOContext* io = avio_alloc_context(iobuf, io_size, 0, &m, mem_read, nullptr, mem_seek);
    AVFormatContext* fmt = avformat_alloc_context();
    fmt->pb = io;
    if (avformat_open_input(&fmt, nullptr, av_find_input_format("asf"), nullptr) < 0) {
        av_freep(&io->buffer);
        avio_context_free(&io);
        return r;
    }
    AVPacket* pkt = av_packet_alloc();
    while (av_read_frame(fmt, pkt) >= 0) {
        r.frames++;
        av_packet_unref(pkt);
    }
    av_packet_free(&pkt);
    avformat_close_input(&fmt);
    av_freep(&io->buffer);
    avio_context_free(&io);
    r.ok = true;
    return r;
}
#endif

Result copy(const Bytes& file, Bytes& dst) {
    std::memcpy(dst.data(), file.data(), file.size());
    asm volatile("" : : "r"(dst.data()) : "memory");
    Result r;
    r.ok = true;
    return r;
}

// ---- inputs ----

std::string self_dir() {
    char buf[PATH_MAX];
    const ssize_t n = readlink("/proc/self/exe", buf, sizeof buf - 1);
    if (n <= 0) return ".";
    std::string p(buf, static_cast<size_t>(n));
    return p.substr(0, p.find_last_of('/'));
}

bool read_file(const std::string& path, Bytes* out) {
    std::ifstream f(path, std::ios::binary);
    if (!f) return false;
    out->assign(std::istreambuf_iterator<char>(f), {});
    return true;
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

std::string base_name(const std::string& p) { return p.substr(p.find_last_of('/') + 1); }

void report(const std::string& name, size_t size) {
    Bytes file;
    if (!read_file(name, &file)) return;
    Bytes dst(file.size());
    const Result mc = g_only.empty() ? measure([&] { return copy(file, dst); }) : Result{1, 0, true};
    const double gb = static_cast<double>(file.size()) / 1e9;
    std::printf("%s (%zu bytes)\n", base_name(name).c_str(), size);
    std::printf("  %-24s %12s %10s\n", "", "frames/s", "GB/s");
    std::printf("  %-24s %12s %10.2f\n", "memcpy", "-", gb / mc.seconds);
    double av_time = 0, av_fps = 0;
#ifdef PLIMO_HAVE_LIBAV
    const Result av = g_only.empty() ? measure([&] { return libav(file); }) : Result{};
    if (av.ok) {
        av_time = av.seconds;
        av_fps = static_cast<double>(av.frames) / av.seconds;
        std::printf("  %-24s %12.0f %10.2f   (%llu packets, %.2fx memcpy time)\n", "libavformat", av_fps,
                    gb / av.seconds, static_cast<unsigned long long>(av.frames), av.seconds / mc.seconds);
    }
#endif
    struct Row {
        const char* label;
        std::function<Result()> run;
    };
    const Row rows[] = {
        {"plimo lean host, cache", [&] { return plugin_lean(file, true); }},
        {"plimo lean host, none", [&] { return plugin_lean(file, false); }},
        {"plimo ref host, cache", [&] { return plugin_reference(file, true); }},
        {"plimo ref host, none", [&] { return plugin_reference(file, false); }},
    };
    for (const Row& row : rows) {
        if (!g_only.empty() && std::string(row.label).find(g_only) == std::string::npos) continue;
        const Result r = measure(row.run);
        if (!r.ok) {
            std::printf("  %-24s failed\n", row.label);
            continue;
        }
        const double fps = static_cast<double>(r.frames) / r.seconds;
        std::printf("  %-24s %12.0f %10.2f   (%llu frames, %.2fx memcpy time", row.label, fps,
                    gb / r.seconds, static_cast<unsigned long long>(r.frames), r.seconds / mc.seconds);
        if (av_time > 0)
            std::printf(", %.2fx libavformat speed, %.2fx its packet rate", av_time / r.seconds, fps / av_fps);
        std::printf(")\n");
    }
}

}  // namespace

int main(int argc, char** argv) {
    std::string corpus, cache = plimo_bench::default_cache_dir(), big;
    if (const char* c = std::getenv("ASF_CORPUS")) corpus = c;
    for (int i = 1; i + 1 < argc; i += 2) {
        const std::string a = argv[i];
        if (a == "--corpus") corpus = argv[i + 1];
        else if (a == "--cache") cache = argv[i + 1];
        else if (a == "--big") big = argv[i + 1];
        else if (a == "--min-time") g_min_time = std::atof(argv[i + 1]);
        else if (a == "--only") g_only = argv[i + 1];
        else if (a == "--block-size") g_block_size = std::atoi(argv[i + 1]);
        else {
            std::fprintf(stderr, "usage: %s [--corpus DIR] [--cache DIR] [--big FILE] [--min-time S] [--only LABEL] [--block-size N]\n", argv[0]);
            return 2;
        }
    }
    if (corpus.empty()) corpus = self_dir() + "/../../../shared/corpus";
    setenv("PLIMO_LOG", "off", 1);
    for (const std::string& f : corpus_files(corpus)) {
        struct stat st;
        stat(f.c_str(), &st);
        report(f, static_cast<size_t>(st.st_size));
    }
    if (big.empty()) big = plimo_bench::big_file(cache);
    if (big.empty()) {
        std::fprintf(stderr, "no large file (ffmpeg missing?); skipped\n");
        return 0;
    }
    struct stat st;
    stat(big.c_str(), &st);
    report(big, static_cast<size_t>(st.st_size));
    return 0;
}
