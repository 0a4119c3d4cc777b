// Full frame delivery of every corpus file and of a large WMV made with
// ffmpeg, from memory, through a lean host that only hands out frame buffers
// in each of the four buffering modes (file cache, none, ring without a
// thread, ring with the streaming thread), and through the reference host
// (which records every commit and computes its CRC-32) in cache mode; beside
// libavformat's ASF demuxer reading the same bytes from memory (an
// av_read_frame loop over a custom AVIOContext) and a memcpy of the file.
// Each row gives the time per run, the frames, the bytes read from the raw
// input per byte of file and the most memory the plug-in held at once. A
// table of all files in markdown ends the run.
//
// usage: demux_bench [--corpus DIR] [--cache DIR] [--big FILE] [--min-time S]
//                    [--only LABEL] [--block-size N] [--ring-size N]
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

using plimo_bench::read_file;

using Clock = std::chrono::steady_clock;
using Bytes = std::vector<uint8_t>;

double g_min_time = 0.5;
std::string g_only;
int g_block_size = 32768;  // the raw input's block_size
int g_ring_size = 1 << 20;  // what the host passes to open_file

using Mode = host::Buffering;
constexpr auto& kModes = host::kBufferings;

struct Result {
    double seconds = 0;  // per run
    uint64_t frames = 0;
    uint64_t bytes_read = 0;  // from the raw input, in one run
    size_t peak = 0;          // most bytes the plug-in held from the host
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
Result play_plugin(const Bytes& file, Mode mode, Host& host, const hova_callback_st* table,
                   uint64_t* commits) {
    host::InputOptions in = host::with_buffering(mode);
    in.block_size = g_block_size;
    auto input = host::RawInput::borrow_memory(file.data(), file.size(), in);
    host::ContextBuffer buf(static_cast<size_t>(hova_asff_demuxer.min_context_size));
    void* ctx = nullptr;
    Result r;
    if (hova_asff_demuxer.open_file(&ctx, input->io(), buf.data(), buf.size(), g_ring_size, table) != HOVA_OK)
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
    r.bytes_read = input->counters().bytes_read;
    r.ok = true;
    return r;
}

Result plugin_lean(const Bytes& file, Mode mode) {
    LeanHost h;
    Result r = play_plugin(file, mode, h, h.table(), &h.commits);
    r.peak = h.peak_bytes;
    if (h.blocks != 0) r.ok = false;
    return r;
}

Result plugin_reference(const Bytes& file, Mode mode) {
    host::HostCallbacks h;
    uint64_t commits = 0;
    h.on_commit = [&](const host::HostEvent&, const uint8_t*) { commits++; };
    Result r = play_plugin(file, mode, h, h.table(), &commits);
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

std::string base_name(const std::string& p) { return p.substr(p.find_last_of('/') + 1); }

// One line of the closing markdown table per file.
struct Summary {
    std::string name;
    double memcpy_ms = 0, lavf_ms = 0;
    double ms[4] = {0, 0, 0, 0};
    double ratio[4] = {0, 0, 0, 0};
    size_t peak[4] = {0, 0, 0, 0};
};
std::vector<Summary> g_summary;

void report(const std::string& name, size_t size) {
    Bytes file;
    if (!read_file(name, &file)) return;
    Bytes dst(file.size());
    Summary sum;
    sum.name = base_name(name);
    const Result mc = g_only.empty() ? measure([&] { return copy(file, dst); }) : Result{1, 0, 0, 0, true};
    const double gb = static_cast<double>(file.size()) / 1e9;
    sum.memcpy_ms = mc.seconds * 1e3;
    std::printf("%s (%zu bytes)\n", sum.name.c_str(), size);
    std::printf("  %-24s %10s %12s %8s %10s %9s\n", "", "ms/run", "frames/s", "GB/s", "read/size", "peak KB");
    std::printf("  %-24s %10.3f %12s %8.2f\n", "memcpy", mc.seconds * 1e3, "-", gb / mc.seconds);
    double av_time = 0, av_fps = 0;
#ifdef PLIMO_HAVE_LIBAV
    const Result av = g_only.empty() ? measure([&] { return libav(file); }) : Result{};
    if (av.ok) {
        av_time = av.seconds;
        av_fps = static_cast<double>(av.frames) / av.seconds;
        sum.lavf_ms = av.seconds * 1e3;
        std::printf("  %-24s %10.3f %12.0f %8.2f   (%llu packets)\n", "libavformat", av.seconds * 1e3, av_fps,
                    gb / av.seconds, static_cast<unsigned long long>(av.frames));
    }
#endif
    struct Row {
        std::string label;
        int mode_index;  // into the summary, -1 for none
        std::function<Result()> run;
    };
    std::vector<Row> rows;
    for (Mode m : kModes)
        rows.push_back({std::string("plimo lean, ") + host::buffering_name(m), static_cast<int>(m),
                        [&file, m] { return plugin_lean(file, m); }});
    rows.push_back({"plimo ref host, cache", -1, [&file] { return plugin_reference(file, Mode::Cache); }});
    const double bytes = static_cast<double>(file.size());
    for (const Row& row : rows) {
        if (!g_only.empty() && row.label.find(g_only) == std::string::npos) continue;
        const Result r = measure(row.run);
        if (!r.ok) {
            std::printf("  %-24s failed\n", row.label.c_str());
            continue;
        }
        const double fps = static_cast<double>(r.frames) / r.seconds;
        const double ratio = static_cast<double>(r.bytes_read) / bytes;
        std::printf("  %-24s %10.3f %12.0f %8.2f %10.2f %9.1f   (%llu frames", row.label.c_str(), r.seconds * 1e3,
                    fps, gb / r.seconds, ratio, static_cast<double>(r.peak) / 1024.0,
                    static_cast<unsigned long long>(r.frames));
        if (av_time > 0) std::printf(", %.2fx libavformat's packet rate", fps / av_fps);
        std::printf(")\n");
        if (row.mode_index >= 0) {
            sum.ms[row.mode_index] = r.seconds * 1e3;
            sum.ratio[row.mode_index] = ratio;
            sum.peak[row.mode_index] = r.peak;
        }
    }
    g_summary.push_back(sum);
}

void print_summary() {
    std::printf("\n| File | memcpy ms | libavformat ms | cache ms | none ms | ring ms | thread ms | "
                "read/size cache / none / ring / thread | peak KB cache / none / ring / thread |\n");
    std::printf("|---|---|---|---|---|---|---|---|---|\n");
    for (const Summary& s : g_summary) {
        std::printf("| %s | %.3f | %.3f | %.3f | %.3f | %.3f | %.3f | %.2f / %.2f / %.2f / %.2f | %.0f / %.1f / %.0f / %.0f |\n",
                    s.name.c_str(), s.memcpy_ms, s.lavf_ms, s.ms[0], s.ms[1], s.ms[2], s.ms[3], s.ratio[0],
                    s.ratio[1], s.ratio[2], s.ratio[3], static_cast<double>(s.peak[0]) / 1024.0,
                    static_cast<double>(s.peak[1]) / 1024.0, static_cast<double>(s.peak[2]) / 1024.0,
                    static_cast<double>(s.peak[3]) / 1024.0);
    }
}

}  // namespace

int main(int argc, char** argv) {
    std::string corpus = plimo_bench::default_corpus_dir(), cache = plimo_bench::default_cache_dir(), big;
    for (int i = 1; i + 1 < argc; i += 2) {
        const std::string a = argv[i];
        if (a == "--corpus") corpus = argv[i + 1];
        else if (a == "--cache") cache = argv[i + 1];
        else if (a == "--big") big = argv[i + 1];
        else if (a == "--min-time") g_min_time = std::atof(argv[i + 1]);
        else if (a == "--only") g_only = argv[i + 1];
        else if (a == "--block-size") g_block_size = std::atoi(argv[i + 1]);
        else if (a == "--ring-size") g_ring_size = std::atoi(argv[i + 1]);
        else {
            std::fprintf(stderr, "usage: %s [--corpus DIR] [--cache DIR] [--big FILE] [--min-time S] [--only LABEL] [--block-size N] [--ring-size N]\n", argv[0]);
            return 2;
        }
    }
    setenv("PLIMO_LOG", "off", 1);
    for (const std::string& f : plimo_bench::corpus_files(corpus)) {
        struct stat st;
        stat(f.c_str(), &st);
        report(f, static_cast<size_t>(st.st_size));
    }
    if (big.empty()) big = plimo_bench::big_file(cache);
    if (big.empty()) {
        std::fprintf(stderr, "no large file (ffmpeg missing?); skipped\n");
        print_summary();
        return 0;
    }
    struct stat st;
    stat(big.c_str(), &st);
    report(big, static_cast<size_t>(st.st_size));
    print_summary();
    return 0;
}
