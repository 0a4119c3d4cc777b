// The whole plug-in under every way the host can buffer the input, with the
// streaming thread, short or early-ending reads, refused seeks, allocations
// and frame buffers, and host actions between deliveries.
// Input: 4 bytes of mode, 32 of host actions, then the file (plugfuzz::modes_input).
#include "plugin_driver.h"

extern "C" int LLVMFuzzerInitialize(int*, char***) {
    plugfuzz::quiet_log();
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    plugfuzz::modes_input(data, size);
    return 0;
}
