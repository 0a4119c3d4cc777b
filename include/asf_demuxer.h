/*
 * The ASF demuxer context: the fixed record the host buffer holds, followed
 * directly by the per-stream records.
 */
#ifndef ASF_DEMUXER_H
#define ASF_DEMUXER_H

#include <stdint.h>

#include "sys_demuxer.h"

#ifdef __cplusplus
extern "C" {
#endif

typedef enum parse_mode_e { PARSE_SEQ = 0, PARSE_SEP = 1 } parse_mode_et;

/* Value types of ASF descriptors. */
typedef enum asf_data_type_e {
    ASF_DATA_STRING = 0,
    ASF_DATA_BYTE = 1,
    ASF_DATA_BOOL = 2,
    ASF_DATA_DWORD = 3,
    ASF_DATA_QWORD = 4,
    ASF_DATA_GUID = 5
} asf_data_type_et;

/* Cursor over one data packet and its current payload. */
typedef struct asf_packet_s {
    uint32_t num_payloads;      /* payloads not yet read; 0: next step reads a packet header */
    uint32_t payload_len_type;
    uint32_t packet_len;
    uint32_t padding_len;
    uint8_t property_flags;
    uint8_t stream_num;         /* key-frame bit included */
    uint8_t compressed_payload;
    uint8_t presentation_time_delta;
    uint32_t object_num;
    uint32_t offset_into_obj;
    uint32_t media_object_size;
    uint32_t presentation_time; /* ms; 0xFFFFFFFF when unknown */
    uint32_t payload_len;
    uint32_t parsed_size;
    uint64_t num;
} asf_packet_s, asf_packet_st;

typedef struct asf_stream_s {
    sys_stream_st s;
    int stream_num;
    int object_num;             /* -1 when none */
    int keyframe;
    uint8_t* buffer;            /* host frame buffer receiving the object */
    uint32_t object_size;
    uint32_t media_object_size;
    int64_t time_offset;        /* microseconds */
    int64_t pts;                /* -1 when unknown */
    uint32_t bitrate;
    asf_packet_st cache_data_packet;
    const char* lang;
} asf_stream_s, asf_stream_st;

typedef struct asf_demuxer_s {
    sys_demuxer_st s;
    int max_streams;
    uint64_t num_packets;
    uint64_t cur_packets;
    uint32_t first_packet;
    uint32_t packet_size;
    cb_fpos index_packet;
    uint32_t index_count;
    uint64_t index_time_interval;
    int64_t index_start_offset;
    uint32_t preroll;
    int seeked;
    int resync;
    uint32_t stream_bitrate[128];
    uint32_t time_per_frame[128];
    uint16_t stream_language_index[128];
    char language_list[128][3];
    parse_mode_et parse_mode;
    uint8_t a_spread_span;
    uint16_t a_spread_packet_len;
    uint16_t a_spread_chunk_len;
    hova_stream_type_et accept_stream_type;
    asf_packet_st cur_data_packet;
    hova_data_info_st cover;
    uint32_t pic_offset;
    hova_string_info_st title;
    hova_string_info_st author;
    hova_string_info_st albumTitle;
    int year;
    int parse_file_end;
    char* genre;
    asf_stream_st stream_info[];
} asf_demuxer_s, asf_demuxer_st;

/* Room the host allocates: the fixed record and one audio and one video record
 * (min_context_size). For N streams: sizeof(asf_demuxer_st) + N *
 * sizeof(asf_stream_st), in a buffer aligned to 8 bytes (add 8 otherwise);
 * every whole record the buffer holds is used. */
#define ASF_MIN_CONTEXT_SIZE ((int)(sizeof(asf_demuxer_st) + 2 * sizeof(asf_stream_st)))

#ifdef __cplusplus
}
#endif

#endif /* ASF_DEMUXER_H */
