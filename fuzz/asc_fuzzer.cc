// AudioSpecificConfig, and the bit reader under it with widths taken from the input.
#include <cstddef>
#include <cstdint>
#include <cstdlib>

#include "bit_reader.h"
#include "sys_aac.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size > 1 << 16) return 0;
    int channels = -1;
    const int r = sys_get_aac_audiospecificconfig_channel_count(data, static_cast<int>(size), &channels);
    if (r == 1 && (channels < 1 || channels > 8)) std::abort();
    if (r != 0 && r != 1) std::abort();

    // Walk the same bytes with reads and skips of input-chosen widths.
    buffer_bitstream_st bs;
    buf_stream_init(&bs, data, static_cast<int>(size));
    for (size_t i = 0; i < size && i < 64; ++i) {
        const int n = data[i] % 40;
        const uint32_t v = buf_bit_read(&bs, n);
        if (n < 32 && (v >> n) != 0) std::abort();
        if (data[i] & 0x80) buf_bit_skip(&bs, data[i]);
        if (bs.buf_left < 0 || bs.cache_left < 0 || bs.cache_left > 31) std::abort();
    }
    (void)aac_parse_latm_get_value(&bs);
    return 0;
}
