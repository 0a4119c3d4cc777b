/* GUIDs of the ASF objects and media types the demuxer knows. */
#ifndef ASF_GUID_H
#define ASF_GUID_H

#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

/* Stored form: data1..data3 little-endian, then data4 in order (16 bytes). */
typedef struct guid_s {
    uint32_t data1;
    uint16_t data2;
    uint16_t data3;
    uint8_t data4[8];
} guid_s, guid_st;

extern const guid_st asf_header_object;
extern const guid_st asf_file_prop_object;
extern const guid_st asf_stream_prop_object;
extern const guid_st asf_stream_prop_object2;
extern const guid_st asf_header_extension_object;
extern const guid_st asf_reserved_1;
extern const guid_st asf_extended_stream_prop_object;
extern const guid_st asf_language_list_object;
extern const guid_st asf_metadata_library_object;
extern const guid_st asf_content_desc_object;
extern const guid_st asf_extended_content_desc_object;
extern const guid_st asf_simple_index_object;
extern const guid_st asf_audio_media;
extern const guid_st asf_video_media;
extern const guid_st asf_spread_audio;
extern const guid_st wfex_guid;
extern const guid_st ac3_guid;
extern const guid_st eac3_guid;
extern const guid_st mp2_guid;
/* Data object; not in the header walk's table, but located by open. */
extern const guid_st asf_data_object;

/* 1 when the 16 stored bytes are identical, else 0. */
int sys_is_equal_guid(const guid_st* g1, const guid_st* g2);

#ifdef __cplusplus
}
#endif

#ifdef __cplusplus
#include <cstring>
/* A GUID taken from its 16 stored bytes. */
inline guid_st guid_from_bytes(const uint8_t* p) {
    guid_st g;
    std::memcpy(&g, p, sizeof g);
    return g;
}
static_assert(sizeof(guid_st) == 16, "a GUID is stored in 16 bytes");
#endif

#endif /* ASF_GUID_H */
