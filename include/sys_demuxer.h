/*
 * Common demuxer state shared by the framework's demuxer plug-ins: the
 * per-stream record and the record every demuxer context starts with.
 */
#ifndef SYS_DEMUXER_H
#define SYS_DEMUXER_H

#include <stdint.h>

#include "cb_buffer.h"
#include "hova_dmx.h"

#ifdef __cplusplus
extern "C" {
#endif

/* Index of the per-kind arrays of sys_demuxer_s. */
typedef enum sys_stream_type_e { AUD = 0, VID = 1, SUB = 2, OTH = 3 } sys_stream_type_et;

typedef struct sys_aud_inf_s {
    uint32_t sample_rate;   /* Hz */
    uint32_t sample_size;   /* block alignment in bytes, 0 when meaningless */
    uint32_t bit_rate;      /* bits per second */
    uint32_t ch_num;
    uint32_t sample_depth;  /* bits per sample */
} sys_aud_inf_s, sys_aud_inf_st;

typedef struct sys_vid_inf_s {
    uint16_t width;
    uint16_t height;
} sys_vid_inf_s, sys_vid_inf_st;

typedef struct sys_stream_s {
    hova_stream_type_et stream_type;
    int codec_type;           /* HOVAAudioType or HOVAVideoType */
    uint8_t* config;          /* host block, released at close */
    uint32_t config_len;
    int config_sent;
    int disc_sent;
    cb_fpos next_pos;         /* frame-drop target, all ones when none */
    int64_t last_thumbnail_pts;
    union {
        sys_aud_inf_st aud;
        sys_vid_inf_st vid;
    } info;
} sys_stream_s, sys_stream_st;

typedef struct sys_demuxer_s {
    int64_t duration;         /* microseconds; 0 for broadcast content */
    int seekable;
    int streaming;
    int total_streams;
    int num_streams[4];       /* per sys_stream_type_e */
    int active_stream[3];     /* record index per AUD, VID, SUB; -1 when none */
    cb_buffer_st cbuffer;
    hova_callback_st callback;
    hova_drop_level_et drop_level;
    int drop_ratio_num;
    int drop_ratio_den;
    int drop_index;
    int64_t last_pts[3];
    int64_t last_dur[3];
    int64_t seek_time;
    int64_t base_pts;
    int64_t thumbnail_interval; /* microseconds, -1 when off */
    uint8_t dv_profile;
    uint8_t dv_level;
    int8_t bl_signal_compatibility_id;
} sys_demuxer_s, sys_demuxer_st;

#ifdef __cplusplus
}
#endif

#endif /* SYS_DEMUXER_H */
