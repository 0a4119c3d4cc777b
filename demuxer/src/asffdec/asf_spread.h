// Spread audio: objects whose fixed-size chunks were interleaved across
// several virtual packets are put back in order before they are committed.
#ifndef ASF_SPREAD_H
#define ASF_SPREAD_H

#include "asf_demuxer.h"

// Reorders the `object_size` bytes of the stream's pending frame in place,
// using the frame doubled in size as scratch memory. Leaves the object as it
// was when the spread parameters do not describe it or memory is refused.
void asf_handle_audio_spread(asf_demuxer_st* d, asf_stream_st* s, hova_stream_type_et type);

#endif  // ASF_SPREAD_H
