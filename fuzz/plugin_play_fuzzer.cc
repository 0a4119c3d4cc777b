// The whole plug-in over an ASF file in memory, as the framework plays it:
// probe, open, every information query, delivery to the end of the stream
// (or the call limit), close. The input is the file itself.
#include "plugin_driver.h"

extern "C" int LLVMFuzzerInitialize(int*, char***) {
    plugfuzz::quiet_log();
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    plugfuzz::play_input(data, size);
    return 0;
}
