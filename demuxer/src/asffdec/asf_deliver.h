// Frame delivery: media objects reassembled from payloads straight in the
// host's pending frames and committed when the stream's next object begins.
#ifndef ASF_DELIVER_H
#define ASF_DELIVER_H

#include "asf_demuxer.h"

// The active audio or video stream with this 7-bit number (audio first).
asf_stream_st* get_stream(asf_demuxer_st* d, int stream_num, hova_stream_type_et* type);

// Non-zero when the payload must be passed over. `s` is the payload's stream
// from get_stream (null when it belongs to no active stream).
int check_drop(asf_demuxer_st* d, const asf_packet_st* p, const asf_stream_st* s,
               hova_stream_type_et type, hova_stream_type_et accepted);

// Appends `len` bytes at the reader's position to the stream's object.
// Returns 1 when the payload completed (committed or dropped) the previous
// object of the stream, else 0.
int read_media_object(asf_demuxer_st* d, asf_stream_st* s, hova_stream_type_et type, int keyframe,
                      uint32_t object_num, uint32_t len, uint32_t object_len, uint32_t pts_ms);

// Host time of an object from its payload's presentation time in ms.
int64_t asf_payload_pts(const asf_demuxer_st* d, const asf_stream_st* s, uint32_t pts_ms);

#endif  // ASF_DELIVER_H
