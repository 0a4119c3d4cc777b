// Functions shared between the ASF plug-in's files: the header walk and its
// object handlers, metadata helpers, open/close helpers and the queries the
// delivery code also uses.
#ifndef ASF_INTERNAL_H
#define ASF_INTERNAL_H

#include <cstddef>
#include <cstdint>

#include "asf_demuxer.h"

// Object sizes are carried in 64 bits so that what the walk counts is what it
// consumes, whatever the file declares.

// Header object from the current reader position to its end.
int asf_parse_header(asf_demuxer_st* demuxer);
int asf_parse_header_extension(asf_demuxer_st* demuxer, uint64_t size);
void asf_assign_bitrate(asf_demuxer_st* demuxer);
void asf_assign_language(asf_demuxer_st* demuxer);
int asf_valid_stream_num(int stream_num);

// One stream properties object; the reader stands behind its object header.
int asf_parse_stream_prop(asf_demuxer_st* demuxer, uint64_t size);
void reset_object_size(asf_stream_st* stream);

// Descriptive objects; each leaves the reader at the object's end (or
// reports a short read with HOVA_EndOfStream).
int asf_parse_content_desc(asf_demuxer_st* demuxer, uint64_t size);
int asf_parse_ext_content_desc(asf_demuxer_st* demuxer, uint64_t size);
int asf_parse_metadata_library(asf_demuxer_st* demuxer, uint64_t size);

int asf_read_wchar_str_with_malloc(asf_demuxer_st* demuxer, uint32_t length,
                                   hova_string_info_st* string_info);
size_t asf_read_utf16(asf_demuxer_st* demuxer, uint8_t* buffer, uint32_t buffer_len,
                      uint32_t size);
void asf_convert_wchar_to_char(hova_string_info_st* string_info);
int asf_read_cover(asf_demuxer_st* demuxer, uint32_t cover_length);
int asf_skip_picture_header_and_get_size(uint8_t* input, uint32_t input_len);

// Values of `seeked`: where video delivery may start after open or a seek.
// After open, at the first payload that starts an object; after a seek, at
// the first object start with the key-frame bit whose time is at or after
// the time the seek reported (kept in s.seek_time), so that a decoder's first
// picture has no missing reference.
inline constexpr int kAsfStartAnywhere = 0;
inline constexpr int kAsfStartAtObject = 1;
inline constexpr int kAsfStartAtKeyFrame = 2;

// Open and close helpers.
void asf_free_memory(asf_demuxer_st* demuxer);
void reset_data_packet(asf_packet_st* packet, uint64_t packet_num);
void reset_last_thumbnail_pts(asf_demuxer_st* demuxer);
void reset_stream_pts(asf_demuxer_st* demuxer);
void asf_parse_index(asf_demuxer_st* demuxer);
int asf_judge_streaming_seekable(asf_demuxer_st* demuxer);

// Queries.
int find_stream_with_index(asf_demuxer_st* ctx, hova_stream_type_et type, int index);
int asf_get_bitrate(asf_demuxer_st* demuxer, hova_stream_type_et type);
uint32_t asf_get_frame_duration(asf_demuxer_st* demuxer);

// Records of stream_info that fit in a host buffer of `bufsize` bytes at
// `buffer` once the context is placed at `ctx`.
int asf_stream_capacity(const void* buffer, int bufsize, const asf_demuxer_st* ctx);

#endif  // ASF_INTERNAL_H
