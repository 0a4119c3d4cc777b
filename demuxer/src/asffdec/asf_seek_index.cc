// The simple index path: entry i stands for the time index_start_offset +
// i x interval and names the packet holding the video key frame for it.
// A small index is held in one host block from the open (on a network every
// entry read from the input is a jump to the end of the file and back);
// otherwise, or when the host refuses the block, entries are read one at a
// time from the input.
#include "asf_seek.h"

#include "asf_timestamp.h"
#include "byte_reader.h"
#include "dprintf.h"
#include "streaming.h"
#include "sys_output.h"

namespace {

constexpr uint32_t kNoEntry = 0xFFFFFFFFu;
constexpr uint64_t kEntrySize = 6;

struct IndexEntry {
    uint32_t packet_number = kNoEntry;
};

// The held index is one host block: the active video record its times were
// found for, then per entry the key-frame time found from its packet (once
// probed), then per entry its packet number. Its address lives in the
// timeline base of the shared pts repair, which this plug-in never uses: the
// context record has no free pointer-sized room on 64-bit targets and its
// size is fixed.
constexpr int64_t kUnprobed = INT64_MIN;

int64_t* held_block(const asf_demuxer_st* d) {
    return reinterpret_cast<int64_t*>(static_cast<uintptr_t>(d->s.base_pts));
}

void set_held_block(asf_demuxer_st* d, int64_t* p) {
    d->s.base_pts = static_cast<int64_t>(reinterpret_cast<uintptr_t>(p));
}

int64_t* held_times(int64_t* block) { return block + 1; }

uint32_t* held_packets(int64_t* block, uint32_t count) {
    return reinterpret_cast<uint32_t*>(block + 1 + count);
}

size_t held_size(uint32_t count) {
    return sizeof(int64_t) * (1 + uint64_t{count}) + sizeof(uint32_t) * uint64_t{count};
}

// Time of the video key frame found from entry i's packet. The answer
// depends only on the file and the active video stream, so with the index
// held it is kept: a seek whose walk meets known entries costs only the
// jump to its own packet. Failed probes are not kept (a read may fail once).
int64_t entry_time(asf_demuxer_st* d, uint32_t i, uint32_t packet, uint64_t* barren) {
    // An entry the walk did not find names no packet: its kept time, if any,
    // belongs to the entry it was left at, not to a packet.
    if (packet == kNoEntry) return -1;
    int64_t* block = held_block(d);
    if (!block) return get_packet_pts_with_number(d, packet, barren);
    int64_t* times = held_times(block);
    if (block[0] != d->s.active_stream[VID]) {
        for (uint32_t k = 0; k < d->index_count; ++k) times[k] = kUnprobed;
        block[0] = d->s.active_stream[VID];
    }
    if (times[i] != kUnprobed) return times[i];
    const int64_t t = get_packet_pts_with_number(d, packet, barren);
    if (t != -1) times[i] = t;
    return t;
}

// Entry i, which the reader stands on unless the entries are held.
[[nodiscard]] bool read_next_entry(asf_demuxer_st* d, uint32_t i, IndexEntry* e) {
    if (int64_t* block = held_block(d)) {
        e->packet_number = held_packets(block, d->index_count)[i];
        return true;
    }
    cb_buffer_st* cb = &d->s.cbuffer;
    uint8_t b[kEntrySize];
    if (cb->cb_read(cb, b, static_cast<int32_t>(kEntrySize)) != static_cast<int32_t>(kEntrySize))
        return false;
    e->packet_number = plimo::load_le<uint32_t>(b);
    return true;
}

[[nodiscard]] bool read_entry_at(asf_demuxer_st* d, uint32_t i, IndexEntry* e) {
    if (held_block(d)) return read_next_entry(d, i, e);
    cb_buffer_st* cb = &d->s.cbuffer;
    const uint64_t pos = d->index_packet + kEntrySize * i;
    if (cb->cb_seek64(cb, static_cast<cb_off_t>(pos), CB_SEEK_SET) == -1) return false;
    return read_next_entry(d, i, e);
}

// Moves *at to the nearest entry before (or after) it that names another
// packet than `packet`; false at the end of the index or on a failed read.
[[nodiscard]] bool neighbour_entry(asf_demuxer_st* d, bool before, uint32_t* at, uint32_t packet,
                                   IndexEntry* e) {
    do {
        if (before ? *at == 0 : *at + 1 >= d->index_count) return false;
        *at = before ? *at - 1 : *at + 1;
        if (!read_entry_at(d, *at, e)) return false;
    } while (e->packet_number == packet);
    return true;
}

// Entry 0 may stand for a time other than 0 (the first key frame rarely sits
// at 0): the first entry naming another packet than entry 0 is probed and the
// offset worked back from its time. False on a failed read of the index.
bool compute_index_start_offset(asf_demuxer_st* d, uint64_t* barren) {
    cb_buffer_st* cb = &d->s.cbuffer;
    if (!held_block(d) &&
        cb->cb_seek64(cb, static_cast<cb_off_t>(d->index_packet), CB_SEEK_SET) == -1)
        return false;
    d->index_start_offset = 0;
    uint32_t first = kNoEntry;
    // A probe that found no key frame from packet p on lowers the bound: an
    // entry at or after it is not probed, one before it walks only up to it,
    // so an index naming packets in descending order costs one pass over the
    // data, not one per entry.
    bool in_place = true;  // the reader stands on entry i
    for (uint32_t i = 0; i < d->index_count; ++i) {
        IndexEntry e;
        if (!(in_place ? read_next_entry(d, i, &e) : read_entry_at(d, i, &e))) return false;
        in_place = true;
        if (i == 0) {
            first = e.packet_number;
            continue;
        }
        if (e.packet_number == first || e.packet_number >= *barren) continue;
        const int64_t t = entry_time(d, i, e.packet_number, barren);
        in_place = false;
        if (t == -1) continue;
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

void asf_hold_index(asf_demuxer_st* d) {
    if (d->index_count == 0 || d->index_count > kAsfMaxHeldIndexEntries) return;
    const uint32_t n = d->index_count;
    auto* block = static_cast<int64_t*>(sys_malloc(&d->s, held_size(n)));
    if (!block) return;  // the entries stay on the input
    uint32_t* packets = held_packets(block, n);
    cb_buffer_st* cb = &d->s.cbuffer;
    constexpr uint32_t kChunk = 64;
    uint8_t b[kEntrySize * kChunk];
    for (uint32_t i = 0; i < n;) {
        const uint32_t m = n - i < kChunk ? n - i : kChunk;
        const auto want = static_cast<int32_t>(kEntrySize * m);
        if (cb->cb_read(cb, b, want) != want) {
            // A short index is read entry by entry, as far as it goes.
            sys_free(&d->s, block);
            return;
        }
        for (uint32_t k = 0; k < m; ++k) packets[i + k] = plimo::load_le<uint32_t>(b + kEntrySize * k);
        i += m;
    }
    block[0] = d->s.active_stream[VID];
    for (uint32_t k = 0; k < n; ++k) held_times(block)[k] = kUnprobed;
    set_held_block(d, block);
}

void asf_release_index(asf_demuxer_st* d) {
    int64_t* block = held_block(d);
    if (!block) return;
    sys_free(&d->s, block);
    set_held_block(d, nullptr);
}

uint64_t asf_find_packet_by_index(asf_demuxer_st* d, int dir, int64_t* pts, uint64_t* barren) {
    if (d->index_packet == 0 || d->index_time_interval == 0) return kAsfNoPacket;
    if (d->index_start_offset == -1 && !compute_index_start_offset(d, barren)) return kAsfNoPacket;

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
            if (!read_next_entry(d, index, &next)) break;
            next_at = index;
            if (next.packet_number != pre.packet_number) break;
            ++index;
        }
        if (next.packet_number == kNoEntry || index > prev_index + 1) break;
        const int64_t t = entry_time(d, next_at, next.packet_number, barren);
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
    int64_t t = entry_time(d, at, packet, barren);
    if (t == -1) return kAsfNoPacket;
    // Entry 0's time is worked out from a key frame found at or after a later
    // entry's packet, which need not be that entry's own time: the walk may
    // end an entry off. Step entry by entry (over entries repeating the
    // packet) until the key frame lies on the asked side of the target.
    // Going back past entry 0 there is no earlier key frame: entry 0's, the
    // first one, is the answer (as the search without index answers).
    bool stepped = false;
    while (back ? t > target : t < target) {
        IndexEntry e;
        uint32_t from = at;
        if (!neighbour_entry(d, back, &from, packet, &e)) {
            if (back && from == 0) break;
            return kAsfNoPacket;
        }
        const int64_t te = entry_time(d, from, e.packet_number, barren);
        if (te == -1) return kAsfNoPacket;
        at = from;
        packet = e.packet_number;
        t = te;
        stepped = true;
    }
    // Going forward, the entries before the answer may name key frames after
    // the target too (the walk started an entry late): the first key frame
    // after the target is the answer.
    for (uint32_t j = at; !back && !stepped;) {
        IndexEntry e;
        if (!neighbour_entry(d, true, &j, packet, &e)) break;
        const int64_t tj = entry_time(d, j, e.packet_number, barren);
        if (tj == -1 || tj <= target) break;
        at = j;
        packet = e.packet_number;
        t = tj;
    }
    *pts = t;
    return packet;
}
