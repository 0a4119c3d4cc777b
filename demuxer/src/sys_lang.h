/* Language codes and genre names of the shared toolkit. */
#ifndef SYS_LANG_H
#define SYS_LANG_H

#include "hova_dmx.h"

#ifdef __cplusplus
extern "C" {
#endif

/* Three-letter (bibliographic) code of the two-letter code at `code`, or NULL.
 * Compares exactly the first two bytes, case-sensitively. */
const char* sys_alpha2_to_alpha3(const char* code);

/* Name of ID3 genre `index` (0..148; 148 is ""), or NULL outside that range. */
const char* sys_index_to_genre(int index);

/* Wraps a NUL-terminated string as a host data record (nothing is copied). */
void sys_set_info_from_string(hova_data_info_st* info, char* str);

#ifdef __cplusplus
}
#endif

#endif /* SYS_LANG_H */
