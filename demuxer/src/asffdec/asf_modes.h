// What changes plain front-to-back delivery: separate audio and video cursors
// for badly interleaved files, the end of the data with the scan for a new
// header, the end-of-stream notice and the thumbnail drop rule.
#ifndef ASF_MODES_H
#define ASF_MODES_H

#include "asf_demuxer.h"

// Switches to separate parsing when audio and video are more than 2 s apart.
void asf_check_bad_interleave(asf_demuxer_st* d);

// Separate parsing: follows the stream that is behind, swapping cursors.
void asf_follow_stream_behind(asf_demuxer_st* d);

// Separate parsing ran off the end of the data with the followed stream:
// resumes the other stream's cursor and returns to sequential parsing.
void asf_resume_other_stream(asf_demuxer_st* d);

// Non-zero when a new ASF header was found at or after the reader position.
int asf_detect_discontinuity(cb_buffer_st* cb, const hova_callback_st* callback);

// HOVA_EVENT_EOS for the active audio, then video stream.
void send_end_stream(asf_demuxer_st* d);

// Non-zero when a video frame must not be delivered in thumbnail mode.
int asf_need_drop_frame(asf_demuxer_st* d, hova_stream_type_et type, int keyframe, int64_t pts);

// The active stream record of a kind, or null.
inline asf_stream_st* asf_active_stream(asf_demuxer_st* d, sys_stream_type_et kind) {
    const int idx = d->s.active_stream[kind];
    return idx < 0 ? nullptr : &d->stream_info[idx];
}

#endif  // ASF_MODES_H
