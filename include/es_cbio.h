/*
 * The host's elementary-stream source, reached through the raw input's
 * `parent` pointer when the input is opened in elementary-stream mode.
 * Laid out exactly as the host declares it; the plug-in uses only `peek`,
 * `flush` and `es_is_data_end`.
 */
#ifndef ES_CBIO_H
#define ES_CBIO_H

#include <stddef.h>
#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

typedef enum es_data_type_e {
    EMPTY_TYPE = 0,
    AUDIO_DATA = 1,
    VIDEO_DATA = 2,
    SUBTITLE_DATA = 3,
    ALL_DATA = 4
} es_data_type_et;

typedef struct tiny_info_data_s {
    int64_t duration;
    int32_t video_ts_type;
    int32_t tee_path;
    int32_t frame_rate;
    int32_t drm_type;
    int32_t reserved_4;
    int32_t reserved_5;
} tiny_info_data_s, tiny_info_data;

typedef struct tiny_track_info_s {
    int32_t total_video_track_num;
    int32_t total_audio_track_num;
    int32_t total_subtitle_track_num;
    int32_t video_es_track_id;
    int32_t audio_es_track_id;
    int32_t subtitle_es_track_id;
    int32_t reserved_1;
    int32_t reserved_2;
    int32_t reserved_3;
    int32_t reserved_4;
    int32_t reserved_5;
} tiny_track_info_s, tiny_track_info;

typedef struct tiny_video_config_s {
    int32_t codec_type;
    int32_t width;
    int32_t height;
    int32_t config_len;
    uint8_t config[256];
} tiny_video_config_s, tiny_video_config;

typedef struct tiny_audio_config_s {
    int32_t codec_type;
    int32_t sample_rate;
    int32_t channel_num;
    int32_t bits_per_sample;
    int32_t frame_length;
    int32_t config_len;
    uint8_t config[256];
} tiny_audio_config_s, tiny_audio_config;

typedef struct tiny_header_info_s {
    int32_t frame_type;
    int32_t flag;
    int64_t s64TimeStamp;
    uint32_t u32Size;
} tiny_header_info_s, tiny_header_info_st;

typedef struct es_cbio_s es_cbio_s, es_cbio_st;

struct es_cbio_s {
    size_t (*write)(es_cbio_st* src, const void* data, tiny_header_info_st* hdr,
                    es_data_type_et type);
    size_t (*get_free_size)(es_cbio_st* src, es_data_type_et type);
    /* The reader passes its raw input object (cb_io_st*) here, not the source. */
    size_t (*peek)(void* obj, void* dst, size_t len);
    /* The reader passes the source object itself here. */
    void (*flush)(void* obj, es_data_type_et type);
    void* a_srbuf;
    void* a_ringbuf;
    void* v_srbuf;
    void* v_ringbuf;
    size_t es_remain_size;
    es_data_type_et active_type;
    size_t buffer_position;
    tiny_info_data tiny_info;
    tiny_track_info track_info;
    tiny_video_config v_config;
    tiny_audio_config a_config;
    uint8_t flag_SendTrackInfoYet;
    uint8_t flag_SendAudioConfigDataYet;
    uint8_t flag_SendVideoConfigDataYet;
    uint8_t flag_SendTNYWordYet;
    uint8_t es_no_rebase;
    int64_t pts_base;
    uint8_t es_debug;
    uint8_t es_is_data_end; /* non-zero once the source has no more data */
    int32_t es_pre_video_track_id;
    int32_t es_pre_audio_track_id;
    int32_t es_pre_subtitle_track_id;
};

#ifdef __cplusplus
}
#endif

#endif /* ES_CBIO_H */
