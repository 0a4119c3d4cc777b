// asfdump info FILE: opens the file as the framework does and prints every
// record get_info hands the host, as one JSON object.
#include <cstdio>
#include <string>

#include <nlohmann/json.hpp>

#include "codec_names.h"
#include "commands.h"
#include "record_text.h"
#include "session.h"

namespace asfdump {

namespace {

using nlohmann::json;

// Text that may not be valid UTF-8 is kept where it is and replaced where it
// is not, so that the JSON stays valid.
json text(const std::string& s) {
    return json::parse(json(s).dump(-1, ' ', false, json::error_handler_t::replace));
}

json string_info(const hova_string_info_st& s) { return s.payload ? text(record_text(s)) : json(nullptr); }

json c_string(const char* s) { return s ? text(s) : json(nullptr); }

json data_info(const hova_data_info_st& d) { return json{{"length", d.length}}; }

json name_info(const hova_name_info_st& n) { return json{{"count", n.count}}; }

json clip_json(const hova_clip_info_st& c) {
    return json{{"seekable", c.seekable},         {"num_program", c.num_program},
                {"active_program", c.active_program}, {"ts_type", static_cast<int>(c.ts_type)},
                {"tee_path", c.tee_path},         {"seek_without_index", c.seek_without_index}};
}

json program_json(const hova_program_info_st& p) {
    json editions = json::array();
    for (const hova_name_info_st& e : p.edition_title) editions.push_back(name_info(e));
    return json{
        {"duration", p.duration},
        {"base_pts", p.base_pts},
        {"output_base_pts", p.output_base_pts},
        {"num_video_streams", p.num_video_streams},
        {"num_audio_streams", p.num_audio_streams},
        {"num_subtitle_streams", p.num_subtitle_streams},
        {"num_editions", p.num_editions},
        {"active_video", p.active_video},
        {"active_audio", p.active_audio},
        {"active_subtitle", p.active_subtitle},
        {"active_edition", p.active_edition},
        {"dynamic_subtitle", p.dynamic_subtitle},
        {"divx_plus", p.divx_plus},
        {"divx_drm", p.divx_drm},
        {"divx_trick_track", p.divx_trick_track},
        {"year", p.year},
        {"disc_number", p.disc_number},
        {"total_disk", p.total_disk},
        {"track_number", p.track_number},
        {"total_track", p.total_track},
        {"compilation", p.compilation},
        {"delay", p.delay},
        {"padding", p.padding},
        {"discontinuity_count", p.discontinuity_count},
        {"tag_title", name_info(p.tag_title)},
        {"law_rating", data_info(p.law_rating)},
        {"title", string_info(p.title)},
        {"artist", string_info(p.artist)},
        {"private_data", data_info(p.private_data)},
        {"edition_title", editions},
        {"album", string_info(p.album)},
        {"comment", string_info(p.comment)},
        {"composer", string_info(p.composer)},
        {"album_artist", string_info(p.album_artist)},
        {"grouping", string_info(p.grouping)},
        {"cover", data_info(p.cover)},
        {"location", data_info(p.location)},
        {"writer", string_info(p.writer)},
        {"genre", c_string(p.genre)},
        {"date", c_string(p.date)},
        {"capture_framerate", p.capture_framerate},
        {"pic_offset", p.pic_offset},
    };
}

json audio_json(const hova_audio_info_st& a) {
    return json{{"stream_id", a.stream_id},
                {"codec", a.codec},
                {"codec_name", audio_codec_name(a.codec)},
                {"sample_rate", a.sample_rate},
                {"bit_rate", a.bit_rate},
                {"channel_num", a.channel_num},
                {"desc", data_info(a.desc)},
                {"tag_title", name_info(a.tag_title)},
                {"language", text(record_language(a.language))},
                {"component_tag", a.component_tag},
                {"is_audio_description", a.is_audio_description}};
}

json video_json(const hova_video_info_st& v) {
    const hova_hdr10_colour_info_st& h = v.hdr10_metadata;
    const hova_hdr10_masteringMetadata_st& m = h.maseteringMetadata;
    return json{
        {"stream_id", v.stream_id},
        {"codec", v.codec},
        {"codec_name", video_codec_name(v.codec)},
        {"width", v.width},
        {"height", v.height},
        {"display_width", v.display_width},
        {"display_height", v.display_height},
        {"frame_rate_num", v.frame_rate_num},
        {"frame_rate_den", v.frame_rate_den},
        {"bit_rate", v.bit_rate},
        {"mvc_type", v.mvc_type},
        {"desc", data_info(v.desc)},
        {"dv_profile", v.dv_profile},
        {"dv_level", v.dv_level},
        {"dv_metaorder", v.dv_metaorder},
        {"dv_bl_signal_compatibility_id", v.dv_bl_signal_compatibility_id},
        {"component_tag", v.component_tag},
        {"is_hdr10_metadata_available", v.is_hdr10_metadata_available},
        {"hdr10_metadata",
         {{"size", h.size}, {"version", h.version}, {"matrixCoefficients", h.matrixCoefficients},
          {"bitsPerChannel", h.bitsPerChannel}, {"chromaSubsamplingHorz", h.chromaSubsamplingHorz},
          {"chromaSubsamplingVert", h.chromaSubsamplingVert},
          {"cbSubsamplingHorz", h.cbSubsamplingHorz}, {"cbSubsamplingVert", h.cbSubsamplingVert},
          {"chromaSitingHorz", h.chromaSitingHorz}, {"chromaSitingVert", h.chromaSitingVert},
          {"range", h.range}, {"transferCharacteristics", h.transferCharacteristics},
          {"primaries", h.primaries}, {"maxCLL", h.maxCLL}, {"maxFALL", h.maxFALL},
          {"maseteringMetadata",
           {{"primaryRChromaticityX", m.primaryRChromaticityX},
            {"primaryRChromaticityY", m.primaryRChromaticityY},
            {"primaryGChromaticityX", m.primaryGChromaticityX},
            {"primaryGChromaticityY", m.primaryGChromaticityY},
            {"primaryBChromaticityX", m.primaryBChromaticityX},
            {"primaryBChromaticityY", m.primaryBChromaticityY},
            {"whitePointChromaticityX", m.whitePointChromaticityX},
            {"whitePointChromaticityY", m.whitePointChromaticityY},
            {"luminanceMax", m.luminanceMax},
            {"luminanceMin", m.luminanceMin}}}}},
    };
}

}  // namespace

int run_info(const hova_dmx_func_st* dmx, const Options& opts) {
    auto session = make_session(dmx, opts);
    if (!session) return kExitUnreadable;
    if (!open_session(*session, opts)) return report_network(session->input(), opts) ? kExitOpenFailed : kExitUnreadable;
    void* ctx = session->context();

    hova_clip_info_st clip{};
    dmx->get_info(ctx, HOVA_STREAM_NONE, 0, &clip);
    hova_program_info_st prog{};
    dmx->get_info(ctx, HOVA_STREAM_PROG, 0, &prog);

    json out;
    out["clip"] = clip_json(clip);
    out["program"] = program_json(prog);

    hova_audio_info_st a{};
    out["active_audio"] =
        dmx->get_info(ctx, HOVA_STREAM_AUDIO, -1, &a) == HOVA_OK ? audio_json(a) : json(nullptr);
    hova_video_info_st v{};
    out["active_video"] =
        dmx->get_info(ctx, HOVA_STREAM_VIDEO, -1, &v) == HOVA_OK ? video_json(v) : json(nullptr);

    json audio = json::array(), video = json::array();
    for (int i = 0; i < prog.num_audio_streams; ++i) {
        hova_audio_info_st r{};
        if (dmx->get_info(ctx, HOVA_STREAM_AUDIO, i, &r) == HOVA_OK) {
            json j = audio_json(r);
            j["index"] = i;
            audio.push_back(j);
        }
    }
    for (int i = 0; i < prog.num_video_streams; ++i) {
        hova_video_info_st r{};
        if (dmx->get_info(ctx, HOVA_STREAM_VIDEO, i, &r) == HOVA_OK) {
            json j = video_json(r);
            j["index"] = i;
            video.push_back(j);
        }
    }
    out["audio"] = audio;
    out["video"] = video;

    // Strings handed out by get_info live until close: print first.
    std::printf("%s\n", out.dump(2).c_str());
    session->close();
    if (session->blocks_outstanding() != 0) {
        std::fprintf(stderr, "asfdump: %zu blocks still held after close\n",
                     session->blocks_outstanding());
        return kExitOpenFailed;
    }
    return report_network(session->input(), opts) ? kExitOk : kExitUnreadable;
}

}  // namespace asfdump
