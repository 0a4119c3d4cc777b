// The demuxer over a slow network: every input read of `len` bytes first
// waits a latency of 20 ms plus len / link rate, for link rates of a few
// times the file's bit rate (2, 4, 8; 1.25, 2, 4 for the large ffmpeg WMV so
// that a 32 KiB read stays under a second). Input blocks of 32 KiB, a 1 MiB
// ring, the file held in memory. Per file, link rate and buffering mode:
//   (a) a play to the end as fast as the host takes frames: whole-play time
//       (open included), slowest get_data, calls slower than 10 ms;
//   (b) a play paced at the frames' presentation times, the clock starting
//       at the first frame: slowest get_data and calls over 10 ms after the
//       first frame, frames late by more than 10 ms;
//   seeks: from the first frame, to 50 %, back to 25 % and on to 75 % of the
//       duration, each timed to the first video frame at the time found,
//       with the input reads it cost.
// A frame is due at its presentation time on the clock; one the host asks
// for only after its due time (it was still presenting a frame before it in
// decoding order) is due when asked. Late: delivered more than 10 ms after.
//
// Every wait (latency, transfer, pacing) is divided by the speed-up K; every
// time printed is the measured time multiplied by K, so the figures read as
// at full scale (the demuxer's own CPU time is then counted K times: small
// next to the reads, but it is there).
//
// usage: slow_bench [--corpus DIR] [--cache DIR] [--big FILE] [--speedup K]
//                   [--only NAME] [--modes cache,none,ring,thread] [--no-big]
//                   [--links M,M,...] (link rates as multiples of the bit rate)
#include <time.h>

#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <thread>
#include <vector>

#include "asf_api.h"
#include "bench_files.h"
#include "lean_host.h"
#include "loader.h"
#include "raw_input.h"

