// The walk over the header object and its header extension. Each object is
// dispatched on its GUID through a table; every handler leaves the reader at
// the object's declared end, so the walk only ever moves forward.
#include <cstring>

#include "asf_guid.h"
#include "asf_internal.h"
#include "asf_io.h"
#include "asf_objects.h"
#include "byte_reader.h"
#include "dprintf.h"
#include "sys_lang.h"

using plimo::load_le;

namespace {

constexpr uint64_t kHdr = asf::kObjectHeaderSize;
constexpr uint64_t kFilePropObjectSize = kHdr + asf::file_prop::kSize;     // 104
constexpr uint64_t kHeaderExtMin = kHdr + asf::header_ext::kSize;          // 46
constexpr uint64_t kExtStreamFixed = kHdr + asf::ext_stream_prop::kSize;   // 88
// An embedded stream properties object needs at least this many bytes.
constexpr uint64_t kEmbeddedStreamMin = kHdr + asf::stream_prop::kSize;    // 78
constexpr int kLanguageSlots = 128;

struct Walk {
    asf_demuxer_st* d;
    int num_prop;
    int num_strm;
};

// A handler gets the object's size (which it may reduce to what it consumed,
// so the walk goes on behind that) and returns HOVA_OK or a failure code.
using Handler = int (*)(Walk& w, uint64_t& size);

struct Entry {
    const guid_st* guid;
    Handler handler;
};

int skip_body(Walk& w, uint64_t size) {
    return asf::skip(w.d, size - kHdr) ? HOVA_OK : HOVA_EndOfStream;
}

// ---- top level ----

int on_file_prop(Walk& w, uint64_t& size) {
    namespace fp = asf::file_prop;
    asf_demuxer_st* d = w.d;
    if (size < kFilePropObjectSize) return HOVA_OpenFailed;
    uint8_t b[fp::kSize];
    if (!asf::read_exact(d, b, sizeof b)) return HOVA_EndOfStream;
    const uint32_t min_packet = load_le<uint32_t>(b + fp::kMinPacketSize);
    if (min_packet != load_le<uint32_t>(b + fp::kMaxPacketSize)) return HOVA_OpenFailed;
    d->num_packets = load_le<uint64_t>(b + fp::kPacketCount);
    d->packet_size = min_packet;
    const uint64_t preroll = load_le<uint64_t>(b + fp::kPreroll);
    d->preroll = static_cast<uint32_t>(preroll);
    // Unsigned arithmetic: both fields are untrusted and the signed difference
    // could overflow. For any real file this is the plain difference.
    d->s.duration = static_cast<int64_t>(load_le<uint64_t>(b + fp::kPlayDuration) / 10 -
                                         preroll * 1000);
    if (load_le<uint32_t>(b + fp::kFlags) & fp::kFlagBroadcast) {
        ASF_LOG("Broadcast flag is set!\n");
        d->s.duration = 0;
    }
    w.num_prop++;
    // Writers that append to the record still declare its size.
    if (size > kFilePropObjectSize && !asf::skip(d, size - kFilePropObjectSize))
        return HOVA_EndOfStream;
    return HOVA_OK;
}

int on_stream_prop(Walk& w, uint64_t& size) {
    const int rc = asf_parse_stream_prop(w.d, size);
    if (rc != HOVA_OK) return rc;
    w.num_strm++;
    return HOVA_OK;
}

int on_header_ext(Walk& w, uint64_t& size) { return asf_parse_header_extension(w.d, size); }

int on_content_desc(Walk& w, uint64_t& size) { return asf_parse_content_desc(w.d, size); }

int on_ext_content_desc(Walk& w, uint64_t& size) {
    if (size > kHdr + 1) return asf_parse_ext_content_desc(w.d, size);
    return skip_body(w, size);
}

constexpr Entry kTopLevel[] = {
    {&asf_file_prop_object, on_file_prop},
    {&asf_header_extension_object, on_header_ext},
    {&asf_stream_prop_object, on_stream_prop},
    {&asf_stream_prop_object2, on_stream_prop},
    {&asf_content_desc_object, on_content_desc},
    {&asf_extended_content_desc_object, on_ext_content_desc},
};

// ---- header extension children ----

int on_hidden_stream(Walk& w, uint64_t& size) {
    ASF_LOG("found hidden stream!\n");
    return asf_parse_stream_prop(w.d, size);
}

bool is_stream_prop_guid(const guid_st& g) {
    return sys_is_equal_guid(&g, &asf_stream_prop_object) ||
           sys_is_equal_guid(&g, &asf_stream_prop_object2);
}

// Steps over the stream names and payload extension systems behind an
// extended stream properties body, by their own counts and lengths, within
// the `room` bytes left in the object, adding what it consumed to `used`.
// False when an entry would run past the object (the reader then stands
// somewhere inside it); a short read sets `rc` to HOVA_EndOfStream.
bool skip_tail_entries(asf_demuxer_st* d, uint64_t room, uint16_t names, uint16_t systems,
                       uint64_t* used, int* rc) {
    namespace es = asf::ext_stream_prop;
    *rc = HOVA_OK;
    for (uint32_t i = 0; i < names + uint32_t{systems}; ++i) {
        const bool name = i < names;
        const uint64_t fixed = name ? es::kStreamNameFixed : es::kExtSystemFixed;
        if (room - *used < fixed) return false;
        uint8_t b[es::kExtSystemFixed];
        if (!asf::read_exact(d, b, fixed)) {
            *rc = HOVA_EndOfStream;
            return false;
        }
        *used += fixed;
        const uint64_t len = name ? load_le<uint16_t>(b + es::kStreamNameLength)
                                  : load_le<uint32_t>(b + es::kExtSystemInfoLength);
        if (room - *used < len) return false;
        if (!asf::skip(d, len)) {
            *rc = HOVA_EndOfStream;
            return false;
        }
        *used += len;
    }
    return true;
}

int on_ext_stream_prop(Walk& w, uint64_t& size) {
    namespace es = asf::ext_stream_prop;
    asf_demuxer_st* d = w.d;
    if (size < kExtStreamFixed) {
        (void)asf::skip(d, size - kHdr);
        return HOVA_OK;
    }
    uint8_t b[es::kSize];
    if (!asf::read_exact(d, b, sizeof b)) return HOVA_EndOfStream;
    const uint16_t sn = load_le<uint16_t>(b + es::kStreamNum);
    if (asf_valid_stream_num(sn)) {
        d->stream_bitrate[sn] = load_le<uint32_t>(b + es::kBitrate);
        d->stream_language_index[sn] = load_le<uint16_t>(b + es::kStreamLanguageIndex);
        d->time_per_frame[sn] =
            static_cast<uint32_t>(load_le<uint64_t>(b + es::kAvgTimePerFrame) / 10);
    }

    // Stream names and payload extension systems follow, as many as the body
    // counts; nothing here uses them. Behind them an encoder may embed the
    // stream's own stream properties object: the walk is then left in front
    // of it, so that it is met as the next child (a hidden stream).
    const uint64_t room = size - kExtStreamFixed;
    uint64_t used = 0;
    int rc = HOVA_OK;
    const bool whole = skip_tail_entries(d, room, load_le<uint16_t>(b + es::kStreamNameCount),
                                         load_le<uint16_t>(b + es::kPayloadExtSystemCount),
                                         &used, &rc);
    if (rc != HOVA_OK) return rc;
    if (whole && room - used >= kEmbeddedStreamMin) {
        uint8_t g[16];
        cb_buffer_st* cb = &d->s.cbuffer;
        if (cb->cb_peek(cb, g, sizeof g) == static_cast<int32_t>(sizeof g) &&
            is_stream_prop_guid(guid_from_bytes(g))) {
            size = kExtStreamFixed + used;
            return HOVA_OK;
        }
    }
    if (room > used) (void)asf::skip(d, room - used);
    return HOVA_OK;
}

int on_language_list(Walk& w, uint64_t& size) {
    asf_demuxer_st* d = w.d;
    uint64_t consumed = kHdr;
    if (size > kHdr + 1) {
        uint8_t b2[2];
        if (!asf::read_exact(d, b2, 2)) return HOVA_EndOfStream;
        const uint16_t count = load_le<uint16_t>(b2);
        consumed = kHdr + 2;
        for (uint32_t i = 0; i < count; ++i) {
            consumed += 1;
            if (size < consumed) return HOVA_EndOfStream;
            uint8_t len = 0;
            if (!asf::read_exact(d, &len, 1)) return HOVA_EndOfStream;
            if (size < consumed + len) break;
            uint8_t id[4] = {};
            const uint32_t head = len < 4 ? len : 4;
            if (!asf::read_exact(d, id, head)) return HOVA_EndOfStream;
            if (!asf::skip(d, len - head)) return HOVA_EndOfStream;
            consumed += len;
            // The low bytes of the first two UTF-16 characters; entries past
            // the table are read over and dropped.
            if (i < kLanguageSlots) {
                d->language_list[i][0] = static_cast<char>(id[0]);
                d->language_list[i][1] = static_cast<char>(id[2]);
                d->language_list[i][2] = 0;
            }
        }
    }
    if (size > consumed) (void)asf::skip(d, size - consumed);
    return HOVA_OK;
}

int on_metadata_library(Walk& w, uint64_t& size) { return asf_parse_metadata_library(w.d, size); }

constexpr Entry kExtension[] = {
    {&asf_stream_prop_object, on_hidden_stream},
    {&asf_stream_prop_object2, on_hidden_stream},
    {&asf_extended_stream_prop_object, on_ext_stream_prop},
    {&asf_language_list_object, on_language_list},
    {&asf_metadata_library_object, on_metadata_library},
};

template <size_t N>
Handler find_handler(const Entry (&table)[N], const guid_st& g) {
    for (const Entry& e : table)
        if (sys_is_equal_guid(e.guid, &g)) return e.handler;
    return nullptr;
}

// One object header: its GUID and declared size.
bool read_object_header(asf_demuxer_st* d, guid_st* g, uint64_t* size) {
    uint8_t h[asf::kObjectHeaderSize];
    if (!asf::read_exact(d, h, sizeof h)) return false;
    *g = guid_from_bytes(h);
    *size = load_le<uint64_t>(h + asf::kObjSize);
    return true;
}

}  // namespace

