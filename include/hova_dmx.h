/*
 * Host framework interface: the demuxer descriptor, the callback table, the
 * host enumerations and the information records that cross the plug-in
 * boundary. Field order, widths and enumeration values are fixed by the host.
 */
#ifndef HOVA_DMX_H
#define HOVA_DMX_H

#include <stddef.h>
#include <stdint.h>

#include "cb_io.h"
#include "hova_codec.h"

#ifdef __cplusplus
extern "C" {
#endif

typedef enum hova_errno_e {
    HOVA_OK = 0,
    HOVA_NoInputSignal = 1,
    HOVA_TryAgain = 2,
    HOVA_InvalidParam = 3,
    HOVA_NotEnoughMemory = 4,
    HOVA_OpenFailed = 5,
    HOVA_SeekFailed = 6,
    HOVA_ProgramChanged = 7,
    HOVA_EndOfStream = 8,
    HOVA_AVFrameEmpty = 9,
    HOVA_AllocatorDisabled = 10
} hova_errno_et;

typedef enum hova_stream_type_e {
    HOVA_STREAM_NONE = 0,
    HOVA_STREAM_PROG = 1,
    HOVA_STREAM_AUDIO = 2,
    HOVA_STREAM_VIDEO = 3,
    HOVA_STREAM_SUBTITLE = 4,
    HOVA_STREAM_ID3_METADATA = 5,
    HOVA_STREAM_ESG = 6,
    HOVA_STREAM_EMG = 7,
    HOVA_STREAM_CA = 8,
    HOVA_STREAM_PROG2 = 9,
    HOVA_STREAM_BROADCAST = 10,
    HOVA_STREAM_EDITION = 11,
    HOVA_STREAM_CHAPTER = 12,
    HOVA_STREAM_TS_ECM = 13,
    HOVA_STREAM_TSP_CONFIG = 14,
    HOVA_STREAM_CLIP = 15
} hova_stream_type_et;

typedef enum hova_drop_level_e {
    HOVA_DROP_NONE = 0,
    HOVA_DROP_1_3 = 1,
    HOVA_DROP_1_2 = 2,
    HOVA_DROP_2_3 = 3,
    HOVA_DROP_3_4 = 4,
    HOVA_DROP_FULL = 5
} hova_drop_level_et;

typedef enum hova_input_type_e {
    HOVA_INPUT_MASTER = 0,
    HOVA_INPUT_TRICK_FORWARD = 1,
    HOVA_INPUT_TRICK_BACKWARD = 2
} hova_input_type_et;

typedef enum hova_probe_method_e {
    HOVA_PROBE_NORMAL = 0,
    HOVA_PROBE_NO_IO = 1,
    HOVA_PROBE_SLOW = 2
} hova_probe_method_et;

typedef enum hova_player_notify_e {
    HOVA_NOTIFY_NONE = 0,
    HOVA_NOTIFY_SET_CONFIG_DONE = 1,
    HOVA_NOTIFY_VDEC_INIT_OK = 2,
    HOVA_NOTIFY_ADEC_INIT_OK = 3,
    HOVA_NOTIFY_AV_DEC_INIT_OK = 4,
    HOVA_NOTIFY_DISABLE_VIDEO = 5,
    HOVA_NOTIFY_DISABLE_AUDIO = 6,
    HOVA_NOTIFY_GET_SVP_CONFIG_DONE = 7,
    HOVA_NOTIFY_SVP_VERSION = 8
} hova_player_notify_et;

typedef enum hova_event_e {
    HOVA_EVENT_EOS = 0,
    HOVA_EVENT_SEND_ID3_METADATA = 1,
    HOVA_EVENT_SEND_TS_DETECT_SDR_TO_DOVI = 2,
    HOVA_EVENT_SEND_TS_PID = 3,
    HOVA_EVENT_SEND_ECM_INFO = 4
} hova_event_et;

typedef enum hova_seek_direction_e {
    HOVA_SEEK_FORWARD = 0,
    HOVA_SEEK_BACKWARD = 1
} hova_seek_direction_et;

typedef enum hova_ts_type_e {
    HOVA_TS_PTS = 0,
    HOVA_TS_DTS = 1
} hova_ts_type_et;

typedef enum hova_string_format_e {
    HOVA_STRING_FORMAT_UTF8 = 0,
    HOVA_STRING_FORMAT_ASCII = 1,
    HOVA_STRING_FORMAT_UCS2 = 2,
    HOVA_STRING_FORMAT_UTF16BE = 3,
    HOVA_STRING_FORMAT_UTF16LE = 4
} hova_string_format_et;

/* DRM arguments belong to the host; this plug-in never calls the DRM slots. */
typedef int hova_drm_type_et;
typedef int hova_drm_query_info_et;
typedef int hova_drm_set_info_et;

/* ---- information records (get_info) ---- */

typedef struct hova_string_info_s {
    unsigned int size;
    unsigned char* payload;
    hova_string_format_et stringformat;
} hova_string_info_s, hova_string_info_st;

typedef struct hova_data_info_s {
    int length;
    unsigned char* payload;
} hova_data_info_s, hova_data_info_st;

typedef struct hova_name_info_s {
    int32_t count;
    char (*content)[256];
    char (*language)[4];
} hova_name_info_s, hova_name_info_st;

typedef struct hova_clip_info_s {
    int seekable;
    int num_program;
    int active_program;
    hova_ts_type_et ts_type;
    int tee_path;
    uint8_t seek_without_index;
} hova_clip_info_s, hova_clip_info_st;

typedef struct hova_program_info_s {
    int64_t duration;
    int64_t base_pts;
    int64_t output_base_pts;
    int num_video_streams;
    int num_audio_streams;
    int num_subtitle_streams;
    int num_editions;
    int active_video;
    int active_audio;
    int active_subtitle;
    int active_edition;
    int dynamic_subtitle;
    int divx_plus;
    int divx_drm;
    int divx_trick_track;
    int year;
    int disc_number;
    int total_disk;
    int track_number;
    int total_track;
    int compilation;
    int delay;
    int padding;
    int discontinuity_count;
    hova_name_info_st tag_title;
    hova_data_info_st law_rating;
    hova_string_info_st title;
    hova_string_info_st artist;
    hova_data_info_st private_data;
    hova_name_info_st edition_title[16];
    hova_string_info_st album;
    hova_string_info_st comment;
    hova_string_info_st composer;
    hova_string_info_st album_artist;
    hova_string_info_st grouping;
    hova_data_info_st cover;
    hova_data_info_st location;
    hova_string_info_st writer;
    const char* genre;
    const char* date;
    float capture_framerate;
    int pic_offset;
} hova_program_info_s, hova_program_info_st;

typedef struct hova_audio_info_s {
    int stream_id;
    int codec;
    int sample_rate;
    int bit_rate;
    int channel_num;
    hova_data_info_st desc;
    hova_name_info_st tag_title;
    char language[4];
    uint8_t component_tag;
    uint8_t is_audio_description;
} hova_audio_info_s, hova_audio_info_st;

typedef struct hova_hdr10_masteringMetadata_s {
    uint16_t primaryRChromaticityX;
    uint16_t primaryRChromaticityY;
    uint16_t primaryGChromaticityX;
    uint16_t primaryGChromaticityY;
    uint16_t primaryBChromaticityX;
    uint16_t primaryBChromaticityY;
    uint16_t whitePointChromaticityX;
    uint16_t whitePointChromaticityY;
    uint32_t luminanceMax;
    uint32_t luminanceMin;
} hova_hdr10_masteringMetadata_s, hova_hdr10_masteringMetadata_st;

typedef struct hova_hdr10_colour_info_s {
    uint32_t size;
    uint32_t version;
    int8_t matrixCoefficients;
    uint8_t bitsPerChannel;
    uint8_t chromaSubsamplingHorz;
    uint8_t chromaSubsamplingVert;
    uint8_t cbSubsamplingHorz;
    uint8_t cbSubsamplingVert;
    uint8_t chromaSitingHorz;
    uint8_t chromaSitingVert;
    uint8_t range;
    uint8_t transferCharacteristics;
    uint8_t primaries;
    uint16_t maxCLL;
    uint16_t maxFALL;
    hova_hdr10_masteringMetadata_st maseteringMetadata;
} hova_hdr10_colour_info_s, hova_hdr10_colour_info_st;

typedef struct hova_video_info_s {
    int stream_id;
    int codec;
    int width;
    int height;
    int display_width;
    int display_height;
    int frame_rate_num;
    int frame_rate_den;
    int bit_rate;
    int mvc_type;
    hova_data_info_st desc;
    int dv_profile;
    int dv_level;
    int dv_metaorder;
    int dv_bl_signal_compatibility_id;
    uint8_t component_tag;
    int is_hdr10_metadata_available;
    hova_hdr10_colour_info_st hdr10_metadata;
} hova_video_info_s, hova_video_info_st;

typedef struct hova_timeline_info_s {
    uint64_t pts_tick;
    uint64_t media_timestamp;
    uint32_t timescale;
    uint8_t timeline_id;
    uint8_t has_timestamp;
    uint8_t is_force_reload;
    uint8_t is_paused;
    uint8_t is_discontinuity;
} hova_timeline_info_s, hova_timeline_info_st;

/* ---- callbacks the host offers; each receives `context` first ----
 * Called only on the thread inside an entry point (never on the reader's
 * streaming thread). docs/integration.md has the whole contract. */

typedef struct hova_callback_s {
    int (*notify)(void* context, hova_stream_type_et type, hova_event_et event);
    /* Every block the plug-in holds comes from malloc (during open_file only). */
    void* (*malloc)(void* context, size_t size);
    void* (*realloc)(void* context, void* ptr, size_t size); /* not called */
    /* `pptr` is the address of the plug-in's pointer: free *(void**)pptr and
     * set it to NULL; a NULL *pptr is accepted. */
    void (*freep)(void* context, void* pptr);
    int64_t (*get_time)(void* context); /* microseconds, monotonic */
    /* A frame buffer of `size` bytes: return 0 and store its address in
     * *buffer; non-zero refuses. One pending frame per stream type. */
    int (*stream_alloc)(void* context, hova_stream_type_et type, void** buffer, int size);
    /* Gives the pending frame back uncommitted. */
    int (*stream_discard)(void* context, hova_stream_type_et type);
    /* Publishes the pending frame. packet_type 1: the configuration record
     * (int32 codec code, then the codec data), sent once per stream before
     * its frames; 0: a media frame, pts in microseconds (-1 unknown). */
    int (*stream_commit)(void* context, hova_stream_type_et type, int size, int64_t pts,
                         int64_t duration, int packet_type);
    /* Grows the pending frame, keeping its bytes: 0 and the (maybe moved)
     * address in *buffer; non-zero refuses (the frame is then discarded). */
    int (*stream_realloc)(void* context, hova_stream_type_et type, void** buffer, int size);
    int (*drm_init)(void* context, hova_drm_type_et type, void* data, int len);
    int (*drm_decrypt)(void* context, hova_stream_type_et type, void* in, int in_len, void* out,
                       int out_len);
    int (*drm_get_one_frame)(void* context, hova_stream_type_et type, int64_t* pts, void** buf,
                             int* len);
    int (*drm_get_info)(void* context, hova_drm_query_info_et what, void* data);
    int (*drm_set_info)(void* context, hova_drm_set_info_et what, void* data);
    int (*stream_check_rbuf_size)(void* context, hova_stream_type_et type);
    void* context;
} hova_callback_s, hova_callback_st;

/* ---- the descriptor a demuxer plug-in exports ----
 * open_file stores the context (the first 8-byte boundary in `buffer`, not
 * always `buffer`) through `ctx`; every later slot takes that pointer. The
 * entry points of one context are called from one thread at a time. */

typedef struct hova_dmx_func_s {
    int (*probe)(const uint8_t* header, int len, cb_io_st* cbio, hova_probe_method_et method);
    int (*open_file)(void** ctx, cb_io_st* cbio, void* buffer, int bufsize, int ringbuf_size,
                     const hova_callback_st* cb);
    int (*close_file)(void* ctx);
    int (*get_info)(void* ctx, hova_stream_type_et type, int index, void* info);
    int (*get_data)(void* ctx, hova_stream_type_et* type, int* bufsize, int64_t* pts);
    int (*seek_time)(void* ctx, int dir, int64_t* pts, int query_only);
    int (*resync_time)(void* ctx, int64_t resync_time);
    int (*set_track)(void* ctx, hova_stream_type_et type, int index, int64_t pts,
                     hova_input_type_et input_type);
    int (*set_drop)(void* ctx, hova_drop_level_et level);
    int (*set_edition)(void* ctx, int edition);
    int (*set_multi_thumb)(void* ctx, int64_t interval);
    int (*release_data)(void* ctx, void* data, int size);
    int (*get_frame_info)(void* ctx, hova_stream_type_et* type, int* size, int64_t* pts,
                          int* flags);
    int (*get_frame_data)(void* ctx, hova_stream_type_et* type, int* size, int64_t* pts);
    void (*reset_avframe)(void* ctx, hova_stream_type_et type);
    void (*discard_avframe)(void* ctx, hova_stream_type_et type);
    int (*queue_avframe)(void* ctx, int count, hova_stream_type_et type, int64_t pts);
    int (*deliver_avframe)(void* ctx, int* size, int64_t* pts, hova_stream_type_et type);
    int (*peek_avframe)(void* ctx, int* size, int64_t* pts, hova_stream_type_et type);
    int min_context_size; /* the context with two stream records; see asf_demuxer.h for more */
    int support_avframe_video;
    int support_avframe_audio;
    int support_fast_track_switch;
    int (*notify_event)(void* ctx, hova_player_notify_et event, void* data);
    int (*set_unset_temi_config)(void* ctx, int pid, uint8_t set, uint8_t id);
    int (*get_timeline_info)(void* ctx, uint64_t pts, int pid, uint8_t id,
                             hova_timeline_info_st* info);
} hova_dmx_func_s, hova_dmx_func_st;

#ifdef __cplusplus
}
#endif

#endif /* HOVA_DMX_H */
