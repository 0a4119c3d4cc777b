// The seek_time entry point: finds the packet to resume from (index or
// search), reports its time and, unless the host only asks, re-aims delivery
// there. A seek that fails leaves delivery and the reader as they were.
#include "asf_seek.h"

#include "asf_api.h"
#include "asf_internal.h"
#include "asf_modes.h"
#include "asf_packet.h"
#include "dprintf.h"
#include "streaming.h"
#include "sys_output.h"

namespace {

void discard_pending(asf_demuxer_st* d, sys_stream_type_et kind, hova_stream_type_et type) {
    asf_stream_st* s = asf_active_stream(d, kind);
    if (!s) return;
    // A pending host frame is what delivery's buffer pointer stands for; a
    // partial object whose memory was refused has none to give back.
    if (s->buffer) (void)sys_stream_discard(&d->s, type);
    s->buffer = nullptr;
    s->object_num = -1;
    reset_object_size(s);
}

// Both streams get their own cursor: video on the key frame found, audio on
// its own search from that time. Without an audio position delivery goes on
// with one cursor.
void position_separately(asf_demuxer_st* d, int dir, int64_t video_pts, uint64_t video_packet) {
    asf_stream_st* a = asf_active_stream(d, AUD);
    asf_stream_st* v = asf_active_stream(d, VID);
    int64_t audio_pts = video_pts;
    ASF_LOG("seek audio in separate mode\n");
    uint64_t barren = UINT64_MAX;  // what the video search learnt says nothing of audio
    const uint64_t audio_packet =
        asf_find_packet_with_type(d, dir, &audio_pts, HOVA_STREAM_AUDIO, &barren);
    if (audio_packet == kAsfNoPacket) {
        ASF_LOG("seek audio fails in separate mode, fall back to sequential mode\n");
        d->parse_mode = PARSE_SEQ;
        d->accept_stream_type = HOVA_STREAM_NONE;
        return;
    }
    a->pts = audio_pts;
    v->pts = video_pts;
    reset_data_packet(&a->cache_data_packet, audio_packet);
    reset_data_packet(&v->cache_data_packet, video_packet);
    ASF_LOG("seek in separate mode, audio pts %lld, packet %lld, video pts %lld, packet %lld\n",
            static_cast<long long>(audio_pts), static_cast<long long>(audio_packet),
            static_cast<long long>(video_pts), static_cast<long long>(video_packet));
    d->accept_stream_type = HOVA_STREAM_VIDEO;
}

void apply_position(asf_demuxer_st* d, uint64_t packet, int64_t pts) {
    reset_last_thumbnail_pts(d);
    discard_pending_objects(d);
    d->cur_packets = packet;
    reset_data_packet(&d->cur_data_packet, packet);
    (void)asf_seek_to_packet_with_parsed(d, &d->cur_data_packet);
    d->seeked = kAsfStartAtKeyFrame;
    // A seek to 0 starts at the file's first key frame, whatever its time.
    d->s.seek_time = pts == 0 ? INT64_MIN : pts;
    ASF_LOG("seek success, time %lld\n", static_cast<long long>(pts));
}

}  // namespace

void discard_pending_objects(asf_demuxer_st* d) {
    discard_pending(d, AUD, HOVA_STREAM_AUDIO);
    discard_pending(d, VID, HOVA_STREAM_VIDEO);
}

extern "C" int asf_seek_time(void* ctx, int dir, int64_t* pts, int query_only) {
    auto* d = static_cast<asf_demuxer_st*>(ctx);
    cb_buffer_st* cb = &d->s.cbuffer;
    const cb_fpos curr_pos = cb_tell64(cb);
    const bool video = d->s.active_stream[VID] >= 0;
    ASF_LOG("seek enter, active video %d, audio %d\n", d->s.active_stream[VID],
            d->s.active_stream[AUD]);
    if (!d->s.seekable) return HOVA_SeekFailed;
    // Only the two directions the host names have a meaning; anything else
    // is refused rather than read as one of them.
    if (!pts || (dir != HOVA_SEEK_FORWARD && dir != HOVA_SEEK_BACKWARD)) {
        ASF_LOG("seek fail\n");
        return HOVA_SeekFailed;
    }

    uint64_t packet = 0;
    // Where no object start of the kind lies, as far as this seek found out.
    uint64_t barren = UINT64_MAX;
    if (*pts != 0) {
        if (video) {
            packet = asf_find_packet_by_index(d, dir, pts, &barren);
            if (packet == kAsfNoPacket && !d->s.streaming)
                packet = asf_find_packet_with_type(d, dir, pts, HOVA_STREAM_VIDEO, &barren);
        } else {
            packet = asf_find_packet_with_type(d, dir, pts, HOVA_STREAM_AUDIO, &barren);
        }
    }
    if (packet == kAsfNoPacket) {
        (void)cb->cb_seek64(cb, static_cast<cb_off_t>(curr_pos), CB_SEEK_SET);
        ASF_LOG("seek fail\n");
        return HOVA_SeekFailed;
    }

    const bool both = video && d->s.active_stream[AUD] >= 0;
    if (d->parse_file_end) {
        // Delivery ran off the end in separate parsing and went on with one
        // cursor; a seek starts both cursors anew. Separate parsing needs
        // both streams, so with one left delivery stays sequential.
        d->parse_file_end = 0;
        if (both) {
            d->parse_mode = PARSE_SEP;
        } else {
            d->parse_mode = PARSE_SEQ;
            d->accept_stream_type = HOVA_STREAM_NONE;
        }
    }
    if (query_only) {
        (void)cb->cb_seek64(cb, static_cast<cb_off_t>(curr_pos), CB_SEEK_SET);
        ASF_LOG("seek success, time %lld\n", static_cast<long long>(*pts));
        return HOVA_OK;
    }
    reset_stream_pts(d);
    if (d->parse_mode == PARSE_SEP && both) position_separately(d, dir, *pts, packet);
    apply_position(d, packet, *pts);
    return HOVA_OK;
}
