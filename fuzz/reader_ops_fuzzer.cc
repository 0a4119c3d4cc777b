// The buffered reader alone under random operation sequences (see
// reader_ops_driver.h for the input layout and the checks).
#include <cstdlib>

#include "reader_ops_driver.h"

extern "C" int LLVMFuzzerInitialize(int*, char***) {
    if (!std::getenv("PLIMO_FUZZ_LOG")) setenv("PLIMO_LOG", "off", 1);
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    return readerfuzz::ops_input(data, size);
}
