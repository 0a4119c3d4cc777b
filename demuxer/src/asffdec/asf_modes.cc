#include "asf_modes.h"

#include "asf_api.h"
#include "asf_packet.h"
#include "dprintf.h"
#include "streaming.h"
#include "sys_output.h"

namespace {

constexpr int64_t kInterleaveLimitUs = 2000000;
constexpr int64_t kDiscontinuityScanUs = 3000000;
constexpr int kGuidSize = 16;

}  // namespace

void asf_check_bad_interleave(asf_demuxer_st* d) {
    if (d->parse_file_end || d->parse_mode == PARSE_SEP || d->s.streaming) return;
    asf_stream_st* a = asf_active_stream(d, AUD);
    asf_stream_st* v = asf_active_stream(d, VID);
    if (!a || !v) return;
    if (a->pts == -1 || v->pts == -1) return;
    const int64_t diff = v->pts - a->pts;
    if (diff > kInterleaveLimitUs || diff < -kInterleaveLimitUs) {
        ASF_LOG("bad interleaved ASF detected, switch to index base, v %lld, a %lld\n",
                static_cast<long long>(v->pts), static_cast<long long>(a->pts));
        a->cache_data_packet = d->cur_data_packet;
        v->cache_data_packet = d->cur_data_packet;
        d->parse_mode = PARSE_SEP;
    }
}

void asf_follow_stream_behind(asf_demuxer_st* d) {
    asf_stream_st* a = asf_active_stream(d, AUD);
    asf_stream_st* v = asf_active_stream(d, VID);
    if (!a || !v) return;  // track selection leaves separate parsing first
    const hova_stream_type_et chosen = v->pts < a->pts ? HOVA_STREAM_VIDEO : HOVA_STREAM_AUDIO;
    if (chosen == d->accept_stream_type) return;
    asf_stream_st* followed = d->accept_stream_type == HOVA_STREAM_VIDEO ? v : a;
    asf_stream_st* next = chosen == HOVA_STREAM_VIDEO ? v : a;
    followed->cache_data_packet = d->cur_data_packet;
    d->cur_data_packet = next->cache_data_packet;
    d->cur_packets = d->cur_data_packet.num;
    d->accept_stream_type = chosen;
    (void)asf_seek_to_packet_with_parsed(d, &d->cur_data_packet);
}

void asf_resume_other_stream(asf_demuxer_st* d) {
    const bool video_done = d->accept_stream_type == HOVA_STREAM_VIDEO;
    asf_stream_st* other = asf_active_stream(d, video_done ? AUD : VID);
    d->parse_file_end = 1;
    d->parse_mode = PARSE_SEQ;
    if (!other) {
        d->accept_stream_type = HOVA_STREAM_NONE;
        return;
    }
    (void)asf_seek_to_packet_with_parsed(d, &other->cache_data_packet);
    d->cur_data_packet = other->cache_data_packet;
    d->cur_packets = d->cur_data_packet.num;
    d->accept_stream_type = video_done ? HOVA_STREAM_AUDIO : HOVA_STREAM_VIDEO;
}

int asf_detect_discontinuity(cb_buffer_st* cb, const hova_callback_st* callback) {
    cb_io_st* input = cb->input;
    if (!input || input->detect_discontinuity == 0) return 0;
    ASF_LOG("asf_detect_discontinuity, pos %lld\n", static_cast<long long>(cb_tell64(cb)));
    const int64_t start = callback->get_time(callback->context);
    for (;;) {
        uint8_t guid[kGuidSize];
        if (cb->cb_peek(cb, guid, kGuidSize) < kGuidSize) return 0;
        if (asf_probe(guid, kGuidSize, nullptr, HOVA_PROBE_NO_IO)) {
            const cb_fpos pos = cb_tell64(cb);
            ASF_LOG("detect discontinuity at %lld\n", static_cast<long long>(pos));
            if (input->discontinuity) input->discontinuity(input, static_cast<cb_off_t>(pos));
            return 1;
        }
        if (callback->get_time(callback->context) - start > kDiscontinuityScanUs) {
            ASF_LOG("asf_detect_discontinuity timed out");
            return 0;
        }
        if (cb->cb_seek64(cb, 1, CB_SEEK_CUR) == -1) return 0;
    }
}

void send_end_stream(asf_demuxer_st* d) {
    if (d->s.active_stream[AUD] >= 0) (void)sys_notify(&d->s, HOVA_STREAM_AUDIO, HOVA_EVENT_EOS);
    if (d->s.active_stream[VID] >= 0) (void)sys_notify(&d->s, HOVA_STREAM_VIDEO, HOVA_EVENT_EOS);
}

int asf_need_drop_frame(asf_demuxer_st* d, hova_stream_type_et type, int keyframe, int64_t pts) {
    asf_stream_st* v = asf_active_stream(d, VID);
    if (type != HOVA_STREAM_VIDEO || d->s.thumbnail_interval == -1 || !v) return 0;
    if (pts == -1) return 1;
    if (v->s.last_thumbnail_pts == -1) return 0;
    if (!keyframe) return 1;
    return pts - v->s.last_thumbnail_pts < d->s.thumbnail_interval ? 1 : 0;
}
