// Reading the ASF header through the demuxer's reader: whole records, skips
// that only ever move forward, and the two results a short input gives.
#ifndef ASF_IO_H
#define ASF_IO_H

#include <cstdint>

#include "asf_demuxer.h"

namespace asf {

// Reads up to n bytes into dst; returns the count delivered. Sizes beyond the
// reader's 32-bit transfer are read in pieces.
inline uint64_t read(asf_demuxer_st* d, void* dst, uint64_t n) {
    cb_buffer_st* cb = &d->s.cbuffer;
    auto* out = static_cast<uint8_t*>(dst);
    uint64_t done = 0;
    while (done < n) {
        const uint64_t left = n - done;
        const int32_t want = static_cast<int32_t>(left > 0x40000000u ? 0x40000000u : left);
        const int32_t got = cb->cb_read(cb, out ? out + done : nullptr, want);
        if (got <= 0) break;
        done += static_cast<uint64_t>(got);
        if (got < want) break;
    }
    return done;
}

[[nodiscard]] inline bool read_exact(asf_demuxer_st* d, void* dst, uint64_t n) {
    return read(d, dst, n) == n;
}

// Moves forward by n bytes from the current position. A target beyond the
// largest signed position cannot be reached (and would wrap into a backward
// seek): refused.
[[nodiscard]] inline bool skip(asf_demuxer_st* d, uint64_t n) {
    if (n == 0) return true;
    cb_buffer_st* cb = &d->s.cbuffer;
    if (cb->curpos > static_cast<uint64_t>(INT64_MAX) ||
        n > static_cast<uint64_t>(INT64_MAX) - cb->curpos)
        return false;
    return cb->cb_seek64(cb, static_cast<cb_off_t>(n), CB_SEEK_CUR) != -1;
}

inline cb_fpos position(asf_demuxer_st* d) { return d->s.cbuffer.curpos; }

}  // namespace asf

#endif  // ASF_IO_H
