// Opening a file (context, reader, header, data object, simple index) and
// closing it (every block back to the host, reader closed).
#include <algorithm>
#include <cstring>

#include "asf_api.h"
#include "asf_guid.h"
#include "asf_internal.h"
#include "asf_io.h"
#include "asf_objects.h"
#include "asf_packet.h"
#include "asf_seek.h"
#include "byte_reader.h"
#include "dprintf.h"
#include "streaming.h"
#include "sys_output.h"

using plimo::load_le;

namespace {

constexpr uintptr_t kAlign = 8;
// The fixed record plus the worst-case alignment step.
constexpr unsigned kMinBufsize = sizeof(asf_demuxer_st) + kAlign;

cb_off_t id3v2_tag_length(const uint8_t* h) {
    return static_cast<cb_off_t>(((h[6] & 0x7F) << 21) | ((h[7] & 0x7F) << 14) |
                                 ((h[8] & 0x7F) << 7) | (h[9] & 0x7F)) +
           10;
}

int fail_open(asf_demuxer_st* d, int rc) {
    asf_free_memory(d);
    CloseURL(&d->s.cbuffer, &d->s.callback);
    return rc;
}

// The packet count when the file properties give none (a recorded live
// stream): from the data object's size when it covers a packet, else whole
// packets up to the end of the input when its size is known, else unbounded.
uint64_t count_packets(asf_demuxer_st* d, uint64_t data_size) {
    const uint64_t packet = d->packet_size;
    if (data_size >= asf::data_object::kSize + packet)
        return (data_size - asf::data_object::kSize) / packet;
    cb_buffer_st* rd = &d->s.cbuffer;
    uint64_t size = rd->input ? rd->input->input_size : 0;
    // The single-thread reader can measure a seekable input (and is put back
    // on the first packet); the ring's reader cannot.
    if (size == 0 && d->s.seekable && !d->s.streaming && rd->cb_seek64 == cb_seek_single64) {
        size = cb_get_file_size(rd);
        (void)rd->cb_seek64(rd, d->first_packet, CB_SEEK_SET);
    }
    if (size != 0) return size > d->first_packet ? (size - d->first_packet) / packet : 0;
    return asf_unbounded_packet_count(d);
}

}  // namespace

int asf_stream_capacity(const void* buffer, int bufsize, const asf_demuxer_st* ctx) {
    // A negative size passes the unsigned size check; nothing is known about
    // the buffer then but the descriptor's promise of two records.
    if (bufsize < 0) return 2;
    const auto start = reinterpret_cast<uintptr_t>(buffer);
    const auto records = reinterpret_cast<uintptr_t>(ctx->stream_info);
    const uintptr_t end = start + static_cast<unsigned>(bufsize);
    if (records >= end) return 0;
    const uintptr_t n = (end - records) / sizeof(asf_stream_st);
    return n > 127 ? 127 : static_cast<int>(n);
}

void reset_data_packet(asf_packet_st* packet, uint64_t packet_num) {
    std::memset(packet, 0, sizeof *packet);
    packet->num = packet_num;
}

void reset_last_thumbnail_pts(asf_demuxer_st* d) {
    for (int k = AUD; k <= VID; ++k)
        if (d->s.active_stream[k] >= 0) d->stream_info[d->s.active_stream[k]].s.last_thumbnail_pts = -1;
}

void reset_stream_pts(asf_demuxer_st* d) {
    for (int k = AUD; k <= VID; ++k)
        if (d->s.active_stream[k] >= 0) d->stream_info[d->s.active_stream[k]].pts = -1;
}

void asf_free_memory(asf_demuxer_st* d) {
    sys_demuxer_st* s = &d->s;
    for (int i = 0; i < s->total_streams; ++i) sys_free(s, d->stream_info[i].s.config);
    sys_free(s, d->cover.payload);
    sys_free(s, d->title.payload);
    sys_free(s, d->author.payload);
    sys_free(s, d->albumTitle.payload);
    sys_free(s, d->genre);
    asf_release_index(d);
}

void asf_parse_index(asf_demuxer_st* d) {
    namespace si = asf::simple_index;
    cb_buffer_st* cb = &d->s.cbuffer;
    d->index_packet = 0;
    for (;;) {
        uint8_t h[si::kSize];
        if (cb->cb_peek(cb, h, static_cast<int32_t>(asf::kObjectHeaderSize)) <
            static_cast<int32_t>(asf::kObjectHeaderSize))
            break;
        const guid_st g = guid_from_bytes(h);
        if (sys_is_equal_guid(&g, &asf_simple_index_object)) {
            if (!asf::read_exact(d, h, si::kSize)) return;
            d->index_count = load_le<uint32_t>(h + si::kIndexCount);
            d->index_packet = cb_tell64(cb);
            d->index_time_interval = load_le<uint64_t>(h + si::kTimeInterval) / 10;
            asf_hold_index(d);
            break;  // only the first simple index is used
        }
        const auto size = static_cast<cb_off_t>(load_le<uint64_t>(h + asf::kObjSize));
        if (size < 1) return;
        if (!asf::skip(d, static_cast<uint64_t>(size))) return;
    }
    if (d->index_packet != 0) d->index_start_offset = -1;
}

