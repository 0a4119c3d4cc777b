// Data packets for tests: every header layout the format allows, compressed
// payloads, padding, deliberately damaged packets, spread-audio objects and
// a small muxer that cuts media objects into payloads. The packets go into
// asfb::data_object / asfb::File::packets.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "asf_builder.h"

namespace asfb {

// One payload. Replicated data is written verbatim; `media()` and
// `compressed()` make the usual forms.
struct Payload {
    uint8_t stream = 1; bool key = false;
    uint32_t object_num = 0, offset = 0;  // offset into the object; presentation time when compressed
    Bytes replicated, data;  // data: sub-payloads already framed when compressed
    std::optional<uint32_t> declared_len;  // payload length field; default data.size()
};

// An ordinary fragment: replicated data holds the object size and time, then
// `extra` bytes (payload extensions) filled with 0xEE.
Payload media(uint8_t stream, uint32_t object_num, uint32_t offset, uint32_t object_size,
              uint32_t pts_ms, Bytes data, bool key = false, uint32_t extra = 0);
// A payload with `replicated_len` (0 or 2 to 7) bytes of replicated data that
// carries no size or time.
Payload untimed(uint8_t stream, uint32_t object_num, uint32_t offset, Bytes data, uint32_t replicated_len,
                bool key = false);
// A compressed payload: sub-payloads of whole small objects, the first at
// `pts_ms`, each following one `delta_ms` later.
Payload compressed(uint8_t stream, uint32_t object_num, uint32_t pts_ms, uint8_t delta_ms,
                   const std::vector<Bytes>& subs, bool key = false);

// Header layout of a packet. Length-type codes: 0 absent, 1 byte, 2 word, 3 dword.
// Error correction, when present, is two bytes of zeros; send time and
// duration are zero.
struct PacketLayout {
    bool error_correction = true, multiple = true;  // multiple-payloads flag (forced on for 2+ payloads)
    uint8_t packet_len_type = 0, sequence_type = 0, padding_len_type = 2;
    uint8_t replicated_len_type = 1, offset_type = 3, object_num_type = 1;
    uint8_t payload_len_type = 2;  // multiple payloads only
    // Values written instead of the computed ones (to make damaged packets).
    std::optional<uint32_t> packet_len, padding_len;
    std::optional<uint8_t> num_payloads;
};

// A packet of exactly `packet_size` bytes (padding at the end). When the
// payloads do not fit the packet grows; tests that want that say so.
Bytes packet(const std::vector<Payload>& payloads, uint32_t packet_size, const PacketLayout& layout = {});

// Damage a packet the way delivery rejects it: the packet length field, the
// padding length field or the first payload's length field says
// packet_size + 1, or the payload flags announce no payload.
enum class Damage { PacketLenTooLong, PaddingTooLong, NoPayloads, PayloadTooLong };
Bytes damaged_packet(Damage how, const std::vector<Payload>& payloads, uint32_t packet_size);

// `junk` bytes, then a good packet, cut back to `packet_size` bytes: the
// packet starts off the grid and is only found by the resync scan.
Bytes misaligned_packet(const Bytes& junk, const std::vector<Payload>& payloads, uint32_t packet_size,
                        const PacketLayout& layout = {});

// One media object to mux.
struct Object { uint8_t stream; uint32_t pts_ms; Bytes data; bool key = false; };
// Packs objects in the order given into packets of `packet_size`, splitting
// each into fragments as room allows; object numbers count per stream from
// `first_object_num`. `fill` (0: the packet size) caps the bytes used in
// each packet, leaving the rest as padding.
std::vector<Bytes> mux(const std::vector<Object>& objects, uint32_t packet_size,
                       const PacketLayout& layout = {}, uint8_t first_object_num = 1, uint32_t fill = 0);

// Scrambles an audio object the way a spread-audio encoder stores it (the
// inverse of the demuxer's reordering).
Bytes spread_scramble(const Bytes& object, uint8_t span, uint16_t packet_len, uint16_t chunk_len);

// Deterministic bytes for object contents.
Bytes pattern(size_t n, uint32_t seed);

// A whole test file around packets: file properties (packet size and count,
// preroll), an audio stream 1 and/or a video stream 2 (optionally with
// spread audio), the packets, then `trailing` objects.
struct PacketFile {
    uint32_t packet_size = 1024; uint64_t preroll_ms = 0; bool audio = true, video = true;
    std::optional<uint64_t> packet_count;  // default: packets.size()
    uint64_t audio_time_offset = 0;        // 100-ns units
    struct { uint8_t span = 0; uint16_t packet_len = 0, chunk_len = 0; } spread;
    std::vector<Bytes> packets, trailing; bool broadcast = false;
    std::optional<uint64_t> data_object_size;  // declared (50: a recorded live stream's)
};
Bytes build_packet_file(const PacketFile& f);

}  // namespace asfb
