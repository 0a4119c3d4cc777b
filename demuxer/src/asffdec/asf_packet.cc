// Packet and payload headers. Every header is first parsed from the bytes
// ahead held in memory: in place in the file cache when it holds them, else
// from one peek (one reader call instead of one per field). When neither
// covers the header (end of input, short reads, long replicated data, a
// packet start that needs the resync scan) the same parser runs again field
// by field on the reader itself, so every path gives the same result.
#include "asf_packet.h"

#include <cstring>
#include <initializer_list>

#include "asf_timestamp.h"
#include "byte_reader.h"
#include "streaming.h"
#include "sys_output.h"

namespace {

constexpr uint8_t kEcFlagsUsual = 0x82;   // error correction present, 2 bytes of data
constexpr uint8_t kPropertyFlagsUsual = 0x5D;
constexpr int32_t kResyncWindow = 1024;
constexpr int32_t kResyncPositions = 1020;
constexpr uint32_t kSendTimeAndDuration = 6;
// Longest packet header without the resync scan: flags, 15 error correction
// bytes, length type flags, property flags, three 4-byte fields, send time
// and duration, payload flags.
constexpr int32_t kPacketHeaderPeek = 40;
// A payload header with up to 12 bytes of replicated data fits.
constexpr int32_t kPayloadHeaderPeek = 32;

constexpr uint32_t field_width(uint32_t type) {
    return type == 1 ? 1 : type == 2 ? 2 : type == 3 ? 4 : 0;
}

// Reads straight from the reader, with its short-read behaviour.
struct ReaderSource {
    cb_buffer_st* cb;
    static constexpr bool kCanResync = true;
    int32_t read(uint8_t* dst, int32_t n) { return cb->cb_read(cb, dst, n); }
    bool skip(uint32_t n) {
        return cb->cb_seek64(cb, static_cast<cb_off_t>(n), CB_SEEK_CUR) != -1;
    }
};

// Reads from bytes already peeked. Running past them marks the parse as
// incomplete; the caller then starts over on the reader.
struct PeekSource {
    const uint8_t* data;
    uint32_t size;
    uint32_t pos = 0;
    bool incomplete = false;
    static constexpr bool kCanResync = false;
    [[gnu::always_inline]] int32_t read(uint8_t* dst, int32_t n) {
        if (size - pos < static_cast<uint32_t>(n)) {
            incomplete = true;
            return 0;
        }
        if (n == 1)
            *dst = data[pos];
        else
            std::memcpy(dst, data + pos, static_cast<size_t>(n));
        pos += static_cast<uint32_t>(n);
        return n;
    }
    bool skip(uint32_t n) {
        if (size - pos < n) {
            incomplete = true;
            return false;
        }
        pos += n;
        return true;
    }
};

// Fields straight from the peeked bytes, without a copy per field.
[[gnu::always_inline]] inline uint32_t read_field(PeekSource& src, uint32_t* out, uint32_t type) {
    *out = 0;
    const uint32_t width = field_width(type);
    if (width == 0) return 0;
    if (src.size - src.pos < width) {
        src.incomplete = true;
        return 0;
    }
    const uint8_t* b = src.data + src.pos;
    *out = width == 1 ? b[0] : width == 2 ? plimo::load_le<uint16_t>(b) : plimo::load_le<uint32_t>(b);
    src.pos += width;
    return width;
}

template <typename Source>
uint32_t read_field(Source& src, uint32_t* out, uint32_t type) {
    *out = 0;
    const uint32_t width = field_width(type);
    if (width == 0) return 0;
    uint8_t b[4];
    if (src.read(b, static_cast<int32_t>(width)) != static_cast<int32_t>(width)) return 0;
    *out = width == 1 ? b[0] : width == 2 ? plimo::load_le<uint16_t>(b) : plimo::load_le<uint32_t>(b);
    return width;
}

template <typename Source>
int parse_packet_header(asf_demuxer_st* d, Source& src, asf_packet_st* p, uint32_t* header_size) {
    uint8_t flags = 0;
    if (src.read(&flags, 1) != 1) return HOVA_EndOfStream;
    uint32_t counter = 1;
    if (flags & 0x80) {
        if (flags != kEcFlagsUsual) {
            if constexpr (!Source::kCanResync) {
                src.incomplete = true;
                return HOVA_EndOfStream;
            } else {
                // The packet starts at the found byte: it is read whole from
                // there, and the next one is looked for at its end.
                (void)resync_packet(d, &flags);
            }
        }
        if (flags & 0x80) {
            const uint32_t ec_len = flags & 0x0F;
            if (!src.skip(ec_len)) return HOVA_EndOfStream;
            if (src.read(&flags, 1) != 1) return HOVA_EndOfStream;
            counter += ec_len + 1;
        }
        // Otherwise the scan found a packet without error correction data and
        // the found byte already is the length type flags.
    }
    if (src.read(&p->property_flags, 1) != 1) return HOVA_EndOfStream;
    uint32_t sequence = 0;
    uint32_t fields = read_field(src, &p->packet_len, (flags >> 5) & 3u);
    fields += read_field(src, &sequence, (flags >> 1) & 3u);
    fields += read_field(src, &p->padding_len, (flags >> 3) & 3u);
    if (!src.skip(kSendTimeAndDuration)) return HOVA_EndOfStream;
    p->num_payloads = 1;
    p->payload_len_type = 0;
    uint32_t size = counter + 1 + fields + kSendTimeAndDuration;
    if (flags & 0x01) {
        uint8_t payload_flags = 0;
        if (src.read(&payload_flags, 1) != 1) return HOVA_EndOfStream;
        p->num_payloads = payload_flags & 0x3Fu;
        p->payload_len_type = payload_flags >> 6;
        size += 1;
    }
    if (p->packet_len == 0) {
        p->packet_len = d->packet_size;
    } else if (p->packet_len < d->packet_size) {
        p->padding_len += d->packet_size - p->packet_len;
        p->packet_len = d->packet_size;
    }
    *header_size = size;
    return HOVA_OK;
}

template <typename Source>
int parse_payload_header(Source& src, asf_packet_st* p, uint32_t* parsed, int* announced) {
    *announced = 0;
    if (src.read(&p->stream_num, 1) != 1) return HOVA_EndOfStream;
    uint32_t used = 1;
    uint32_t replicated_len = 0;
    used += read_field(src, &p->object_num, (p->property_flags >> 4) & 3u);
    used += read_field(src, &p->offset_into_obj, (p->property_flags >> 2) & 3u);
    used += read_field(src, &replicated_len, p->property_flags & 3u);
    p->compressed_payload = 0;
    if (replicated_len == 1) {
        p->compressed_payload = 1;
        p->presentation_time = p->offset_into_obj;
        p->offset_into_obj = 0;
        (void)src.read(&p->presentation_time_delta, 1);
        used += 1;
    } else if (replicated_len < 8) {
        p->presentation_time = 0xFFFFFFFFu;
        if (!src.skip(replicated_len)) return HOVA_EndOfStream;
        used += replicated_len;
    } else {
        uint8_t b[4];
        if (src.read(b, 4) == 4) p->media_object_size = plimo::load_le<uint32_t>(b);
        if (src.read(b, 4) == 4) p->presentation_time = plimo::load_le<uint32_t>(b);
        if (!src.skip(replicated_len - 8)) return HOVA_EndOfStream;
        used += replicated_len;
        *announced = 1;
    }
    const uint32_t consumed = *parsed + used;
    if (p->payload_len_type != 0) {
        const uint32_t n = read_field(src, &p->payload_len, p->payload_len_type);
        *parsed = consumed + n;
    } else {
        p->payload_len = p->packet_len - consumed - p->padding_len;
        *parsed = consumed;
    }
    return HOVA_OK;
}

// Runs `parse` over a peek of `window` bytes; returns -1 when the peek did not
// hold the whole header and the caller must parse from the reader instead.
template <typename Parse>
int try_from_peek(cb_buffer_st* cb, int32_t window, Parse parse) {
    // With the file cache the bytes ahead usually are in memory already:
    // parse them where they are.
    if (cb->buffer_type == CB_FS_CACHE && cb->cb_peek == cb_peek_single) {
        const fs_cache_st& c = cb->fs_cache;
        if (cb->curpos >= c.base_pos && cb->curpos < c.base_pos + c.avail_size) {
            const uint32_t off = static_cast<uint32_t>(cb->curpos - c.base_pos);
            PeekSource src{c.buffer + off, c.avail_size - off};
            const int r = parse(src);
            if (!src.incomplete) {
                if (cb->cb_seek64(cb, static_cast<cb_off_t>(src.pos), CB_SEEK_CUR) == -1)
                    return HOVA_EndOfStream;
                return r;
            }
        }
    }
    // A ring holds them in place too, up to where its storage wraps.
    if (cb->buffer_type == CB_STREAM_RBUF) {
        const uint8_t* at = nullptr;
        const uint32_t held = cb_ring_span(cb, &at);
        if (held > 0) {
            PeekSource src{at, held};
            const int r = parse(src);
            if (!src.incomplete) {
                if (cb->cb_seek64(cb, static_cast<cb_off_t>(src.pos), CB_SEEK_CUR) == -1)
                    return HOVA_EndOfStream;
                return r;
            }
        }
    }
    uint8_t buf[kPacketHeaderPeek > kPayloadHeaderPeek ? kPacketHeaderPeek : kPayloadHeaderPeek];
    const int32_t got = cb->cb_peek(cb, buf, window);
    if (got != window) return -1;
    PeekSource src{buf, static_cast<uint32_t>(got)};
    const int r = parse(src);
    if (src.incomplete) return -1;
    if (cb->cb_seek64(cb, static_cast<cb_off_t>(src.pos), CB_SEEK_CUR) == -1)
        return HOVA_EndOfStream;
    return r;
}

}  // namespace

