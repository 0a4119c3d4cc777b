#include "asf_builder.h"

#include <cstring>
#include <stdexcept>

namespace asfb {

namespace {

constexpr guid_st kNoErrorCorrection = {0x20FB5700, 0x5B55, 0x11CF,
                                        {0xA8, 0xFD, 0x00, 0x80, 0x5F, 0x5C, 0x44, 0x2B}};

// UTF-8 to UTF-16 code units; characters outside the BMP are not needed here.
std::vector<uint16_t> to_units(const std::string& s) {
    std::vector<uint16_t> u;
    for (size_t i = 0; i < s.size();) {
        const auto c = static_cast<uint8_t>(s[i]);
        if (c < 0x80) {
            u.push_back(c);
            i += 1;
        } else if ((c & 0xE0) == 0xC0 && i + 1 < s.size()) {
            u.push_back(static_cast<uint16_t>(((c & 0x1F) << 6) | (s[i + 1] & 0x3F)));
            i += 2;
        } else if ((c & 0xF0) == 0xE0 && i + 2 < s.size()) {
            u.push_back(static_cast<uint16_t>(((c & 0x0F) << 12) | ((s[i + 1] & 0x3F) << 6) |
                                              (s[i + 2] & 0x3F)));
            i += 3;
        } else {
            throw std::invalid_argument("utf16: unsupported UTF-8 sequence");
        }
    }
    return u;
}

int hex(char c) {
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'a' && c <= 'f') return c - 'a' + 10;
    if (c >= 'A' && c <= 'F') return c - 'A' + 10;
    throw std::invalid_argument("guid: bad hex digit");
}

uint64_t parse_hex(const std::string& s) {
    uint64_t v = 0;
    for (char c : s) v = v << 4 | static_cast<uint64_t>(hex(c));
    return v;
}

}  // namespace

Writer& Writer::u8(uint8_t v) {
    out_.push_back(v);
    return *this;
}
Writer& Writer::u16(uint16_t v) {
    for (int i = 0; i < 2; ++i) out_.push_back(static_cast<uint8_t>(v >> (8 * i)));
    return *this;
}
Writer& Writer::u32(uint32_t v) {
    for (int i = 0; i < 4; ++i) out_.push_back(static_cast<uint8_t>(v >> (8 * i)));
    return *this;
}
Writer& Writer::u64(uint64_t v) {
    for (int i = 0; i < 8; ++i) out_.push_back(static_cast<uint8_t>(v >> (8 * i)));
    return *this;
}
Writer& Writer::guid(const guid_st& g) {
    u32(g.data1).u16(g.data2).u16(g.data3);
    return bytes(g.data4, 8);
}
Writer& Writer::bytes(const Bytes& b) {
    out_.insert(out_.end(), b.begin(), b.end());
    return *this;
}
Writer& Writer::bytes(const void* p, size_t n) {
    auto* c = static_cast<const uint8_t*>(p);
    out_.insert(out_.end(), c, c + n);
    return *this;
}
Writer& Writer::utf16(const std::string& text, bool terminated) {
    for (uint16_t u : to_units(text)) u16(u);
    if (terminated) u16(0);
    return *this;
}
Writer& Writer::zeros(size_t n) {
    out_.insert(out_.end(), n, 0);
    return *this;
}

Bytes utf16le(const std::string& text, bool terminated) {
    return Writer().utf16(text, terminated).take();
}

guid_st guid_from_text(const std::string& t) {
    if (t.size() != 36) throw std::invalid_argument("guid: bad text form");
    guid_st g{};
    g.data1 = static_cast<uint32_t>(parse_hex(t.substr(0, 8)));
    g.data2 = static_cast<uint16_t>(parse_hex(t.substr(9, 4)));
    g.data3 = static_cast<uint16_t>(parse_hex(t.substr(14, 4)));
    const std::string rest = t.substr(19, 4) + t.substr(24, 12);
    for (int i = 0; i < 8; ++i) g.data4[i] = static_cast<uint8_t>(parse_hex(rest.substr(2 * i, 2)));
    return g;
}

