// ASF writer for tests: builds header objects, the data object, the simple
// index and an ID3v2 prefix from plain descriptions. Every object helper
// returns the object's bytes with its size computed, unless a declared size
// is given to make a malformed one. The data object takes packets built
// elsewhere (asf_packets.h), so packet layouts never touch the header side.
#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "asf_guid.h"

namespace asfb {

using Bytes = std::vector<uint8_t>;
// A declared object size; empty: the real one.
using Size = std::optional<uint64_t>;

// Little-endian byte sink.
struct Writer {
    Bytes out;
    Writer& le(uint64_t v, int n) {
        for (int i = 0; i < n; ++i) out.push_back(uint8_t(v >> (8 * i)));
        return *this;
    }
    Writer& u8(uint64_t v) { return le(v, 1); }
    Writer& u16(uint64_t v) { return le(v, 2); }
    Writer& u32(uint64_t v) { return le(v, 4); }
    Writer& u64(uint64_t v) { return le(v, 8); }
    Writer& bytes(const Bytes& b) { return out.insert(out.end(), b.begin(), b.end()), *this; }
    Writer& all(const std::vector<Bytes>& parts) { for (const Bytes& b : parts) bytes(b); return *this; }
    Writer& guid(const guid_st& g);
    // UTF-8 text as terminated UTF-16LE (BMP only).
    Writer& utf16(const std::string& text);
};

// A GUID from its text form XXXXXXXX-XXXX-XXXX-XXXX-XXXXXXXXXXXX.
guid_st guid_from_text(const std::string& text);
// Any object: header (GUID, size) and body.
Bytes object(const guid_st& guid, const Bytes& body, Size declared = {});

struct FileProps {
    // Durations in 100-ns units (the play duration with the preroll), preroll in ms.
    uint64_t packet_count = 1, play_duration = 50000000, send_duration = 20000000, preroll = 3000;
    uint32_t flags = 0x2, min_packet_size = 3200, max_packet_size = 3200;  // flags: seekable, not broadcast
};
Bytes file_properties(const FileProps& p, Size declared = {});

struct WaveFormat {
    uint16_t format_tag = 0x0161, channels = 2; uint32_t sample_rate = 44100, bytes_per_second = 16000;
    uint16_t block_align = 1485, bits_per_sample = 16; Bytes extra;  // extra: bytes behind cbSize
};
Bytes waveformatex(const WaveFormat& w);
// WAVE_FORMAT_EXTENSIBLE around `sub` (subformat GUID), `tail` behind it.
Bytes waveformat_extensible(const WaveFormat& base, const guid_st& sub, const Bytes& tail = {});
// The base subformat GUID carrying a format tag in its first field.
guid_st tag_subformat(uint16_t tag);

// The FourCC in file order.
struct BitmapInfo { int32_t width = 320, height = 240; std::string fourcc = "WMV3"; Bytes codec_private; };
Bytes bitmapinfoheader(const BitmapInfo& b);
// Video type-specific data: encoded width, height, flags, format data size,
// then the BITMAPINFOHEADER.
Bytes video_type_specific(const BitmapInfo& b);

struct StreamProps {
    guid_st stream_type = asf_audio_media, ec_type = {};  // no error correction
    uint64_t time_offset = 0; uint16_t flags = 1; Bytes type_specific, ec_data;  // 100-ns; number in bits 0-6
};
Bytes stream_properties(const StreamProps& s, Size declared = {});
Bytes audio_stream(uint16_t number, const WaveFormat& w = {});
Bytes video_stream(uint16_t number, const BitmapInfo& b = {});

// ---- header extension ----
struct PayloadExtSystem { guid_st id = {}; uint16_t data_size = 0xFFFF; Bytes info; };
struct ExtStreamProps {
    uint32_t bitrate = 128000; uint16_t stream_num = 1, language_index = 0;
    uint64_t avg_time_per_frame = 0;                      // 100-ns units
    std::vector<std::pair<uint16_t, std::string>> names;  // (language index, name)
    std::vector<PayloadExtSystem> ext_systems; Bytes embedded_stream;  // a stream properties object, or empty
};
Bytes extended_stream_properties(const ExtStreamProps& e, Size declared = {});
Bytes language_list(const std::vector<std::string>& tags, Size declared = {});
Bytes header_extension(const std::vector<Bytes>& children, Size declared = {}, uint16_t reserved2 = 6);

// ---- descriptive metadata ----
// Title, author, copyright, description, rating.
Bytes content_description(const std::array<std::string, 5>& c, Size declared = {});
struct Descriptor { std::string name; uint16_t data_type = 0; Bytes value; };
Bytes extended_content_description(const std::vector<Descriptor>& d, Size declared = {});
Bytes string_value(const std::string& text);  // UTF-16LE with terminator

// ---- top level ----
Bytes header_object(const std::vector<Bytes>& children, Size declared = {});
// Data object over packets built elsewhere; each packet is taken verbatim.
Bytes data_object(const std::vector<Bytes>& packets, Size declared = {});
struct IndexEntry { uint32_t packet_number; uint16_t packet_count; };
Bytes simple_index(uint64_t interval_100ns, const std::vector<IndexEntry>& entries);

// A whole file: optional ID3v2 prefix (a tag header and `id3_payload` zero
// bytes), header, data object, then whatever follows the data (index
// objects, unknown objects).
struct File {
    uint32_t id3_payload = 0;  // 0: no ID3 prefix
    std::vector<Bytes> header_children, packets, trailing; Size data_object_size;  // declared; default: real
};
Bytes build(const File& f);
// Where the body of the first file properties object of `file` starts; 0
// when there is none (or it is cut short).
size_t file_properties_body(const Bytes& file);

// The usual shape: file properties, a WMA2 stream 1 and/or a WMV3 stream 2,
// `packets` zero-filled packets and a simple index when there is video.
File standard_file(bool audio = true, bool video = true, uint32_t packets = 4);

}  // namespace asfb
