// The whole plug-in with the host acting between deliveries: seeks in both
// directions (and seek queries), resyncs, tracks turned off, thumbnail mode,
// requests the plug-in must refuse, repeated queries.
// Input: 32 bytes of host actions, then the ASF file (plugfuzz::seek_input).
#include "plugin_driver.h"

extern "C" int LLVMFuzzerInitialize(int*, char***) {
    plugfuzz::quiet_log();
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    plugfuzz::seek_input(data, size);
    return 0;
}