int read_1_2_4_bytes(cb_buffer_st* cb, uint32_t* out, uint32_t type) {
    ReaderSource src{cb};
    return static_cast<int>(read_field(src, out, type));
}

int read_packet_header(asf_demuxer_st* d, asf_packet_st* p, uint32_t* header_size) {
    cb_buffer_st* cb = &d->s.cbuffer;
    // Peeked parses write into a copy so that a fallback starts clean.
    asf_packet_st tmp;
    uint32_t size = 0;
    const int r = try_from_peek(cb, kPacketHeaderPeek, [&](PeekSource& src) {
        tmp = *p;
        return parse_packet_header(d, src, &tmp, &size);
    });
    if (r >= 0) {
        *p = tmp;
        *header_size = size;
        return r;
    }
    ReaderSource src{cb};
    return parse_packet_header(d, src, p, header_size);
}

int asf_read_payload_header_ex(asf_demuxer_st* d, asf_packet_st* p, uint32_t* parsed,
                               int* announced_size) {
    cb_buffer_st* cb = &d->s.cbuffer;
    asf_packet_st tmp;
    uint32_t tmp_parsed = 0;
    int tmp_announced = 0;
    const int r = try_from_peek(cb, kPayloadHeaderPeek, [&](PeekSource& src) {
        // Each attempt starts from the caller's record.
        tmp = *p;
        tmp_parsed = *parsed;
        return parse_payload_header(src, &tmp, &tmp_parsed, &tmp_announced);
    });
    if (r >= 0) {
        // `parsed` may point into `p`; store it last.
        *p = tmp;
        *announced_size = tmp_announced;
        *parsed = tmp_parsed;
        return r;
    }
    ReaderSource src{cb};
    return parse_payload_header(src, p, parsed, announced_size);
}

