// The file cache of the single-thread set: one block holding the input bytes
// just after the last read. While it holds bytes the input stands at its end
// (base_pos + avail_size); while it is empty the input stands at curpos.
// Large reads bypass it in whole blocks.
#include <string.h>

#include "stream_internal.h"

namespace {

bool in_cache(const fs_cache_st* c, cb_fpos pos) {
    return pos >= c->base_pos && pos < c->base_pos + c->avail_size;
}

// Copies what the cache holds from `pos` on, up to `size` bytes.
size_t read_data_from_cache(const fs_cache_st* c, uint8_t* dst, size_t size, cb_fpos pos) {
    if (!in_cache(c, pos)) return 0;
    const size_t off = static_cast<size_t>(pos - c->base_pos);
    size_t n = c->avail_size - off;
    if (n > size) n = size;
    memcpy(dst, c->buffer + off, n);
    return n;
}

// Serves `r` bytes from the input: whole blocks straight into dst, then one
// refill of the cache for the tail.
size_t read_data_from_fs(cb_buffer_st* cb, fs_cache_st* c, uint8_t* dst, size_t r, cb_fpos pos) {
    cb_io_st* in = cb->input;
    const size_t d = (r / c->buffer_length) * c->buffer_length;
    size_t got = 0;
    while (got < d) {
        const size_t k = in->read(in, dst + got, d - got);
        if (k == 0) {
            reset_fs_cache(c);
            return got;
        }
        got += k;
    }
    const size_t k = in->read(in, c->buffer, c->buffer_length);
    c->avail_size = static_cast<uint32_t>(k);
    c->base_pos = pos + d;
    size_t tail = r - d;
    if (tail > c->avail_size) tail = c->avail_size;
    memcpy(dst + d, c->buffer, tail);
    return d + tail;
}

}  // namespace

void reset_fs_cache(fs_cache_st* c) {
    c->base_pos = 0;
    c->avail_size = 0;
}

void init_fs_cache(fs_cache_st* c, uint8_t* block, uint32_t len) {
    c->buffer = block;
    c->buffer_length = len;
    reset_fs_cache(c);
}

size_t read_fs_cache(cb_buffer_st* cb, fs_cache_st* c, uint8_t* dst, size_t size, cb_fpos pos) {
    const size_t n = read_data_from_cache(c, dst, size, pos);
    if (n == size) return n;
    return n + read_data_from_fs(cb, c, dst + n, size - n, pos + n);
}

int32_t peek_fs_cache(cb_buffer_st* cb, uint8_t* dst, int32_t size) {
    fs_cache_st* c = &cb->fs_cache;
    cb_io_st* in = cb->input;
    if (size < 0) size = 0;
    const cb_fpos pos = cb->curpos;
    int32_t count;
    if (static_cast<uint32_t>(size) > c->buffer_length) {
        count = static_cast<int32_t>(read_fs_cache(cb, c, dst, static_cast<size_t>(size), pos));
        (void)in->seek(in, static_cast<cb_off_t>(pos), CB_SEEK_SET);
        reset_fs_cache(c);
    } else {
        const size_t n = read_data_from_cache(c, dst, static_cast<size_t>(size), pos);
        count = static_cast<int32_t>(n);
        if (n < static_cast<size_t>(size)) {
            // Keep the cached tail, then fill the rest of the block after it,
            // so the cache afterwards starts at curpos.
            if (n) memmove(c->buffer, c->buffer + (pos - c->base_pos), n);
            const size_t k = in->read(in, c->buffer + n, c->buffer_length - n);
            c->avail_size = static_cast<uint32_t>(n + k);
            c->base_pos = pos;
            size_t total = c->avail_size;
            if (total > static_cast<size_t>(size)) total = static_cast<size_t>(size);
            memcpy(dst + n, c->buffer + n, total - n);
            count = static_cast<int32_t>(total);
        }
    }
    cb->cb_errcode = count < size ? CB_ERR_EOF : CB_ERR_OK;
    return count;
}
