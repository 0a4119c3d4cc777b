/* Codec configuration blocks held by a stream and replaced in place. */
#ifndef SYS_CONFIG_H
#define SYS_CONFIG_H

#include <stdint.h>

#include "sys_demuxer.h"

#ifdef __cplusplus
extern "C" {
#endif

/* Replaces the content of *config with `len` bytes of `src`, reusing the block
 * when it is large enough. When a larger block cannot be had, the old block
 * keeps its length and receives as much of `src` as fits. */
void sys_assign_config_with_realloc(sys_demuxer_st* d, uint8_t** config, uint32_t* config_len,
                                    const uint8_t* src, uint32_t len);

#ifdef __cplusplus
}
#endif

#endif /* SYS_CONFIG_H */
