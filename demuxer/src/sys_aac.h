/*
 * AAC configuration: the channel count of ADTS, LOAS/LATM and
 * AudioSpecificConfig data, and the AudioSpecificConfig a demuxer sends to
 * the host for raw AAC.
 */
#ifndef SYS_AAC_H
#define SYS_AAC_H

#include <stdint.h>

#include "bit_reader.h"
#include "sys_demuxer.h"

typedef struct aac_parameter_s {
    int object_type;
    int sample_rate;      /* Hz */
    int channels;
    int sbr;              /* non-zero: signal SBR explicitly */
    int ext_object_type;  /* not used */
    int ext_sample_rate;  /* Hz, the SBR output rate */
} aac_parameter_s, aac_parameter_st;

typedef struct audioSpecificConfig_s {
    uint32_t samplingFrequencyIndex;
    uint32_t samplingFrequency;
    uint32_t channelsConfiguration;
    int objectTypeIndex;
    int sbr_present_flag;
    int forceUpSampling;
    int downSampledSBR;
} audioSpecificConfig_s, audioSpecificConfig_st;

/* MPEG-4 sampling frequency index table; indexes 13 to 15 are reserved (0). */
extern const uint32_t aac_sample_rates[16];
/* Channels per channel configuration; 0 where a PCE or reserved value applies. */
extern const int loas_channel_table[16];

#ifdef __cplusplus
extern "C" {
#endif

/* LatmGetValue: a 1- to 4-byte value preceded by its 2-bit byte count minus one. */
uint32_t aac_parse_latm_get_value(buffer_bitstream_st* bs);

/* Rate of sampling frequency index `index`, 0 outside the table. */
uint32_t aac_get_loas_sample_rate(int index);

/* Reads object type, rate index and channel configuration. 1 when they name a
 * supported AAC flavour with a known channel count (written to *channels). */
int AudioSpecificConfig(int asc_len, audioSpecificConfig_st* asc, buffer_bitstream_st* bs,
                        int* channels);

/* 1 and the channel count when `buf` starts with a usable AudioSpecificConfig, else 0. */
int sys_get_aac_audiospecificconfig_channel_count(const uint8_t* buf, int len, int* channels);

/* 1 and the channel count from the first LOAS frame that carries a usable
 * StreamMuxConfig, -1 when there is none. */
int sys_get_aac_latm_channel_count(const uint8_t* buf, int len, int* channels);

/* 1 when an ADTS header with a valid sampling frequency is found, 0 otherwise.
 * *channels receives the raw channel configuration (0..7) of the last candidate. */
int sys_get_aac_adts_channel_count(const uint8_t* buf, int len, int* channels);

/* Writes a 2-byte AudioSpecificConfig, or 5 bytes with explicit SBR signalling,
 * into *config (allocated from the host when null; *config_len 0 on failure). */
void sys_update_aac_config(sys_demuxer_st* d, uint8_t** config, uint32_t* config_len,
                           const aac_parameter_st* param);

#ifdef __cplusplus
}
#endif

#endif /* SYS_AAC_H */