int read_payload_header(asf_demuxer_st* d, asf_packet_st* p, uint32_t* parsed) {
    int announced = 0;
    return asf_read_payload_header_ex(d, p, parsed, &announced);
}

cb_off_t asf_seek_to_packet_with_parsed(asf_demuxer_st* d, const asf_packet_st* p) {
    const uint64_t pos = static_cast<uint64_t>(d->first_packet) +
                         p->num * static_cast<uint64_t>(d->packet_size) + p->parsed_size;
    return d->s.cbuffer.cb_seek64(&d->s.cbuffer, static_cast<cb_off_t>(pos), CB_SEEK_SET);
}

uint32_t resync_packet(asf_demuxer_st* d, uint8_t* first_byte) {
    // Scratch memory comes from a stream's pending host frame, behind the
    // partial object it may be assembling, so that object survives the scan.
    static constexpr struct {
        sys_stream_type_et kind;
        hova_stream_type_et type;
    } kOrder[] = {{VID, HOVA_STREAM_VIDEO}, {AUD, HOVA_STREAM_AUDIO}};
    asf_stream_st* owner = nullptr;
    hova_stream_type_et owner_type = HOVA_STREAM_NONE;
    uint8_t* scratch = nullptr;
    bool fresh = false;
    for (const auto& k : kOrder) {
        const int idx = d->s.active_stream[k.kind];
        if (idx < 0) continue;
        asf_stream_st* s = &d->stream_info[idx];
        void* frame = s->buffer;
        if (s->buffer) {
            if (s->object_size > static_cast<uint32_t>(INT32_MAX - kResyncWindow)) continue;
            if (sys_stream_realloc(&d->s, k.type, &frame,
                                   static_cast<int>(s->object_size) + kResyncWindow) != 0 ||
                !frame)
                continue;  // the partial object stays as it was
            s->buffer = static_cast<uint8_t*>(frame);
            scratch = s->buffer + s->object_size;
        } else if (s->object_size == 0) {
            frame = nullptr;
            if (sys_stream_alloc(&d->s, k.type, &frame, kResyncWindow) != 0 || !frame) continue;
            scratch = static_cast<uint8_t*>(frame);
            fresh = true;
        } else {
            continue;  // its partial object has no memory to extend
        }
        owner = s;
        owner_type = k.type;
        break;
    }
    if (!owner) return 0;

    cb_buffer_st* cb = &d->s.cbuffer;
    const int32_t got = cb->cb_peek(cb, scratch, kResyncWindow);
    uint32_t passed = 0;
    // Only bytes the peek delivered are looked at.
    for (int32_t k = 0; k < kResyncPositions && k + 1 < got; ++k) {
        const uint8_t b = scratch[k];
        const bool match = (b & 0x80) ? (b == kEcFlagsUsual && k + 4 < got &&
                                         scratch[k + 4] == kPropertyFlagsUsual)
                                      : scratch[k + 1] == kPropertyFlagsUsual;
        if (match) {
            (void)cb->cb_seek64(cb, static_cast<cb_off_t>(k) + 1, CB_SEEK_CUR);
            *first_byte = b;
            passed = static_cast<uint32_t>(k) + 1;
            break;
        }
    }
    if (fresh) (void)sys_stream_discard(&d->s, owner_type);
    return passed;
}