namespace {

using plimo_bench::read_file;

using Clock = std::chrono::steady_clock;
using Bytes = std::vector<uint8_t>;
using Mode = host::Buffering;

constexpr int kBlock = 32768;
constexpr int kRing = 1 << 20;
constexpr double kLatencyS = 0.020;
constexpr double kSlowS = 0.010;  // a call or a late frame beyond this counts
double g_k = 10;

double since(Clock::time_point t0) { return std::chrono::duration<double>(Clock::now() - t0).count(); }

void sleep_s(double s) {
    if (s > 0) std::this_thread::sleep_for(std::chrono::duration<double>(s));
}

// One opened file over the slow input; everything in unscaled seconds.
class Play {
public:
    Play(const Bytes& file, Mode mode, double link_bps) {
        host::InputOptions in;
        in.block_size = kBlock;
        in = host::with_buffering(mode, in);
        input_ = host::RawInput::borrow_memory(file.data(), file.size(), in);
        input_->faults().before_read = [link_bps](uint64_t, size_t len) {
            sleep_s((kLatencyS + static_cast<double>(len) / link_bps) / g_k);
        };
        buf_ = std::make_unique<host::ContextBuffer>(static_cast<size_t>(hova_asff_demuxer.min_context_size));
    }
    ~Play() {
        if (ctx_) hova_asff_demuxer.close_file(ctx_);
    }
    bool open() {
        const auto t0 = Clock::now();
        const bool ok = hova_asff_demuxer.open_file(&ctx_, input_->io(), buf_->data(), static_cast<int>(buf_->size()),
                                                    kRing, host_.table()) == HOVA_OK;
        open_s = since(t0) * g_k;
        if (!ok) ctx_ = nullptr;
        return ok;
    }
    // One get_data: its result, its time (unscaled) and whether it committed
    // a media frame (its pts in *pts).
    int call(double* s, bool* frame, int64_t* pts) {
        hova_stream_type_et t = HOVA_STREAM_NONE;
        int bs = 0;
        int64_t p = 0;
        const uint64_t commits = host_.commits;
        host_.last_type = HOVA_STREAM_NONE;
        const auto t0 = Clock::now();
        const int r = hova_asff_demuxer.get_data(ctx_, &t, &bs, &p);
        *s = since(t0) * g_k;
        *frame = host_.commits != commits &&
                 (host_.last_type == HOVA_STREAM_VIDEO || host_.last_type == HOVA_STREAM_AUDIO);
        *pts = host_.last_pts;
        return r;
    }
    int seek(int64_t* pts) { return hova_asff_demuxer.seek_time(ctx_, HOVA_SEEK_BACKWARD, pts, 0); }
    // Reads the input has answered (the host counts a read once its wait is
    // over, on whichever thread reads).
    uint64_t reads() { return __atomic_load_n(&input_->counters().reads, __ATOMIC_RELAXED); }
    hova_stream_type_et last_type() const { return host_.last_type; }
    double open_s = 0;

private:
    plimo_bench::LeanHost host_;
    std::unique_ptr<host::RawInput> input_;
    std::unique_ptr<host::ContextBuffer> buf_;
    void* ctx_ = nullptr;
};

bool ends(int r) { return r != HOVA_OK && r != HOVA_TryAgain; }

struct PlayFigures {
    bool ok = false;
    double whole = 0, slowest = 0;
    int slow_calls = 0, late = 0, frames = 0;
    uint64_t slowest_reads = 0;  // input reads that ended during the slowest call
};

// (a) as fast as the host takes frames.
PlayFigures play_fast(const Bytes& file, Mode mode, double link) {
    PlayFigures f;
    Play p(file, mode, link);
    const auto t0 = Clock::now();
    if (!p.open()) return f;
    for (int guard = 0; guard < 10000000; ++guard) {
        double s = 0;
        bool frame = false;
        int64_t pts = 0;
        const uint64_t reads = p.reads();
        const int r = p.call(&s, &frame, &pts);
        if (s > f.slowest) {
            f.slowest = s;
            f.slowest_reads = p.reads() - reads;
        }
        if (s > kSlowS) ++f.slow_calls;
        f.frames += frame;
        if (ends(r)) break;
    }
    f.whole = since(t0) * g_k;
    f.ok = true;
    return f;
}

// (b) paced at presentation times from the first frame on.
PlayFigures play_paced(const Bytes& file, Mode mode, double link) {
    PlayFigures f;
    Play p(file, mode, link);
    const auto t0 = Clock::now();
    if (!p.open()) return f;
    bool started = false;
    Clock::time_point clock0;
    int64_t pts0 = 0;
    for (int guard = 0; guard < 10000000; ++guard) {
        double s = 0;
        bool frame = false;
        int64_t pts = 0;
        const auto asked = Clock::now();
        const int r = p.call(&s, &frame, &pts);
        if (started) {
            f.slowest = std::max(f.slowest, s);
            if (s > kSlowS) ++f.slow_calls;
        }
        if (frame) {
            ++f.frames;
            if (!started) {
                started = true;
                clock0 = Clock::now();
                pts0 = pts;
            } else {
                const auto due = clock0 + std::chrono::duration_cast<Clock::duration>(
                                              std::chrono::duration<double>(static_cast<double>(pts - pts0) / 1e6 / g_k));
                const auto by = std::max(due, asked);
                const double late = std::chrono::duration<double>(Clock::now() - by).count() * g_k;
                if (late > kSlowS) ++f.late;
                std::this_thread::sleep_until(due);
            }
        }
        if (ends(r)) break;
    }
    f.whole = since(t0) * g_k;
    f.ok = true;
    return f;
}

struct SeekFigures {
    bool ok = false;
    double s[3] = {0, 0, 0};
    uint64_t reads[3] = {0, 0, 0};
};

// From the first frame: to 50 %, back to 25 %, on to 75 %; each to the first
// video frame at the time found.
SeekFigures seeks(const Bytes& file, Mode mode, double link, int64_t duration) {
    SeekFigures out;
    Play p(file, mode, link);
    if (!p.open()) return out;
    double s = 0;
    bool frame = false;
    int64_t pts = 0;
    for (int guard = 0; guard < 100000 && !frame; ++guard)
        if (ends(p.call(&s, &frame, &pts))) return out;
    const double at[3] = {0.50, 0.25, 0.75};
    for (int i = 0; i < 3; ++i) {
        int64_t target = static_cast<int64_t>(static_cast<double>(duration) * at[i]);
        const uint64_t r0 = p.reads();
        const auto t0 = Clock::now();
        if (p.seek(&target) != HOVA_OK) return out;
        for (int guard = 0; guard < 1000000; ++guard) {
            const int r = p.call(&s, &frame, &pts);
            if (frame && p.last_type() == HOVA_STREAM_VIDEO && pts >= target) break;
            if (ends(r)) break;
        }
        out.s[i] = since(t0) * g_k;
        out.reads[i] = p.reads() - r0;
    }
    out.ok = true;
    return out;
}

// Duration (us) and whether the plug-in finds a video stream.
bool describe(const Bytes& file, int64_t* duration, bool* video) {
    plimo_bench::LeanHost host;
    auto input = host::RawInput::borrow_memory(file.data(), file.size());
    host::ContextBuffer buf(static_cast<size_t>(hova_asff_demuxer.min_context_size));
    void* ctx = nullptr;
    if (hova_asff_demuxer.open_file(&ctx, input->io(), buf.data(), static_cast<int>(buf.size()), kRing,
                                    host.table()) != HOVA_OK)
        return false;
    const auto* d = static_cast<const asf_demuxer_st*>(ctx);
    *duration = d->s.duration;
    *video = d->s.active_stream[VID] >= 0;
    hova_asff_demuxer.close_file(ctx);
    return true;
}

std::vector<Mode> g_modes(std::begin(host::kBufferings), std::end(host::kBufferings));

void run_file(const std::string& name, const Bytes& file, const std::vector<double>& multiples) {
    int64_t duration = 0;
    bool video = false;
    if (!describe(file, &duration, &video) || !video || duration <= 0) return;
    const double rate = static_cast<double>(file.size()) / (static_cast<double>(duration) / 1e6);  // bytes/s
    std::printf("\n### %s: %.1f s, %.0f kbit/s\n\n", name.c_str(), static_cast<double>(duration) / 1e6,
                rate * 8 / 1000);
    std::printf("| Link | Mode | Read | (a) whole play | (a) slowest call (reads in it) | (a) calls > 10 ms | "
                "(b) slowest call | (b) calls > 10 ms | (b) late frames | seek 50 %% / 25 %% / 75 %% (ms, reads) |\n"
                "|---|---|---|---|---|---|---|---|---|---|\n");
    for (double m : multiples) {
        const double link = rate * m;
        const double read_ms = (kLatencyS + kBlock / link) * 1000;
        for (Mode mode : g_modes) {
            const PlayFigures a = play_fast(file, mode, link);
            const PlayFigures b = play_paced(file, mode, link);
            const SeekFigures s = seeks(file, mode, link, duration);
            std::printf("| %.3gx | %s | %.0f ms | %.2f s | %.0f ms (%llu) | %d | %.0f ms | %d | %d of %d | ", m,
                        host::buffering_name(mode), read_ms, a.whole, a.slowest * 1000,
                        static_cast<unsigned long long>(a.slowest_reads), a.slow_calls,
                        b.slowest * 1000, b.slow_calls, b.late, b.frames);
            if (s.ok)
                std::printf("%.0f, %llu / %.0f, %llu / %.0f, %llu |\n", s.s[0] * 1000,
                            static_cast<unsigned long long>(s.reads[0]), s.s[1] * 1000,
                            static_cast<unsigned long long>(s.reads[1]), s.s[2] * 1000,
                            static_cast<unsigned long long>(s.reads[2]));
            else
                std::printf("failed |\n");
            std::fflush(stdout);
        }
    }
}

}  // namespace

