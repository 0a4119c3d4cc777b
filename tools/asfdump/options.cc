#include "options.h"

#include <getopt.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>

namespace asfdump {

namespace {

enum OptId {
    kBuffer = 256, kThread, kBlockSize, kRingSize, kStreaming, kNotSeekable, kDetectDisc,
    kSeek, kBackward, kQuery, kResync, kThumbnail, kNoAudio, kNoVideo, kMaxFrames, kDumpStreams,
    kLog, kPlugin, kHelp, kVersion, kThumbAt, kThumbWidth, kThumbEvery, kThumbSheet, kThumbColumns,
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
    {"version", no_argument, nullptr, kVersion},
    {"at", required_argument, nullptr, kThumbAt},
    {"width", required_argument, nullptr, kThumbWidth},
    {"every", required_argument, nullptr, kThumbEvery},
    {"sheet", required_argument, nullptr, kThumbSheet},
    {"columns", required_argument, nullptr, kThumbColumns},
    {nullptr, 0, nullptr, 0},
};

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
    return "usage: asfdump probe FILE\n"
           "       asfdump info FILE [input options]\n"
           "       asfdump frames FILE [input options] [play options]\n"
           "       asfdump thumb FILE --at TIME -o OUT.png [--width N]\n"
           "       asfdump thumb FILE --every DURATION --sheet OUT.png [--columns N] [--width N]\n"
           "       asfdump --help | --version [--plugin PATH]\n"
           "FILE may be an http:// URL (default buffering then: --buffer ring --thread)\n"
           "input options: --buffer cache|none|ring, --thread, --block-size N, --ring-size N,\n"
           "               --streaming, --not-seekable, --detect-discontinuity, --plugin PATH\n"
           "play options:  --seek US, --backward, --query, --resync US, --thumbnail US,\n"
           "               --no-audio, --no-video, --max-frames N, --dump-streams DIR, --log\n";
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
                if (!parse_int(optarg, INT64_MIN, INT64_MAX, &o->seek_us)) { *error = "bad --seek"; return false; }
                o->has_seek = true;
                break;
            case kBackward: o->backward = true; break;
            case kQuery: o->query = true; break;
            case kResync:
                if (!parse_int(optarg, INT64_MIN, INT64_MAX, &o->resync_us)) { *error = "bad --resync"; return false; }
                o->has_resync = true;
                break;
            case kThumbnail:
                if (!parse_int(optarg, INT64_MIN, INT64_MAX, &o->thumbnail_us)) { *error = "bad --thumbnail"; return false; }
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
    if (rest != 2) {
        *error = rest < 2 ? "missing command or file" : "too many arguments";
        return false;
    }
    o->command = argv[optind];
    o->file = argv[optind + 1];
    if (o->command != "probe" && o->command != "info" && o->command != "frames" &&
        o->command != "thumb") {
        *error = "unknown command " + o->command;
        return false;
    }
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
