#include "sys_avc.h"

#include <cstring>

#include "dprintf.h"
#include "sys_config.h"
#include "sys_output.h"

const uint8_t avccfgprefix[4] = {0x00, 0x00, 0x00, 0x01};

namespace {

constexpr int kFirstListOffset = 5;

// One walk over the SPS and PPS lists. Without `out` it only measures; with
// it, it writes each set behind a start code. The total output size, or -1
// when a count, size or set runs past the record.
int64_t walk_parameter_sets(const uint8_t* avcc, int len, uint8_t* out) {
    int pos = kFirstListOffset;
    int64_t written = 0;
    for (int list = 0; list < 2; ++list) {  // sequence, then picture parameter sets
        if (pos >= len) return -1;
        const int count = avcc[pos++] & 0x1F;
        for (int n = 0; n < count; ++n) {
            if (len - pos < 2) return -1;
            const int size = (avcc[pos] << 8) | avcc[pos + 1];
            pos += 2;
            if (len - pos < size) return -1;
            if (out) {
                std::memcpy(out + written, avccfgprefix, sizeof(avccfgprefix));
                std::memcpy(out + written + sizeof(avccfgprefix), avcc + pos, static_cast<size_t>(size));
            }
            pos += size;
            written += static_cast<int64_t>(sizeof(avccfgprefix)) + size;
        }
    }
    return written;
}

}  // namespace

extern "C" {

int parse_avc_video_config(sys_demuxer_st* d, const uint8_t* avcc, int len, uint8_t** out,
                           uint32_t* out_size, int* nal_length_size) {
    if (avcc == nullptr || len <= 4) return HOVA_EndOfStream;
    *nal_length_size = (avcc[4] & 3) + 1;
    const int64_t total = walk_parameter_sets(avcc, len, nullptr);
    if (total < 0) return HOVA_EndOfStream;
    if (total == 0) {
        // No parameter sets: an empty configuration, without asking the host
        // for a zero-byte block.
        sys_assign_config_with_realloc(d, out, out_size, nullptr, 0);
        return HOVA_OK;
    }
    auto* work = static_cast<uint8_t*>(sys_malloc(d, static_cast<size_t>(total)));
    if (work == nullptr) {
        DPRINTF("[SYS] malloc config fail in parse_avc_video_config\n");
        return HOVA_NotEnoughMemory;
    }
    if (walk_parameter_sets(avcc, len, work) != total) {
        sys_freep(d, &work);
        return HOVA_EndOfStream;
    }
    sys_assign_config_with_realloc(d, out, out_size, work, static_cast<uint32_t>(total));
    sys_freep(d, &work);
    return HOVA_OK;
}

}  // extern "C"
