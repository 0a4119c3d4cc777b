// The network path: every corpus file and the large ffmpeg WMV served by
// lighttpd on loopback, played and sought by URL through the reference
// host's HTTP input in each buffering mode, beside libavformat reading the
// same URLs with its own HTTP client (avformat_open_input on the URL) in the
// same run. Per play: requests, bytes received per byte of file and the time
// to the first frame; per seek that succeeds (each followed by delivery up to
// the first video frame, after one warm-up seek): requests and KB received.
//
// Requests and bytes come from the server's access log for both sides (each
// run asks with its own query string), so that both are counted the same
// way; the plug-in rows also show what the host's input counted itself.
//
// usage: http_bench [--corpus DIR] [--cache DIR] [--big FILE] [--seeks N] [--only NAME]
#include <dirent.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <map>
#include <random>
#include <sstream>
#include <string>
#include <vector>

#include "asf_api.h"
#include "bench_files.h"
#include "lean_host.h"
#include "loader.h"
#include "local_web_server.h"
#include "raw_input.h"

#ifdef PLIMO_HAVE_LIBAV
extern "C" {
#include <libavformat/avformat.h>
}
#endif

namespace {

using Clock = std::chrono::steady_clock;
using plimo_bench::LeanHost;

double ms_since(Clock::time_point t0) {
    return std::chrono::duration<double, std::milli>(Clock::now() - t0).count();
}

// What one run (one URL tag) cost, from the client's side.
struct Run {
    bool ok = false;
    std::string tag;
    uint64_t requests = 0, received = 0;  // the host's own count (plug-in only)
    double first_frame_ms = 0;
    int seeks = 0;
    double seek_ms = 0;  // per seek plus first frame
};

// ---- the plug-in through the host's HTTP input ----

struct Opened {
    std::unique_ptr<host::RawInput> input;
    std::unique_ptr<LeanHost> host;
    host::ContextBuffer buf{static_cast<size_t>(hova_asff_demuxer.min_context_size)};
    void* ctx = nullptr;
};

bool open_url(const std::string& url, int m, Opened* o) {
    std::string why;
    o->input = host::RawInput::from_url(url, host::with_buffering(host::kBufferings[m]), &why);
    if (!o->input) {
        std::fprintf(stderr, "%s: %s\n", url.c_str(), why.c_str());
        return false;
    }
    o->host = std::make_unique<LeanHost>();
    return hova_asff_demuxer.open_file(&o->ctx, o->input->io(), o->buf.data(), static_cast<int>(o->buf.size()),
                                       1 << 20, o->host->table()) == HOVA_OK;
}

// get_data until a media frame of `type` (any when NONE) is committed; false at the end.
bool until_frame(Opened& o, hova_stream_type_et type) {
    o.host->last_type = HOVA_STREAM_NONE;
    hova_stream_type_et t = HOVA_STREAM_NONE;
    int bs = 0;
    int64_t pts = 0;
    for (int calls = 0; calls < 1000000; ++calls) {
        const int r = hova_asff_demuxer.get_data(o.ctx, &t, &bs, &pts);
        if (o.host->last_type != HOVA_STREAM_NONE && (type == HOVA_STREAM_NONE || o.host->last_type == type))
            return true;
        if (r != HOVA_OK && r != HOVA_TryAgain) return false;
    }
    return false;
}

void finish(Opened& o, Run* run) {
    hova_asff_demuxer.close_file(o.ctx);
    run->requests = o.input->http()->stats().requests;
    run->received = o.input->http()->stats().bytes_received;
}

Run plugin_play(const std::string& url, int m) {
    Run run;
    run.tag = url.substr(url.find('?') + 1);
    Opened o;
    const auto t0 = Clock::now();
    if (!open_url(url, m, &o)) return run;
    run.ok = true;
    run.first_frame_ms = until_frame(o, HOVA_STREAM_NONE) ? ms_since(t0) : -1;
    while (until_frame(o, HOVA_STREAM_NONE)) {
    }
    finish(o, &run);
    return run;
}

// Open, configuration records, a warm-up seek to targets[0] with its first
// frame, then the other targets when `all`.
Run plugin_seek(const std::string& url, int m, const std::vector<int64_t>& targets, bool all) {
    Run run;
    run.tag = url.substr(url.find('?') + 1);
    Opened o;
    if (!open_url(url, m, &o)) return run;
    const size_t n = all ? targets.size() : 1;
    Clock::time_point t0;
    for (size_t i = 0; i < n; ++i) {
        if (i == 1) t0 = Clock::now();
        int64_t found = targets[i];
        if (hova_asff_demuxer.seek_time(o.ctx, HOVA_SEEK_BACKWARD, &found, 0) != HOVA_OK) continue;
        if (i > 0) ++run.seeks;
        (void)until_frame(o, HOVA_STREAM_VIDEO);
    }
    if (n > 1) run.seek_ms = ms_since(t0) / static_cast<double>(n - 1);
    run.ok = true;
    finish(o, &run);
    return run;
}

// Duration (us) and whether there is video to seek by.
bool describe(const std::string& url, int64_t* duration, bool* video) {
    Opened o;
    if (!open_url(url, 0, &o)) return false;
    const auto* d = static_cast<const asf_demuxer_st*>(o.ctx);
    *duration = d->s.duration;
    *video = d->s.active_stream[VID] >= 0;
    hova_asff_demuxer.close_file(o.ctx);
    return true;
}

// ---- libavformat over the same URLs ----

#ifdef PLIMO_HAVE_LIBAV
AVFormatContext* lavf_open(const std::string& url) {
    AVFormatContext* fmt = nullptr;
    if (avformat_open_input(&fmt, url.c_str(), nullptr, nullptr) != 0) return nullptr;
    return fmt;
}

Run lavf_play(const std::string& url) {
    Run run;
    run.tag = url.substr(url.find('?') + 1);
    const auto t0 = Clock::now();
    AVFormatContext* fmt = lavf_open(url);
    if (!fmt) return run;
    AVPacket* pkt = av_packet_alloc();
    bool first = true;
    while (av_read_frame(fmt, pkt) >= 0) {
        if (first) run.first_frame_ms = ms_since(t0);
        first = false;
        av_packet_unref(pkt);
    }
    run.ok = true;
    if (first) run.first_frame_ms = -1;
    run.received = static_cast<uint64_t>(fmt->pb->bytes_read);
    av_packet_free(&pkt);
    avformat_close_input(&fmt);
    return run;
}

Run lavf_seek(const std::string& url, const std::vector<int64_t>& targets, bool all) {
    Run run;
    run.tag = url.substr(url.find('?') + 1);
    AVFormatContext* fmt = lavf_open(url);
    if (!fmt) return run;
    const int vs = av_find_best_stream(fmt, AVMEDIA_TYPE_VIDEO, -1, -1, nullptr, 0);
    if (vs < 0) {
        avformat_close_input(&fmt);
        return run;
    }
    const AVRational tb = fmt->streams[vs]->time_base;
    AVPacket* pkt = av_packet_alloc();
    const size_t n = all ? targets.size() : 1;
    Clock::time_point t0;
    for (size_t i = 0; i < n; ++i) {
        if (i == 1) t0 = Clock::now();
        if (av_seek_frame(fmt, vs, av_rescale_q(targets[i], AV_TIME_BASE_Q, tb), AVSEEK_FLAG_BACKWARD) < 0) continue;
        if (i > 0) ++run.seeks;
        while (av_read_frame(fmt, pkt) >= 0) {
            const bool video = pkt->stream_index == vs;
            av_packet_unref(pkt);
            if (video) break;
        }
    }
    if (n > 1) run.seek_ms = ms_since(t0) / static_cast<double>(n - 1);
    run.ok = true;
    run.received = static_cast<uint64_t>(fmt->pb->bytes_read);
    av_packet_free(&pkt);
    avformat_close_input(&fmt);
    return run;
}
#endif

// ---- the server's view ----

struct Served {
    uint64_t requests = 0, bytes = 0;
};

// Access log lines "GET /name?tag HTTP/1.1 status bytes", summed by tag.
std::map<std::string, Served> by_tag(const std::vector<std::string>& log) {
    std::map<std::string, Served> out;
    for (const std::string& line : log) {
        std::istringstream f(line);
        std::string method, target, proto, status, bytes;
        f >> method >> target >> proto >> status >> bytes;
        const size_t q = target.find('?');
        if (q == std::string::npos) continue;
        Served& s = out[target.substr(q + 1)];
        s.requests++;
        s.bytes += bytes == "-" ? 0 : std::strtoull(bytes.c_str(), nullptr, 10);
    }
    return out;
}

struct FileRuns {
    std::string name;
    uint64_t size = 0;
    std::vector<std::pair<std::string, Run>> play;                        // (who, run)
    std::vector<std::tuple<std::string, Run, Run>> seek;                  // (who, warm-up only, all)
};

}  // namespace

