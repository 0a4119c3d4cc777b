// ADTS header scan over arbitrary bytes.
#include <cstddef>
#include <cstdint>
#include <cstdlib>

#include "sys_aac.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size > 1 << 20) return 0;
    int channels = -1;
    const int r = sys_get_aac_adts_channel_count(data, static_cast<int>(size), &channels);
    if (r == 1 && (channels < 0 || channels > 7)) std::abort();
    if (r != 0 && r != 1) std::abort();
    return 0;
}
