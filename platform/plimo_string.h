/*
 * UTF-16LE (as native 16-bit units) to UTF-8. Callers measure, make room for
 * the measured size, then convert. Each unit is encoded on its own: surrogate
 * halves become separate 3-byte sequences.
 */
#ifndef PLIMO_STRING_H
#define PLIMO_STRING_H

#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

/* Bytes of the zero-terminated UTF-16 string in [start, end), terminator included. */
int get_UTF16_byte_length(const uint8_t* start, const uint8_t* end);

/* Bytes the UTF-8 form of [start, end) needs, terminator included. */
int calculate_UTF16_to_UTF8_size(const uint8_t* start, const uint8_t* end);

/* Writes the UTF-8 form of [start, end) to target, appending a terminator when absent. */
void convert_UTF16_to_UTF8(const uint8_t* start, const uint8_t* end, uint8_t* target);

#ifdef __cplusplus
}
#endif

#endif /* PLIMO_STRING_H */
