// Seek cost: 200 random seeks, each followed by delivery of the video key
// frame found, over files held in memory and read in 32 KiB blocks (1 MiB
// ring): the large ffmpeg WMV and the corpus files that carry a simple index,
// each with its index and with the index hidden (the copy cut after the data
// object). Per seek: time, input read and seek calls and bytes read, for the
// seek alone and for the seek plus the first key frame, with the file cache;
// the seek plus first key frame again in each of the four buffering modes
// (with the most memory the plug-in held); beside libavformat's av_seek_frame
// plus av_read_frame up to the first video key frame on the same bytes (its
// index loaded by a first seek, as ours has its start offset). A markdown
// table of the per-mode figures ends the run.
//
// usage: seek_bench [--corpus DIR] [--cache DIR] [--big FILE] [--seeks N] [--block-size N]
#include <algorithm>
#include <chrono>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <dirent.h>
#include <unistd.h>
#include <random>
#include <string>
#include <vector>

#include "asf_api.h"
#include "bench_files.h"
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
int g_block = 32768;
constexpr int kRing = 1 << 20;
constexpr int kPasses = 3;

using Mode = host::Buffering;
constexpr auto& kModes = host::kBufferings;

// The file cut right after its data object (found by its GUID).
Bytes without_index(const Bytes& file) {
    static const uint8_t kData[16] = {0x36, 0x26, 0xB2, 0x75, 0x8E, 0x66, 0xCF, 0x11,
                                      0xA6, 0xD9, 0x00, 0xAA, 0x00, 0x62, 0xCE, 0x6C};
    const auto it = std::search(file.begin(), file.end(), std::begin(kData), std::end(kData));
    if (it == file.end() || file.end() - it < 24) return file;
    uint64_t size = 0;
    std::memcpy(&size, &*(it + 16), 8);
    const uint64_t end = static_cast<uint64_t>(it - file.begin()) + size;
    if (end >= file.size()) return file;
    return Bytes(file.begin(), file.begin() + static_cast<std::ptrdiff_t>(end));
}

using plimo_bench::LeanHost;

struct Figures {
    bool ok = false;
    int done = 0, failed = 0;
    double us = 0;  // per seek (and first frame), best pass
    double reads = 0, seeks = 0, kb = 0;
    size_t peak = 0;  // most bytes the plug-in held from the host
};

void print(const char* who, const std::string& what, const char* part, const Figures& f) {
    if (!f.ok) {
        std::printf("%-10s %-46s %-14s unavailable\n", who, what.c_str(), part);
        return;
    }
    std::printf("%-10s %-46s %-14s %8.1f us/seek %7.1f reads %6.1f seeks %9.1f KB read  (%d ok, %d failed)\n",
                who, what.c_str(), part, f.us, f.reads, f.seeks, f.kb, f.done, f.failed);
}

// ---- the plug-in ----

