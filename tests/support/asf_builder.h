// ASF writer for tests: builds header objects, the data object, the simple
// index and an ID3v2 prefix from plain descriptions. Every object helper
// returns the object's bytes with its size computed, unless a declared size
// is given to make a malformed one.
//
// Packets: the data object takes a list of already-built packets, so packet
// layouts (payload kinds, length types, replicated data, padding, damage) are
// added as separate packet builders without touching the header side.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "asf_guid.h"

namespace asfb {

using Bytes = std::vector<uint8_t>;

// Little-endian byte sink.
class Writer {
public:
    Writer& u8(uint8_t v);
    Writer& u16(uint16_t v);
    Writer& u32(uint32_t v);
    Writer& u64(uint64_t v);
    Writer& guid(const guid_st& g);
    Writer& bytes(const Bytes& b);
    Writer& bytes(const void* p, size_t n);
    // UTF-8 text as UTF-16LE code units (BMP only), with a terminator if asked.
    Writer& utf16(const std::string& text, bool terminated = true);
    Writer& zeros(size_t n);
    const Bytes& out() const { return out_; }
    Bytes take() { return std::move(out_); }
    size_t size() const { return out_.size(); }

private:
    Bytes out_;
};

Bytes utf16le(const std::string& text, bool terminated = true);
// A GUID from its text form XXXXXXXX-XXXX-XXXX-XXXX-XXXXXXXXXXXX.
guid_st guid_from_text(const std::string& text);

// Any object: header (GUID, size) and body. `declared` overrides the size.
Bytes object(const guid_st& guid, const Bytes& body, std::optional<uint64_t> declared = {});

// ---- file properties ----
struct FileProps {
    uint64_t file_size = 0;
    uint64_t creation_date = 0;
    uint64_t packet_count = 1;
    uint64_t play_duration = 20000000 + 30000000;  // 100-ns units, preroll included
    uint64_t send_duration = 20000000;
    uint64_t preroll = 3000;                       // ms
    uint32_t flags = 0x2;                          // seekable, not broadcast
    uint32_t min_packet_size = 3200;
    uint32_t max_packet_size = 3200;
    uint32_t max_bitrate = 128000;
};
Bytes file_properties(const FileProps& p, std::optional<uint64_t> declared = {});

// ---- media types ----
struct WaveFormat {
    uint16_t format_tag = 0x0161;
    uint16_t channels = 2;
    uint32_t sample_rate = 44100;
    uint32_t bytes_per_second = 16000;
    uint16_t block_align = 1485;
    uint16_t bits_per_sample = 16;
    Bytes extra;              // bytes behind cbSize
    bool with_cbsize = true;  // false: the bare 16-byte header
};
Bytes waveformatex(const WaveFormat& w);
// WAVE_FORMAT_EXTENSIBLE around `sub` (subformat GUID), `tail` behind it.
Bytes waveformat_extensible(const WaveFormat& base, const guid_st& sub, const Bytes& tail = {});
// The base subformat GUID carrying a format tag in its first field.
guid_st tag_subformat(uint16_t tag);

struct BitmapInfo {
    int32_t width = 320;
    int32_t height = 240;
    std::string fourcc = "WMV3";  // four characters in file order
    Bytes codec_private;
};
Bytes bitmapinfoheader(const BitmapInfo& b);
// Video type-specific data: encoded width, height, flags, format data size,
// then the BITMAPINFOHEADER.
Bytes video_type_specific(const BitmapInfo& b);

// ---- stream properties ----
struct StreamProps {
    guid_st stream_type = asf_audio_media;
    guid_st ec_type = {};                     // none
    uint64_t time_offset = 0;                 // 100-ns units
    uint16_t flags = 1;                       // stream number in bits 0-6
    Bytes type_specific;
    Bytes ec_data;
    std::optional<uint32_t> ec_data_len;      // declared; default ec_data.size()
    bool alternate_guid = false;              // the second stream properties GUID
};
Bytes stream_properties(const StreamProps& s, std::optional<uint64_t> declared = {});
Bytes audio_stream(uint16_t number, const WaveFormat& w = {});
Bytes video_stream(uint16_t number, const BitmapInfo& b = {});
// Spread-audio error correction data.
Bytes spread_ec(uint8_t span, uint16_t packet_len, uint16_t chunk_len);

// ---- header extension ----
struct PayloadExtSystem {
    guid_st id = {};
    uint16_t data_size = 0xFFFF;
    Bytes info;
};
struct ExtStreamProps {
    uint64_t start_time = 0, end_time = 0;
    uint32_t bitrate = 128000, buffer_size = 3000, init_buffer_fullness = 0;
    uint32_t alt_bitrate = 0, alt_buffer_size = 0, alt_init_buffer_fullness = 0;
    uint32_t max_obj_size = 0, flags = 0;
    uint16_t stream_num = 1;
    uint16_t language_index = 0;
    uint64_t avg_time_per_frame = 0;  // 100-ns units
    std::vector<std::pair<uint16_t, std::string>> names;  // (language index, name)
    std::vector<PayloadExtSystem> ext_systems;
    Bytes embedded_stream;  // a whole stream properties object, or empty
    Bytes raw_tail;         // anything else behind
};
Bytes extended_stream_properties(const ExtStreamProps& e, std::optional<uint64_t> declared = {});
Bytes language_list(const std::vector<std::string>& tags, std::optional<uint64_t> declared = {});

struct MetadataRecord {
    uint16_t language_index = 0;
    uint16_t stream_number = 0;
    std::string name;
    uint16_t data_type = 1;
    Bytes data;
};
Bytes metadata_library(const std::vector<MetadataRecord>& records,
                       std::optional<uint64_t> declared = {});
Bytes header_extension(const std::vector<Bytes>& children, std::optional<uint64_t> declared = {},
                       uint16_t reserved2 = 6);

// ---- descriptive metadata ----
struct ContentDesc {
    std::string title, author, copyright, description, rating;
};
Bytes content_description(const ContentDesc& c, std::optional<uint64_t> declared = {});
// Raw form: the five lengths as given, then `strings` verbatim.
Bytes content_description_raw(const uint16_t (&lengths)[5], const Bytes& strings,
                              std::optional<uint64_t> declared = {});

struct Descriptor {
    Descriptor(std::string n = {}, uint16_t type = 0, Bytes v = {})
        : name(std::move(n)), data_type(type), value(std::move(v)) {}
    std::string name;
    uint16_t data_type = 0;
    Bytes value;
    std::optional<Bytes> raw_name;  // name bytes verbatim (for odd lengths)
};
Bytes extended_content_description(const std::vector<Descriptor>& d,
                                   std::optional<uint64_t> declared = {});
Bytes string_value(const std::string& text);  // UTF-16LE with terminator
Bytes dword_value(uint32_t v);
// WM/Picture value: type, data length, MIME, description, picture bytes.
Bytes picture_value(uint8_t picture_type, const std::string& mime, const std::string& description,
                    const Bytes& picture);

// ---- top level ----
// Header object around its children; `declared` overrides its size.
Bytes header_object(const std::vector<Bytes>& children, std::optional<uint64_t> declared = {},
                    uint8_t reserved1 = 1, uint8_t reserved2 = 2);
// Data object over packets built elsewhere; each packet is taken verbatim.
Bytes data_object(const std::vector<Bytes>& packets, std::optional<uint64_t> declared = {});
// A packet of `size` bytes of filler, for tests that never read packets.
Bytes filler_packet(uint32_t size, uint8_t fill = 0);
struct IndexEntry {
    uint32_t packet_number;
    uint16_t packet_count;
};
Bytes simple_index(uint64_t interval_100ns, const std::vector<IndexEntry>& entries,
                   uint32_t max_packet_count = 1);
// ID3v2 tag header with a syncsafe size and `payload` zero bytes behind it.
Bytes id3v2_prefix(uint32_t payload);

// A whole file: optional ID3 prefix, header, data object, then whatever
// follows the data (index objects, unknown objects).
struct File {
    uint32_t id3_payload = 0;  // 0: no ID3 prefix
    std::vector<Bytes> header_children;
    std::vector<Bytes> packets;
    std::vector<Bytes> trailing;
    std::optional<uint64_t> data_object_size;  // declared; default: what it holds
};
Bytes build(const File& f);

// The usual shape: file properties, a WMA2 stream 1 and/or a WMV3 stream 2,
// `packets` filler packets and a simple index when there is video.
File standard_file(bool audio = true, bool video = true, uint32_t packets = 4);

}  // namespace asfb
