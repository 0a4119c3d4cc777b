#include "options.h"

#include <getopt.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "time_arg.h"

namespace asfdump {

namespace {

enum OptId {
    kBuffer = 256, kThread, kBlockSize, kRingSize, kStreaming, kNotSeekable, kDetectDisc,
    kSeek, kBackward, kQuery, kResync, kThumbnail, kNoAudio, kNoVideo, kMaxFrames, kDumpStreams,
    kLog, kPlugin, kHelp, kStreams, kVersion, kThumbAt, kThumbWidth, kThumbEvery, kThumbSheet, kThumbColumns,
};

const option kLongOptions[] = {
    {"buffer", required_argument, nullptr, kBuffer},
    {"thread", no_argument, nullptr, kThread},
    {"block-size", required_argument, nullptr, kBlockSize},
    {"ring-size", required_argument, nullptr, kRingSize},
    {"streaming", no_argument, nullptr, kStreaming},
    {"not-seekable", no_argument, nullptr, kNotSeekable},
    {"detect-discontinuity", no_argument, nullptr, kDetectDisc},
    {"seek", required_argument, nullptr, kSeek},
    {"backward", no_argument, nullptr, kBackward},
    {"query", no_argument, nullptr, kQuery},
    {"resync", required_argument, nullptr, kResync},
    {"thumbnail", required_argument, nullptr, kThumbnail},
    {"no-audio", no_argument, nullptr, kNoAudio},
    {"no-video", no_argument, nullptr, kNoVideo},
    {"max-frames", required_argument, nullptr, kMaxFrames},
    {"dump-streams", required_argument, nullptr, kDumpStreams},
    {"log", no_argument, nullptr, kLog},
    {"plugin", required_argument, nullptr, kPlugin},
    {"help", no_argument, nullptr, kHelp},
    {"streams", required_argument, nullptr, kStreams},
    {"version", no_argument, nullptr, kVersion},
    {"at", required_argument, nullptr, kThumbAt},
    {"width", required_argument, nullptr, kThumbWidth},
    {"every", required_argument, nullptr, kThumbEvery},
    {"sheet", required_argument, nullptr, kThumbSheet},
    {"columns", required_argument, nullptr, kThumbColumns},
    {nullptr, 0, nullptr, 0},
};

constexpr const char* kTimeForms = " (a time: 30s, 1:02.5, 500ms, 1h2m or microseconds)";

bool parse_int(const char* text, int64_t lo, int64_t hi, int64_t* out) {
    if (!text || !*text) return false;
    errno = 0;
    char* end = nullptr;
    long long v = std::strtoll(text, &end, 10);
    if (errno != 0 || *end != '\0' || v < lo || v > hi) return false;
    *out = v;
    return true;
}

}  // namespace

const char* usage_text() {
    return "usage: asfdump FILE [input options]           a summary for a person\n"
           "       asfdump probe FILE                     prints 1 (ASF, exit 0) or 0 (exit 1)\n"
           "       asfdump info FILE [input options]      every record get_info gives, one JSON object\n"
           "       asfdump frames FILE [input options] [play options]\n"
           "                                              JSON Lines, one host event per line\n"
           "       asfdump stats FILE [input options]     per stream: frames, times, bit rate, gaps,\n"
           "                                              key-frame interval; the index checked\n"
           "       asfdump thumb FILE --at TIME -o OUT.png [--width N]\n"
           "       asfdump thumb FILE --every DURATION --sheet OUT.png [--columns N] [--width N]\n"
           "       asfdump --help | --version [--plugin PATH]\n"
           "summary: container, duration (h:mm:ss.mmm), how it seeks (index / search / not), title,\n"
           "artist, album, year, genre, cover; a line per stream (codec, size or rate and channels,\n"
           "bit rate, language, active or not); notes (bad interleaving, broadcast capture)\n"
           "stats: key frames are what a second play in thumbnail mode delivers; each index\n"
           "entry must lead a seek to the latest key frame at or before its time\n"
           "FILE may be an http:// URL (default buffering then: --buffer ring --thread)\n"
           "input options: --buffer cache|none|ring, --thread, --block-size N, --ring-size N,\n"
           "               --streaming, --not-seekable, --detect-discontinuity, --plugin PATH,\n"
           "               --streams N (stream records the context holds, 0 to 127; default:\n"
           "               as many as min_context_size holds for info and frames, 127 otherwise)\n"
           "play options:  --seek TIME, --backward, --query, --resync TIME, --thumbnail TIME,\n"
           "               --no-audio, --no-video, --max-frames N, --dump-streams DIR, --log\n"
           "TIME: 30s, 1:02.5, 1:02:03, 500ms, 1h2m, 1h2m3.5s or microseconds (2000000)\n"
           "exit status: 0 played (or summarised) to the end or to --max-frames; 1 open failed\n"
           "(the reason on stderr); 2 usage error; 3 the file cannot be read; 4 a --seek or\n"
           "--resync the plug-in refused (the play still runs)\n";
}

bool parse_options(int argc, char** argv, Options* o, std::string* error) {
    optind = 1;
    opterr = 0;
    bool use_thread = false;
    bool buffer_given = false;
    std::string buffer = "cache";
    int c;
    int64_t v = 0;
    while ((c = getopt_long(argc, argv, "ho:", kLongOptions, nullptr)) != -1) {
        switch (c) {
            case kBuffer:
                buffer = optarg;
                buffer_given = true;
                if (buffer != "cache" && buffer != "none" && buffer != "ring") {
                    *error = "--buffer takes cache, none or ring";
                    return false;
                }
                break;
            case kThread: use_thread = true; break;
            case kBlockSize:
                if (!parse_int(optarg, 1, INT32_MAX, &v)) { *error = "bad --block-size"; return false; }
                o->input.block_size = static_cast<int>(v);
                break;
            case kRingSize:
                if (!parse_int(optarg, 2, INT32_MAX, &v)) { *error = "bad --ring-size"; return false; }
                o->ring_size = static_cast<int>(v);
                break;
            case kStreaming: o->input.streaming = true; break;
            case kNotSeekable: o->not_seekable = true; break;
            case kDetectDisc: o->input.detect_discontinuity = 1; break;
            case kSeek:
                if (!parse_time_us(optarg, &o->seek_us)) { *error = "bad --seek " + std::string(optarg) + kTimeForms; return false; }
                o->has_seek = true;
                break;
            case kBackward: o->backward = true; break;
            case kQuery: o->query = true; break;
            case kResync:
                if (!parse_time_us(optarg, &o->resync_us)) { *error = "bad --resync " + std::string(optarg) + kTimeForms; return false; }
                o->has_resync = true;
                break;
            case kThumbnail:
                if (!parse_time_us(optarg, &o->thumbnail_us)) { *error = "bad --thumbnail " + std::string(optarg) + kTimeForms; return false; }
                o->has_thumbnail = true;
                break;
            case kNoAudio: o->no_audio = true; break;
            case kNoVideo: o->no_video = true; break;
            case kMaxFrames:
                if (!parse_int(optarg, 0, INT64_MAX, &o->max_frames)) { *error = "bad --max-frames"; return false; }
                break;
            case kDumpStreams: o->dump_dir = optarg; break;
            case kLog: o->log = true; break;
            case kPlugin: o->plugin = optarg; break;
            case kStreams:
                if (!parse_int(optarg, 0, 127, &v)) { *error = "bad --streams (0 to 127)"; return false; }
                o->streams = static_cast<int>(v);
                break;
            case kVersion: o->version = true; break;
            case kThumbAt: o->thumb.at = optarg; break;
            case 'o': o->thumb.output = optarg; break;
            case kThumbWidth: o->thumb.width = optarg; break;
            case kThumbEvery: o->thumb.every = optarg; break;
            case kThumbSheet: o->thumb.sheet = optarg; break;
            case kThumbColumns: o->thumb.columns = optarg; break;
            case kHelp:
            case 'h':
                o->help = true;
                return true;
            default:
                *error = std::string("unknown option ") + (optind > 0 ? argv[optind - 1] : "");
                return false;
        }
    }
    const int rest = argc - optind;
    if (o->version && rest == 0) return true;
    if (rest < 1 || rest > 2) {
        *error = rest < 1 ? "missing file" : "too many arguments";
        return false;
    }
    if (rest == 2) o->command = argv[optind];
    o->file = argv[optind + rest - 1];
    o->is_url = host::is_http_url(o->file);
    // Network input defaults to what the framework uses for it: the ring
    // filled by the streaming thread. Any buffering option replaces that.
    if (o->is_url && !buffer_given && !use_thread) {
        buffer = "ring";
        use_thread = true;
    }
    if (use_thread && buffer != "ring") {
        *error = "--thread needs --buffer ring";
        return false;
    }
    o->input.disable_cache = buffer == "none";
    o->input.rbuf_mode = buffer == "ring" ? CBIO_APPLY_RBUF : CBIO_NO_RBUF;
    o->input.use_thread = use_thread;
    o->input.seekable = !o->not_seekable;
    return true;
}

}  // namespace asfdump