int main(int argc, char** argv) {
    std::string corpus = plimo_bench::default_corpus_dir();
    std::string cache = plimo_bench::default_cache_dir(), big, only;
    bool no_big = false;
    std::vector<double> links;  // empty: 2, 4, 8 (1.25, 2, 4 for the large file)
    for (int i = 1; i < argc; ++i) {
        const std::string a = argv[i];
        if (i + 1 < argc && a == "--corpus") corpus = argv[++i];
        else if (i + 1 < argc && a == "--cache") cache = argv[++i];
        else if (i + 1 < argc && a == "--big") big = argv[++i];
        else if (i + 1 < argc && a == "--speedup") g_k = std::atof(argv[++i]);
        else if (i + 1 < argc && a == "--only") only = argv[++i];
        else if (a == "--no-big") no_big = true;
        else if (i + 1 < argc && a == "--links") {
            links.clear();
            for (const char* p = argv[++i]; *p;) {
                char* end = nullptr;
                links.push_back(std::strtod(p, &end));
                if (end == p) break;
                p = *end == ',' ? end + 1 : end;
            }
        }
        else if (i + 1 < argc && a == "--modes") {
            g_modes.clear();
            const std::string list = argv[++i];
            for (Mode m : host::kBufferings)
                if (list.find(host::buffering_name(m)) != std::string::npos) g_modes.push_back(m);
        } else {
            std::fprintf(stderr,
                         "usage: %s [--corpus DIR] [--cache DIR] [--big FILE] [--speedup K] [--only NAME] "
                         "[--modes cache,none,ring,thread] [--no-big] [--links M,M,...]\n",
                         argv[0]);
            return 2;
        }
    }
    if (g_k <= 0) g_k = 1;
    std::printf("Slow input: each read waits 20 ms + size / link rate; %d-byte blocks, %d-byte ring, "
                "speed-up %g (times shown unscaled)\n",
                kBlock, kRing, g_k);
    Bytes file;
    for (const std::string& path : plimo_bench::corpus_files(corpus)) {
        const std::string name = path.substr(path.find_last_of('/') + 1);
        if (!only.empty() && name.find(only) == std::string::npos) continue;
        if (read_file(path, &file)) run_file(name, file, links.empty() ? std::vector<double>{2, 4, 8} : links);
    }
    if (no_big || (!only.empty() && std::string("big.wmv").find(only) == std::string::npos)) return 0;
    if (big.empty()) big = plimo_bench::big_file(cache);
    if (!big.empty() && read_file(big, &file))
        run_file("big.wmv", file, links.empty() ? std::vector<double>{1.25, 2, 4} : links);
    else std::fprintf(stderr, "no large file (ffmpeg missing?); skipped\n");
    return 0;
}