int asf_valid_stream_num(int stream_num) { return static_cast<unsigned>(stream_num) <= 127u; }

int asf_parse_header_extension(asf_demuxer_st* d, uint64_t size) {
    namespace he = asf::header_ext;
    if (size < kHeaderExtMin) return HOVA_OpenFailed;
    uint8_t b[he::kSize];
    if (!asf::read_exact(d, b, 16)) return HOVA_EndOfStream;
    if (!asf::read_exact(d, b + 16, 2)) return HOVA_EndOfStream;
    const guid_st reserved = guid_from_bytes(b + he::kReserved1);
    if (!sys_is_equal_guid(&reserved, &asf_reserved_1) ||
        load_le<uint16_t>(b + he::kReserved2) != he::kReserved2Value)
        return HOVA_OpenFailed;
    if (!asf::read_exact(d, b + 18, 4)) return HOVA_EndOfStream;

    // Hidden streams do not count as top-level streams: the children get a
    // walk state of their own.
    Walk w{d, 0, 0};
    uint64_t remaining = size - kHeaderExtMin;
    while (remaining >= kHdr) {
        guid_st g;
        uint64_t child = 0;
        if (!read_object_header(d, &g, &child)) return HOVA_EndOfStream;
        // A child smaller than its own header cannot be stepped over.
        if (child > remaining || child < kHdr) return HOVA_OpenFailed;
        int rc;
        if (Handler h = find_handler(kExtension, g)) rc = h(w, child);
        else rc = skip_body(w, child);
        if (rc != HOVA_OK) return rc;
        remaining -= child;
    }
    if (remaining > 0) (void)asf::skip(d, remaining);
    return HOVA_OK;
}

