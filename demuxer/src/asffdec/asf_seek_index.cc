// The simple index path: entry i stands for the time index_start_offset +
// i x interval and names the packet holding the video key frame for it.
// Entries are read one at a time from the file; the index is never loaded.
#include "asf_seek.h"

#include "asf_timestamp.h"
#include "byte_reader.h"
#include "dprintf.h"
#include "streaming.h"

namespace {

constexpr uint32_t kNoEntry = 0xFFFFFFFFu;
constexpr uint64_t kEntrySize = 6;

struct IndexEntry {
    uint32_t packet_number = kNoEntry;
};

[[nodiscard]] bool read_next_entry(asf_demuxer_st* d, IndexEntry* e) {
    cb_buffer_st* cb = &d->s.cbuffer;
    uint8_t b[kEntrySize];
    if (cb->cb_read(cb, b, static_cast<int32_t>(kEntrySize)) != static_cast<int32_t>(kEntrySize))
        return false;
    e->packet_number = plimo::load_le<uint32_t>(b);
    return true;
}

[[nodiscard]] bool read_entry_at(asf_demuxer_st* d, uint32_t i, IndexEntry* e) {
    cb_buffer_st* cb = &d->s.cbuffer;
    const uint64_t pos = d->index_packet + kEntrySize * i;
    if (cb->cb_seek64(cb, static_cast<cb_off_t>(pos), CB_SEEK_SET) == -1) return false;
    return read_next_entry(d, e);
}

// Entry 0 may stand for a time other than 0 (the first key frame rarely sits
// at 0): the first entry naming another packet than entry 0 is probed and the
// offset worked back from its time. False on a failed read of the index.
bool compute_index_start_offset(asf_demuxer_st* d) {
    cb_buffer_st* cb = &d->s.cbuffer;
    if (cb->cb_seek64(cb, static_cast<cb_off_t>(d->index_packet), CB_SEEK_SET) == -1) return false;
    d->index_start_offset = 0;
    uint32_t first = kNoEntry;
    // A probe that found no key frame from packet p to the end of the data
    // finds none from any later packet either: not worth walking again.
    uint64_t barren_from = UINT64_MAX;
    bool in_place = true;  // the reader stands on entry i
    for (uint32_t i = 0; i < d->index_count; ++i) {
        IndexEntry e;
        if (!(in_place ? read_next_entry(d, &e) : read_entry_at(d, i, &e))) return false;
        in_place = true;
        if (i == 0) {
            first = e.packet_number;
            continue;
        }
        if (e.packet_number == first || e.packet_number >= barren_from) continue;
        const int64_t t = get_packet_pts_with_number(d, e.packet_number);
        in_place = false;
        if (t == -1) {
            barren_from = e.packet_number;
            continue;
        }
        d->index_start_offset =
            static_cast<int64_t>(static_cast<uint64_t>(t) - uint64_t{i} * d->index_time_interval);
        ASF_LOG("index_start_offset %lld, preroll %u, first non-zero pts %lld, packet %u, index %d, "
                "interval %lld\n",
                static_cast<long long>(d->index_start_offset), d->preroll,
                static_cast<long long>(t), e.packet_number, static_cast<int>(i),
                static_cast<long long>(d->index_time_interval));
        return true;
    }
    return true;
}

}  // namespace

uint64_t asf_find_packet_by_index(asf_demuxer_st* d, int dir, int64_t* pts) {
    if (d->index_packet == 0 || d->index_time_interval == 0) return kAsfNoPacket;
    if (d->index_start_offset == -1 && !compute_index_start_offset(d)) return kAsfNoPacket;

    const int64_t target = *pts;
    // Worked out in 64 bits: a far target must not wrap back into the index.
    const uint64_t slot =
        target < d->index_start_offset
            ? 0
            : (static_cast<uint64_t>(target) - static_cast<uint64_t>(d->index_start_offset)) /
                  d->index_time_interval;
    ASF_LOG("enter asf_find_packet_by_index, index %u\n", static_cast<uint32_t>(slot));
    if (slot >= d->index_count) return kAsfNoPacket;

    // From the target's entry, look at the next entry naming another packet.
    // A repeat in between means no key frame starts before the following
    // interval: the target's entry is as close as the index gets. Otherwise
    // the next key frame is probed and, when it is not after the target,
    // taken: once going backward, as long as that holds going forward.
    uint32_t index = static_cast<uint32_t>(slot);
    IndexEntry pre, next;
    uint32_t pre_at = index, next_at = index;  // entry numbers of the two
    for (;;) {
        if (!read_entry_at(d, index, &pre)) return kAsfNoPacket;
        pre_at = index;
        const uint32_t prev_index = index;
        next.packet_number = kNoEntry;
        index = prev_index + 1;
        while (index < d->index_count) {
            // A short read ends the run with the last entry read (if any).
            if (!read_next_entry(d, &next)) break;
            next_at = index;
            if (next.packet_number != pre.packet_number) break;
            ++index;
        }
        if (next.packet_number == kNoEntry || index > prev_index + 1) break;
        const int64_t t = get_packet_pts_with_number(d, next.packet_number);
        if (t == -1) {
            next.packet_number = kNoEntry;
            break;
        }
        if (target < t) break;
        pre = next;
        pre_at = next_at;
        if (dir == HOVA_SEEK_BACKWARD) break;
    }

    const bool back = dir == HOVA_SEEK_BACKWARD;
    uint32_t at = back ? pre_at : next_at;
    uint32_t packet = back ? pre.packet_number : next.packet_number;
    int64_t t = get_packet_pts_with_number(d, packet);
    if (t == -1) return kAsfNoPacket;
    // Entry 0's time is worked out from a key frame found at or after a later
    // entry's packet, which need not be that entry's own time: the walk may
    // end an entry off. Step entry by entry (over entries repeating the
    // packet) until the key frame lies on the asked side of the target.
    while (back ? t > target : t < target) {
        IndexEntry e;
        do {
            if (back ? at == 0 : at + 1 >= d->index_count) return kAsfNoPacket;
            at = back ? at - 1 : at + 1;
            if (!read_entry_at(d, at, &e)) return kAsfNoPacket;
        } while (e.packet_number == packet);
        packet = e.packet_number;
        t = get_packet_pts_with_number(d, packet);
        if (t == -1) return kAsfNoPacket;
    }
    *pts = t;
    return packet;
}
