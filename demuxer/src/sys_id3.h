/*
 * ID3 metadata for the framework's demuxers whose inputs carry it: an ID3v2
 * tag at the start of the input or an ID3v1 block in its last 128 bytes.
 * Decoded items are views into one host block that the caller owns.
 */
#ifndef SYS_ID3_H
#define SYS_ID3_H

#include <stdint.h>

#include "cb_buffer.h"
#include "hova_dmx.h"

#ifdef __cplusplus
extern "C" {
#endif

typedef enum {
    ID3_NONE = 0,
    ID3_TITLE = 1,
    ID3_ALBUM = 2,
    ID3_ARTIST = 4,
    ID3_GENRE = 8,
    ID3_YEAR = 16,
    ID3_COMMENT = 32,
    ID3_APIC = 64,
    ID3_CONTENT = 128,  /* never set */
    ID3_COMPILATION = 256,
    ID3_COMPOSER = 512,
    ID3_ALBUMARTIST = 1024,
    ID3_DISCNUMBER = 2048,
    ID3_CDTRACKNUMBER = 4096,
    ID3_GROUPING = 8192,
    ID3_LYRICIST = 16384
} ID3_TAG_FLAG_T;

typedef struct ST_ID3_INFO {
    hova_string_info_st Title;
    hova_string_info_st Artist;
    hova_string_info_st Album;
    hova_string_info_st Year;
    hova_string_info_st Comment;
    hova_string_info_st Genre;
    hova_string_info_st Compilation;
    hova_string_info_st Composer;
    hova_string_info_st AlbumArtist;
    hova_string_info_st DiscNumber;
    hova_string_info_st CDTrackNumber;
    hova_string_info_st Grouping;
    hova_data_info_st Pic;
    hova_string_info_st Lyricist;
    uint32_t u32ID3TagSize;  /* ID3v2 size without its header, after unsynchronisation */
    uint32_t eID3TagFlags;   /* ID3_TAG_FLAG_T bits of the items present */
    uint32_t pic_offset;     /* picture data offset within the tag */
} ST_ID3_INFO;

typedef struct id3_context_s {
    int id3_v2_size;         /* ID3v2 tag size, header included */
    int id3_v1_size;         /* 128 once the end of the input was examined */
    cb_fpos file_size;       /* set by the caller; all ones when unknown */
    ST_ID3_INFO id3_info;
    uint8_t* id3_info_buffer;
} id3_context_s, id3_context_st;

/* Bytes of the ID3v1 block copy: the six fields, each NUL-terminated. */
#define ID3V1_BLOCK_SIZE 134

/* With the reader at the start of the input: 1 when an ID3v2 tag was taken or
 * an ID3v1 tag decoded (the caller then owns id3_info_buffer), 0 otherwise. */
int parse_ID3(cb_buffer_st* reader, const hova_callback_st* cb, id3_context_st* ctx);

/* Points the program information at the decoded items (nothing is copied). */
void get_id3_info(hova_program_info_st* info, const ST_ID3_INFO* id3);

/* Finds "ID3" in the first count - 9 positions: 1 with its position and whole size. */
int find_ID3v2(const uint8_t* buf, int count, int* position, int* size);

/* The 28-bit value of four syncsafe bytes. */
uint32_t calc_ID3v2_size(const uint8_t* bytes);

/* 1 when the 4 bytes at `offset` form a frame ID, 0 when not, -1 past the end. */
int check_tag(const uint8_t* buf, uint32_t count, uint32_t offset);

/* Copies a fixed-width ID3v1 field plus a NUL and advances the cursor;
 * *len = text length up to the first NUL, plus 1. */
void copy_id3_tag(const uint8_t** cursor, int width, uint8_t* out, unsigned int* len);

hova_string_format_et parse_string_format(uint8_t encoding);

/* Drops a text frame's encoding byte: shifts size - 1 bytes left and ends with a NUL. */
void move_zero_to_string_end(uint8_t* frame, uint32_t size);

#ifdef __cplusplus
}
#endif

#endif /* SYS_ID3_H */
