#include "asf_deliver.h"

#include "asf_api.h"
#include "asf_internal.h"
#include "asf_modes.h"
#include "asf_packet.h"
#include "asf_spread.h"
#include "dprintf.h"
#include "streaming.h"
#include "sys_output.h"

namespace {

constexpr uint32_t kUnknownTime = 0xFFFFFFFFu;

int send_config(asf_demuxer_st* d, sys_stream_type_et kind, const char* what) {
    asf_stream_st* s = asf_active_stream(d, kind);
    if (!s || s->s.config_sent) return HOVA_OK;
    const int ret = sys_stream_send_config(&d->s, &s->s);
    ASF_LOG("send %s config packet, ret = %d\n", what, ret);
    if (ret != 0) return ret;
    s->s.config_sent = 1;
    return HOVA_OK;
}

int end_stream(asf_demuxer_st* d) {
    send_end_stream(d);
    return HOVA_EndOfStream;
}

// Gives up the current packet; the next call starts at the following one.
int abandon_packet(asf_demuxer_st* d) {
    d->resync = 1;
    d->cur_packets++;
    return HOVA_TryAgain;
}

// Moves past what is left of the finished packet onto the next one.
void finish_packet(asf_demuxer_st* d) {
    asf_packet_st* p = &d->cur_data_packet;
    cb_buffer_st* cb = &d->s.cbuffer;
    d->cur_packets++;
    if (p->parsed_size <= d->packet_size) {
        (void)cb->cb_seek64(cb, static_cast<cb_off_t>(d->packet_size - p->parsed_size), CB_SEEK_CUR);
        p->parsed_size = 0;
        p->num = d->cur_packets;
    } else {
        // Payloads ran past the packet's end: go to the next packet by its
        // position rather than by a wrapped-around skip.
        p->parsed_size = 0;
        p->num = d->cur_packets;
        (void)asf_seek_to_packet_with_parsed(d, p);
    }
}

// The object being assembled is finished: commit it, or drop it when
// fragments were lost, memory was refused or the thumbnail rule says so.
void complete_object(asf_demuxer_st* d, asf_stream_st* s, hova_stream_type_et type) {
    if (!s->buffer) {
        // Nothing is pending at the host: memory was refused and any frame
        // that was handed out has already been given back.
    } else if ((s->media_object_size != 0 && s->media_object_size != s->object_size) ||
               asf_need_drop_frame(d, type, s->keyframe, s->pts)) {
        (void)sys_stream_discard(&d->s, type);
    } else {
        if (type == HOVA_STREAM_AUDIO) asf_handle_audio_spread(d, s, type);
        (void)sys_stream_commit(&d->s, type, static_cast<int>(s->object_size), s->pts, 0, 0);
        s->s.last_thumbnail_pts = s->pts;
    }
    s->buffer = nullptr;
    reset_object_size(s);
}

// A sub-payload's length byte. With the file cache holding it, it is taken in
// place, as the cached read would (copy, then advance the position), without
// a call per byte.
int32_t read_length_byte(cb_buffer_st* cb, uint8_t* out) {
    if (cb->buffer_type == CB_FS_CACHE && cb->cb_read == cb_read_single) {
        const fs_cache_st& c = cb->fs_cache;
        if (cb->curpos >= c.base_pos && cb->curpos < c.base_pos + c.avail_size) {
            *out = c.buffer[cb->curpos - c.base_pos];
            cb->curpos++;
            cb->cb_errcode = CB_ERR_OK;
            return 1;
        }
    }
    return cb->cb_read(cb, out, 1);
}

// Packets found off their grid: the reader is put on the nearest pair of
// packet starts. When that is behind it, the last payload of the packet just
// read ran into the next packet unless its padding covered the distance: its
// object now holds bytes that are not its own and is dropped.
void realign(asf_demuxer_st* d) {
    asf_packet_st* p = &d->cur_data_packet;
    const int64_t moved = asf_realign_packet(d);
    if (moved >= 0 || p->padding_len >= static_cast<uint64_t>(-moved)) return;
    hova_stream_type_et type = HOVA_STREAM_NONE;
    asf_stream_st* s = get_stream(d, p->stream_num & 0x7F, &type);
    if (!s) return;
    if (s->buffer) (void)sys_stream_discard(&d->s, type);
    s->buffer = nullptr;
    s->object_num = -1;
    reset_object_size(s);
}

// Gives the pending frame back after the host refused to grow it, so that a
// null buffer always means that nothing is pending.
void lose_frame(asf_demuxer_st* d, asf_stream_st* s, hova_stream_type_et type) {
    (void)sys_stream_discard(&d->s, type);
    s->buffer = nullptr;
}

}  // namespace