Bytes object(const guid_st& guid, const Bytes& body, std::optional<uint64_t> declared) {
    Writer w;
    w.guid(guid).u64(declared.value_or(24 + body.size())).bytes(body);
    return w.take();
}

Bytes file_properties(const FileProps& p, std::optional<uint64_t> declared) {
    Writer w;
    w.guid(guid_from_text("5A2F7E40-95C5-4E2A-9E8A-3B8E1F0A2C11"))
        .u64(p.file_size)
        .u64(p.creation_date)
        .u64(p.packet_count)
        .u64(p.play_duration)
        .u64(p.send_duration)
        .u64(p.preroll)
        .u32(p.flags)
        .u32(p.min_packet_size)
        .u32(p.max_packet_size)
        .u32(p.max_bitrate);
    return object(asf_file_prop_object, w.out(), declared);
}

Bytes waveformatex(const WaveFormat& f) {
    Writer w;
    w.u16(f.format_tag)
        .u16(f.channels)
        .u32(f.sample_rate)
        .u32(f.bytes_per_second)
        .u16(f.block_align)
        .u16(f.bits_per_sample);
    if (f.with_cbsize) w.u16(static_cast<uint16_t>(f.extra.size())).bytes(f.extra);
    return w.take();
}

guid_st tag_subformat(uint16_t tag) {
    guid_st g = wfex_guid;
    g.data1 = tag;
    return g;
}

Bytes waveformat_extensible(const WaveFormat& base, const guid_st& sub, const Bytes& tail) {
    Writer extra;
    extra.u16(base.bits_per_sample).u32(0x3).guid(sub).bytes(tail);
    WaveFormat f = base;
    f.format_tag = 0xFFFE;
    f.extra = extra.take();
    f.with_cbsize = true;
    return waveformatex(f);
}

Bytes bitmapinfoheader(const BitmapInfo& b) {
    if (b.fourcc.size() != 4) throw std::invalid_argument("fourcc: four characters");
    Writer w;
    w.u32(static_cast<uint32_t>(40 + b.codec_private.size()))
        .u32(static_cast<uint32_t>(b.width))
        .u32(static_cast<uint32_t>(b.height))
        .u16(1)
        .u16(24)
        .bytes(b.fourcc.data(), 4)
        .u32(0)
        .u32(0)
        .u32(0)
        .u32(0)
        .u32(0)
        .bytes(b.codec_private);
    return w.take();
}

Bytes video_type_specific(const BitmapInfo& b) {
    const Bytes bih = bitmapinfoheader(b);
    Writer w;
    w.u32(static_cast<uint32_t>(b.width))
        .u32(static_cast<uint32_t>(b.height))
        .u8(2)
        .u16(static_cast<uint16_t>(bih.size()))
        .bytes(bih);
    return w.take();
}

Bytes stream_properties(const StreamProps& s, std::optional<uint64_t> declared) {
    static constexpr guid_st kZero = {};
    const bool no_ec = std::memcmp(&s.ec_type, &kZero, sizeof kZero) == 0;
    Writer w;
    w.guid(s.stream_type)
        .guid(no_ec ? kNoErrorCorrection : s.ec_type)
        .u64(s.time_offset)
        .u32(static_cast<uint32_t>(s.type_specific.size()))
        .u32(s.ec_data_len.value_or(static_cast<uint32_t>(s.ec_data.size())))
        .u16(s.flags)
        .u32(0)
        .bytes(s.type_specific)
        .bytes(s.ec_data);
    return object(s.alternate_guid ? asf_stream_prop_object2 : asf_stream_prop_object, w.out(),
                  declared);
}

Bytes audio_stream(uint16_t number, const WaveFormat& f) {
    StreamProps s;
    s.stream_type = asf_audio_media;
    s.flags = number;
    s.type_specific = waveformatex(f);
    return stream_properties(s);
}

