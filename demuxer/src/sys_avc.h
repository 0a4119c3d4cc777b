/* AVC decoder configuration record (avcC) to start-code-prefixed parameter sets. */
#ifndef SYS_AVC_H
#define SYS_AVC_H

#include <stdint.h>

#include "sys_demuxer.h"

#ifdef __cplusplus
extern "C" {
#endif

/* Start code written before each parameter set. */
extern const uint8_t avccfgprefix[4];

/* Converts the avcC record into 00 00 00 01 + SPS ... 00 00 00 01 + PPS ... in
 * *out (replaced through sys_assign_config_with_realloc) and reports the NAL
 * length size of the samples. HOVA_OK, HOVA_NotEnoughMemory, or
 * HOVA_EndOfStream for a record that is too short. */
int parse_avc_video_config(sys_demuxer_st* d, const uint8_t* avcc, int len, uint8_t** out,
                           uint32_t* out_size, int* nal_length_size);

#ifdef __cplusplus
}
#endif

#endif /* SYS_AVC_H */
