// E-AC-3 sync frame scan over arbitrary bytes.
#include <cstddef>
#include <cstdint>
#include <cstdlib>

#include "sys_ac3.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size > 1 << 20) return 0;
    int channels = -1;
    const int r = sys_get_ac3_channel_count(data, static_cast<int>(size), 1, &channels);
    if (r == 1 && (channels < 1 || channels > 6)) std::abort();
    if (r != 1 && r != -1) std::abort();
    return 0;
}