// `deliver`: after each seek, get_data until the video frame at the time found.
Figures plugin_seeks(const Bytes& file, const std::vector<int64_t>& targets, int dir, bool deliver,
                     Mode mode = Mode::Cache) {
    Figures out;
    out.us = 1e300;
    for (int pass = 0; pass < kPasses; ++pass) {
        LeanHost host;
        host::InputOptions in;
        in.block_size = g_block;
        in = host::with_buffering(mode, in);
        auto input = host::RawInput::borrow_memory(file.data(), file.size(), in);
        host::ContextBuffer buf(static_cast<size_t>(hova_asff_demuxer.min_context_size));
        void* ctx = nullptr;
        if (hova_asff_demuxer.open_file(&ctx, input->io(), buf.data(), static_cast<int>(buf.size()), kRing,
                                        host.table()) != HOVA_OK)
            return out;
        hova_stream_type_et t = HOVA_STREAM_NONE;
        int bs = 0;
        int64_t pts = 0;
        (void)hova_asff_demuxer.get_data(ctx, &t, &bs, &pts);  // configuration records
        int64_t warm = targets.front();                          // index start offset
        (void)hova_asff_demuxer.seek_time(ctx, dir, &warm, 1);

        const host::InputCounters before = input->counters();
        int done = 0, failed = 0;
        const auto t0 = Clock::now();
        for (int64_t target : targets) {
            int64_t found = target;
            if (hova_asff_demuxer.seek_time(ctx, dir, &found, 0) != HOVA_OK) {
                ++failed;
                continue;
            }
            ++done;
            if (!deliver) continue;
            host.last_type = HOVA_STREAM_NONE;
            for (int calls = 0; calls < 100000; ++calls) {
                const int r = hova_asff_demuxer.get_data(ctx, &t, &bs, &pts);
                if (host.last_type == HOVA_STREAM_VIDEO && host.last_pts == found) break;
                if (r != HOVA_OK && r != HOVA_TryAgain) break;
            }
        }
        const double us = std::chrono::duration<double, std::micro>(Clock::now() - t0).count();
        const host::InputCounters& after = input->counters();
        hova_asff_demuxer.close_file(ctx);
        out.peak = std::max(out.peak, host.peak_bytes);
        const double n = static_cast<double>(targets.size());
        out.ok = true;
        out.done = done;
        out.failed = failed;
        out.us = std::min(out.us, us / n);
        out.reads = static_cast<double>(after.reads - before.reads) / n;
        out.seeks = static_cast<double>(after.seeks - before.seeks) / n;
        out.kb = static_cast<double>(after.bytes_read - before.bytes_read) / n / 1024.0;
    }
    return out;
}

// ---- libavformat ----

#ifdef PLIMO_HAVE_LIBAV
struct MemIO {
    const Bytes* file;
    int64_t pos = 0;
    uint64_t reads = 0, seeks = 0, bytes = 0;
};

int mem_read(void* opaque, uint8_t* buf, int n) {
    auto* m = static_cast<MemIO*>(opaque);
    m->reads++;
    const int64_t left = static_cast<int64_t>(m->file->size()) - m->pos;
    if (left <= 0) return AVERROR_EOF;
    const int k = static_cast<int>(std::min<int64_t>(n, left));
    std::memcpy(buf, m->file->data() + m->pos, static_cast<size_t>(k));
    m->pos += k;
    m->bytes += static_cast<uint64_t>(k);
    return k;
}

int64_t mem_seek(void* opaque, int64_t off, int whence) {
    auto* m = static_cast<MemIO*>(opaque);
    if (whence & AVSEEK_SIZE) return static_cast<int64_t>(m->file->size());
    m->seeks++;
    switch (whence & ~AVSEEK_FORCE) {
        case SEEK_SET: m->pos = off; break;
        case SEEK_CUR: m->pos += off; break;
        case SEEK_END: m->pos = static_cast<int64_t>(m->file->size()) + off; break;
        default: return -1;
    }
    return m->pos;
}

