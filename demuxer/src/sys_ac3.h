/* Dolby audio headers: AC-3 / E-AC-3 channel counts and the AC-4 sync frame header. */
#ifndef SYS_AC3_H
#define SYS_AC3_H

#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

/* Full-range channels per AC-3 audio coding mode (acmod 0..7). */
extern const uint8_t AC3ChannelTable[8];

/* Bytes of a sync frame header that must be in the buffer before it is examined. */
#define SYS_AC3_HEADER_BYTES 7
#define SYS_EAC3_HEADER_BYTES 5

/* 1 and the channel count (LFE included) of the first usable sync frame, -1 when none. */
int sys_get_ac3_channel_count(const uint8_t* buf, int len, int EAC3_flag, int* channels);

/* Writes the 7-byte AC-4 sync frame header (no CRC, 24-bit frame size). */
void sys_update_ac4_header(uint8_t* header, uint32_t frame_size);

#ifdef __cplusplus
}
#endif

#endif /* SYS_AC3_H */
