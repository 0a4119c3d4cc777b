// asfdump frames FILE: plays the file as the framework does and prints every
// event the host sees (configuration records, frames, discards, end-of-stream
// notices, the seek before playing) as one JSON line each, then an "end" line
// after close_file.
#include <cinttypes>
#include <cstdio>
#include <cstring>
#include <memory>
#include <string>

#include <nlohmann/json.hpp>

#include "codec_names.h"
#include "commands.h"
#include "session.h"

namespace asfdump {

namespace {

using nlohmann::json;
using nlohmann::ordered_json;

json type_name(hova_stream_type_et t) {
    if (t == HOVA_STREAM_AUDIO) return "audio";
    if (t == HOVA_STREAM_VIDEO) return "video";
    return static_cast<int>(t);
}

std::string hex32(uint32_t v) {
    char buf[9];
    std::snprintf(buf, sizeof buf, "%08" PRIx32, v);
    return buf;
}

void emit(const ordered_json& j) {
    const std::string s = j.dump();
    std::fwrite(s.data(), 1, s.size(), stdout);
    std::fputc('\n', stdout);
}

// Media frames appended to DIR/audio.bin and DIR/video.bin.
class StreamDump {
public:
    bool open(const std::string& dir) {
        audio_.reset(std::fopen((dir + "/audio.bin").c_str(), "wb"));
        video_.reset(std::fopen((dir + "/video.bin").c_str(), "wb"));
        return audio_ && video_;
    }
    void write(hova_stream_type_et type, const uint8_t* bytes, int size) {
        FILE* f = type == HOVA_STREAM_AUDIO ? audio_.get() : type == HOVA_STREAM_VIDEO ? video_.get() : nullptr;
        if (f && size > 0) std::fwrite(bytes, 1, static_cast<size_t>(size), f);
    }

private:
    struct Closer {
        void operator()(FILE* f) const { std::fclose(f); }
    };
    std::unique_ptr<FILE, Closer> audio_, video_;
};

// Prints the host events recorded since `*next`.
void print_events(host::HostCallbacks& cb, size_t* next, const std::vector<int32_t>& config_codecs,
                  size_t* next_codec) {
    auto& ev = cb.events();
    for (; *next < ev.size(); ++*next) {
        const host::HostEvent& e = ev[*next];
        ordered_json j;
        j["call"] = e.call;
        switch (e.kind) {
            case host::EventKind::Commit:
                if (e.packet_type == 1) {
                    const int32_t codec = *next_codec < config_codecs.size() ? config_codecs[(*next_codec)++] : -1;
                    j["event"] = "config";
                    j["type"] = type_name(e.type);
                    j["codec"] = codec;
                    j["codec_name"] = codec_name(e.type, codec);
                } else {
                    j["event"] = "frame";
                    j["type"] = type_name(e.type);
                    j["pts"] = e.pts;
                }
                j["size"] = e.size;
                j["crc32"] = hex32(e.crc32);
                break;
            case host::EventKind::Discard:
                j["event"] = "discard";
                j["type"] = type_name(e.type);
                break;
            case host::EventKind::Notify:
                j["event"] = e.event == HOVA_EVENT_EOS ? json("eos") : json(static_cast<int>(e.event));
                j["type"] = type_name(e.type);
                break;
        }
        emit(j);
    }
    // Printed events are not needed again; keep memory flat on long files.
    if (*next == ev.size()) {
        ev.clear();
        *next = 0;
    }
}

// Host-side steps before the first get_data call: track and thumbnail
// choices, then a seek or resynchronisation when asked for. False when the
// plug-in refused the seek or the resynchronisation.
bool before_playing(const hova_dmx_func_st* dmx, void* ctx, const Options& opts) {
    if (opts.no_audio) dmx->set_track(ctx, HOVA_STREAM_AUDIO, -1, 0, HOVA_INPUT_MASTER);
    if (opts.no_video) dmx->set_track(ctx, HOVA_STREAM_VIDEO, -1, 0, HOVA_INPUT_MASTER);
    if (opts.has_thumbnail) dmx->set_multi_thumb(ctx, opts.thumbnail_us);
    bool accepted = true;
    if (opts.has_seek) {
        int64_t pts = opts.seek_us;
        const int r = dmx->seek_time(ctx, opts.backward ? HOVA_SEEK_BACKWARD : HOVA_SEEK_FORWARD, &pts,
                                     opts.query ? 1 : 0);
        ordered_json j;
        j["event"] = "seek";
        j["result"] = r;
        j["pts"] = pts;
        emit(j);
        accepted = r == HOVA_OK;
    }
    if (opts.has_resync) {
        const int r = dmx->resync_time(ctx, opts.resync_us);
        ordered_json j;
        j["event"] = "resync";
        j["result"] = r;
        j["pts"] = opts.resync_us;
        emit(j);
        accepted = accepted && r == HOVA_OK;
    }
    return accepted;
}

}  // namespace

int run_frames(const hova_dmx_func_st* dmx, const Options& opts) {
    auto session = make_session(dmx, opts);
    if (!session) return kExitUnreadable;
    StreamDump dump;
    if (!opts.dump_dir.empty() && !dump.open(opts.dump_dir)) {
        std::fprintf(stderr, "asfdump: cannot write into %s\n", opts.dump_dir.c_str());
        return kExitUsage;
    }

    host::HostCallbacks& cb = session->callbacks();
    // Configuration records begin with the codec code; frames go to the dump.
    std::vector<int32_t> config_codecs;
    cb.on_commit = [&](const host::HostEvent& e, const uint8_t* bytes) {
        if (e.packet_type == 1) {
            int32_t codec = -1;
            if (e.size >= 4) std::memcpy(&codec, bytes, 4);
            config_codecs.push_back(codec);
        } else if (!opts.dump_dir.empty()) {
            dump.write(e.type, bytes, e.size);
        }
    };

    if (!open_session(*session, opts)) return report_network(session->input(), opts) ? kExitOpenFailed : kExitUnreadable;
    void* ctx = session->context();
    const bool accepted = before_playing(dmx, ctx, opts);

    size_t next_event = 0, next_codec = 0;
    print_events(cb, &next_event, config_codecs, &next_codec);
    uint64_t calls = 0;
    int64_t frames = 0;
    int result = HOVA_OK;
    for (;;) {
        cb.call = ++calls;
        hova_stream_type_et type = HOVA_STREAM_NONE;
        int bufsize = 0;
        int64_t pts = 0;
        result = dmx->get_data(ctx, &type, &bufsize, &pts);
        for (size_t i = next_event; i < cb.events().size(); ++i) {
            const host::HostEvent& e = cb.events()[i];
            if (e.kind == host::EventKind::Commit && e.packet_type == 0) ++frames;
        }
        print_events(cb, &next_event, config_codecs, &next_codec);
        if (config_codecs.size() > 64 && next_codec == config_codecs.size()) {
            config_codecs.clear();
            next_codec = 0;
        }
        if (result != HOVA_OK && result != HOVA_TryAgain) break;
        if (opts.max_frames >= 0 && frames >= opts.max_frames) break;
    }
    session->close();
    ordered_json end;
    end["event"] = "end";
    end["result"] = result;
    end["calls"] = calls;
    end["blocks_outstanding"] = session->blocks_outstanding();
    emit(end);
    std::fflush(stdout);
    // A connection cut during play ends the stream like the end of the file;
    // the status says that the file was not read to its end.
    if (!report_network(session->input(), opts)) return kExitUnreadable;
    if (!accepted) {
        std::fprintf(stderr, "asfdump: the plug-in refused the %s (the play ran from where it was)\n",
                     opts.has_seek && opts.has_resync ? "seek or resync" : opts.has_seek ? "seek" : "resync");
        return kExitRefused;
    }
    return kExitOk;
}

}  // namespace asfdump
