// Stream properties: one object becomes one audio or video stream record,
// which becomes the active stream of its kind.
#include <cstring>

#include "asf_guid.h"
#include "asf_internal.h"
#include "asf_io.h"
#include "asf_objects.h"
#include "byte_reader.h"
#include "dprintf.h"
#include "sys_msft.h"
#include "sys_output.h"

using plimo::load_le;

namespace {

// The BITMAPINFOHEADER of a video stream sits behind the encoded width and
// height, a flags byte and the format data size.
constexpr uint64_t kVideoPrefix = 11;

// No decoder configuration comes near this; a longer type-specific part is
// answered as a refused allocation without asking the host for it.
constexpr uint64_t kMaxConfigLen = 16u << 20;

sys_stream_type_et kind_of(hova_stream_type_et type) {
    return type == HOVA_STREAM_AUDIO ? AUD : VID;
}

// Index of the record the new stream of `kind` is written to, or -1 when the
// context has none to give. With every record in use, the earliest record
// that will not be active afterwards gives way (its configuration block is
// released and the later records move down), so the active streams are
// always the last audio and the last video of the header and record order
// stays header order.
int claim_record(asf_demuxer_st* d, sys_stream_type_et kind) {
    sys_demuxer_st& s = d->s;
    if (s.total_streams < d->max_streams) return s.total_streams;
    int victim = -1;
    for (int i = 0; i < s.total_streams; ++i) {
        const bool active = i == s.active_stream[AUD] || i == s.active_stream[VID];
        if (!active || i == s.active_stream[kind]) {
            victim = i;
            break;
        }
    }
    if (victim < 0) return -1;
    asf_stream_st* rec = d->stream_info;
    sys_free(&s, rec[victim].s.config);
    s.num_streams[kind_of(rec[victim].s.stream_type)]--;
    std::memmove(&rec[victim], &rec[victim + 1],
                 sizeof(asf_stream_st) * static_cast<size_t>(s.total_streams - victim - 1));
    s.total_streams--;
    for (int k = AUD; k <= VID; ++k) {
        if (s.active_stream[k] == victim) s.active_stream[k] = -1;
        else if (s.active_stream[k] > victim) s.active_stream[k]--;
    }
    return s.total_streams;
}

void fill_record(asf_stream_st* st, const uint8_t* body, hova_stream_type_et type) {
    std::memset(st, 0, sizeof *st);
    st->s.stream_type = type;
    st->s.config_sent = 0;
    st->s.next_pos = ~static_cast<cb_fpos>(0);
    st->stream_num = load_le<uint16_t>(body + asf::stream_prop::kFlags) &
                     asf::stream_prop::kStreamNumberMask;
    st->time_offset =
        static_cast<int64_t>(load_le<uint64_t>(body + asf::stream_prop::kTimeOffset) / 10);
    st->object_num = -1;
    reset_object_size(st);
}

// A block of `len` bytes for the record's configuration; a zero length has
// no block. False when the host refuses (or would have to refuse) it.
bool alloc_config(asf_demuxer_st* d, asf_stream_st* st, uint64_t len) {
    st->s.config = nullptr;
    st->s.config_len = 0;
    if (len == 0) return true;
    if (len > kMaxConfigLen) return false;
    st->s.config = static_cast<uint8_t*>(sys_malloc(&d->s, len));
    if (!st->s.config) return false;
    std::memset(st->s.config, 0, len);
    st->s.config_len = static_cast<uint32_t>(len);
    return true;
}

void register_stream(asf_demuxer_st* d, int idx, sys_stream_type_et kind) {
    d->s.active_stream[kind] = idx;
    d->s.num_streams[kind]++;
    d->s.total_streams++;
}

// Spread-audio parameters from the first five bytes of the error correction
// data; E drops by what was read.
void read_spread(asf_demuxer_st* d, uint64_t* e) {
    uint8_t b[2] = {};
    uint64_t got = asf::read(d, b, 1);
    *e -= got;
    d->a_spread_span = b[0];
    b[0] = b[1] = 0;
    got = asf::read(d, b, 2);
    *e -= got;
    d->a_spread_packet_len = load_le<uint16_t>(b);
    b[0] = b[1] = 0;
    got = asf::read(d, b, 2);
    *e -= got;
    d->a_spread_chunk_len = load_le<uint16_t>(b);
    const uint16_t pkt = d->a_spread_packet_len, chunk = d->a_spread_chunk_len;
    if (d->a_spread_span > 1 && (chunk == 0 || chunk >= pkt || pkt % chunk != 0))
        d->a_spread_span = 0;
}

}  // namespace

void reset_object_size(asf_stream_st* stream) {
    stream->object_size = 0;
    stream->media_object_size = 0;
}

int asf_parse_stream_prop(asf_demuxer_st* d, uint64_t size) {
    if (size < asf::kObjectHeaderSize + asf::stream_prop::kSize) return HOVA_OpenFailed;
    uint8_t body[asf::stream_prop::kSize];
    if (!asf::read_exact(d, body, sizeof body)) return HOVA_EndOfStream;

    uint64_t r = size - asf::kObjectHeaderSize - asf::stream_prop::kSize;
    uint64_t e = load_le<uint32_t>(body + asf::stream_prop::kEcDataLen);
    if (e > r) e = r;
    r -= e;

    const guid_st type = guid_from_bytes(body + asf::stream_prop::kStreamType);
    const guid_st ec_type = guid_from_bytes(body + asf::stream_prop::kEcType);

    if (sys_is_equal_guid(&type, &asf_audio_media)) {
        const int idx = claim_record(d, AUD);
        if (idx < 0) {
            ASF_LOG("no stream record left for audio stream\n");
            return HOVA_NotEnoughMemory;
        }
        asf_stream_st* st = &d->stream_info[idx];
        fill_record(st, body, HOVA_STREAM_AUDIO);
        if (!alloc_config(d, st, r)) {
            ASF_LOG("malloc audio config fails!\n");
            return HOVA_NotEnoughMemory;
        }
        uint32_t unread = static_cast<uint32_t>(r);
        (void)sys_msft_parse_audio_header(&d->s, &st->s, &unread);
        r = unread;
        if (sys_is_equal_guid(&ec_type, &asf_spread_audio) && e > 4) read_spread(d, &e);
        register_stream(d, idx, AUD);
        st->pts = 0;
    } else if (sys_is_equal_guid(&type, &asf_video_media)) {
        const int idx = claim_record(d, VID);
        if (idx < 0) {
            ASF_LOG("no stream record left for video stream\n");
            return HOVA_NotEnoughMemory;
        }
        asf_stream_st* st = &d->stream_info[idx];
        fill_record(st, body, HOVA_STREAM_VIDEO);
        if (!asf::skip(d, kVideoPrefix)) return HOVA_EndOfStream;
        // Fewer bytes than the prefix would leave a wrapped length that no
        // host can allocate.
        if (r < kVideoPrefix || !alloc_config(d, st, r - kVideoPrefix)) {
            ASF_LOG("malloc video config fails!\n");
            return HOVA_NotEnoughMemory;
        }
        r -= kVideoPrefix;
        uint32_t unread = static_cast<uint32_t>(r);
        uint32_t fourcc = 0;
        (void)sys_msft_parse_video_header(&d->s, &st->s, &unread, &fourcc);
        r = unread;
        register_stream(d, idx, VID);
        st->pts = -1;
    }
    // Error correction bytes not read and type-specific bytes not consumed.
    (void)asf::skip(d, e + r);
    return HOVA_OK;
}
