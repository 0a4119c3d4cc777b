// avcC to start-code form, with the host's allocator failing where the first
// byte says; whatever happens, every block must go back.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>

#include "callbacks.h"
#include "sys_avc.h"
#include "sys_output.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 1 || size > 1 << 18) return 0;
    host::HostCallbacks host;
    sys_demuxer_st d;
    std::memset(&d, 0, sizeof d);
    d.callback = *host.table();
    host.fail_malloc_at(data[0] & 3);  // 0: never; 1..3: that allocation fails

    const uint8_t* record = data + 1;
    const int len = static_cast<int>(size - 1);
    uint8_t* out = nullptr;
    uint32_t out_size = 0;
    int nal = 0;
    // Twice: the second pass replaces the first output (reuse or grow).
    for (int pass = 0; pass < 2; ++pass) {
        const int r = parse_avc_video_config(&d, record, pass == 0 ? len / 2 : len, &out, &out_size, &nal);
        if (r != HOVA_OK && r != HOVA_NotEnoughMemory && r != HOVA_EndOfStream) std::abort();
        if (r == HOVA_OK && (nal < 1 || nal > 4)) std::abort();
        if (out_size != 0 && out == nullptr) std::abort();
        if (out != nullptr && out_size >= 4 && std::memcmp(out, avccfgprefix, 4) != 0) std::abort();
    }
    sys_freep(&d, &out);
    if (host.outstanding_blocks() != 0 || host.foreign_frees() != 0) std::abort();
    return 0;
}