Bytes video_stream(uint16_t number, const BitmapInfo& b) {
    StreamProps s;
    s.stream_type = asf_video_media;
    s.flags = number;
    s.type_specific = video_type_specific(b);
    return stream_properties(s);
}

Bytes spread_ec(uint8_t span, uint16_t packet_len, uint16_t chunk_len) {
    Writer w;
    w.u8(span).u16(packet_len).u16(chunk_len).u16(packet_len).u8(0);
    return w.take();
}

Bytes extended_stream_properties(const ExtStreamProps& e, std::optional<uint64_t> declared) {
    Writer w;
    w.u64(e.start_time)
        .u64(e.end_time)
        .u32(e.bitrate)
        .u32(e.buffer_size)
        .u32(e.init_buffer_fullness)
        .u32(e.alt_bitrate)
        .u32(e.alt_buffer_size)
        .u32(e.alt_init_buffer_fullness)
        .u32(e.max_obj_size)
        .u32(e.flags)
        .u16(e.stream_num)
        .u16(e.language_index)
        .u64(e.avg_time_per_frame)
        .u16(static_cast<uint16_t>(e.names.size()))
        .u16(static_cast<uint16_t>(e.ext_systems.size()));
    for (const auto& [lang, name] : e.names) {
        const Bytes n = utf16le(name);
        w.u16(lang).u16(static_cast<uint16_t>(n.size())).bytes(n);
    }
    for (const PayloadExtSystem& p : e.ext_systems)
        w.guid(p.id).u16(p.data_size).u32(static_cast<uint32_t>(p.info.size())).bytes(p.info);
    w.bytes(e.embedded_stream).bytes(e.raw_tail);
    return object(asf_extended_stream_prop_object, w.out(), declared);
}

Bytes language_list(const std::vector<std::string>& tags, std::optional<uint64_t> declared) {
    Writer w;
    w.u16(static_cast<uint16_t>(tags.size()));
    for (const std::string& t : tags) {
        const Bytes b = utf16le(t);
        w.u8(static_cast<uint8_t>(b.size())).bytes(b);
    }
    return object(asf_language_list_object, w.out(), declared);
}

Bytes metadata_library(const std::vector<MetadataRecord>& records,
                       std::optional<uint64_t> declared) {
    Writer w;
    w.u16(static_cast<uint16_t>(records.size()));
    for (const MetadataRecord& r : records) {
        const Bytes name = utf16le(r.name);
        w.u16(r.language_index)
            .u16(r.stream_number)
            .u16(static_cast<uint16_t>(name.size()))
            .u16(r.data_type)
            .u32(static_cast<uint32_t>(r.data.size()))
            .bytes(name)
            .bytes(r.data);
    }
    return object(asf_metadata_library_object, w.out(), declared);
}

Bytes header_extension(const std::vector<Bytes>& children, std::optional<uint64_t> declared,
                       uint16_t reserved2) {
    Writer body;
    for (const Bytes& c : children) body.bytes(c);
    Writer w;
    w.guid(asf_reserved_1).u16(reserved2).u32(static_cast<uint32_t>(body.size())).bytes(body.out());
    return object(asf_header_extension_object, w.out(), declared);
}

Bytes content_description(const ContentDesc& c, std::optional<uint64_t> declared) {
    const std::string* fields[5] = {&c.title, &c.author, &c.copyright, &c.description, &c.rating};
    uint16_t lengths[5];
    Writer strings;
    for (int i = 0; i < 5; ++i) {
        const Bytes b = fields[i]->empty() ? Bytes{} : utf16le(*fields[i]);
        lengths[i] = static_cast<uint16_t>(b.size());
        strings.bytes(b);
    }
    return content_description_raw(lengths, strings.out(), declared);
}

Bytes content_description_raw(const uint16_t (&lengths)[5], const Bytes& strings,
                              std::optional<uint64_t> declared) {
    Writer w;
    for (uint16_t l : lengths) w.u16(l);
    w.bytes(strings);
    return object(asf_content_desc_object, w.out(), declared);
}

