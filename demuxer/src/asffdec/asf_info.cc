// Information queries: clip, program and per-stream records answered from
// the context that header parsing filled. Nothing is read from the file.
#include <cstring>

#include "asf_api.h"
#include "asf_internal.h"

namespace {

sys_stream_type_et kind_of(hova_stream_type_et type) {
    return type == HOVA_STREAM_AUDIO ? AUD : VID;
}

// Record of the active stream of `kind`, or null.
const asf_stream_st* active(const asf_demuxer_st* d, sys_stream_type_et kind) {
    const int i = d->s.active_stream[kind];
    return i < 0 ? nullptr : &d->stream_info[i];
}

int get_clip_info(asf_demuxer_st* d, hova_clip_info_st* info) {
    std::memset(info, 0, sizeof *info);
    info->seekable = d->s.seekable;
    info->num_program = 1;
    info->active_program = 0;
    info->ts_type = HOVA_TS_DTS;
    return HOVA_OK;
}

hova_string_info_st utf16_string(const hova_string_info_st& s) {
    hova_string_info_st out = {};
    out.size = s.payload ? s.size : 0;
    out.payload = s.payload;
    out.stringformat = HOVA_STRING_FORMAT_UTF16LE;
    return out;
}

int get_program_info(asf_demuxer_st* d, hova_program_info_st* info) {
    std::memset(info, 0, sizeof *info);
    info->duration = d->s.duration;
    info->num_video_streams = d->s.num_streams[VID];
    info->num_audio_streams = d->s.num_streams[AUD];
    info->num_subtitle_streams = d->s.num_streams[SUB];
    info->active_video = d->s.active_stream[VID] < 0 ? -1 : 0;
    info->active_audio = d->s.active_stream[AUD] < 0 ? -1 : 0;
    info->active_subtitle = d->s.active_stream[SUB] < 0 ? -1 : 0;
    info->title = utf16_string(d->title);
    info->artist = utf16_string(d->author);
    info->album = utf16_string(d->albumTitle);
    info->year = d->year;
    info->genre = d->genre;
    info->cover = d->cover;
    info->pic_offset = static_cast<int>(d->pic_offset);
    return HOVA_OK;
}

int get_audio_info(asf_demuxer_st* d, int index, hova_audio_info_st* info) {
    std::memset(info, 0, sizeof *info);
    const int i = find_stream_with_index(d, HOVA_STREAM_AUDIO, index);
    if (i < 0) return HOVA_InvalidParam;
    const asf_stream_st& st = d->stream_info[i];
    info->codec = st.s.codec_type;
    info->sample_rate = static_cast<int>(st.s.info.aud.sample_rate);
    info->bit_rate = asf_get_bitrate(d, HOVA_STREAM_AUDIO);
    if (st.lang) std::memcpy(info->language, st.lang, sizeof info->language);
    return HOVA_OK;
}

int get_video_info(asf_demuxer_st* d, int index, hova_video_info_st* info) {
    std::memset(info, 0, sizeof *info);
    const int i = find_stream_with_index(d, HOVA_STREAM_VIDEO, index);
    if (i < 0) return HOVA_InvalidParam;
    const asf_stream_st& st = d->stream_info[i];
    info->codec = st.s.codec_type;
    info->width = st.s.info.vid.width;
    info->height = st.s.info.vid.height;
    const uint32_t frame = asf_get_frame_duration(d);
    if (frame != 0) {
        info->frame_rate_num = 1000000;
        info->frame_rate_den = static_cast<int>(frame);
    }
    info->bit_rate = asf_get_bitrate(d, HOVA_STREAM_VIDEO);
    return HOVA_OK;
}

}  // namespace

int find_stream_with_index(asf_demuxer_st* d, hova_stream_type_et type, int index) {
    if (index == -1) return d->s.active_stream[kind_of(type)];
    int seen = 0;
    for (int i = 0; i < d->s.total_streams; ++i) {
        if (d->stream_info[i].s.stream_type != type) continue;
        if (seen++ == index) return i;
    }
    // No such record: record 0 answers, as long as there is one.
    return d->s.total_streams > 0 ? 0 : -1;
}

int asf_get_bitrate(asf_demuxer_st* d, hova_stream_type_et type) {
    const asf_stream_st* st = active(d, kind_of(type));
    if (!st || !asf_valid_stream_num(st->stream_num)) return 0;
    return static_cast<int>(d->stream_bitrate[st->stream_num]);
}

uint32_t asf_get_frame_duration(asf_demuxer_st* d) {
    const asf_stream_st* st = active(d, VID);
    if (!st || !asf_valid_stream_num(st->stream_num)) return 0;
    return d->time_per_frame[st->stream_num];
}

extern "C" int asf_get_information(void* ctx, hova_stream_type_et type, int index, void* info) {
    if (!ctx || !info) return HOVA_InvalidParam;
    auto* d = static_cast<asf_demuxer_st*>(ctx);
    switch (type) {
        case HOVA_STREAM_NONE:
            return get_clip_info(d, static_cast<hova_clip_info_st*>(info));
        case HOVA_STREAM_PROG:
            return get_program_info(d, static_cast<hova_program_info_st*>(info));
        case HOVA_STREAM_AUDIO:
            return get_audio_info(d, index, static_cast<hova_audio_info_st*>(info));
        case HOVA_STREAM_VIDEO:
            return get_video_info(d, index, static_cast<hova_video_info_st*>(info));
        default:
            return HOVA_InvalidParam;
    }
}
