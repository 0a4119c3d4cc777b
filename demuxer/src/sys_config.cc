#include "sys_config.h"

#include <cstring>

#include "sys_output.h"

extern "C" {

void sys_assign_config_with_realloc(sys_demuxer_st* d, uint8_t** config, uint32_t* config_len,
                                    const uint8_t* src, uint32_t len) {
    // A length without a block is no room at all.
    const uint32_t room = *config != nullptr ? *config_len : 0;
    if (len <= room) {
        if (len != 0) std::memcpy(*config, src, len);
        *config_len = len;
        return;
    }
    auto* block = static_cast<uint8_t*>(sys_malloc(d, len));
    if (block == nullptr) {
        if (room != 0) std::memcpy(*config, src, room);
        return;
    }
    sys_freep(d, config);
    std::memcpy(block, src, len);
    *config = block;
    *config_len = len;
}

}  // extern "C"
