#include "sys_msft.h"

#include <cstring>

#include "asffdec/asf_guid.h"
#include "byte_reader.h"

namespace {

using plimo::load_le;

constexpr uint32_t kAudioHeader = MSFT_AUDIO_HEADER_SIZE;

struct TagCodec {
    uint16_t tag;
    HOVAAudioType codec;
};

constexpr TagCodec kTagTable[] = {
    {0x0001, CLIP_AUDIO_TYPE_LPCM},      {0x0003, CLIP_AUDIO_TYPE_LPCM},
    {0x0002, CLIP_AUDIO_TYPE_ADPCM},     {0x0011, CLIP_AUDIO_TYPE_ADPCM},
    {0x0006, CLIP_AUDIO_TYPE_PCM},       {0x0007, CLIP_AUDIO_TYPE_PCM},
    {0x000A, CLIP_AUDIO_TYPE_WMA_VOICE}, {0x0050, CLIP_AUDIO_TYPE_MP3},
    {0x0055, CLIP_AUDIO_TYPE_MP3},       {0x0092, CLIP_AUDIO_TYPE_AC3},
    {0x2000, CLIP_AUDIO_TYPE_AC3},       {0x00FE, CLIP_AUDIO_TYPE_AMRNB},
    {0x00FF, CLIP_AUDIO_TYPE_AAC},       {0x706D, CLIP_AUDIO_TYPE_AAC},
    {0x0160, CLIP_AUDIO_TYPE_WMA1},      {0x0161, CLIP_AUDIO_TYPE_WMA2},
    {0x0162, CLIP_AUDIO_TYPE_WMA3},      {0x0163, CLIP_AUDIO_TYPE_WMA_LOSSLESS},
    {0x2001, CLIP_AUDIO_TYPE_DTS},       {0x566F, CLIP_AUDIO_TYPE_VORBIS},
    {0x7653, CLIP_AUDIO_TYPE_LPCM},      {0x7654, CLIP_AUDIO_TYPE_LPCM},
    {0x7655, CLIP_AUDIO_TYPE_LPCM},      {0x7656, CLIP_AUDIO_TYPE_LPCM},
    {0x7657, CLIP_AUDIO_TYPE_ADPCM},
};

struct FourccCodec {
    char cc[4];
    HOVAVideoType codec;
};

// Characters in file order; case matters unless a variant is listed.
constexpr FourccCodec kFourccTable[] = {
    {{'M', 'P', '4', 'S'}, CLIP_VIDEO_TYPE_MP4S}, {{'M', '4', 'S', '2'}, CLIP_VIDEO_TYPE_M4S2},
    {{'M', 'P', '4', 'V'}, CLIP_VIDEO_TYPE_M4V},  {{'m', 'p', '4', 'v'}, CLIP_VIDEO_TYPE_M4V},
    {{'F', 'M', 'P', '4'}, CLIP_VIDEO_TYPE_M4V},  {{'R', 'M', 'P', '4'}, CLIP_VIDEO_TYPE_M4V},
    {{'3', 'I', 'V', '2'}, CLIP_VIDEO_TYPE_M4V},  {{'X', 'V', 'I', 'D'}, CLIP_VIDEO_TYPE_M4V},
    {{'x', 'v', 'i', 'd'}, CLIP_VIDEO_TYPE_M4V},  {{'D', 'X', '5', '0'}, CLIP_VIDEO_TYPE_DX50},
    {{'M', 'P', 'G', '4'}, CLIP_VIDEO_TYPE_MP41}, {{'M', 'P', '4', '2'}, CLIP_VIDEO_TYPE_MP42},
    {{'M', 'P', '4', '3'}, CLIP_VIDEO_TYPE_DIV3}, {{'D', 'I', 'V', '3'}, CLIP_VIDEO_TYPE_DIV3},
    {{'d', 'i', 'v', '3'}, CLIP_VIDEO_TYPE_DIV3}, {{'D', 'I', 'V', 'X'}, CLIP_VIDEO_TYPE_DIVX},
    {{'d', 'i', 'v', 'x'}, CLIP_VIDEO_TYPE_DIVX}, {{'B', 'L', 'Z', '0'}, CLIP_VIDEO_TYPE_DIVX},
    {{'F', 'L', 'V', '1'}, CLIP_VIDEO_TYPE_FLV1}, {{'f', 'l', 'v', '\0'}, CLIP_VIDEO_TYPE_FLV1},
    {{'H', '2', '6', '3'}, CLIP_VIDEO_TYPE_H263}, {{'h', '2', '6', '3'}, CLIP_VIDEO_TYPE_H263},
    {{'M', 'J', 'P', 'G'}, CLIP_VIDEO_TYPE_MJPG}, {{'m', 'j', 'p', 'g'}, CLIP_VIDEO_TYPE_MJPG},
    {{'a', 'v', 'c', '1'}, CLIP_VIDEO_TYPE_AVC1}, {{'H', '2', '6', '4'}, CLIP_VIDEO_TYPE_AVC1},
    {{'h', '2', '6', '4'}, CLIP_VIDEO_TYPE_AVC1}, {{'X', '2', '6', '4'}, CLIP_VIDEO_TYPE_AVC1},
    {{'x', '2', '6', '4'}, CLIP_VIDEO_TYPE_AVC1}, {{'V', 'S', 'S', 'H'}, CLIP_VIDEO_TYPE_AVC1},
    {{'M', 'P', 'E', 'G'}, CLIP_VIDEO_TYPE_MP2V}, {{'M', 'P', 'G', '1'}, CLIP_VIDEO_TYPE_MP2V},
    {{'M', 'P', 'G', '2'}, CLIP_VIDEO_TYPE_MP2V}, {{'m', 'p', 'g', '1'}, CLIP_VIDEO_TYPE_MP2V},
    {{'m', 'p', 'g', '2'}, CLIP_VIDEO_TYPE_MP2V}, {{'C', 'R', 'A', 'M'}, CLIP_VIDEO_TYPE_MSVC},
    {{'V', 'P', '6', 'F'}, CLIP_VIDEO_TYPE_VP60}, {{'V', 'P', '8', '0'}, CLIP_VIDEO_TYPE_VP80},
    {{'W', 'M', 'V', '1'}, CLIP_VIDEO_TYPE_WMV1}, {{'W', 'M', 'V', '2'}, CLIP_VIDEO_TYPE_WMV2},
    {{'W', 'M', 'V', '3'}, CLIP_VIDEO_TYPE_WMV3}, {{'W', 'M', 'V', 'A'}, CLIP_VIDEO_TYPE_WMVA},
    {{'W', 'V', 'C', '1'}, CLIP_VIDEO_TYPE_WVC1}, {{'I', 'V', '3', '2'}, CLIP_VIDEO_TYPE_IV32},
    {{'i', 'v', '3', '2'}, CLIP_VIDEO_TYPE_IV32}, {{'I', 'V', '4', '1'}, CLIP_VIDEO_TYPE_IV41},
    {{'i', 'v', '4', '1'}, CLIP_VIDEO_TYPE_IV41}, {{'D', 'V', 'S', 'D'}, CLIP_VIDEO_TYPE_DVSD},
    {{'d', 'v', 's', 'd'}, CLIP_VIDEO_TYPE_DVSD}, {{'C', 'A', 'V', 'S'}, CLIP_VIDEO_TYPE_AVS1},
    {{'M', 'S', 'S', '2'}, CLIP_VIDEO_TYPE_MSS2}, {{'H', 'E', 'V', 'C'}, CLIP_VIDEO_TYPE_HEVC},
    {{'h', 'e', 'v', 'c'}, CLIP_VIDEO_TYPE_HEVC},
};

// Codecs whose decoder wants the whole WAVEFORMATEX rather than the bytes
// behind it.
bool keeps_whole_header(HOVAAudioType c) {
    switch (c) {
        case CLIP_AUDIO_TYPE_ADPCM:
        case CLIP_AUDIO_TYPE_LPCM:
        case CLIP_AUDIO_TYPE_PCM:
        case CLIP_AUDIO_TYPE_WMA1:
        case CLIP_AUDIO_TYPE_WMA2:
        case CLIP_AUDIO_TYPE_WMA3:
            return true;
        default:
            return false;
    }
}

// Reads n bytes (dst may not be null); returns the count delivered.
uint32_t read_into(sys_demuxer_st* d, uint8_t* dst, uint32_t n) {
    cb_buffer_st* cb = &d->cbuffer;
    uint32_t done = 0;
    while (done < n) {
        const uint32_t want = (n - done) > 0x40000000u ? 0x40000000u : (n - done);
        const int32_t got = cb->cb_read(cb, dst + done, static_cast<int32_t>(want));
        if (got <= 0) break;
        done += static_cast<uint32_t>(got);
        if (static_cast<uint32_t>(got) < want) break;
    }
    return done;
}

// The subformat of WAVEFORMATEXTENSIBLE is a format tag when it is the base
// GUID with only its first field changed.
bool is_tag_subformat(const uint8_t* sub) {
    return std::memcmp(sub + 4, reinterpret_cast<const uint8_t*>(&wfex_guid) + 4, 12) == 0;
}

}  // namespace

