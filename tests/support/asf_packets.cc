#include "asf_packets.h"

#include <algorithm>
#include <map>
#include <stdexcept>

namespace asfb {

namespace {

uint32_t width(uint8_t type) { return type == 1 ? 1 : type == 2 ? 2 : type == 3 ? 4 : 0; }

void field(Writer& w, uint8_t type, uint32_t value) {
    switch (type) {
        case 1: w.u8(static_cast<uint8_t>(value)); break;
        case 2: w.u16(static_cast<uint16_t>(value)); break;
        case 3: w.u32(value); break;
        default: break;
    }
}

bool is_multiple(const PacketLayout& l, size_t payloads) { return l.multiple || payloads > 1; }

uint32_t payload_len_of(const Payload& p) {
    return p.declared_len ? *p.declared_len : static_cast<uint32_t>(p.data.size());
}

}  // namespace

Payload media(uint8_t stream, uint32_t object_num, uint32_t offset, uint32_t object_size,
              uint32_t pts_ms, Bytes data, bool key, uint32_t extra) {
    Payload p;
    p.stream = stream;
    p.key = key;
    p.object_num = object_num;
    p.offset = offset;
    Writer w;
    w.u32(object_size).u32(pts_ms);
    for (uint32_t i = 0; i < extra; ++i) w.u8(0xEE);
    p.replicated = w.take();
    p.data = std::move(data);
    return p;
}

Payload untimed(uint8_t stream, uint32_t object_num, uint32_t offset, Bytes data,
                uint32_t replicated_len, bool key) {
    Payload p;
    p.stream = stream;
    p.key = key;
    p.object_num = object_num;
    p.offset = offset;
    p.replicated.assign(replicated_len, 0xAB);
    p.data = std::move(data);
    return p;
}

Payload compressed(uint8_t stream, uint32_t object_num, uint32_t pts_ms, uint8_t delta_ms,
                   const std::vector<Bytes>& subs, bool key) {
    Payload p;
    p.stream = stream;
    p.key = key;
    p.object_num = object_num;
    p.offset = pts_ms;
    p.replicated = {delta_ms};
    Writer w;
    for (const Bytes& s : subs) {
        if (s.size() > 255) throw std::invalid_argument("sub-payload longer than 255 bytes");
        w.u8(static_cast<uint8_t>(s.size())).bytes(s);
    }
    p.data = w.take();
    return p;
}

uint32_t packet_header_size(const PacketLayout& l) {
    uint32_t n = 0;
    if (l.error_correction) n += 1 + static_cast<uint32_t>(l.ec_data.size());
    n += 2;  // length type flags, property flags
    n += width(l.packet_len_type) + width(l.sequence_type) + width(l.padding_len_type);
    n += 6;
    if (l.multiple) n += 1;
    return n;
}

uint32_t payload_header_size(const PacketLayout& l, const Payload& p) {
    uint32_t n = 1 + width(l.object_num_type) + width(l.offset_type) + width(l.replicated_len_type);
    n += static_cast<uint32_t>(p.replicated.size());
    if (l.multiple) n += width(l.payload_len_type);
    return n;
}

Bytes packet(const std::vector<Payload>& payloads, uint32_t packet_size, const PacketLayout& layout) {
    PacketLayout l = layout;
    l.multiple = is_multiple(layout, payloads.size());
    uint32_t used = packet_header_size(l);
    for (const Payload& p : payloads) used += payload_header_size(l, p) + static_cast<uint32_t>(p.data.size());
    const uint32_t padding = used < packet_size ? packet_size - used : 0;

    Writer w;
    if (l.error_correction) w.u8(l.ec_flags).bytes(l.ec_data);
    const uint8_t ltf = static_cast<uint8_t>((l.multiple ? 1 : 0) | (l.sequence_type << 1) |
                                             (l.padding_len_type << 3) | (l.packet_len_type << 5));
    const uint8_t pf = static_cast<uint8_t>(l.replicated_len_type | (l.offset_type << 2) |
                                            (l.object_num_type << 4) | (l.stream_num_type << 6));
    w.u8(ltf).u8(pf);
    uint32_t packet_len = packet_size;
    uint32_t padding_field = padding;
    if (l.padding_len_type == 0 && l.packet_len_type != 0) packet_len = used;  // padding implied
    if (l.packet_len) packet_len = *l.packet_len;
    if (l.padding_len) padding_field = *l.padding_len;
    field(w, l.packet_len_type, packet_len);
    field(w, l.sequence_type, 0);
    field(w, l.padding_len_type, padding_field);
    w.u32(l.send_time).u16(l.duration);
    if (l.multiple) {
        const uint8_t count = l.num_payloads ? *l.num_payloads : static_cast<uint8_t>(payloads.size());
        w.u8(static_cast<uint8_t>((count & 0x3F) | (l.payload_len_type << 6)));
    }
    for (const Payload& p : payloads) {
        w.u8(static_cast<uint8_t>((p.stream & 0x7F) | (p.key ? 0x80 : 0)));
        field(w, l.object_num_type, p.object_num);
        field(w, l.offset_type, p.offset);
        field(w, l.replicated_len_type, static_cast<uint32_t>(p.replicated.size()));
        w.bytes(p.replicated);
        if (l.multiple) field(w, l.payload_len_type, payload_len_of(p));
        w.bytes(p.data);
    }
    w.zeros(padding);
    return w.take();
}

Bytes damaged_packet(Damage how, const std::vector<Payload>& payloads, uint32_t packet_size) {
    PacketLayout l;
    std::vector<Payload> ps = payloads;
    switch (how) {
        case Damage::PacketLenTooLong:
            l.packet_len_type = 2;
            l.packet_len = packet_size + 1;
            break;
        case Damage::PaddingTooLong:
            l.padding_len = packet_size + 1;
            break;
        case Damage::NoPayloads:
            l.num_payloads = 0;
            break;
        case Damage::PayloadTooLong:
            ps.at(0).declared_len = packet_size + 1;
            break;
    }
    Bytes out = packet(ps, packet_size, l);
    out.resize(packet_size);
    return out;
}

Bytes misaligned_packet(const Bytes& junk, const std::vector<Payload>& payloads,
                        uint32_t packet_size, const PacketLayout& layout) {
    Bytes out = junk;
    const Bytes good = packet(payloads, packet_size, layout);
    out.insert(out.end(), good.begin(), good.end());
    out.resize(packet_size);
    return out;
}

std::vector<Bytes> mux(const std::vector<Object>& objects, uint32_t packet_size,
                       const PacketLayout& layout, uint8_t first_object_num, uint32_t fill) {
    const uint32_t limit = fill ? std::min(fill, packet_size) : packet_size;
    std::vector<Bytes> packets;
    std::map<uint8_t, uint32_t> next_num;
    std::vector<Payload> current;
    PacketLayout l = layout;
    uint32_t used = packet_header_size(l);
    auto flush = [&] {
        if (current.empty()) return;
        packets.push_back(packet(current, packet_size, l));
        current.clear();
        used = packet_header_size(l);
    };
    for (const Object& o : objects) {
        auto it = next_num.try_emplace(o.stream, first_object_num).first;
        const uint32_t num = it->second++ & 0xFF;
        const uint32_t size = static_cast<uint32_t>(o.data.size());
        uint32_t offset = 0;
        do {
            Payload probe = media(o.stream, num, offset, size, o.pts_ms, {}, o.key);
            const uint32_t head = payload_header_size(l, probe);
            if (used + head >= limit || (!l.multiple && !current.empty())) {
                flush();
                continue;
            }
            const uint32_t room = limit - used - head;
            const uint32_t take = std::min(room, size - offset);
            probe.data.assign(o.data.begin() + offset, o.data.begin() + offset + take);
            current.push_back(std::move(probe));
            used += head + take;
            offset += take;
        } while (offset < size);
    }
    flush();
    return packets;
}

Bytes spread_scramble(const Bytes& object, uint8_t span, uint16_t packet_len, uint16_t chunk_len) {
    Bytes out(object.size());
    const size_t chunks = object.size() / chunk_len;
    for (size_t index = 0; index < chunks; ++index) {
        const size_t row = index / span, column = index % span;
        const size_t new_index = column * packet_len / chunk_len + row;
        std::copy_n(object.begin() + static_cast<long>(new_index * chunk_len), chunk_len,
                    out.begin() + static_cast<long>(index * chunk_len));
    }
    return out;
}

Bytes pattern(size_t n, uint32_t seed) {
    Bytes out(n);
    uint32_t x = seed * 2654435761u + 12345u;
    for (auto& b : out) {
        x = x * 1103515245u + 12345u;
        b = static_cast<uint8_t>(x >> 16);
    }
    return out;
}

Bytes build_packet_file(const PacketFile& f) {
    File file;
    FileProps fp;
    fp.packet_count = f.packet_count ? *f.packet_count : f.packets.size();
    fp.min_packet_size = fp.max_packet_size = f.packet_size;
    fp.preroll = f.preroll_ms;
    fp.flags = f.broadcast ? 0x1 : 0x2;
    file.header_children.push_back(file_properties(fp));
    if (f.audio) {
        StreamProps s;
        s.stream_type = asf_audio_media;
        s.flags = 1;
        s.time_offset = f.audio_time_offset;
        s.type_specific = waveformatex(WaveFormat{});
        if (f.spread.span) {
            s.ec_type = asf_spread_audio;
            s.ec_data = spread_ec(f.spread.span, f.spread.packet_len, f.spread.chunk_len);
        }
        file.header_children.push_back(stream_properties(s));
    }
    if (f.video) {
        StreamProps s;
        s.stream_type = asf_video_media;
        s.flags = 2;
        s.time_offset = f.video_time_offset;
        s.type_specific = video_type_specific(BitmapInfo{});
        file.header_children.push_back(stream_properties(s));
    }
    file.packets = f.packets;
    file.trailing = f.trailing;
    file.data_object_size = f.data_object_size;
    return build(file);
}

}  // namespace asfb
