/*
 * Microsoft media types of the shared toolkit: WAVEFORMATEX (plain and
 * extensible) and BITMAPINFOHEADER read through the demuxer's reader, and the
 * mapping of format tags and FourCCs to the host's codec codes.
 */
#ifndef SYS_MSFT_H
#define SYS_MSFT_H

#include <stdint.h>

#include "hova_codec.h"
#include "sys_demuxer.h"

#ifdef __cplusplus
extern "C" {
#endif

/* Format tags known by name. */
typedef enum msft_audio_format_e {
    MSFT_AUDIO_PCM = 1,
    MSFT_AUDIO_MS_ADPCM = 2,
    MSFT_AUDIO_F32LE_PCM = 3,
    MSFT_AUDIO_ALAW = 6,
    MSFT_AUDIO_MULAW = 7,
    MSFT_AUDIO_WMAVOICE = 10,
    MSFT_AUDIO_IMA_ADPCM_MS = 17,
    MSFT_AUDIO_MPG = 80,
    MSFT_AUDIO_MP3 = 85,
    MSFT_AUDIO_AC3_SPDIF = 146,
    MSFT_AUDIO_AMR = 254,
    MSFT_AUDIO_AAC = 255,
    MSFT_AUDIO_WMA1 = 352,
    MSFT_AUDIO_WMA2 = 353,
    MSFT_AUDIO_WMA3 = 354,
    MSFT_AUDIO_WMA_LOSSLESS = 355,
    MSFT_AUDIO_AC3 = 8192,
    MSFT_AUDIO_DTS = 8193,
    MSFT_AUDIO_VORBIS = 22127,
    MSFT_AUDIO_FAAC = 28781,
    MSFT_AUDIO_EXTENSIBLE = 65534
} msft_audio_format_et;

/* Sizes of the fixed parts read from the file. */
enum { MSFT_AUDIO_HEADER_SIZE = 16, MSFT_VIDEO_HEADER_SIZE = 40, MSFT_EXTENSIBLE_SIZE = 40 };

HOVAAudioType sys_msft_format_tag_to_acodec(int format_tag);
/* `config` is the whole WAVEFORMATEXTENSIBLE structure. */
HOVAAudioType sys_msft_format_extensible_to_acodec(const uint8_t* config, uint32_t config_len);
HOVAVideoType sys_msft_fourcc_to_vcodec(uint32_t fourcc);

/* Both read from d's reader, which stands at the structure; `size` holds the
 * bytes of type-specific data still unread and drops by every byte read. The
 * caller has allocated s->config with s->config_len bytes. */
int sys_msft_parse_audio_header(sys_demuxer_st* d, sys_stream_st* s, uint32_t* size);
int sys_msft_parse_video_header(sys_demuxer_st* d, sys_stream_st* s, uint32_t* size,
                                uint32_t* fourcc);

/* 1 for ADPCM, LPCM and PCM streams, else 0. */
int sys_is_codec_PCM(sys_stream_st* s);

#ifdef __cplusplus
}
#endif

#endif /* SYS_MSFT_H */