int asf_judge_streaming_seekable(asf_demuxer_st* d) {
    return (d->index_count > 1 && d->index_packet != 0 && d->index_time_interval != 0) ? 1 : 0;
}

extern "C" int asf_init_demuxer(void** ctx, cb_io_st* cbio, void* buffer, int bufsize,
                                int ringbuf_size, const hova_callback_st* cb) {
    DPRINTF("[demuxer_format]: ASF\n");
    if (static_cast<unsigned>(bufsize) < kMinBufsize) return HOVA_NotEnoughMemory;
    if (!ctx || !cbio || !buffer || !cb) return HOVA_InvalidParam;

    const uintptr_t at = (reinterpret_cast<uintptr_t>(buffer) + kAlign - 1) & ~(kAlign - 1);
    auto* d = reinterpret_cast<asf_demuxer_st*>(at);
    *ctx = d;
    std::memset(d, 0, sizeof *d);
    d->s.callback = *cb;
    cb_buffer_st* rd = &d->s.cbuffer;
    if (OpenURL(rd, cbio, ringbuf_size, cb) != 0) return HOVA_NotEnoughMemory;

    d->s.seekable = cbio->seekable;
    d->s.streaming = cbio->streaming;
    // Every record the host's buffer holds is used, two at the least size.
    d->max_streams = asf_stream_capacity(buffer, bufsize, d);
    d->s.active_stream[AUD] = d->s.active_stream[VID] = d->s.active_stream[SUB] = -1;
    d->parse_mode = PARSE_SEQ;
    d->parse_file_end = 0;
    reset_data_packet(&d->cur_data_packet, 0);

    uint8_t id3[10];
    if (rd->cb_peek(rd, id3, sizeof id3) == static_cast<int32_t>(sizeof id3) &&
        std::memcmp(id3, "ID3", 3) == 0)
        (void)rd->cb_seek64(rd, id3v2_tag_length(id3), CB_SEEK_SET);

    const int rc = asf_parse_header(d);
    if (rc != HOVA_OK) return fail_open(d, rc);

    uint8_t data_obj[asf::data_object::kSize];
    if (!asf::read_exact(d, data_obj, sizeof data_obj)) return fail_open(d, HOVA_OpenFailed);

    d->seeked = 1;
    d->resync = 0;
    d->cur_packets = 0;
    d->first_packet = static_cast<uint32_t>(cb_tell64(rd));
    const uint64_t data_size = load_le<uint64_t>(data_obj + asf::kObjSize);
    // The file properties' count is trusted only as far as the data object
    // (when its size says nothing, the input) holds packets, and never past
    // what a position in 63 bits can address: a hostile count would have
    // seeks interpolate into packets that lie nowhere.
    const uint64_t held = std::min(count_packets(d, data_size), asf_unbounded_packet_count(d));
    if (d->num_packets == 0 || d->num_packets > held) d->num_packets = held;
    d->index_packet = 0;
    d->accept_stream_type = HOVA_STREAM_NONE;
    d->index_count = 0;
    d->s.thumbnail_interval = -1;
    reset_last_thumbnail_pts(d);
    reset_stream_pts(d);
    // Audio-only files need no index: the reader already stands at packet 0.
    if (d->s.active_stream[VID] < 0) return HOVA_OK;
    if (!d->s.seekable) return HOVA_OK;

    if (cbio->open_done)
        (void)cbio->open_done(cbio, asf_get_bitrate(d, HOVA_STREAM_AUDIO),
                              asf_get_bitrate(d, HOVA_STREAM_VIDEO),
                              static_cast<uint32_t>(d->s.duration / 1000));

    // Step over the packets to what follows the data object. A size below
    // its own header would be a backward seek, and a size of just its header
    // (a recorded live stream) would read the packets as objects: the index
    // is then unreachable.
    if (data_size > asf::data_object::kSize &&
        asf::skip(d, data_size - asf::data_object::kSize))
        asf_parse_index(d);

    if (d->s.streaming) d->s.seekable = asf_judge_streaming_seekable(d);
    (void)rd->cb_seek64(rd, d->first_packet, CB_SEEK_SET);
    return HOVA_OK;
}

extern "C" int asf_close_demuxer(void* ctx) {
    if (!ctx) return HOVA_InvalidParam;
    auto* d = static_cast<asf_demuxer_st*>(ctx);
    asf_free_memory(d);
    CloseURL(&d->s.cbuffer, &d->s.callback);
    return HOVA_OK;
}
