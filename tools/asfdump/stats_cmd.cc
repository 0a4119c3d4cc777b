// asfdump stats FILE: plays the file as the framework does and prints, per
// delivered stream, the frame count, first and last time, bit rate, largest
// gap between frames and the key-frame interval, then checks the simple index:
// a seek to each entry's time must deliver a key frame first.
//
// The host interface carries no key-frame flag with a frame. Thumbnail mode
// (set_multi_thumb) delivers only key video frames, so a second play with an
// interval of 0 delivers every key frame: those times are the key frames.
#include <algorithm>
#include <cinttypes>
#include <cstdio>
#include <set>
#include <string>
#include <vector>

#include "codec_names.h"
#include "commands.h"
#include "context_view.h"
#include "session.h"
#include "time_arg.h"

namespace asfdump {

namespace {

struct Track {
    std::vector<int64_t> pts;  // delivery order
    uint64_t bytes = 0;
};

// Delivered media frames per stream type, played to the end.
struct Played {
    Track audio, video;
    int result = HOVA_OK;
};

int get_data(const hova_dmx_func_st* dmx, host::Session& s) {
    hova_stream_type_et type = HOVA_STREAM_NONE;
    int size = 0;
    int64_t pts = 0;
    return dmx->get_data(s.context(), &type, &size, &pts);
}

// Plays to the end (or until `stop` says so after a call), collecting frames.
template <typename Stop>
Played play(const hova_dmx_func_st* dmx, host::Session& s, Stop stop) {
    Played p;
    for (;;) {
        p.result = get_data(dmx, s);
        for (const host::HostEvent& e : s.callbacks().events()) {
            if (e.kind != host::EventKind::Commit || e.packet_type != 0) continue;
            Track& t = e.type == HOVA_STREAM_AUDIO ? p.audio : p.video;
            t.pts.push_back(e.pts);
            t.bytes += static_cast<uint64_t>(e.size);
        }
        s.callbacks().events().clear();
        if ((p.result != HOVA_OK && p.result != HOVA_TryAgain) || stop(p)) return p;
    }
}

std::unique_ptr<host::Session> open_new(const hova_dmx_func_st* dmx, const Options& opts, int* status) {
    auto s = make_session(dmx, opts, kAllRecords);
    if (!s) {
        *status = kExitUnreadable;
        return nullptr;
    }
    if (!open_session(*s, opts)) {
        *status = report_network(s->input(), opts) ? kExitOpenFailed : kExitUnreadable;
        return nullptr;
    }
    return s;
}

// Largest distance between neighbouring times and where it starts.
std::pair<int64_t, int64_t> largest_gap(std::vector<int64_t> t) {
    std::sort(t.begin(), t.end());
    std::pair<int64_t, int64_t> g{0, t.empty() ? 0 : t.front()};
    for (size_t i = 1; i < t.size(); ++i)
        if (t[i] - t[i - 1] > g.first) g = {t[i] - t[i - 1], t[i - 1]};
    return g;
}

void print_track(const char* kind, const std::string& codec, const Track& t) {
    if (t.pts.empty()) {
        std::printf("%s %s: no frames\n", kind, codec.c_str());
        return;
    }
    const auto [lo, hi] = std::minmax_element(t.pts.begin(), t.pts.end());
    const int64_t span = *hi - *lo;
    const size_t n = t.pts.size();
    // The span runs from the first frame's start to the last one's; one mean
    // frame more covers the last frame itself.
    const double seconds = n > 1 ? static_cast<double>(span) * n / (n - 1) / 1e6 : 0;
    std::printf("%s %s: %zu frames, %s to %s", kind, codec.c_str(), n, format_time_us(*lo).c_str(),
                format_time_us(*hi).c_str());
    if (seconds > 0) std::printf(", %.1f kb/s", static_cast<double>(t.bytes) * 8 / seconds / 1000);
    const auto [gap, at] = largest_gap(t.pts);
    std::printf(", largest gap %s (after %s)\n", format_time_us(gap).c_str(), format_time_us(at).c_str());
}

void print_keys(const std::set<int64_t>& keys) {
    std::printf("  key frames: %zu", keys.size());
    if (keys.size() > 1) {
        const int64_t mean = (*keys.rbegin() - *keys.begin()) / static_cast<int64_t>(keys.size() - 1);
        const auto [longest, at] = largest_gap(std::vector<int64_t>(keys.begin(), keys.end()));
        std::printf(", one every %s on average, longest interval %s (after %s)", format_time_us(mean).c_str(),
                    format_time_us(longest).c_str(), format_time_us(at).c_str());
    }
    std::printf("\n");
}

// Seeks (backward) to each index entry's time and plays to the first key
// frame: it must be the latest key frame at or before that time.
void check_index(const hova_dmx_func_st* dmx, host::Session& s, const std::set<int64_t>& keys) {
    int64_t probe = 0;
    dmx->seek_time(s.context(), HOVA_SEEK_BACKWARD, &probe, 0);  // makes the plug-in place entry 0
    const ContextView v = view_context(s.context());
    const int64_t start = std::max<int64_t>(v.index_start_us, 0);
    uint32_t good = 0;
    std::string misses;
    int shown = 0;
    for (uint32_t i = 0; i < v.index_entries; ++i) {
        const int64_t target = start + static_cast<int64_t>(i) * v.index_interval_us;
        const auto latest = keys.upper_bound(target);
        const int64_t want = latest == keys.begin() ? -1 : *std::prev(latest);
        int64_t pts = target;
        std::string why;
        if (dmx->seek_time(s.context(), HOVA_SEEK_BACKWARD, &pts, 0) != HOVA_OK) {
            why = "seek refused";
        } else {
            const Played p = play(dmx, s, [&](const Played& q) {
                return q.video.pts.size() > 500 || (!q.video.pts.empty() && keys.count(q.video.pts.back()));
            });
            const int64_t got = !p.video.pts.empty() && keys.count(p.video.pts.back()) ? p.video.pts.back() : -1;
            if (got >= 0 && got == want) ++good;
            else if (got < 0) why = want < 0 ? "no key frame at or before it" : "no key frame follows";
            else why = "leads to the key frame at " + format_time_us(got) + ", the latest one before it is at " +
                       (want < 0 ? std::string("none") : format_time_us(want));
        }
        if (!why.empty() && shown++ < 5)
            misses += "  entry " + std::to_string(i) + " (" + format_time_us(target) + "): " + why + "\n";
    }
    std::printf("index: %" PRIu32 " entries, one every %s from %s; %" PRIu32 " lead to the latest key frame at or before their time\n",
                v.index_entries, format_time_us(v.index_interval_us).c_str(), format_time_us(start).c_str(), good);
    std::fputs(misses.c_str(), stdout);
}

}  // namespace

int run_stats(const hova_dmx_func_st* dmx, const Options& opts) {
    int status = kExitOk;
    auto s = open_new(dmx, opts, &status);
    if (!s) return status;
    hova_audio_info_st a{};
    hova_video_info_st v{};
    const bool has_audio = dmx->get_info(s->context(), HOVA_STREAM_AUDIO, -1, &a) == HOVA_OK;
    const bool has_video = dmx->get_info(s->context(), HOVA_STREAM_VIDEO, -1, &v) == HOVA_OK;
    const ContextView view = view_context(s->context());
    const Played all = play(dmx, *s, [](const Played&) { return false; });
    s->close();
    if (has_audio) print_track("audio", audio_codec_name(a.codec), all.audio);
    if (has_video) print_track("video", video_codec_name(v.codec), all.video);
    if (has_audio) std::printf("  key frames: not told apart for audio (every audio frame decodes alone)\n");

    if (has_video) {
        auto thumbs = open_new(dmx, opts, &status);
        if (!thumbs) return status;
        dmx->set_multi_thumb(thumbs->context(), 0);  // every key frame, nothing else
        const Played keyed = play(dmx, *thumbs, [](const Played&) { return false; });
        dmx->set_multi_thumb(thumbs->context(), -1);
        // The first frame after open is delivered whatever it is; it counts
        // only when it is a key frame of the full play too (always, for a file
        // that starts on one).
        const std::set<int64_t> keys(keyed.video.pts.begin(), keyed.video.pts.end());
        print_keys(keys);
        if (view.index_entries > 0) {
            check_index(dmx, *thumbs, keys);
        } else {
            std::printf("index: none\n");
        }
        thumbs->close();
        if (thumbs->blocks_outstanding() != 0) status = kExitOpenFailed;
    }
    if (s->blocks_outstanding() != 0) status = kExitOpenFailed;
    if (status != kExitOk) std::fprintf(stderr, "asfdump: blocks still held after close\n");
    std::fflush(stdout);
    return report_network(s->input(), opts) ? status : kExitUnreadable;
}

}  // namespace asfdump