Figures libav_seeks(const Bytes& file, const std::vector<int64_t>& targets, bool deliver) {
    Figures out;
    out.us = 1e300;
    for (int pass = 0; pass < kPasses; ++pass) {
        MemIO mem{&file};
        auto* iobuf = static_cast<uint8_t*>(av_malloc(static_cast<size_t>(g_block)));
        AVIOContext* avio = avio_alloc_context(iobuf, g_block, 0, &mem, mem_read, nullptr, mem_seek);
        AVFormatContext* fmt = avformat_alloc_context();
        fmt->pb = avio;
        bool opened = avformat_open_input(&fmt, nullptr, nullptr, nullptr) == 0;
        int vs = -1;
        if (opened && avformat_find_stream_info(fmt, nullptr) >= 0)
            vs = av_find_best_stream(fmt, AVMEDIA_TYPE_VIDEO, -1, -1, nullptr, 0);
        if (vs < 0) {
            if (opened) avformat_close_input(&fmt);
            else avformat_free_context(fmt);
            av_freep(&avio->buffer);
            avio_context_free(&avio);
            return out;
        }
        const AVRational tb = fmt->streams[vs]->time_base;
        AVPacket* pkt = av_packet_alloc();
        (void)av_seek_frame(fmt, vs, av_rescale_q(targets.front(), AV_TIME_BASE_Q, tb), AVSEEK_FLAG_BACKWARD);
        const uint64_t r0 = mem.reads, s0 = mem.seeks, b0 = mem.bytes;
        int done = 0, failed = 0;
        const auto t0 = Clock::now();
        for (int64_t target : targets) {
            if (av_seek_frame(fmt, vs, av_rescale_q(target, AV_TIME_BASE_Q, tb), AVSEEK_FLAG_BACKWARD) < 0) {
                ++failed;
                continue;
            }
            ++done;
            if (!deliver) continue;
            while (av_read_frame(fmt, pkt) >= 0) {
                const bool key = pkt->stream_index == vs && (pkt->flags & AV_PKT_FLAG_KEY);
                av_packet_unref(pkt);
                if (key) break;
            }
        }
        const double us = std::chrono::duration<double, std::micro>(Clock::now() - t0).count();
        const double n = static_cast<double>(targets.size());
        out.ok = true;
        out.done = done;
        out.failed = failed;
        out.us = std::min(out.us, us / n);
        out.reads = static_cast<double>(mem.reads - r0) / n;
        out.seeks = static_cast<double>(mem.seeks - s0) / n;
        out.kb = static_cast<double>(mem.bytes - b0) / n / 1024.0;
        av_packet_free(&pkt);
        avformat_close_input(&fmt);
        av_freep(&avio->buffer);
        avio_context_free(&avio);
    }
    return out;
}
#endif

// Duration (us) and whether the plug-in plays video from an index.
bool describe(const Bytes& file, int64_t* duration, bool* indexed) {
    LeanHost host;
    auto input = host::RawInput::borrow_memory(file.data(), file.size());
    host::ContextBuffer buf(static_cast<size_t>(hova_asff_demuxer.min_context_size));
    void* ctx = nullptr;
    if (hova_asff_demuxer.open_file(&ctx, input->io(), buf.data(), static_cast<int>(buf.size()), 1 << 20,
                                    host.table()) != HOVA_OK)
        return false;
    const auto* d = static_cast<const asf_demuxer_st*>(ctx);
    *duration = d->s.duration;
    *indexed = d->index_packet != 0 && d->s.active_stream[VID] >= 0 && d->num_packets > 0;
    hova_asff_demuxer.close_file(ctx);
    return true;
}

// The closing markdown table: per file and variant, seek plus first key frame.
struct Summary {
    std::string what;
    Figures modes[4];
    Figures lavf;
};
std::vector<Summary> g_summary;