namespace {

constexpr int32_t kRealignReach = 256;  // bytes looked at on either side
constexpr int32_t kStartBytes = 5;

bool usual_packet_start(const uint8_t* b) {
    if (b[0] & 0x80) return b[0] == kEcFlagsUsual && b[4] == kPropertyFlagsUsual;
    return b[1] == kPropertyFlagsUsual;
}

// True when a usual packet start lies at `pos` and, unless it is the last
// packet, another one packet later.
bool confirmed_start(cb_buffer_st* cb, uint64_t pos, uint32_t packet_size, bool last) {
    uint8_t b[kStartBytes];
    for (uint64_t at : {pos, pos + packet_size}) {
        if (at != pos && last) break;
        if (cb->cb_seek64(cb, static_cast<cb_off_t>(at), CB_SEEK_SET) == -1) return false;
        if (cb->cb_peek(cb, b, kStartBytes) != kStartBytes || !usual_packet_start(b)) return false;
    }
    return true;
}

}  // namespace

int64_t asf_realign_packet(asf_demuxer_st* d) {
    cb_buffer_st* cb = &d->s.cbuffer;
    asf_packet_st* p = &d->cur_data_packet;
    const uint64_t pos = cb_tell64(cb);
    const uint64_t grid = asf_packet_position(d, d->cur_packets);
    const bool last = d->cur_packets + 1 >= d->num_packets;
    if (pos < d->first_packet) return 0;
    // Only files whose packets start in the usual form are looked after: the
    // previous packet had it (or nothing was read since a repositioning).
    if (p->property_flags != kPropertyFlagsUsual && p->property_flags != 0) return 0;
    uint8_t b[kStartBytes];
    const bool usual_here = cb->cb_peek(cb, b, kStartBytes) == kStartBytes && usual_packet_start(b);
    if (usual_here && pos == grid) return 0;

    uint64_t found = UINT64_MAX;
    if (usual_here && (b[0] & 0x80) && confirmed_start(cb, pos, d->packet_size, last)) {
        found = pos;
    } else {
        // Nearest first, ahead before behind, never before the data.
        uint8_t w[2 * kRealignReach + kStartBytes];
        const uint64_t from = pos - d->first_packet >= static_cast<uint64_t>(kRealignReach)
                                  ? pos - kRealignReach
                                  : d->first_packet;
        int32_t got = -1;
        if (cb->cb_seek64(cb, static_cast<cb_off_t>(from), CB_SEEK_SET) != -1)
            got = cb->cb_peek(cb, w, static_cast<int32_t>(sizeof w));
        const int64_t here = static_cast<int64_t>(pos - from);
        // Starts with error correction data first: the bytes behind its flags
        // look like a start without it.
        for (int pass = 0; pass < 2 && found == UINT64_MAX; ++pass)
        for (int32_t dist = 0; dist <= kRealignReach && found == UINT64_MAX; ++dist) {
            for (int64_t at : {here + dist, here - dist}) {
                if (at < 0 || at + kStartBytes > got || !usual_packet_start(w + at) ||
                    ((w[at] & 0x80) != 0) != (pass == 0))
                    continue;
                if (confirmed_start(cb, from + static_cast<uint64_t>(at), d->packet_size, last)) {
                    found = from + static_cast<uint64_t>(at);
                    break;
                }
            }
        }
    }
    auto keep = [&] {
        (void)cb->cb_seek64(cb, static_cast<cb_off_t>(pos), CB_SEEK_SET);
        return 0;
    };
    if (found == UINT64_MAX || found < d->first_packet) return keep();
    const int64_t near = static_cast<int64_t>(found - grid);
    if (near >= -kRealignReach && near <= kRealignReach) {
        // Bytes gained or lost around the packet delivery expects: the grid
        // follows them (and the packet count goes on, so delivery always
        // moves on). A grid that would leave the 32-bit range stays.
        const int64_t first = static_cast<int64_t>(d->first_packet) + near;
        if (first < 0 || first > static_cast<int64_t>(UINT32_MAX)) return keep();
        d->first_packet = static_cast<uint32_t>(first);
    } else {
        // Far from it (the host moved its input): a start a whole number of
        // packets from the grid is on it, and delivery counts from that
        // packet; one within reach of a slot moves the grid to it; any other
        // leaves all as it was, as does a start behind the reader in a packet
        // delivery has passed (reading it again could go on for ever).
        const uint64_t off = (found - d->first_packet) % d->packet_size;
        const int64_t shift = off <= d->packet_size - off ? static_cast<int64_t>(off)
                                                           : -static_cast<int64_t>(d->packet_size - off);
        const int64_t first = static_cast<int64_t>(d->first_packet) + shift;
        if (shift > kRealignReach || shift < -kRealignReach || first < 0 ||
            first > static_cast<int64_t>(UINT32_MAX))
            return keep();
        const uint64_t slot = (found - static_cast<uint64_t>(first)) / d->packet_size;
        if (found < pos && slot < d->cur_packets) return keep();
        d->first_packet = static_cast<uint32_t>(first);
        d->cur_packets = slot;
        p->num = slot;
    }
    (void)cb->cb_seek64(cb, static_cast<cb_off_t>(found), CB_SEEK_SET);
    return static_cast<int64_t>(found - pos);
}
