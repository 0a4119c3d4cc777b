// asfdump thumb FILE: pictures of the video the plug-in delivers, decoded with
// libavcodec. --at TIME seeks back to the key frame at or before TIME and
// keeps the first picture at or after it; --every DURATION plays the file in
// the plug-in's thumbnail mode and lays its key frames out on a contact sheet.
#include <unistd.h>

#include <chrono>
#include <cinttypes>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <deque>
#include <string>
#include <vector>

#include "commands.h"
#include "time_arg.h"

#ifdef PLIMO_HAVE_PICTURES
#include "contact_sheet.h"
#include "picture_codec.h"
#endif

namespace asfdump {

#ifndef PLIMO_HAVE_PICTURES

int run_thumb(const hova_dmx_func_st*, const Options&) {
    std::fputs("asfdump: thumb is not available: this asfdump was built without libavcodec and "
               "libswscale (install libavcodec-dev and libswscale-dev and build again)\n", stderr);
    return kExitUsage;
}

#else

namespace {

struct Request {
    bool sheet = false;
    int64_t at_us = 0;
    int64_t every_us = 0;
    std::string out;
    int width = 0;  // 0: the stream's own (--at) or a default (--sheet)
    int columns = 4;
};

constexpr int kDefaultTileWidth = 240;

bool read_count(const char* text, int lo, int hi, int* out) {
    char* end = nullptr;
    const long v = std::strtol(text, &end, 10);
    if (end == text || *end != '\0' || v < lo || v > hi) return false;
    *out = static_cast<int>(v);
    return true;
}

bool read_request(const ThumbArgs& a, Request* r, std::string* error) {
    if ((a.at != nullptr) == (a.every != nullptr)) {
        *error = "thumb takes either --at TIME -o OUT.png or --every DURATION --sheet OUT.png";
        return false;
    }
    r->sheet = a.every != nullptr;
    if (!r->sheet) {
        if (!parse_time_us(a.at, &r->at_us) || r->at_us < 0) {
            *error = std::string("bad --at ") + a.at + " (a time such as 30s, 1:02.5 or 500ms)";
            return false;
        }
        if (!a.output || a.sheet || a.columns) {
            *error = "--at writes one picture: give -o OUT.png (--sheet and --columns go with --every)";
            return false;
        }
        r->out = a.output;
    } else {
        if (!parse_time_us(a.every, &r->every_us) || r->every_us <= 0) {
            *error = std::string("bad --every ") + a.every + " (a duration such as 10s or 1:00)";
            return false;
        }
        if (!a.sheet || a.output) {
            *error = "--every makes a contact sheet: give --sheet OUT.png";
            return false;
        }
        r->out = a.sheet;
        if (a.columns && !read_count(a.columns, 1, 64, &r->columns)) {
            *error = "--columns takes 1 to 64";
            return false;
        }
    }
    if (a.width && !read_count(a.width, 16, 8192, &r->width)) {
        *error = "--width takes 16 to 8192 pixels";
        return false;
    }
    return true;
}

// Video frames the plug-in commits (audio is turned off), kept until the
// decoder takes them.
struct Delivery {
    struct Frame {
        int64_t pts;
        std::vector<uint8_t> bytes;
    };
    std::vector<uint8_t> config;  // the configuration record, once it came
    std::deque<Frame> frames;

