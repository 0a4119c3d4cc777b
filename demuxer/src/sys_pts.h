/*
 * Timestamp continuity and position-based frame dropping over the common
 * demuxer state, for the framework's demuxers that deliver source timestamps.
 */
#ifndef SYS_PTS_H
#define SYS_PTS_H

#include <stdint.h>

#include "sys_demuxer.h"

#ifdef __cplusplus
extern "C" {
#endif

/* A jump between consecutive timestamps of one kind larger than this (µs) is a gap. */
#define SYS_PTS_GAP_THRESHOLD 30000000LL

/* Streams of every kind. */
int sys_get_cur_stream_num(const sys_demuxer_st* d);

/* Starts a new timeline at `seek_time` (µs): no base offset, no known step. */
void sys_set_pts_info(sys_demuxer_st* d, int64_t seek_time);

/* Rebases an audio or video timestamp in place and closes gaps of more than
 * 30 s so that the timeline continues; other kinds are only recorded. */
void sys_update_and_fix_pts_gap(sys_demuxer_st* d, int64_t* pts, hova_stream_type_et type);

void sys_reset_drop_target(sys_stream_st* s);

/* Streams of kinds other than `target_type` drop their frames until the reader
 * is back at `current_pos`; the targeted kind keeps none. */
void sys_set_drop_target(hova_stream_type_et target_type, sys_stream_st* s, cb_fpos current_pos);

/* 1 to drop the stream's frame at hand, 0 to deliver it. */
int sys_check_drop(sys_demuxer_st* d, sys_stream_st* s);

#ifdef __cplusplus
}
#endif

#endif /* SYS_PTS_H */