extern "C" {

HOVAAudioType sys_msft_format_tag_to_acodec(int format_tag) {
    for (const TagCodec& e : kTagTable)
        if (e.tag == format_tag) return e.codec;
    return CLIP_AUDIO_TYPE_UNKNOWN;
}

HOVAAudioType sys_msft_format_extensible_to_acodec(const uint8_t* config, uint32_t config_len) {
    if (!config || config_len < MSFT_EXTENSIBLE_SIZE) return CLIP_AUDIO_TYPE_UNKNOWN;
    const uint8_t* sub = config + 24;
    if (is_tag_subformat(sub))
        return sys_msft_format_tag_to_acodec(load_le<uint16_t>(sub));
    const guid_st g = guid_from_bytes(sub);
    if (sys_is_equal_guid(&g, &ac3_guid)) return CLIP_AUDIO_TYPE_AC3;
    if (sys_is_equal_guid(&g, &eac3_guid)) return CLIP_AUDIO_TYPE_EAC3;
    if (sys_is_equal_guid(&g, &mp2_guid)) return CLIP_AUDIO_TYPE_MP3;
    return CLIP_AUDIO_TYPE_UNKNOWN;
}

HOVAVideoType sys_msft_fourcc_to_vcodec(uint32_t fourcc) {
    char cc[4];
    for (int i = 0; i < 4; ++i) cc[i] = static_cast<char>((fourcc >> (8 * i)) & 0xFF);
    for (const FourccCodec& e : kFourccTable)
        if (std::memcmp(e.cc, cc, 4) == 0) return e.codec;
    return CLIP_VIDEO_TYPE_UNKNOWN;
}

int sys_msft_parse_audio_header(sys_demuxer_st* d, sys_stream_st* s, uint32_t* size) {
    if (*size < MSFT_AUDIO_HEADER_SIZE) return HOVA_EndOfStream;
    uint8_t h[MSFT_AUDIO_HEADER_SIZE];
    if (read_into(d, h, sizeof h) != sizeof h) return HOVA_EndOfStream;
    *size -= MSFT_AUDIO_HEADER_SIZE;

    const uint16_t format_tag = load_le<uint16_t>(h + 0);
    const uint16_t channels = load_le<uint16_t>(h + 2);
    const uint16_t block_align = load_le<uint16_t>(h + 12);
    const uint16_t depth = load_le<uint16_t>(h + 14);
    sys_aud_inf_st& aud = s->info.aud;
    aud.sample_rate = load_le<uint32_t>(h + 4);
    aud.sample_size = block_align;
    aud.bit_rate = load_le<uint32_t>(h + 8) * 8u;
    aud.ch_num = channels;
    aud.sample_depth = depth;

    // The block holds config_len bytes; never copy or read past it.
    const uint64_t avail = static_cast<uint64_t>(*size) + MSFT_AUDIO_HEADER_SIZE;
    if (s->config_len > avail) s->config_len = static_cast<uint32_t>(avail);
    if (!s->config) s->config_len = 0;
    const uint32_t head = s->config_len < kAudioHeader ? s->config_len : kAudioHeader;
    if (head) std::memcpy(s->config, h, head);
    uint32_t extra = 0;
    if (s->config_len > MSFT_AUDIO_HEADER_SIZE) {
        extra = s->config_len - MSFT_AUDIO_HEADER_SIZE;
        const uint32_t got = read_into(d, s->config + MSFT_AUDIO_HEADER_SIZE, extra);
        *size -= got;
        if (got != extra) return HOVA_EndOfStream;
    }

    HOVAAudioType codec;
    uint32_t trim;
    if (format_tag == MSFT_AUDIO_EXTENSIBLE) {
        codec = sys_msft_format_extensible_to_acodec(s->config, s->config_len);
        const bool tag_form = s->config_len >= MSFT_EXTENSIBLE_SIZE && is_tag_subformat(s->config + 24);
        trim = (tag_form && keeps_whole_header(codec)) ? 0 : 24;
    } else {
        codec = sys_msft_format_tag_to_acodec(format_tag);
        trim = keeps_whole_header(codec) ? 0 : 2;  // cbSize
    }
    s->codec_type = codec;
    if (trim) {
        if (extra <= trim) {
            s->config_len = 0;
        } else {
            std::memmove(s->config, s->config + MSFT_AUDIO_HEADER_SIZE + trim, extra - trim);
            s->config_len = extra - trim;
        }
    }
    if (codec == CLIP_AUDIO_TYPE_AAC &&
        block_align == static_cast<uint32_t>(channels) * depth / 8u)
        aud.sample_size = 0;
    return HOVA_OK;
}

int sys_msft_parse_video_header(sys_demuxer_st* d, sys_stream_st* s, uint32_t* size,
                                uint32_t* fourcc) {
    if (*size < MSFT_VIDEO_HEADER_SIZE) return HOVA_EndOfStream;
    uint8_t h[MSFT_VIDEO_HEADER_SIZE];
    if (read_into(d, h, sizeof h) != sizeof h) return HOVA_EndOfStream;
    *size -= MSFT_VIDEO_HEADER_SIZE;

    const uint32_t compression = load_le<uint32_t>(h + 16);
    s->codec_type = sys_msft_fourcc_to_vcodec(compression);
    if (s->config_len > *size) s->config_len = *size;
    if (!s->config) s->config_len = 0;
    // Only the low 16 bits fit; a top-down image's negative height wraps.
    s->info.vid.width = static_cast<uint16_t>(load_le<uint32_t>(h + 4));
    s->info.vid.height = static_cast<uint16_t>(load_le<uint32_t>(h + 8));
    if (s->config_len) {
        const uint32_t got = read_into(d, s->config, s->config_len);
        *size -= got;
        if (got != s->config_len) return HOVA_EndOfStream;
    }
    if (fourcc) *fourcc = compression;
    return HOVA_OK;
}

int sys_is_codec_PCM(sys_stream_st* s) {
    return (s->codec_type == CLIP_AUDIO_TYPE_ADPCM || s->codec_type == CLIP_AUDIO_TYPE_LPCM ||
            s->codec_type == CLIP_AUDIO_TYPE_PCM)
               ? 1
               : 0;
}

}  // extern "C"