    void attach(host::HostCallbacks& cb) {
        cb.on_commit = [this](const host::HostEvent& e, const uint8_t* bytes) {
            if (e.type != HOVA_STREAM_VIDEO) return;
            if (e.packet_type == 1)
                config.assign(bytes, bytes + e.size);
            else
                frames.push_back({e.pts, std::vector<uint8_t>(bytes, bytes + e.size)});
        };
    }
};

// One open file with its video stream chosen; null after saying why.
struct Opened {
    std::unique_ptr<host::Session> session;
    hova_video_info_st video{};
    int64_t duration = -1;
    int status = kExitOk;
};

Opened open_video(const hova_dmx_func_st* dmx, const Options& opts, Delivery* delivery) {
    Opened o;
    o.session = make_session(dmx, opts);
    if (!o.session) {
        o.status = kExitUnreadable;
        return o;
    }
    delivery->attach(o.session->callbacks());
    if (!open_session(*o.session, opts)) {
        o.status = report_network(o.session->input(), opts) ? kExitOpenFailed : kExitUnreadable;
        return o;
    }
    void* ctx = o.session->context();
    if (dmx->get_info(ctx, HOVA_STREAM_VIDEO, -1, &o.video) != HOVA_OK) {
        std::fprintf(stderr, "asfdump: %s has no video stream (audio only): there is no picture to show\n",
                     opts.file.c_str());
        o.status = kExitUsage;
        return o;
    }
    hova_program_info_st prog{};
    if (dmx->get_info(ctx, HOVA_STREAM_PROG, 0, &prog) == HOVA_OK) o.duration = prog.duration;
    dmx->set_track(ctx, HOVA_STREAM_AUDIO, -1, 0, HOVA_INPUT_MASTER);
    return o;
}

// One get_data call; the host's event record is not needed here.
int step(const hova_dmx_func_st* dmx, host::Session& s) {
    hova_stream_type_et type = HOVA_STREAM_NONE;
    int size = 0;
    int64_t pts = 0;
    const int rc = dmx->get_data(s.context(), &type, &size, &pts);
    s.callbacks().events().clear();
    return rc;
}

bool playing(int rc) { return rc == HOVA_OK || rc == HOVA_TryAgain; }

std::unique_ptr<VideoDecoder> make_decoder(const Delivery& d, const Opened& o) {
    std::string why;
    auto decoder = VideoDecoder::create(d.config.data(), d.config.size(), o.video.width, o.video.height, &why);
    if (!decoder) std::fprintf(stderr, "asfdump: cannot decode the video: %s\n", why.c_str());
    return decoder;
}

bool write_or_say(const Image& image, const std::string& path) {
    std::string why;
    if (write_png(image, path, &why)) return true;
    std::fprintf(stderr, "asfdump: %s\n", why.c_str());
    return false;
}

// Ends the session; a block the plug-in still holds is a fault worth saying.
int finish(Opened& o, const Options& opts, int status) {
    o.session->close();
    if (o.session->blocks_outstanding() != 0) {
        std::fprintf(stderr, "asfdump: %zu blocks still held after close\n", o.session->blocks_outstanding());
        return kExitOpenFailed;
    }
    if (!report_network(o.session->input(), opts)) return kExitUnreadable;
    return status;
}

int thumb_at(const hova_dmx_func_st* dmx, const Options& opts, const Request& r) {
    Delivery delivery;
    Opened o = open_video(dmx, opts, &delivery);
    if (o.status != kExitOk) return o.session ? finish(o, opts, o.status) : o.status;
    int64_t found = r.at_us;
    if (dmx->seek_time(o.session->context(), HOVA_SEEK_BACKWARD, &found, 0) != HOVA_OK && r.at_us > 0)
        std::fprintf(stderr, "asfdump: the seek to %s was refused; decoding from the start\n",
                     format_time_us(r.at_us).c_str());

    // Pictures before the first key picture lack their references and are
    // passed over, as are pictures before the target.
    std::unique_ptr<VideoDecoder> decoder;
    bool key_seen = false, got = false, ended = false;
    int64_t got_pts = -1, last_pts = INT64_MIN, last_step = 1;
    auto take = [&] {
        int64_t pts = 0;
        bool key = false;
        while (!got && decoder->receive(&pts, &key)) {
            // Pictures drained at the end have no time: they follow the last
            // one at the same pace.
            if (pts == INT64_MIN && last_pts != INT64_MIN) pts = last_pts + last_step;
            if (pts != INT64_MIN && last_pts != INT64_MIN && pts > last_pts) last_step = pts - last_pts;
            last_pts = pts;
            key_seen = key_seen || key;
            if (key_seen && pts >= r.at_us) {
                got = true;
                got_pts = pts;
            }
        }
    };
    while (!got && !ended) {
        ended = !playing(step(dmx, *o.session));
        if (!decoder && !delivery.config.empty() && !(decoder = make_decoder(delivery, o)))
            return finish(o, opts, kExitOpenFailed);
        for (; decoder && !got && !delivery.frames.empty(); delivery.frames.pop_front()) {
            decoder->send(delivery.frames.front().bytes.data(), delivery.frames.front().bytes.size(),
                          delivery.frames.front().pts);
            take();
        }
    }
    if (decoder && !got) {
        decoder->send_end();
        take();
    }
    if (!got) {
        std::fprintf(stderr, "asfdump: %s: no picture at or after %s\n", opts.file.c_str(),
                     format_time_us(r.at_us).c_str());
        return finish(o, opts, kExitOpenFailed);
    }
    const Image image = decoder->rgb(r.width);
    if (!write_or_say(image, r.out)) return finish(o, opts, kExitUnreadable);
    std::printf("%s: picture at %s, %dx%d\n", r.out.c_str(), format_time_us(got_pts).c_str(), image.width,
                image.height);
    return finish(o, opts, kExitOk);
}

// "at 0:12:00.000 of 1:30:00.000, 144 pictures" on stderr, at most twice a
// second and only once the work has taken a second: short files stay quiet.
class Progress {
public:
    explicit Progress(int64_t duration) : duration_(duration), tty_(isatty(STDERR_FILENO) != 0) {}
    void update(int64_t pts, size_t pictures) {
        const auto now = Clock::now();
        if (now - start_ < std::chrono::seconds(1) || now - last_ < std::chrono::milliseconds(tty_ ? 500 : 5000))
            return;
        last_ = now;
        shown_ = true;
        std::fprintf(stderr, "%sasfdump: thumb: at %s of %s, %zu pictures%s", tty_ ? "\r" : "",
                     format_time_us(pts).c_str(), duration_ > 0 ? format_time_us(duration_).c_str() : "?", pictures,
                     tty_ ? "" : "\n");
    }
    void done() {
        if (shown_ && tty_) std::fputc('\n', stderr);
    }

private:
    using Clock = std::chrono::steady_clock;
    int64_t duration_;
    bool tty_;
    bool shown_ = false;
    Clock::time_point start_ = Clock::now(), last_{};
};

int thumb_sheet(const hova_dmx_func_st* dmx, const Options& opts, const Request& r) {
    Delivery delivery;
    Opened o = open_video(dmx, opts, &delivery);
    if (o.status != kExitOk) return o.session ? finish(o, opts, o.status) : o.status;
    dmx->set_multi_thumb(o.session->context(), r.every_us);
    const int width = r.width > 0 ? r.width : std::min<int>(kDefaultTileWidth, o.video.width);

    // Each delivered key frame is decoded on its own: the decoder is drained
    // for its picture and reset before the next.
    std::unique_ptr<VideoDecoder> decoder;
    std::vector<Tile> tiles;
    Progress progress(o.duration);
    for (bool ended = false; !ended;) {
        ended = !playing(step(dmx, *o.session));
        if (!decoder && !delivery.config.empty() && !(decoder = make_decoder(delivery, o)))
            return finish(o, opts, kExitOpenFailed);
        for (; decoder && !delivery.frames.empty(); delivery.frames.pop_front()) {
            const Delivery::Frame& f = delivery.frames.front();
            decoder->send(f.bytes.data(), f.bytes.size(), f.pts);
            decoder->send_end();
            int64_t pts = 0;
            bool key = false;
            if (decoder->receive(&pts, &key)) tiles.push_back({f.pts, decoder->rgb(width)});
            decoder->reset();
            progress.update(f.pts, tiles.size());
        }
    }
    progress.done();
    if (tiles.empty()) {
        std::fprintf(stderr, "asfdump: %s: no picture could be decoded\n", opts.file.c_str());
        return finish(o, opts, kExitOpenFailed);
    }
    const SheetLayout layout = SheetLayout::of(tiles, r.columns);
    if (!write_or_say(compose_sheet(tiles, layout), r.out)) return finish(o, opts, kExitUnreadable);
    // Where each tile is, for people and for scripts.
    for (size_t i = 0; i < tiles.size(); ++i)
        std::printf("tile %zu: %s at %d,%d, %dx%d\n", i + 1, format_time_us(tiles[i].pts).c_str(), layout.x(i),
                    layout.y(i), tiles[i].image.width, tiles[i].image.height);
    return finish(o, opts, kExitOk);
}

}  // namespace

int run_thumb(const hova_dmx_func_st* dmx, const Options& opts) {
    Request r;
    std::string error;
    if (!read_request(opts.thumb, &r, &error)) {
        std::fprintf(stderr, "asfdump: %s\n", error.c_str());
        return kExitUsage;
    }
    set_codec_log(opts.log);
    return r.sheet ? thumb_sheet(dmx, opts, r) : thumb_at(dmx, opts, r);
}

#endif

}  // namespace asfdump