void run_file(const std::string& name, const Bytes& file, int count) {
    int64_t duration = 0;
    bool indexed = false;
    if (!describe(file, &duration, &indexed) || !indexed || duration <= 0) return;
    std::mt19937_64 rng(20261123);
    std::uniform_int_distribution<int64_t> pick(1, duration - 1);
    std::vector<int64_t> targets(static_cast<size_t>(count));
    for (int64_t& t : targets) t = pick(rng);

    const Bytes hidden = without_index(file);
    for (const auto& [variant, bytes] : {std::pair<const char*, const Bytes*>{"index", &file}, {"no index", &hidden}}) {
        const std::string what = name + " (" + variant + ")";
        print("plimo", what, "seek", plugin_seeks(*bytes, targets, HOVA_SEEK_BACKWARD, false));
        const Figures ours = plugin_seeks(*bytes, targets, HOVA_SEEK_BACKWARD, true);
        print("plimo", what, "seek+keyframe", ours);
        print("plimo", what, "fwd+keyframe", plugin_seeks(*bytes, targets, HOVA_SEEK_FORWARD, true));
        Summary sum;
        sum.what = what;
        for (Mode m : kModes) {
            const Figures f = m == Mode::Cache ? ours : plugin_seeks(*bytes, targets, HOVA_SEEK_BACKWARD, true, m);
            sum.modes[static_cast<int>(m)] = f;
            const std::string part = std::string("+key ") + host::buffering_name(m);
            print("plimo", what, part.c_str(), f);
            if (f.ok) std::printf("%-10s %-46s %-14s %8.1f KB peak memory\n", "", "", "", static_cast<double>(f.peak) / 1024.0);
        }
#ifdef PLIMO_HAVE_LIBAV
        print("lavf", what, "seek", libav_seeks(*bytes, targets, false));
        const Figures theirs = libav_seeks(*bytes, targets, true);
        sum.lavf = theirs;
        print("lavf", what, "seek+keyframe", theirs);
        if (ours.ok && theirs.ok && ours.kb > 0)
            std::printf("%-10s %-46s %-14s time x%.2f, bytes x%.2f (lavf / plimo)\n", "ratio", what.c_str(),
                        "seek+keyframe", theirs.us / ours.us, theirs.kb / ours.kb);
#endif
        g_summary.push_back(sum);
    }
}

void print_summary() {
    std::printf("\n| File | libavformat us / KB | cache us / KB | none us / KB | ring us / KB | thread us / KB | "
                "peak KB cache / none / ring / thread |\n|---|---|---|---|---|---|---|\n");
    for (const Summary& s : g_summary) {
        std::printf("| %s | %.1f / %.1f", s.what.c_str(), s.lavf.us, s.lavf.kb);
        for (const Figures& f : s.modes) std::printf(" | %.1f / %.1f", f.us, f.kb);
        std::printf(" | %.0f / %.1f / %.0f / %.0f |\n", static_cast<double>(s.modes[0].peak) / 1024.0,
                    static_cast<double>(s.modes[1].peak) / 1024.0, static_cast<double>(s.modes[2].peak) / 1024.0,
                    static_cast<double>(s.modes[3].peak) / 1024.0);
    }
}

}  // namespace

int main(int argc, char** argv) {
    std::string corpus = plimo_bench::default_corpus_dir();
    std::string cache = plimo_bench::default_cache_dir(), big;
    int count = 200;
    for (int i = 1; i < argc; ++i) {
        const std::string a = argv[i];
        if (i + 1 < argc && a == "--corpus") corpus = argv[++i];
        else if (i + 1 < argc && a == "--cache") cache = argv[++i];
        else if (i + 1 < argc && a == "--big") big = argv[++i];
        else if (i + 1 < argc && a == "--seeks") count = std::atoi(argv[++i]);
        else if (i + 1 < argc && a == "--block-size") g_block = std::atoi(argv[++i]);
        else {
            std::fprintf(stderr, "usage: %s [--corpus DIR] [--cache DIR] [--big FILE] [--seeks N] [--block-size N]\n", argv[0]);
            return 2;
        }
    }
    if (count < 1) count = 1;
#ifdef PLIMO_HAVE_LIBAV
    av_log_set_level(AV_LOG_QUIET);
#endif
    std::printf("%d random backward seeks per file, %d-byte input blocks, %d-byte ring, from memory\n", count,
                g_block, kRing);
    if (big.empty()) big = plimo_bench::big_file(cache);
    Bytes file;
    if (!big.empty() && read_file(big, &file)) run_file("big.wmv", file, count);
    else std::fprintf(stderr, "no large file (ffmpeg missing?); skipped\n");
    for (const std::string& path : plimo_bench::corpus_files(corpus))
        if (read_file(path, &file)) run_file(path.substr(path.find_last_of('/') + 1), file, count);
    print_summary();
    return 0;
}