int main(int argc, char** argv) {
    std::string corpus = plimo_bench::default_corpus_dir();
    std::string cache = plimo_bench::default_cache_dir(), big, only;
    int seeks = 20;
    for (int i = 1; i < argc; ++i) {
        const std::string a = argv[i];
        if (i + 1 < argc && a == "--corpus") corpus = argv[++i];
        else if (i + 1 < argc && a == "--cache") cache = argv[++i];
        else if (i + 1 < argc && a == "--big") big = argv[++i];
        else if (i + 1 < argc && a == "--seeks") seeks = std::max(1, std::atoi(argv[++i]));
        else if (i + 1 < argc && a == "--only") only = argv[++i];
        else {
            std::fprintf(stderr, "usage: %s [--corpus DIR] [--cache DIR] [--big FILE] [--seeks N] [--only NAME]\n",
                         argv[0]);
            return 2;
        }
    }
#ifdef PLIMO_HAVE_LIBAV
    av_log_set_level(AV_LOG_QUIET);
    avformat_network_init();
#endif
    if (big.empty()) big = plimo_bench::big_file(cache);

    // The server's folder: links to the files measured.
    char tmpl[] = "/tmp/plimo_http_bench_XXXXXX";
    if (!mkdtemp(tmpl)) return 1;
    const std::string root = tmpl;
    std::vector<std::string> files = plimo_bench::corpus_files(corpus);
    if (!big.empty()) files.insert(files.begin(), big);
    std::vector<FileRuns> all;
    for (const std::string& path : files) {
        const std::string name = path.substr(path.find_last_of('/') + 1);
        if (!only.empty() && name.find(only) == std::string::npos) continue;
        struct stat st {};
        if (stat(path.c_str(), &st) != 0) continue;
        if (symlink(std::filesystem::absolute(path).c_str(), (root + "/" + name).c_str()) != 0) continue;
        FileRuns f;
        f.name = name;
        f.size = static_cast<uint64_t>(st.st_size);
        all.push_back(f);
    }
    std::string why;
    auto server = host::LocalWebServer::start(root, &why);
    if (!server) {
        std::fprintf(stderr, "http_bench: %s\n", why.c_str());
        std::filesystem::remove_all(root);
        return 1;
    }

    int tag = 0;
    auto url = [&](const std::string& name, const std::string& what) {
        return server->url(name) + "?" + what + "-" + std::to_string(++tag);
    };
    for (FileRuns& f : all) {
        std::fprintf(stderr, "%s...\n", f.name.c_str());
        for (int m = 0; m < 4; ++m) f.play.emplace_back(host::buffering_name(host::kBufferings[m]), plugin_play(url(f.name, "play"), m));
#ifdef PLIMO_HAVE_LIBAV
        f.play.emplace_back("lavf", lavf_play(url(f.name, "lavf-play")));
#endif
        int64_t duration = 0;
        bool video = false;
        if (!describe(url(f.name, "describe"), &duration, &video) || !video || duration <= 1) continue;
        std::mt19937_64 rng(20261123);
        std::uniform_int_distribution<int64_t> pick(1, duration - 1);
        std::vector<int64_t> targets(static_cast<size_t>(seeks) + 1);
        for (int64_t& t : targets) t = pick(rng);
        for (int m = 0; m < 4; ++m)
            f.seek.emplace_back(host::buffering_name(host::kBufferings[m]), plugin_seek(url(f.name, "warm"), m, targets, false),
                                plugin_seek(url(f.name, "seek"), m, targets, true));
#ifdef PLIMO_HAVE_LIBAV
        f.seek.emplace_back("lavf", lavf_seek(url(f.name, "lavf-warm"), targets, false),
                            lavf_seek(url(f.name, "lavf-seek"), targets, true));
#endif
    }
    const std::map<std::string, Served> served = by_tag(server->stop());
    std::filesystem::remove_all(root);

    std::printf("lighttpd on 127.0.0.1. requests: the server's access log. received: body bytes that reached the\n"
                "client (the host's HTTP input; libavformat's AVIOContext bytes_read). written: body bytes the server\n"
                "handed to its socket (an upper bound on the wire: on loopback a dropped transfer's socket buffers\n"
                "count in full).\n\n");
    std::printf("%-38s %-12s %9s %14s %14s %13s\n", "file", "play", "requests", "received/byte", "written/byte",
                "1st frame ms");
    for (const FileRuns& f : all) {
        for (const auto& [who, run] : f.play) {
            if (!run.ok) {
                std::printf("%-38s %-12s unavailable\n", f.name.c_str(), who.c_str());
                continue;
            }
            const Served s = served.count(run.tag) ? served.at(run.tag) : Served{};
            const double size = static_cast<double>(f.size);
            std::printf("%-38s %-12s %9llu %14.3f %14.3f %13.1f\n", f.name.c_str(), who.c_str(),
                        static_cast<unsigned long long>(s.requests), static_cast<double>(run.received) / size,
                        static_cast<double>(s.bytes) / size, run.first_frame_ms);
        }
    }
    std::printf("\n%-38s %-12s %9s %14s %14s %13s %9s\n", "file", "seek+frame", "req/seek", "KB recv/seek",
                "KB written", "warm-up req", "ms/seek");
    for (const FileRuns& f : all) {
        for (const auto& [who, warm, run] : f.seek) {
            if (!warm.ok || !run.ok || run.seeks == 0) {
                std::printf("%-38s %-12s unavailable\n", f.name.c_str(), who.c_str());
                continue;
            }
            const Served w = served.count(warm.tag) ? served.at(warm.tag) : Served{};
            const Served s = served.count(run.tag) ? served.at(run.tag) : Served{};
            const double n = static_cast<double>(run.seeks);
            const double req = (static_cast<double>(s.requests) - static_cast<double>(w.requests)) / n;
            const double kb = (static_cast<double>(run.received) - static_cast<double>(warm.received)) / n / 1024.0;
            const double kbw = (static_cast<double>(s.bytes) - static_cast<double>(w.bytes)) / n / 1024.0;
            std::printf("%-38s %-12s %9.2f %14.1f %14.1f %13llu %9.2f\n", f.name.c_str(), who.c_str(), req, kb, kbw,
                        static_cast<unsigned long long>(w.requests), run.seek_ms);
        }
    }
    return 0;
}