int64_t asf_payload_pts(const asf_demuxer_st* d, const asf_stream_st* s, uint32_t pts_ms) {
    if (pts_ms == kUnknownTime) return -1;
    const int64_t ms = static_cast<int64_t>(pts_ms) - static_cast<int64_t>(d->preroll);
    return ms * 1000 + s->time_offset;
}

asf_stream_st* get_stream(asf_demuxer_st* d, int stream_num, hova_stream_type_et* type) {
    asf_stream_st* a = asf_active_stream(d, AUD);
    if (a && a->stream_num == stream_num) {
        *type = HOVA_STREAM_AUDIO;
        return a;
    }
    asf_stream_st* v = asf_active_stream(d, VID);
    if (v && v->stream_num == stream_num) {
        *type = HOVA_STREAM_VIDEO;
        return v;
    }
    return nullptr;
}

int check_drop(asf_demuxer_st* d, const asf_packet_st* p, const asf_stream_st* s,
               hova_stream_type_et type, hova_stream_type_et accepted) {
    if (!s) return 1;
    if (type == HOVA_STREAM_AUDIO)
        return (accepted == HOVA_STREAM_NONE || accepted == HOVA_STREAM_AUDIO) ? 0 : 1;
    if (accepted != HOVA_STREAM_NONE && accepted != HOVA_STREAM_VIDEO) return 1;
    if (d->seeked != kAsfStartAnywhere) {
        // After open video starts at the beginning of an object; after a
        // seek at the key frame it reported. What comes before is passed
        // over unread: the host sees neither a frame nor a discard.
        if (p->offset_into_obj != 0) return 1;
        if (d->seeked == kAsfStartAtKeyFrame &&
            (!(p->stream_num & 0x80) || asf_payload_pts(d, s, p->presentation_time) < d->s.seek_time))
            return 1;
        d->seeked = kAsfStartAnywhere;
    }
    return 0;
}

int read_media_object(asf_demuxer_st* d, asf_stream_st* s, hova_stream_type_et type, int keyframe,
                      uint32_t object_num, uint32_t len, uint32_t object_len, uint32_t pts_ms) {
    int result = 0;
    bool start = false;
    if (s->object_num == -1 || static_cast<uint32_t>(s->object_num) == object_num) {
        if (s->object_size == 0 && !s->buffer) {
            start = true;
        } else if (s->buffer) {
            void* frame = s->buffer;
            const uint64_t want = static_cast<uint64_t>(s->object_size) + len;
            if (want > INT32_MAX ||
                sys_stream_realloc(&d->s, type, &frame, static_cast<int>(want)) != 0 || !frame)
                lose_frame(d, s, type);
            else
                s->buffer = static_cast<uint8_t*>(frame);
        }
    } else {
        complete_object(d, s, type);
        result = 1;
        start = true;
    }

    if (start) {
        void* frame = nullptr;
        if (len > INT32_MAX || sys_stream_alloc(&d->s, type, &frame, static_cast<int>(len)) != 0)
            frame = nullptr;
        s->buffer = static_cast<uint8_t*>(frame);
        s->pts = asf_payload_pts(d, s, pts_ms);
    }

    cb_buffer_st* cb = &d->s.cbuffer;
    if (!s->buffer || asf_need_drop_frame(d, type, keyframe, s->pts)) {
        (void)cb->cb_seek64(cb, static_cast<cb_off_t>(len), CB_SEEK_CUR);
    } else if (len != 0) {
        (void)cb->cb_read(cb, s->buffer + s->object_size, static_cast<int32_t>(len));
    }
    s->keyframe = keyframe;
    s->object_num = static_cast<int>(object_num);
    s->object_size += len;
    s->media_object_size = object_len;
    return result;
}

