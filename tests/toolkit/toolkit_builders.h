// Small writers that produce the byte formats the toolkit parses: an MSB-first
// bit writer and, on top of it, ADTS, LOAS, AudioSpecificConfig, AC-3, E-AC-3,
// avcC and ID3 tags. Shared by the tests and the fuzzers' seed generator.
#pragma once

#include <algorithm>
#include <cstdint>
#include <string>
#include <vector>

namespace tkb {

using Bytes = std::vector<uint8_t>;

class BitWriter {
public:
    BitWriter& put(uint64_t value, int bits) {
        for (int i = bits - 1; i >= 0; --i, ++used_) {
            if (used_ % 8 == 0) bytes_.push_back(0);
            if ((value >> i) & 1) bytes_.back() |= static_cast<uint8_t>(0x80 >> (used_ % 8));
        }
        return *this;
    }
    // LatmGetValue: 2-bit byte count minus one, then the value in that many bytes.
    BitWriter& latm_value(uint32_t v) {
        const int n = v < 0x100 ? 1 : v < 0x10000 ? 2 : v < 0x1000000 ? 3 : 4;
        return put(static_cast<uint64_t>(n - 1), 2).put(v, 8 * n);
    }
    Bytes bytes() const { return bytes_; }

private:
    Bytes bytes_;
    size_t used_ = 0;
};

inline Bytes cat(std::initializer_list<Bytes> parts) {
    Bytes out;
    for (const auto& p : parts) out.insert(out.end(), p.begin(), p.end());
    return out;
}
inline Bytes padded(Bytes b, size_t extra, uint8_t fill = 0) { return b.resize(b.size() + extra, fill), b; }
inline Bytes pattern(size_t n, uint8_t seed) {
    Bytes b(n);
    for (size_t i = 0; i < n; ++i) b[i] = static_cast<uint8_t>(seed + i * 7);
    return b;
}

// ---- AAC ----
struct Asc { int object_type = 2, sf_index = 4, channel_config = 2; };
// Object type, rate index, channel configuration, then 3 zero GASpecificConfig bits.
inline Bytes asc_bytes(const Asc& a) {
    return BitWriter().put(a.object_type, 5).put(a.sf_index, 4).put(a.channel_config, 4).put(0, 3).bytes();
}
// One ADTS header (7 bytes, MPEG-4, no CRC, LC) followed by `payload` zero bytes.
inline Bytes adts_frame(int sf_index, int channel_config, int payload = 0) {
    auto w = BitWriter().put(0xFFF, 12).put(0, 3).put(1, 1).put(1, 2).put(sf_index, 4).put(0, 1);
    return padded(w.put(channel_config, 3).put(0, 4).put(7 + payload, 13).put(0x7FF, 11).put(0, 2).bytes(), payload);
}

// use_same_config is ignored for program 0 layer 0; asc_pad_bits: zero bits
// behind the 13 ASC bits (their count is stored in version 1).
struct LoasLayer { bool use_same_config = false; Asc asc; int asc_pad_bits = 0; };
struct LoasConfig {
    bool use_same_stream_mux = false;
    int mux_version = 0;
    std::vector<std::vector<LoasLayer>> programs{{LoasLayer{}}};
};
// One AudioMuxElement in a LOAS AudioSyncStream frame; the frame length fields
// are written once, after the last layer (the toolkit reads configs only).
inline Bytes loas_frame(const LoasConfig& c, int payload = 4) {
    BitWriter b;
    b.put(c.use_same_stream_mux ? 1 : 0, 1);
    if (!c.use_same_stream_mux) {
        b.put(c.mux_version, 1);
        if (c.mux_version == 1) b.put(0, 1).latm_value(0xFF);
        b.put(1, 1).put(0, 6).put(c.programs.size() - 1, 4);
        for (size_t p = 0; p < c.programs.size(); ++p) {
            b.put(c.programs[p].size() - 1, 3);
            for (size_t l = 0; l < c.programs[p].size(); ++l) {
                const LoasLayer& y = c.programs[p][l];
                if (p != 0 || l != 0) {
                    b.put(y.use_same_config ? 1 : 0, 1);
                    if (y.use_same_config) continue;
                }
                if (c.mux_version == 1) b.latm_value(static_cast<uint32_t>(y.asc_pad_bits));
                b.put(y.asc.object_type, 5).put(y.asc.sf_index, 4).put(y.asc.channel_config, 4);
                b.put(0, y.asc_pad_bits);
            }
        }
        b.put(0, 3).put(0xFF, 8).put(0, 2);  // frameLengthType 0, fullness, no other data, CRC
    }
    for (int i = 0; i < payload; ++i) b.put(0xA5, 8);
    const Bytes body = b.bytes();
    return cat({BitWriter().put(0x2B7, 11).put(body.size(), 13).bytes(), body});
}

// ---- Dolby ----
// AC-3 sync frame header (bit stream information up to dialnorm), padded.
inline Bytes ac3_frame(int acmod, int lfeon, int frmsizecod = 10, int pad = 8) {
    BitWriter w;
    w.put(0x0B77, 16).put(0x1234, 16).put(0, 2).put(frmsizecod, 6).put(8, 5).put(0, 3).put(acmod, 3);
    if ((acmod & 1) && acmod != 1) w.put(1, 2);  // centre mix level
    if (acmod & 4) w.put(1, 2);                  // surround mix level
    if (acmod == 2) w.put(2, 2);                 // Dolby surround mode
    return padded(w.put(lfeon, 1).put(0x1F, 5).bytes(), static_cast<size_t>(pad));
}
inline Bytes eac3_frame(int acmod, int lfeon, int pad = 8) {
    auto w = BitWriter().put(0x0B77, 16).put(0, 5).put(255, 11).put(0, 2).put(3, 2).put(acmod, 3);
    return padded(w.put(lfeon, 1).put(16, 5).bytes(), static_cast<size_t>(pad));
}

// ---- AVC ----
inline Bytes avcc(const std::vector<Bytes>& sps, const std::vector<Bytes>& pps,
                  int nal_length_size = 4) {
    Bytes b = {1, 0x64, 0x00, 0x1F, static_cast<uint8_t>(0xFC | (nal_length_size - 1))};
    for (const auto* list : {&sps, &pps}) {
        b.push_back(static_cast<uint8_t>((list == &sps ? 0xE0 : 0) | list->size()));
        for (const auto& s : *list)
            b = cat({b, {static_cast<uint8_t>(s.size() >> 8), static_cast<uint8_t>(s.size())}, s});
    }
    return b;
}

// ---- ID3 ----
inline Bytes be(uint32_t v, int n, int bits = 8) {  // bits 7: syncsafe
    Bytes b;
    for (int i = n - 1; i >= 0; --i) b.push_back(static_cast<uint8_t>((v >> (bits * i)) & (bits == 7 ? 0x7F : 0xFF)));
    return b;
}
inline Bytes text(const std::string& s) { return Bytes(s.begin(), s.end()); }

// stored_size: the size field as stored (-1: body.size()); plain_size_v4: a
// v2.4 size written big-endian instead of syncsafe.
struct Id3Frame { std::string id; Bytes body; int64_t stored_size = -1; bool plain_size_v4 = false; };
inline Id3Frame text_frame(const std::string& id, uint8_t enc, const Bytes& v) { return {id, cat({{enc}, v})}; }
// The frames of a tag as stored for `version` (2, 3 or 4).
inline Bytes id3_frames(int version, const std::vector<Id3Frame>& frames) {
    Bytes out;
    for (const auto& f : frames) {
        const auto size = static_cast<uint32_t>(f.stored_size >= 0 ? f.stored_size : int64_t(f.body.size()));
        Bytes id = text(f.id);
        id.resize(version == 2 ? 3 : 4, 0);
        const Bytes sz = be(size, version == 2 ? 3 : 4, version == 4 && !f.plain_size_v4 ? 7 : 8);
        out = cat({out, id, sz, version == 2 ? Bytes{} : Bytes{0, 0}, f.body});
    }
    return out;
}
// A whole tag: header, the given body (frames or anything else), padding.
inline Bytes id3_tag(int version, const Bytes& body, size_t padding = 0, uint8_t flags = 0) {
    const Bytes head = {'I', 'D', '3', static_cast<uint8_t>(version), 0, flags};
    return padded(cat({head, be(static_cast<uint32_t>(body.size() + padding), 4, 7), body}), padding);
}
// The 128-byte ID3v1 block.
inline Bytes id3v1(const std::string& title, const std::string& artist, const std::string& album,
                   const std::string& year, const std::string& comment, uint8_t genre) {
    Bytes out = text("TAG");
    for (const auto& [s, width] : {std::pair{title, 30}, {artist, 30}, {album, 30}, {year, 4}, {comment, 30}})
        out = cat({out, padded(text(s.substr(0, width)), width - std::min<size_t>(s.size(), width))});
    out.push_back(genre);
    return out;
}

}  // namespace tkb
