#include "asf_builder.h"

#include <algorithm>
#include <cstdio>
#include <stdexcept>

// Records are written with designated initializers, naming only what differs.
#pragma GCC diagnostic ignored "-Wmissing-field-initializers"

namespace asfb {

// The file ID of the file properties, the data object and the index.
constexpr guid_st kFileId = {0x5A2F7E40, 0x95C5, 0x4E2A, {0x9E, 0x8A, 0x3B, 0x8E, 0x1F, 0x0A, 0x2C, 0x11}};
constexpr guid_st kNoEc = {0x20FB5700, 0x5B55, 0x11CF, {0xA8, 0xFD, 0x00, 0x80, 0x5F, 0x5C, 0x44, 0x2B}};

Writer& Writer::guid(const guid_st& g) {
    return u32(g.data1).u16(g.data2).u16(g.data3).bytes(Bytes(g.data4, g.data4 + 8));
}

Writer& Writer::utf16(const std::string& text) {
    for (char c : text) u16(static_cast<uint8_t>(c) < 0x80 ? c : throw std::invalid_argument("ASCII only"));
    return u16(0);
}

guid_st guid_from_text(const std::string& t) {
    guid_st g;
    uint8_t* b = g.data4;
    if (t.size() != 36 || std::sscanf(t.c_str(), "%8x-%4hx-%4hx-%2hhx%2hhx-%2hhx%2hhx%2hhx%2hhx%2hhx%2hhx",
                                      &g.data1, &g.data2, &g.data3, b, b + 1, b + 2, b + 3, b + 4,
                                      b + 5, b + 6, b + 7) != 11)
        throw std::invalid_argument("guid: bad text form");
    return g;
}

Bytes object(const guid_st& guid, const Bytes& body, Size declared) {
    return Writer().guid(guid).u64(declared.value_or(24 + body.size())).bytes(body).out;
}

Bytes file_properties(const FileProps& p, Size declared) {
    Writer w;
    w.guid(kFileId).u64(0).u64(0).u64(p.packet_count).u64(p.play_duration).u64(p.send_duration);
    w.u64(p.preroll).u32(p.flags).u32(p.min_packet_size).u32(p.max_packet_size).u32(128000);
    return object(asf_file_prop_object, w.out, declared);
}

Bytes waveformatex(const WaveFormat& f) {
    return Writer().u16(f.format_tag).u16(f.channels).u32(f.sample_rate).u32(f.bytes_per_second)
        .u16(f.block_align).u16(f.bits_per_sample).u16(f.extra.size()).bytes(f.extra).out;
}

guid_st tag_subformat(uint16_t tag) { guid_st g = wfex_guid; return g.data1 = tag, g; }

Bytes waveformat_extensible(const WaveFormat& base, const guid_st& sub, const Bytes& tail) {
    WaveFormat f = base;
    f.format_tag = 0xFFFE;
    f.extra = Writer().u16(base.bits_per_sample).u32(0x3).guid(sub).bytes(tail).out;
    return waveformatex(f);
}

Bytes bitmapinfoheader(const BitmapInfo& b) {
    if (b.fourcc.size() != 4) throw std::invalid_argument("fourcc: four characters");
    return Writer().u32(40 + b.codec_private.size()).u32(b.width).u32(b.height).u16(1).u16(24)
        .bytes(Bytes(b.fourcc.begin(), b.fourcc.end())).bytes(Bytes(20, 0)).bytes(b.codec_private).out;
}

Bytes video_type_specific(const BitmapInfo& b) {
    const Bytes bih = bitmapinfoheader(b);
    return Writer().u32(b.width).u32(b.height).u8(2).u16(bih.size()).bytes(bih).out;
}

Bytes stream_properties(const StreamProps& s, Size declared) {
    const bool no_ec = Writer().guid(s.ec_type).out == Bytes(16, 0);
    Writer w;
    w.guid(s.stream_type).guid(no_ec ? kNoEc : s.ec_type).u64(s.time_offset);
    w.u32(s.type_specific.size()).u32(s.ec_data.size()).u16(s.flags).u32(0);
    return object(asf_stream_prop_object, w.bytes(s.type_specific).bytes(s.ec_data).out, declared);
}

Bytes audio_stream(uint16_t number, const WaveFormat& f) {
    return stream_properties({.flags = number, .type_specific = waveformatex(f)});
}

Bytes video_stream(uint16_t number, const BitmapInfo& b) {
    return stream_properties(
        {.stream_type = asf_video_media, .flags = number, .type_specific = video_type_specific(b)});
}

Bytes extended_stream_properties(const ExtStreamProps& e, Size declared) {
    Writer w;
    // Start and end time, then the bitrate, buffer and alternate fields, of
    // which only the bitrate is read.
    w.u64(0).u64(0).u32(e.bitrate).u32(3000).bytes(Bytes(24, 0)).u16(e.stream_num);
    w.u16(e.language_index).u64(e.avg_time_per_frame).u16(e.names.size()).u16(e.ext_systems.size());
    for (const auto& [lang, name] : e.names) w.u16(lang).u16(2 * name.size() + 2).utf16(name);
    for (const PayloadExtSystem& p : e.ext_systems)
        w.guid(p.id).u16(p.data_size).u32(p.info.size()).bytes(p.info);
    return object(asf_extended_stream_prop_object, w.bytes(e.embedded_stream).out, declared);
}

Bytes language_list(const std::vector<std::string>& tags, Size declared) {
    Writer w;
    w.u16(tags.size());
    for (const std::string& t : tags) w.u8(2 * t.size() + 2).utf16(t);
    return object(asf_language_list_object, w.out, declared);
}

Bytes header_extension(const std::vector<Bytes>& children, Size declared, uint16_t reserved2) {
    const Bytes body = Writer().all(children).out;
    return object(asf_header_extension_object,
                  Writer().guid(asf_reserved_1).u16(reserved2).u32(body.size()).bytes(body).out, declared);
}

Bytes content_description(const std::array<std::string, 5>& c, Size declared) {
    Writer lengths, strings;
    for (const std::string& s : c) {
        lengths.u16(s.empty() ? 0 : 2 * s.size() + 2);
        if (!s.empty()) strings.utf16(s);
    }
    return object(asf_content_desc_object, lengths.bytes(strings.out).out, declared);
}

Bytes extended_content_description(const std::vector<Descriptor>& ds, Size declared) {
    Writer w;
    w.u16(ds.size());
    for (const Descriptor& d : ds)
        w.u16(2 * d.name.size() + 2).utf16(d.name).u16(d.data_type).u16(d.value.size()).bytes(d.value);
    return object(asf_extended_content_desc_object, w.out, declared);
}

Bytes string_value(const std::string& text) { return Writer().utf16(text).out; }

Bytes header_object(const std::vector<Bytes>& children, Size declared) {
    return object(asf_header_object, Writer().u32(children.size()).u8(1).u8(2).all(children).out, declared);
}

Bytes data_object(const std::vector<Bytes>& packets, Size declared) {
    return object(asf_data_object,
                  Writer().guid(kFileId).u64(packets.size()).u16(0x0101).all(packets).out, declared);
}

Bytes simple_index(uint64_t interval_100ns, const std::vector<IndexEntry>& entries) {
    Writer w;
    w.guid(kFileId).u64(interval_100ns).u32(1).u32(entries.size());
    for (const IndexEntry& e : entries) w.u32(e.packet_number).u16(e.packet_count);
    return object(asf_simple_index_object, w.out);
}

Bytes build(const File& f) {
    Writer w;
    if (f.id3_payload) {
        // An ID3v2.3 tag header with a syncsafe size, then the tag's bytes.
        w.bytes({'I', 'D', '3', 3, 0, 0});
        for (int shift : {21, 14, 7, 0}) w.u8((f.id3_payload >> shift) & 0x7F);
        w.bytes(Bytes(f.id3_payload, 0));
    }
    return w.bytes(header_object(f.header_children))
        .bytes(data_object(f.packets, f.data_object_size)).all(f.trailing).out;
}

File standard_file(bool audio, bool video, uint32_t packets) {
    const FileProps fp{.packet_count = packets};
    File f{.header_children = {file_properties(fp)},
           .packets = std::vector<Bytes>(packets, Bytes(fp.min_packet_size, 0))};
    if (audio) f.header_children.push_back(audio_stream(1));
    if (video) {
        f.header_children.push_back(video_stream(2));
        std::vector<IndexEntry> entries;
        for (uint32_t i = 0; i < packets; ++i) entries.push_back({i, 1});
        f.trailing.push_back(simple_index(10000000, entries));
    }
    return f;
}

size_t file_properties_body(const Bytes& file) {
    const Bytes id = Writer().guid(asf_file_prop_object).out;
    const auto at = std::search(file.begin(), file.end(), id.begin(), id.end());
    return size_t(file.end() - at) < 24 + 80 ? 0 : size_t(at - file.begin()) + 24;
}

}  // namespace asfb
