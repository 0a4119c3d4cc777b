// Presentation times of data packets, learnt from packet and payload headers
// alone: the probes the seek code is built on. They move the reader and never
// touch the delivery cursors; callers put the reader back themselves.
#ifndef ASF_TIMESTAMP_H
#define ASF_TIMESTAMP_H

#include <cstdint>

#include "asf_demuxer.h"

// One step of `cursor` (zero-filled: at a packet start): reads one payload
// header and skips its data, and the packet's rest after its last payload.
// *pts is the payload's host time when it starts an object of `target_type`
// (for video, a key frame), else -1. Returns HOVA_OK after a payload,
// HOVA_TryAgain for a packet header whose lengths are unusable, or the
// header readers' failure (HOVA_EndOfStream); *pts is -1 on every failure.
int get_packet_pts(asf_demuxer_st* d, asf_packet_st* cursor, int64_t* pts,
                   hova_stream_type_et target_type);

// Time of the first video key-frame start at or after data packet `packet`,
// or -1 when there is none before packet *barren_from (a seek's knowledge:
// no key frame starts from there to the end of the data). A probe that finds
// none lowers *barren_from to `packet`, so that no later probe of the same
// seek walks those packets again. The reader is left behind the payload that
// gave the time.
int64_t get_packet_pts_with_number(asf_demuxer_st* d, uint32_t packet, uint64_t* barren_from);

// File position of data packet `packet` (64-bit, no wrap).
inline uint64_t asf_packet_position(const asf_demuxer_st* d, uint64_t packet) {
    return static_cast<uint64_t>(d->first_packet) + static_cast<uint64_t>(d->packet_size) * packet;
}

#endif  // ASF_TIMESTAMP_H
