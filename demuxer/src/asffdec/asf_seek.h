// Seeking by time: the packet search through the simple index or over the
// data packets, and the reset of what delivery was assembling.
#ifndef ASF_SEEK_H
#define ASF_SEEK_H

#include <cstdint>

#include "asf_demuxer.h"

// What the packet searches return when they cannot answer.
inline constexpr uint64_t kAsfNoPacket = UINT64_MAX;

// Most simple index entries held in memory: 12 bytes each (packet number and
// key-frame time) in one block of at most 64 KiB, 91 minutes at one entry a
// second.
inline constexpr uint32_t kAsfMaxHeldIndexEntries = (65536 - 8) / 12;

// With the reader on the simple index entries, keeps their packet numbers
// (and the key-frame times seeks find for them) in one host block when there
// are at most kAsfMaxHeldIndexEntries of them and the host grants it;
// otherwise (or on a short read) the index walk reads entries from the input
// and probes every time. Moves the reader.
void asf_hold_index(asf_demuxer_st* d);
// Gives the held entries back to the host (nothing when none are held).
void asf_release_index(asf_demuxer_st* d);

// Packet of the video key frame for *pts through the simple index; *pts
// becomes that key frame's time. kAsfNoPacket when the index cannot answer.
// *barren_from: the seek's bound of get_packet_pts_with_number.
uint64_t asf_find_packet_by_index(asf_demuxer_st* d, int dir, int64_t* pts, uint64_t* barren_from);

// Packet whose `target_type` object start (for video, key frame) is nearest
// *pts in direction `dir`, found by interpolation and a packet scan; *pts
// becomes its time. Backward with none at or before *pts, the first one.
// kAsfNoPacket when the search fails. *barren_from: the seek's bound for
// this kind (none of its object starts from there on), kept up to date.
uint64_t asf_find_packet_with_type(asf_demuxer_st* d, int dir, int64_t* pts,
                                   hova_stream_type_et target_type, uint64_t* barren_from);

// Gives back the host frames of partly assembled audio and video objects and
// clears their assembly state.
void discard_pending_objects(asf_demuxer_st* d);

#endif  // ASF_SEEK_H
