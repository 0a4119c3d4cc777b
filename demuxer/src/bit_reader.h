// MSB-first bit reader over a byte buffer. Past the end it yields zero bits,
// so a parser over truncated input reads zeros instead of stray memory.
#ifndef PLIMO_BIT_READER_H
#define PLIMO_BIT_READER_H

#include <cstdint>

typedef struct buffer_bitstream_s {
    const uint8_t* buf_ptr;  // next byte to load
    int buf_left;            // bytes not yet loaded
    uint32_t cache;          // unread bits in the low cache_left bits
    int cache_left;
} buffer_bitstream_s, buffer_bitstream_st;

inline void buf_stream_init(buffer_bitstream_st* bs, const uint8_t* buf, int len) {
    bs->buf_ptr = buf;
    bs->buf_left = (buf != nullptr && len > 0) ? len : 0;
    bs->cache = 0;
    bs->cache_left = 0;
}

namespace plimo::detail {

// At most 24 bits, so the cache (up to 31 bits after refilling) never overflows.
inline uint32_t bit_read_small(buffer_bitstream_st* bs, int n) {
    while (n > bs->cache_left) {
        uint32_t next = 0;
        if (bs->buf_left > 0) {
            next = *bs->buf_ptr++;
            bs->buf_left--;
        }
        bs->cache = (bs->cache << 8) | next;
        bs->cache_left += 8;
    }
    bs->cache_left -= n;
    return (bs->cache >> bs->cache_left) & ((1u << n) - 1u);
}

}  // namespace plimo::detail

// Skips n bits without touching more than the buffer holds; a skip past the
// end leaves nothing but zero bits to read.
inline void buf_bit_skip(buffer_bitstream_st* bs, uint32_t n) {
    if (n <= static_cast<uint32_t>(bs->cache_left)) {
        bs->cache_left -= static_cast<int>(n);
        return;
    }
    n -= static_cast<uint32_t>(bs->cache_left);
    bs->cache_left = 0;
    bs->cache = 0;
    const uint32_t whole = n / 8;
    if (whole >= static_cast<uint32_t>(bs->buf_left)) {
        bs->buf_ptr += bs->buf_left;
        bs->buf_left = 0;
        return;
    }
    bs->buf_ptr += whole;
    bs->buf_left -= static_cast<int>(whole);
    if (n % 8) (void)plimo::detail::bit_read_small(bs, static_cast<int>(n % 8));
}

// The next n bits, exact for n up to 32; a wider read advances n bits and
// returns the last 32 of them.
inline uint32_t buf_bit_read(buffer_bitstream_st* bs, int n) {
    if (n <= 0) return 0;
    if (n <= 24) return plimo::detail::bit_read_small(bs, n);
    if (n > 32) {
        buf_bit_skip(bs, static_cast<uint32_t>(n - 32));
        n = 32;
    }
    const uint32_t hi = plimo::detail::bit_read_small(bs, n - 16);
    return (hi << 16) | plimo::detail::bit_read_small(bs, 16);
}

#endif  // PLIMO_BIT_READER_H