void asf_assign_bitrate(asf_demuxer_st* d) {
    for (int i = 0; i < d->s.total_streams; ++i) {
        asf_stream_st* st = &d->stream_info[i];
        if (asf_valid_stream_num(st->stream_num)) st->bitrate = d->stream_bitrate[st->stream_num];
    }
}

void asf_assign_language(asf_demuxer_st* d) {
    for (int i = 0; i < d->s.total_streams; ++i) {
        asf_stream_st* st = &d->stream_info[i];
        if (!asf_valid_stream_num(st->stream_num)) continue;
        const uint16_t li = d->stream_language_index[st->stream_num];
        if (li < kLanguageSlots) st->lang = sys_alpha2_to_alpha3(d->language_list[li]);
    }
}

int asf_parse_header(asf_demuxer_st* d) {
    uint8_t h[asf::kHeaderObjectSize];
    if (!asf::read_exact(d, h, sizeof h)) return HOVA_EndOfStream;
    const guid_st g = guid_from_bytes(h);
    if (!sys_is_equal_guid(&g, &asf_header_object) || h[asf::kHeaderReserved1] != 1 ||
        h[asf::kHeaderReserved2] != 2)
        return HOVA_OpenFailed;
    const uint64_t header_size = load_le<uint64_t>(h + asf::kObjSize);
    if (header_size <= asf::kHeaderObjectSize) return HOVA_OpenFailed;

    Walk w{d, 0, 0};
    uint64_t parsed = asf::kHeaderObjectSize;
    int rc = HOVA_OK;
    while (parsed < header_size) {
        guid_st og;
        uint64_t size = 0;
        if (!read_object_header(d, &og, &size)) {
            rc = HOVA_EndOfStream;
            break;
        }
        // Compared without overflow; an object smaller than its own header
        // would leave the walk where it is.
        if (size > header_size - parsed || size < kHdr) {
            rc = HOVA_OpenFailed;
            break;
        }
        if (Handler hd = find_handler(kTopLevel, og)) rc = hd(w, size);
        else rc = skip_body(w, size);
        if (rc != HOVA_OK) break;
        parsed += size;
    }
    if (rc != HOVA_OK) return rc;
    if (w.num_strm <= 0 || w.num_prop != 1) return HOVA_OpenFailed;
    if (d->packet_size == 0) return HOVA_OpenFailed;
    asf_assign_bitrate(d);
    asf_assign_language(d);
    return HOVA_OK;
}