Bytes extended_content_description(const std::vector<Descriptor>& ds,
                                   std::optional<uint64_t> declared) {
    Writer w;
    w.u16(static_cast<uint16_t>(ds.size()));
    for (const Descriptor& d : ds) {
        const Bytes name = d.raw_name ? *d.raw_name : utf16le(d.name);
        w.u16(static_cast<uint16_t>(name.size()))
            .bytes(name)
            .u16(d.data_type)
            .u16(static_cast<uint16_t>(d.value.size()))
            .bytes(d.value);
    }
    return object(asf_extended_content_desc_object, w.out(), declared);
}

Bytes string_value(const std::string& text) { return utf16le(text); }

Bytes dword_value(uint32_t v) { return Writer().u32(v).take(); }

Bytes picture_value(uint8_t picture_type, const std::string& mime, const std::string& description,
                    const Bytes& picture) {
    Writer w;
    w.u8(picture_type)
        .u32(static_cast<uint32_t>(picture.size()))
        .utf16(mime)
        .utf16(description)
        .bytes(picture);
    return w.take();
}

Bytes header_object(const std::vector<Bytes>& children, std::optional<uint64_t> declared,
                    uint8_t reserved1, uint8_t reserved2) {
    Writer body;
    body.u32(static_cast<uint32_t>(children.size())).u8(reserved1).u8(reserved2);
    for (const Bytes& c : children) body.bytes(c);
    return object(asf_header_object, body.out(), declared);
}

Bytes data_object(const std::vector<Bytes>& packets, std::optional<uint64_t> declared) {
    Writer w;
    w.guid(guid_from_text("5A2F7E40-95C5-4E2A-9E8A-3B8E1F0A2C11"))
        .u64(packets.size())
        .u16(0x0101);
    for (const Bytes& p : packets) w.bytes(p);
    return object(asf_data_object, w.out(), declared);
}

Bytes filler_packet(uint32_t size, uint8_t fill) { return Bytes(size, fill); }

Bytes simple_index(uint64_t interval_100ns, const std::vector<IndexEntry>& entries,
                   uint32_t max_packet_count) {
    Writer w;
    w.guid(guid_from_text("5A2F7E40-95C5-4E2A-9E8A-3B8E1F0A2C11"))
        .u64(interval_100ns)
        .u32(max_packet_count)
        .u32(static_cast<uint32_t>(entries.size()));
    for (const IndexEntry& e : entries) w.u32(e.packet_number).u16(e.packet_count);
    return object(asf_simple_index_object, w.out());
}

Bytes id3v2_prefix(uint32_t payload) {
    Writer w;
    w.bytes("ID3", 3).u8(3).u8(0).u8(0);
    w.u8(static_cast<uint8_t>((payload >> 21) & 0x7F))
        .u8(static_cast<uint8_t>((payload >> 14) & 0x7F))
        .u8(static_cast<uint8_t>((payload >> 7) & 0x7F))
        .u8(static_cast<uint8_t>(payload & 0x7F));
    w.zeros(payload);
    return w.take();
}

Bytes build(const File& f) {
    Writer w;
    if (f.id3_payload) w.bytes(id3v2_prefix(f.id3_payload));
    w.bytes(header_object(f.header_children));
    w.bytes(data_object(f.packets, f.data_object_size));
    for (const Bytes& t : f.trailing) w.bytes(t);
    return w.take();
}

File standard_file(bool audio, bool video, uint32_t packets) {
    File f;
    FileProps fp;
    fp.packet_count = packets;
    f.header_children.push_back(file_properties(fp));
    if (audio) f.header_children.push_back(audio_stream(1));
    if (video) f.header_children.push_back(video_stream(2));
    for (uint32_t i = 0; i < packets; ++i) f.packets.push_back(filler_packet(fp.min_packet_size));
    if (video) {
        std::vector<IndexEntry> entries;
        for (uint32_t i = 0; i < packets; ++i) entries.push_back({i, 1});
        f.trailing.push_back(simple_index(10000000, entries));
    }
    return f;
}

}  // namespace asfb