extern "C" int asf_deliver_frame(void* ctx, hova_stream_type_et* type, int*, int64_t*) {
    asf_demuxer_st* d = static_cast<asf_demuxer_st*>(ctx);
    asf_packet_st* p = &d->cur_data_packet;
    cb_buffer_st* cb = &d->s.cbuffer;

    int ret = send_config(d, AUD, "audio");
    if (ret != HOVA_OK) return ret;
    ret = send_config(d, VID, "video");
    if (ret != HOVA_OK) return ret;

    asf_check_bad_interleave(d);

    if (d->resync) {
        p->num_payloads = 0;
        p->parsed_size = 0;
        p->num = d->cur_packets;
        if (asf_seek_to_packet_with_parsed(d, p) == -1) return end_stream(d);
        d->resync = 0;
    }

    if (d->parse_mode == PARSE_SEP) asf_follow_stream_behind(d);

    for (;;) {
        bool data_end = d->cur_packets >= d->num_packets;
        const bool packet_start = !data_end && p->num_payloads == 0;
        if (packet_start && d->parse_mode == PARSE_SEQ) realign(d);
        if (packet_start && read_packet_header(d, p, &p->parsed_size) != HOVA_OK) {
            // Where nothing counts the packets, the end of the input is the
            // end of the data; elsewhere it ends the stream at once.
            if (!asf_packets_unbounded(d)) return end_stream(d);
            data_end = true;
        }
        if (data_end) {
            if (d->parse_mode == PARSE_SEP) {
                asf_resume_other_stream(d);
                continue;  // the resumed cursor may itself be at the end
            }
            (void)asf_detect_discontinuity(cb, &d->s.callback);
            return end_stream(d);
        }
        if (packet_start && (p->packet_len > d->packet_size || p->padding_len > d->packet_size ||
                             p->num_payloads == 0))
            return abandon_packet(d);

        int announced = 0;
        if (asf_read_payload_header_ex(d, p, &p->parsed_size, &announced) != HOVA_OK)
            return end_stream(d);
        if (p->payload_len > d->packet_size) return abandon_packet(d);

        // A payload whose replicated data carries no size announces none, so
        // a size left over from an earlier payload does not condemn it.
        const uint32_t object_len = announced ? p->media_object_size : 0;
        int delivered = 0;
        uint32_t len = p->payload_len;
        for (;;) {
            if (p->compressed_payload) {
                if (p->payload_len == 0) break;
                uint8_t sub_len = 0;
                (void)read_length_byte(cb, &sub_len);
                len = sub_len;
                p->payload_len--;
                p->parsed_size++;
            }
            hova_stream_type_et stype = HOVA_STREAM_NONE;
            asf_stream_st* s = get_stream(d, p->stream_num & 0x7F, &stype);
            if (s) *type = stype;
            if (check_drop(d, p, s, stype, d->accept_stream_type)) {
                (void)cb->cb_seek64(cb, static_cast<cb_off_t>(len), CB_SEEK_CUR);
            } else {
                delivered = read_media_object(d, s, stype, p->stream_num & 0x80, p->object_num, len,
                                              object_len, p->presentation_time);
            }
            p->parsed_size += len;
            if (!p->compressed_payload || len >= p->payload_len) break;
            p->presentation_time += p->presentation_time_delta;
            p->payload_len -= len;
        }

        if (--p->num_payloads == 0) finish_packet(d);
        if (delivered) return HOVA_OK;
    }
}
