#include "asf_packets.h"

#include <algorithm>
#include <map>
#include <stdexcept>

#pragma GCC diagnostic ignored "-Wmissing-field-initializers"

namespace asfb {

static int width(uint8_t type) { return type == 3 ? 4 : type; }
static Bytes cut(Bytes b, uint32_t size) { return b.resize(size), b; }

static uint32_t header_size(const PacketLayout& l) {
    return (l.error_correction ? 3 : 0) + 8 + width(l.packet_len_type) + width(l.sequence_type) +
           width(l.padding_len_type) + l.multiple;
}

static uint32_t payload_header_size(const PacketLayout& l, const Payload& p) {
    return 1 + width(l.object_num_type) + width(l.offset_type) + width(l.replicated_len_type) +
           static_cast<uint32_t>(p.replicated.size()) + (l.multiple ? width(l.payload_len_type) : 0);
}

Payload media(uint8_t stream, uint32_t object_num, uint32_t offset, uint32_t object_size,
              uint32_t pts_ms, Bytes data, bool key, uint32_t extra) {
    return {stream, key, object_num, offset,
            Writer().u32(object_size).u32(pts_ms).bytes(Bytes(extra, 0xEE)).out, std::move(data)};
}

Payload untimed(uint8_t stream, uint32_t object_num, uint32_t offset, Bytes data,
                uint32_t replicated_len, bool key) {
    return {stream, key, object_num, offset, Bytes(replicated_len, 0xAB), std::move(data)};
}

Payload compressed(uint8_t stream, uint32_t object_num, uint32_t pts_ms, uint8_t delta_ms,
                   const std::vector<Bytes>& subs, bool key) {
    Writer w;
    for (const Bytes& s : subs) w.u8(s.size() < 256 ? s.size() : throw std::invalid_argument("sub")).bytes(s);
    return {stream, key, object_num, pts_ms, {delta_ms}, w.out};
}

Bytes packet(const std::vector<Payload>& payloads, uint32_t packet_size, const PacketLayout& layout) {
    PacketLayout l = layout;
    l.multiple = layout.multiple || payloads.size() > 1;
    uint32_t used = header_size(l);
    for (const Payload& p : payloads) used += payload_header_size(l, p) + p.data.size();
    const uint32_t padding = used < packet_size ? packet_size - used : 0;
    Writer w;
    auto field = [&w](uint8_t type, uint64_t v) { w.le(v, width(type)); };
    if (l.error_correction) w.u8(0x82).u16(0);
    w.u8(l.multiple | l.sequence_type << 1 | l.padding_len_type << 3 | l.packet_len_type << 5);
    // Stream number length type 1 in the property flags: not read.
    w.u8(l.replicated_len_type | l.offset_type << 2 | l.object_num_type << 4 | 1 << 6);
    // With no padding field, the packet length tells the padding.
    field(l.packet_len_type, l.packet_len.value_or(
                                 l.padding_len_type == 0 && l.packet_len_type != 0 ? used : packet_size));
    field(l.sequence_type, 0);
    field(l.padding_len_type, l.padding_len.value_or(padding));
    w.u32(0).u16(0);  // send time, duration
    if (l.multiple) w.u8((l.num_payloads.value_or(payloads.size()) & 0x3F) | l.payload_len_type << 6);
    for (const Payload& p : payloads) {
        w.u8((p.stream & 0x7F) | (p.key ? 0x80 : 0));
        field(l.object_num_type, p.object_num);
        field(l.offset_type, p.offset);
        field(l.replicated_len_type, p.replicated.size());
        w.bytes(p.replicated);
        if (l.multiple) field(l.payload_len_type, p.declared_len.value_or(p.data.size()));
        w.bytes(p.data);
    }
    return w.bytes(Bytes(padding, 0)).out;
}

Bytes damaged_packet(Damage how, const std::vector<Payload>& payloads, uint32_t packet_size) {
    PacketLayout l;
    std::vector<Payload> ps = payloads;
    if (how == Damage::PacketLenTooLong) l.packet_len_type = 2, l.packet_len = packet_size + 1;
    if (how == Damage::PaddingTooLong) l.padding_len = packet_size + 1;
    if (how == Damage::NoPayloads) l.num_payloads = 0;
    if (how == Damage::PayloadTooLong) ps.at(0).declared_len = packet_size + 1;
    return cut(packet(ps, packet_size, l), packet_size);
}

Bytes misaligned_packet(const Bytes& junk, const std::vector<Payload>& payloads,
                        uint32_t packet_size, const PacketLayout& layout) {
    return cut(Writer().bytes(junk).bytes(packet(payloads, packet_size, layout)).out, packet_size);
}

std::vector<Bytes> mux(const std::vector<Object>& objects, uint32_t packet_size,
                       const PacketLayout& l, uint8_t first_object_num, uint32_t fill) {
    const uint32_t limit = fill ? std::min(fill, packet_size) : packet_size;
    std::vector<Bytes> packets;
    std::map<uint8_t, uint32_t> next_num;
    std::vector<Payload> current;
    uint32_t used = header_size(l);
    auto flush = [&] {
        if (!current.empty()) packets.push_back(packet(current, packet_size, l));
        current.clear();
        used = header_size(l);
    };
    for (const Object& o : objects) {
        const uint32_t num = next_num.try_emplace(o.stream, first_object_num).first->second++ & 0xFF;
        const auto size = static_cast<uint32_t>(o.data.size());
        uint32_t offset = 0;
        do {
            Payload p = media(o.stream, num, offset, size, o.pts_ms, {}, o.key);
            const uint32_t head = payload_header_size(l, p);
            if (used + head >= limit || (!l.multiple && !current.empty())) { flush(); continue; }
            const uint32_t take = std::min(limit - used - head, size - offset);
            p.data.assign(o.data.begin() + offset, o.data.begin() + offset + take);
            current.push_back(std::move(p));
            used += head + take;
            offset += take;
        } while (offset < size);
    }
    flush();
    return packets;
}

Bytes spread_scramble(const Bytes& object, uint8_t span, uint16_t packet_len, uint16_t chunk_len) {
    Bytes out(object.size());
    for (size_t index = 0; index < object.size() / chunk_len; ++index) {
        const size_t from = (index % span) * packet_len / chunk_len + index / span;
        std::copy_n(object.begin() + static_cast<long>(from * chunk_len), chunk_len,
                    out.begin() + static_cast<long>(index * chunk_len));
    }
    return out;
}

Bytes pattern(size_t n, uint32_t seed) {
    Bytes out(n);
    uint32_t x = seed * 2654435761u + 12345u;
    for (auto& b : out) b = static_cast<uint8_t>((x = x * 1103515245u + 12345u) >> 16);
    return out;
}

Bytes build_packet_file(const PacketFile& f) {
    File file{.header_children = {file_properties(
                  {.packet_count = f.packet_count.value_or(f.packets.size()),
                   .preroll = f.preroll_ms, .flags = f.broadcast ? 0x1u : 0x2u,
                   .min_packet_size = f.packet_size, .max_packet_size = f.packet_size})},
              .packets = f.packets, .trailing = f.trailing, .data_object_size = f.data_object_size};
    const auto& sp = f.spread;
    if (f.audio)
        file.header_children.push_back(stream_properties(
            {.ec_type = sp.span ? asf_spread_audio : guid_st{}, .time_offset = f.audio_time_offset,
             .type_specific = waveformatex({}),
             .ec_data = sp.span ? Writer().u8(sp.span).u16(sp.packet_len).u16(sp.chunk_len)
                                      .u16(sp.packet_len).u8(0).out : Bytes{}}));
    if (f.video) file.header_children.push_back(video_stream(2));
    return build(file);
}

}  // namespace asfb
