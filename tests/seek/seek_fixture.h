// Files for the seek tests: one audio object (stream 1) and one video object
// (stream 2) per data packet, so that frame i lies in packet i at
// i x step_ms, with a simple index built the way encoders build it (entry j
// names the packet of the last key frame at or before j x interval) or given
// entry by entry.
#pragma once

#include <gtest/gtest.h>

#include <optional>
#include <set>
#include <vector>

#include "../delivery/delivery_fixture.h"
#include "asf_builder.h"
#include "asf_packets.h"

namespace seektest {

using asfb::Bytes;
using delivery::Player;

struct Clip {
    uint32_t packets = 100;
    uint32_t packet_size = 1024;
    uint32_t step_ms = 100;           // frame i at i x step_ms
    uint32_t key_every = 10;          // video key frames at packets key_first + k x key_every
    uint32_t key_first = 0;
    uint32_t preroll_ms = 0;
    bool audio = true;
    bool video = true;
    int32_t audio_lag_ms = 0;         // audio object i at i x step_ms + lag
    uint32_t audio_packets = UINT32_MAX;  // packets that carry audio
    std::optional<uint64_t> play_duration_100ns;
    bool broadcast = false;
    bool index = true;
    uint32_t index_interval_ms = 1000;
    std::optional<std::vector<uint32_t>> index_entries;  // packet numbers
    std::optional<uint64_t> index_interval_100ns;          // written as is
    std::optional<uint32_t> index_declared_count;
    std::optional<uint32_t> cut_after_entries;            // the file ends in the index
    std::optional<uint32_t> cut_in_packet;                 // the file ends halfway into it
};

inline bool is_key(const Clip& c, uint32_t i) {
    return i >= c.key_first && (i - c.key_first) % c.key_every == 0;
}

// Host time of frame i in microseconds.
inline int64_t video_us(const Clip& c, uint32_t i) { return int64_t{i} * c.step_ms * 1000; }
inline int64_t audio_us(const Clip& c, uint32_t i) {
    return (int64_t{i} * c.step_ms + c.audio_lag_ms) * 1000;
}

inline Bytes video_bytes(uint32_t i) { return asfb::pattern(200, 0x5000 + i); }
inline Bytes audio_bytes(uint32_t i) { return asfb::pattern(100, 0xA000 + i); }

inline std::vector<uint32_t> encoder_index(const Clip& c) {
    std::vector<uint32_t> out;
    const uint64_t span_ms = uint64_t{c.packets} * c.step_ms;
    for (uint64_t t = 0; t < span_ms; t += c.index_interval_ms) {
        uint32_t last = c.key_first;
        for (uint32_t i = 0; i < c.packets; ++i)
            if (is_key(c, i) && uint64_t{i} * c.step_ms <= t) last = i;
        out.push_back(last);
    }
    return out;
}

inline Bytes build(const Clip& c) {
    asfb::File f;
    asfb::FileProps fp;
    fp.packet_count = c.packets;
    fp.min_packet_size = fp.max_packet_size = c.packet_size;
    fp.preroll = c.preroll_ms;
    fp.play_duration = c.play_duration_100ns
                           ? *c.play_duration_100ns
                           : (uint64_t{c.packets} * c.step_ms + c.preroll_ms) * 10000;
    fp.flags = c.broadcast ? 0x1 : 0x2;
    f.header_children.push_back(asfb::file_properties(fp));
    if (c.audio) {
        asfb::StreamProps s;
        s.stream_type = asf_audio_media;
        s.flags = 1;
        s.type_specific = asfb::waveformatex(asfb::WaveFormat{});
        f.header_children.push_back(asfb::stream_properties(s));
    }
    if (c.video) {
        asfb::StreamProps s;
        s.stream_type = asf_video_media;
        s.flags = 2;
        s.type_specific = asfb::video_type_specific(asfb::BitmapInfo{});
        f.header_children.push_back(asfb::stream_properties(s));
    }
    for (uint32_t i = 0; i < c.packets; ++i) {
        std::vector<asfb::Payload> pl;
        const uint8_t num = static_cast<uint8_t>(i + 1);
        if (c.audio && i < c.audio_packets) {
            const Bytes a = audio_bytes(i);
            pl.push_back(asfb::media(1, num, 0, static_cast<uint32_t>(a.size()),
                                     static_cast<uint32_t>(audio_us(c, i) / 1000 + c.preroll_ms),
                                     a));
        }
        if (c.video) {
            const Bytes v = video_bytes(i);
            pl.push_back(asfb::media(2, num, 0, static_cast<uint32_t>(v.size()),
                                     static_cast<uint32_t>(video_us(c, i) / 1000 + c.preroll_ms), v,
                                     is_key(c, i)));
        }
        f.packets.push_back(asfb::packet(pl, c.packet_size));
    }
    if (c.index && c.video) {
        const std::vector<uint32_t> entries = c.index_entries ? *c.index_entries : encoder_index(c);
        std::vector<asfb::IndexEntry> e;
        for (uint32_t p : entries) e.push_back({p, 1});
        Bytes idx =
            asfb::simple_index(c.index_interval_100ns ? *c.index_interval_100ns
                                                      : uint64_t{c.index_interval_ms} * 10000,
                               e);
        if (c.index_declared_count) {
            // Entry count at offset 52 of the object.
            for (int k = 0; k < 4; ++k)
                idx[52 + k] = static_cast<uint8_t>(*c.index_declared_count >> (8 * k));
        }
        if (c.cut_after_entries) idx.resize(56 + 6 * size_t{*c.cut_after_entries});
        f.trailing.push_back(idx);
    }
    if (c.cut_in_packet) {
        f.trailing.clear();
        Bytes all = asfb::build(f);
        const size_t first = all.size() - size_t{c.packets} * c.packet_size;
        all.resize(first + size_t{*c.cut_in_packet} * c.packet_size + c.packet_size / 2);
        return all;
    }
    return asfb::build(f);
}

inline int seek(Player& p, int dir, int64_t* pts, int query = 0) {
    return hova_asff_demuxer.seek_time(p.ctx(), dir, pts, query);
}

}  // namespace seektest
