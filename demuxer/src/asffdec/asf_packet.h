// Data packet and payload headers: the cursor over the data object that
// delivery, timestamp probing and seeking share.
#ifndef ASF_PACKET_H
#define ASF_PACKET_H

#include <stdint.h>

#include "asf_demuxer.h"

// Reads one field whose width is given by a 2-bit length-type code (0: absent,
// 1: 8, 2: 16, 3: 32 bits). *out is 0 unless the whole field was read; the
// result is the number of bytes the field took (0 on a short read).
int read_1_2_4_bytes(cb_buffer_st* cb, uint32_t* out, uint32_t type);

// Reads the packet header at the reader's position (a packet's first byte)
// and stores its length in bytes through `header_size`. HOVA_OK, or
// HOVA_EndOfStream when a required byte cannot be read or skipped.
int read_packet_header(asf_demuxer_st* d, asf_packet_st* p, uint32_t* header_size);

// Reads one payload header. `parsed` holds the bytes of the packet consumed
// before the header on entry and including it on return.
int read_payload_header(asf_demuxer_st* d, asf_packet_st* p, uint32_t* parsed);

// As read_payload_header; *announced_size is 1 when this payload's replicated
// data carried a media object size (8 bytes or more), else 0.
int asf_read_payload_header_ex(asf_demuxer_st* d, asf_packet_st* p, uint32_t* parsed,
                               int* announced_size);

// Packet count of a file whose packets are counted by nobody (file
// properties and data object both say 0, and the input's size is unknown):
// as many as positions can address. Delivery then ends where the input ends.
inline uint64_t asf_unbounded_packet_count(const asf_demuxer_st* d) {
    return (static_cast<uint64_t>(INT64_MAX) - UINT32_MAX) / d->packet_size;
}
inline bool asf_packets_unbounded(const asf_demuxer_st* d) {
    return d->num_packets == asf_unbounded_packet_count(d);
}

// At a packet start in sequential delivery: when the bytes there do not start
// a packet of the usual form, or the reader stands off the packet grid (a
// packet the scan found off its place was read whole from where it starts),
// looks for two usual packet starts one packet apart near the reader and, when
// found, moves the packet grid (first_packet) and the reader there. Returns
// the distance moved in bytes (negative: back), 0 when nothing moved.
int64_t asf_realign_packet(asf_demuxer_st* d);

// Moves the reader to the byte the record stands at; -1 on failure.
cb_off_t asf_seek_to_packet_with_parsed(asf_demuxer_st* d, const asf_packet_st* p);

// Looks for a plausible packet start in the next 1024 bytes when the byte
// just read (*first_byte) announced an error correction block of an unusual
// form. On a match the reader stands just behind the found byte, which is
// handed back through *first_byte, and the result is the number of bytes
// passed over (found byte included); otherwise the result is 0.
uint32_t resync_packet(asf_demuxer_st* d, uint8_t* first_byte);

#endif  // ASF_PACKET_H
