#include "asf_timestamp.h"

#include "asf_deliver.h"
#include "asf_packet.h"
#include "streaming.h"

namespace {

constexpr uint32_t kUnknownTime = 0xFFFFFFFFu;
constexpr uint8_t kStreamMask = 0x7F;
constexpr uint8_t kKeyFrame = 0x80;

}  // namespace

int get_packet_pts(asf_demuxer_st* d, asf_packet_st* cursor, int64_t* pts,
                   hova_stream_type_et target_type) {
    cb_buffer_st* cb = &d->s.cbuffer;
    *pts = -1;
    if (cursor->num_payloads == 0) {
        const int r = read_packet_header(d, cursor, &cursor->parsed_size);
        if (r != HOVA_OK) return r;
        if (cursor->packet_len > d->packet_size || cursor->padding_len > d->packet_size ||
            cursor->num_payloads == 0)
            return HOVA_TryAgain;
    }
    const int r = read_payload_header(d, cursor, &cursor->parsed_size);
    if (r != HOVA_OK) return r;

    hova_stream_type_et type = HOVA_STREAM_NONE;
    const asf_stream_st* s = get_stream(d, cursor->stream_num & kStreamMask, &type);
    if (s && type == target_type && cursor->presentation_time != kUnknownTime &&
        cursor->offset_into_obj == 0 &&
        (type != HOVA_STREAM_VIDEO || (cursor->stream_num & kKeyFrame) != 0))
        *pts = asf_payload_pts(d, s, cursor->presentation_time);

    // Where this packet started, to reach the next one by position when the
    // payloads claim more bytes than the packet has.
    const uint64_t at_data = cb_tell64(cb);
    const uint64_t consumed = static_cast<uint64_t>(cursor->parsed_size) + cursor->payload_len;
    (void)cb->cb_seek64(cb, static_cast<cb_off_t>(cursor->payload_len), CB_SEEK_CUR);
    cursor->num_payloads--;
    cursor->parsed_size = static_cast<uint32_t>(consumed);
    if (cursor->num_payloads == 0) {
        if (consumed <= d->packet_size) {
            (void)cb->cb_seek64(cb, static_cast<cb_off_t>(d->packet_size - consumed), CB_SEEK_CUR);
        } else {
            const uint64_t packet_start = at_data - (consumed - cursor->payload_len);
            (void)cb->cb_seek64(cb, static_cast<cb_off_t>(packet_start + d->packet_size),
                                CB_SEEK_SET);
        }
    }
    return HOVA_OK;
}

int64_t get_packet_pts_with_number(asf_demuxer_st* d, uint32_t packet, uint64_t* barren_from) {
    // Only key frames inside the data object count: packets past its end
    // (an index naming them, the bytes of the index itself) are not read.
    const uint64_t end = *barren_from < d->num_packets ? *barren_from : d->num_packets;
    if (packet >= end) return -1;
    cb_buffer_st* cb = &d->s.cbuffer;
    const uint64_t stop = asf_packet_position(d, end);
    if (cb->cb_seek64(cb, static_cast<cb_off_t>(asf_packet_position(d, packet)), CB_SEEK_SET) == -1)
        return -1;
    asf_packet_st cursor{};
    for (;;) {
        if (cursor.num_payloads == 0 && cb_tell64(cb) >= stop) break;
        int64_t pts = -1;
        const int r = get_packet_pts(d, &cursor, &pts, HOVA_STREAM_VIDEO);
        if (r == HOVA_EndOfStream) break;
        if (r == HOVA_OK && pts != -1) return pts;
    }
    // Nothing from here to the end (a read may fail once, but only within
    // this seek is the answer kept).
    *barren_from = packet;
    return -1;
}
