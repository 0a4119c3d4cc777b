// asfdump FILE: a summary for a person, one screen: container, duration,
// seekability, tags, cover, one line per stream and notes. Values come from
// the records get_info hands the host, and what those do not carry (packet
// count, index, channels, each stream's own bit rate) from the context view.
#include <cinttypes>
#include <cstdio>
#include <string>

#include "codec_names.h"
#include "commands.h"
#include "context_view.h"
#include "file_check.h"
#include "record_text.h"
#include "session.h"
#include "time_arg.h"

namespace asfdump {

namespace {

// Delivery calls the summary makes to see whether the plug-in switches to
// separate parsing (bad interleaving shows within the first seconds).
constexpr int kInterleaveCalls = 3000;

void row(const char* label, const std::string& value) { std::printf("  %-10s %s\n", label, value.c_str()); }

std::string human_bytes(uint64_t n) {
    char buf[64];
    if (n >= 1024 * 1024)
        std::snprintf(buf, sizeof buf, "%" PRIu64 " bytes (%.1f MiB)", n, static_cast<double>(n) / (1024.0 * 1024.0));
    else if (n >= 1024)
        std::snprintf(buf, sizeof buf, "%" PRIu64 " bytes (%.1f KiB)", n, static_cast<double>(n) / 1024.0);
    else
        std::snprintf(buf, sizeof buf, "%" PRIu64 " bytes", n);
    return buf;
}

std::string kbps(uint32_t bits_per_second) {
    if (bits_per_second == 0) return "bit rate unknown";
    char buf[32];
    std::snprintf(buf, sizeof buf, "%.1f kb/s", bits_per_second / 1000.0);
    return buf;
}

// The picture format told by the cover's first bytes.
const char* picture_type(const hova_data_info_st& c) {
    const unsigned char* p = c.payload;
    const int n = c.length;
    if (!p || n < 4) return "picture";
    if (p[0] == 0xFF && p[1] == 0xD8 && p[2] == 0xFF) return "JPEG";
    if (p[0] == 0x89 && p[1] == 'P' && p[2] == 'N' && p[3] == 'G') return "PNG";
    if (p[0] == 'G' && p[1] == 'I' && p[2] == 'F') return "GIF";
    if (p[0] == 'B' && p[1] == 'M') return "BMP";
    return "picture of unknown format";
}

std::string seekability(const hova_clip_info_st& clip, const ContextView& v) {
    if (!clip.seekable) return "no (the input cannot seek)";
    if (v.index_entries == 0) return "yes, by a timestamp search (no simple index)";
    char buf[96];
    std::snprintf(buf, sizeof buf, "yes, through the simple index (%" PRIu32 " entries, one every %s)",
                  v.index_entries, format_time_us(v.index_interval_us).c_str());
    return buf;
}

std::string audio_line(int i, const hova_audio_info_st& a, const StreamView& s) {
    char buf[160];
    std::snprintf(buf, sizeof buf, "audio %d: %s, %d Hz, %" PRIu32 " channel%s, %s", i,
                  audio_codec_name(a.codec).c_str(), a.sample_rate, s.channels, s.channels == 1 ? "" : "s",
                  kbps(s.bit_rate).c_str());
    return buf;
}

std::string video_line(int i, const hova_video_info_st& r, const StreamView& s) {
    char buf[160];
    int n = std::snprintf(buf, sizeof buf, "video %d: %s, %dx%d", i, video_codec_name(r.codec).c_str(),
                          r.width, r.height);
    if (r.frame_rate_num > 0 && r.frame_rate_den > 0)
        n += std::snprintf(buf + n, sizeof buf - static_cast<size_t>(n), ", %.3f fps",
                           static_cast<double>(r.frame_rate_num) / r.frame_rate_den);
    std::snprintf(buf + n, sizeof buf - static_cast<size_t>(n), ", %s", kbps(s.bit_rate).c_str());
    return buf;
}

// The end of a stream line: language, active or not, the ASF stream number.
std::string stream_tail(const std::string& language, const StreamView& s) {
    std::string t = language.empty() ? "" : ", " + language;
    t += s.active ? ", active" : ", not active";
    return t + " [ASF stream " + std::to_string(s.stream_num) + "]";
}

// Plays the first delivery calls so that the plug-in's interleave check runs.
void play_start(const hova_dmx_func_st* dmx, host::Session& session) {
    for (int i = 0; i < kInterleaveCalls; ++i) {
        hova_stream_type_et type = HOVA_STREAM_NONE;
        int size = 0;
        int64_t pts = 0;
        const int r = dmx->get_data(session.context(), &type, &size, &pts);
        session.callbacks().events().clear();
        if ((r != HOVA_OK && r != HOVA_TryAgain) || view_context(session.context()).separate_parsing) break;
    }
}

}  // namespace

int run_summary(const hova_dmx_func_st* dmx, const Options& opts) {
    auto session = make_session(dmx, opts, kAllRecords);
    if (!session) return kExitUnreadable;
    if (!open_session(*session, opts))
        return report_network(session->input(), opts) ? kExitOpenFailed : kExitUnreadable;
    void* ctx = session->context();
    hova_clip_info_st clip{};
    dmx->get_info(ctx, HOVA_STREAM_NONE, 0, &clip);
    hova_program_info_st prog{};
    dmx->get_info(ctx, HOVA_STREAM_PROG, 0, &prog);
    const ContextView view = view_context(ctx);

    std::printf("%s\n", opts.file.c_str());
    // With no count in the file's properties the plug-in counts the packets from the data's size.
    std::string container = "ASF, " + human_bytes(session->input().size()) + ", " +
                            std::to_string(view.packets) + " packets of " + std::to_string(view.packet_size) + " bytes";
    row("container", container);
    row("duration", prog.duration > 0 ? format_time_us(prog.duration) : "unknown (the file gives none)");
    row("seekable", seekability(clip, view));
    const std::pair<const char*, std::string> tags[] = {
        {"title", record_text(prog.title)},
        {"artist", record_text(prog.artist)},
        {"album", record_text(prog.album)},
        {"year", prog.year != 0 ? std::to_string(prog.year) : ""},
        {"genre", prog.genre ? prog.genre : ""},
    };
    for (const auto& [label, value] : tags)
        if (!value.empty()) row(label, value);
    if (prog.cover.length > 0)
        row("cover", std::string(picture_type(prog.cover)) + ", " + human_bytes(static_cast<uint64_t>(prog.cover.length)));

    for (int i = 0; i < prog.num_audio_streams && i < static_cast<int>(view.audio.size()); ++i) {
        hova_audio_info_st a{};
        if (dmx->get_info(ctx, HOVA_STREAM_AUDIO, i, &a) != HOVA_OK) continue;
        row("stream", audio_line(i, a, view.audio[i]) + stream_tail(record_language(a.language), view.audio[i]));
    }
    for (int i = 0; i < prog.num_video_streams && i < static_cast<int>(view.video.size()); ++i) {
        hova_video_info_st v{};
        if (dmx->get_info(ctx, HOVA_STREAM_VIDEO, i, &v) != HOVA_OK) continue;
        row("stream", video_line(i, v, view.video[i]) + stream_tail("", view.video[i]));
    }
    if (prog.num_audio_streams + prog.num_video_streams == 0) row("stream", "none that is audio or video");

    bool inactive = false;
    for (const auto* list : {&view.audio, &view.video})
        for (const StreamView& sv : *list) inactive = inactive || !sv.active;
    if (inactive) row("note", "the plug-in plays the last audio and the last video stream of the header only");
    const FileProperties props = opts.is_url ? FileProperties{} : read_file_properties(opts.file);
    if (props.broadcast || (!props.found && prog.duration == 0))
        row("note", props.found && props.packet_count == 0
                        ? "broadcast capture without a packet count: no duration, played to the end of its data"
                        : "broadcast capture: no duration");
    play_start(dmx, *session);
    if (view_context(ctx).separate_parsing)
        row("note", "badly interleaved (audio and video over 2 s apart): played with separate cursors");

    std::fflush(stdout);
    session->close();
    if (session->blocks_outstanding() != 0) {
        std::fprintf(stderr, "asfdump: %zu blocks still held after close\n", session->blocks_outstanding());
        return kExitOpenFailed;
    }
    return report_network(session->input(), opts) ? kExitOk : kExitUnreadable;
}

}  // namespace asfdump
