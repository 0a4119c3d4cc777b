#include "sys_aac.h"

#include <cstring>

#include "sys_output.h"

const uint32_t aac_sample_rates[16] = {96000, 88200, 64000, 48000, 44100, 32000, 24000, 22050,
                                       16000, 12000, 11025, 8000,  7350,  0,     0,     0};

const int loas_channel_table[16] = {0, 1, 2, 3, 4, 5, 6, 8, 0, 0, 0, 0, 0, 0, 0, 0};

namespace {

constexpr uint32_t kLoasSync = 0x2B7;

bool supported_object_type(int type) {
    switch (type) {
        case 1:   // AAC main
        case 2:   // LC
        case 4:   // LTP
        case 5:   // SBR
        case 29:  // PS
            return true;
        default:
            return false;
    }
}

// First index of `rate` in the table; 0 when it is not there.
uint8_t sample_rate_index(int rate, bool* found) {
    for (uint8_t i = 0; i < 16; ++i) {
        if (aac_sample_rates[i] == static_cast<uint32_t>(rate)) {
            if (found) *found = true;
            return i;
        }
    }
    if (found) *found = false;
    return 0;
}

// StreamMuxConfig of one LOAS frame (the reader stands after the sync word
// and length): 1 and the channel count from the first usable layer config.
bool latm_stream_mux_config(buffer_bitstream_st* bs, int* channels) {
    const uint32_t mux_version = buf_bit_read(bs, 1);
    if (mux_version == 1) {
        (void)buf_bit_read(bs, 1);  // audioMuxVersionA
        (void)aac_parse_latm_get_value(bs);  // taraBufferFullness
    }
    (void)buf_bit_read(bs, 1);  // allStreamsSameTimeFraming
    (void)buf_bit_read(bs, 6);  // numSubFrames
    const uint32_t num_program = buf_bit_read(bs, 4);
    for (uint32_t prog = 0; prog <= num_program; ++prog) {
        const uint32_t num_layer = buf_bit_read(bs, 3);
        for (uint32_t lay = 0; lay <= num_layer; ++lay) {
            if ((prog != 0 || lay != 0) && buf_bit_read(bs, 1) != 0) continue;  // useSameConfig
            const uint32_t asc_len = mux_version == 1 ? aac_parse_latm_get_value(bs) : 0;
            audioSpecificConfig_st asc;
            if (AudioSpecificConfig(static_cast<int>(asc_len), &asc, bs, channels) == 1) return true;
            buf_bit_skip(bs, asc_len);
        }
    }
    return false;
}

}  // namespace

extern "C" {

uint32_t aac_parse_latm_get_value(buffer_bitstream_st* bs) {
    const uint32_t bytes = buf_bit_read(bs, 2) + 1;
    if (bytes < 4) return buf_bit_read(bs, static_cast<int>(8 * bytes));
    const uint32_t hi = buf_bit_read(bs, 24);
    return (hi << 8) | buf_bit_read(bs, 8);
}

uint32_t aac_get_loas_sample_rate(int index) {
    return (index >= 0 && index < 16) ? aac_sample_rates[index] : 0;
}

int AudioSpecificConfig(int /*asc_len*/, audioSpecificConfig_st* asc, buffer_bitstream_st* bs,
                        int* channels) {
    std::memset(asc, 0, sizeof(*asc));
    asc->objectTypeIndex = static_cast<int>(buf_bit_read(bs, 5));
    asc->samplingFrequencyIndex = buf_bit_read(bs, 4);
    asc->channelsConfiguration = buf_bit_read(bs, 4);
    asc->samplingFrequency = aac_sample_rates[asc->samplingFrequencyIndex];
    if (!supported_object_type(asc->objectTypeIndex)) return 0;
    if (asc->samplingFrequency == 0 || asc->channelsConfiguration > 7) return 0;
    // Configuration 0 defers the layout to a program config element, which
    // is not parsed here: no count.
    *channels = loas_channel_table[asc->channelsConfiguration];
    return *channels != 0 ? 1 : 0;
}

int sys_get_aac_audiospecificconfig_channel_count(const uint8_t* buf, int len, int* channels) {
    if (channels == nullptr) return 0;
    buffer_bitstream_st bs;
    buf_stream_init(&bs, buf, len);
    audioSpecificConfig_st asc;
    return AudioSpecificConfig(len, &asc, &bs, channels);
}

int sys_get_aac_latm_channel_count(const uint8_t* buf, int len, int* channels) {
    if (buf == nullptr || channels == nullptr || len <= 0) return -1;
    for (int i = 0; i + 1 < len; ++i) {
        const uint32_t sync = (static_cast<uint32_t>(buf[i]) << 3) | (buf[i + 1] >> 5);
        if (sync != kLoasSync) continue;
        buffer_bitstream_st bs;
        buf_stream_init(&bs, buf + i, len - i);
        (void)buf_bit_read(&bs, 24);  // sync word and audioMuxLengthBytes
        if (buf_bit_read(&bs, 1) != 0) continue;  // useSameStreamMux: no config here
        if (latm_stream_mux_config(&bs, channels)) return 1;
    }
    return -1;
}

int sys_get_aac_adts_channel_count(const uint8_t* buf, int len, int* channels) {
    if (buf == nullptr || channels == nullptr || len <= 6) return 0;
    for (int i = 0; i + 3 < len; ++i) {
        // Rest of the 12-bit sync word and layer 0; ID and protection are free.
        if (buf[i] != 0xFF || (buf[i + 1] & 0xF6) != 0xF0) continue;
        *channels = ((buf[i + 2] & 0x01) << 2) | (buf[i + 3] >> 6);
        const int sf_index = (buf[i + 2] >> 2) & 0x0F;
        if (sf_index <= 11) return 1;
    }
    return 0;
}

void sys_update_aac_config(sys_demuxer_st* d, uint8_t** config, uint32_t* config_len,
                           const aac_parameter_st* param) {
    if (*config == nullptr) {
        *config_len = param->sbr ? 5 : 2;
        if (d == nullptr) {
            *config_len = 0;
            return;
        }
        *config = static_cast<uint8_t*>(sys_malloc(d, *config_len));
        if (*config == nullptr) {
            *config_len = 0;
            return;
        }
    }
    if (*config_len < 2) {
        *config_len = 0;
        return;
    }
    const uint8_t index = sample_rate_index(param->sample_rate, nullptr);
    uint8_t* out = *config;
    out[0] = static_cast<uint8_t>((static_cast<uint32_t>(param->object_type) << 3) | (index >> 1u));
    out[1] = static_cast<uint8_t>(((index & 1u) << 7) | (static_cast<uint32_t>(param->channels) << 3));
    if (param->sbr && *config_len >= 5) {
        // Sync extension 0x2B7, extension object type 5 (SBR), SBR present.
        out[2] = 0x56;
        out[3] = 0xE5;
        bool found = false;
        const uint8_t ext_index = sample_rate_index(param->ext_sample_rate, &found);
        out[4] = static_cast<uint8_t>(found ? 0x80 | (ext_index << 3) : 0x80);
    }
}

}  // extern "C"
