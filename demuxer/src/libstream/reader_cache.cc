// The file cache of the single-thread set: a few blocks (slots), each holding
// input bytes from some position on, so that the parser's cursors (audio and
// video in separate parsing, the index behind the data at open) each keep
// their block. `fs_cache` always describes the slot in use; the others are
// described in a small record in front of the slots. The reader knows where
// the input stands, and moves it only when a block must be read from
// somewhere else. Large reads bypass the slots in whole blocks.
#include <string.h>

#include "stream_internal.h"

namespace {

cache_slots_st* slots_of(const cb_buffer_st* cb) { return reinterpret_cast<cache_slots_st*>(cb->base); }

uint8_t* slot_memory(const cb_buffer_st* cb, uint32_t i) {
    return cb->base + CB_CACHE_HEAD + static_cast<size_t>(i) * cb->fs_cache.buffer_length;
}

bool in_cache(const fs_cache_st* c, cb_fpos pos) {
    return pos >= c->base_pos && pos < c->base_pos + c->avail_size;
}

// Saves the slot in use and describes slot i in fs_cache instead.
void use_slot(cb_buffer_st* cb, uint32_t i) {
    cache_slots_st* s = slots_of(cb);
    fs_cache_st* c = &cb->fs_cache;
    s->slot[s->active].base_pos = c->base_pos;
    s->slot[s->active].avail = c->avail_size;
    s->active = i;
    c->buffer = slot_memory(cb, i);
    c->base_pos = s->slot[i].base_pos;
    c->avail_size = s->slot[i].avail;
    s->slot[i].used = ++s->clock;
}

// Makes the slot that holds `pos` the one in use; false when none does.
bool find_slot(cb_buffer_st* cb, cb_fpos pos) {
    if (in_cache(&cb->fs_cache, pos)) return true;
    cache_slots_st* s = slots_of(cb);
    for (uint32_t i = 0; i < s->count; ++i) {
        if (i == s->active) continue;
        if (pos >= s->slot[i].base_pos && pos < s->slot[i].base_pos + s->slot[i].avail) {
            use_slot(cb, i);
            return true;
        }
    }
    return false;
}

// The slot to refill: an empty one, else the one used longest ago. The slot
// in use is kept while another exists: the other cursor of separate parsing
// may still be reading it.
void pick_slot_for(cb_buffer_st* cb) {
    cache_slots_st* s = slots_of(cb);
    if (s->count == 1) return;
    uint32_t pick = s->active;
    uint32_t oldest = UINT32_MAX;
    for (uint32_t i = 0; i < s->count; ++i) {
        if (i == s->active) continue;
        if (s->slot[i].avail == 0) {
            pick = i;
            break;
        }
        if (s->slot[i].used < oldest) {
            oldest = s->slot[i].used;
            pick = i;
        }
    }
    if (pick != s->active) use_slot(cb, pick);
}

// How much of a block from `pos` no other slot holds yet: the refill stops
// where another slot's bytes begin, so no byte is read twice.
size_t fresh_bytes_from(const cb_buffer_st* cb, cb_fpos pos) {
    const cache_slots_st* s = slots_of(cb);
    size_t n = cb->fs_cache.buffer_length;
    for (uint32_t i = 0; i < s->count; ++i) {
        if (i == s->active || s->slot[i].avail == 0) continue;
        const cb_fpos b = s->slot[i].base_pos;
        if (b > pos && b - pos < n) n = static_cast<size_t>(b - pos);
    }
    return n;
}

// Puts the input at `pos` unless it stands there already.
bool input_at(cb_buffer_st* cb, cb_fpos pos) {
    cache_slots_st* s = slots_of(cb);
    if (!s->track_input || s->input_pos == pos) return true;
    cb_io_st* in = cb->input;
    const cb_off_t r = in->seek(in, static_cast<cb_off_t>(pos), CB_SEEK_SET);
    if (r == -1) {
        s->input_pos = static_cast<cb_fpos>(in->tell(in));
        return false;
    }
    s->input_pos = static_cast<cb_fpos>(r);
    return s->input_pos == pos;
}

size_t input_read(cb_buffer_st* cb, uint8_t* dst, size_t n) {
    const size_t k = cb->input->read(cb->input, dst, n);
    slots_of(cb)->input_pos += k;
    return k;
}

// Copies what the cache holds from `pos` on, up to `size` bytes.
size_t read_data_from_cache(cb_buffer_st* cb, uint8_t* dst, size_t size, cb_fpos pos) {
    if (size == 0 || !find_slot(cb, pos)) return 0;
    cache_slots_st* s = slots_of(cb);
    s->slot[s->active].used = ++s->clock;
    const fs_cache_st* c = &cb->fs_cache;
    const size_t off = static_cast<size_t>(pos - c->base_pos);
    size_t n = c->avail_size - off;
    if (n > size) n = size;
    memcpy(dst, c->buffer + off, n);
    return n;
}

// Serves up to `r` bytes from the input at `pos`: whole blocks straight into
// dst, then one refill of a slot for the tail. *end when the input gave less
// than was asked.
size_t read_data_from_fs(cb_buffer_st* cb, uint8_t* dst, size_t r, cb_fpos pos, bool* end) {
    fs_cache_st* c = &cb->fs_cache;
    *end = true;
    if (!input_at(cb, pos)) return 0;
    const size_t d = (r / c->buffer_length) * c->buffer_length;
    size_t got = 0;
    while (got < d) {
        const size_t k = input_read(cb, dst + got, d - got);
        if (k == 0) return got;
        got += k;
    }
    pick_slot_for(cb);
    c->avail_size = 0;  // the slot's old bytes are overwritten now
    c->base_pos = pos + d;
    const size_t want = fresh_bytes_from(cb, pos + d);
    const size_t k = input_read(cb, c->buffer, want);
    c->avail_size = static_cast<uint32_t>(k);
    *end = k < want;
    size_t tail = r - d;
    if (tail > c->avail_size) tail = c->avail_size;
    memcpy(dst + d, c->buffer, tail);
    return d + tail;
}

}  // namespace

size_t cache_block_bytes(uint32_t block, uint32_t* slots) {
    // Fewer slots when several would not fit a size_t (32-bit targets).
    for (uint32_t n = CB_CACHE_SLOTS; n > 1; --n) {
        if (block <= (SIZE_MAX - CB_CACHE_HEAD) / n) {
            *slots = n;
            return CB_CACHE_HEAD + static_cast<size_t>(n) * block;
        }
    }
    *slots = 1;
    return CB_CACHE_HEAD + block;
}

void reset_fs_cache(cb_buffer_st* cb, cb_fpos input_pos) {
    cache_slots_st* s = slots_of(cb);
    for (uint32_t i = 0; i < s->count; ++i) {
        s->slot[i].base_pos = 0;
        s->slot[i].avail = 0;
    }
    cb->fs_cache.base_pos = 0;
    cb->fs_cache.avail_size = 0;
    s->input_pos = input_pos;
}

void cache_input_moved(cb_buffer_st* cb, cb_fpos input_pos) { slots_of(cb)->input_pos = input_pos; }

void init_fs_cache(cb_buffer_st* cb, uint32_t len, uint32_t slots, bool track_input) {
    cache_slots_st* s = slots_of(cb);
    memset(s, 0, sizeof(*s));
    s->count = slots;
    s->track_input = track_input;
    cb->fs_cache.buffer = slot_memory(cb, 0);
    cb->fs_cache.buffer_length = len;
    reset_fs_cache(cb, 0);
}

bool cache_holds(const cb_buffer_st* cb, cb_fpos pos) {
    if (in_cache(&cb->fs_cache, pos)) return true;
    const cache_slots_st* s = slots_of(cb);
    for (uint32_t i = 0; i < s->count; ++i)
        if (i != s->active && pos >= s->slot[i].base_pos && pos < s->slot[i].base_pos + s->slot[i].avail)
            return true;
    return false;
}

size_t cache_copy_held(const cb_buffer_st* cb, uint8_t* dst, size_t size, cb_fpos pos) {
    const cache_slots_st* s = slots_of(cb);
    for (uint32_t i = 0; i < s->count; ++i) {
        const bool active = i == s->active;
        const cb_fpos base = active ? cb->fs_cache.base_pos : s->slot[i].base_pos;
        const uint32_t avail = active ? cb->fs_cache.avail_size : s->slot[i].avail;
        if (pos < base || pos >= base + avail) continue;
        const size_t off = static_cast<size_t>(pos - base);
        const size_t n = avail - off < size ? avail - off : size;
        memcpy(dst, slot_memory(cb, i) + off, n);
        return n;
    }
    return 0;
}

size_t read_fs_cache(cb_buffer_st* cb, uint8_t* dst, size_t size, cb_fpos pos) {
    size_t done = 0;
    for (;;) {
        // From the slots as far as they go (a read may span two of them).
        for (;;) {
            const size_t k = read_data_from_cache(cb, dst + done, size - done, pos + done);
            done += k;
            if (k == 0 || done == size) break;
        }
        if (done == size) return done;
        bool end = false;
        const size_t k = read_data_from_fs(cb, dst + done, size - done, pos + done, &end);
        done += k;
        // A refill that stopped at another slot's bytes goes on from there.
        if (end || k == 0 || done == size) return done;
    }
}

int32_t peek_fs_cache(cb_buffer_st* cb, uint8_t* dst, int32_t size) {
    fs_cache_st* c = &cb->fs_cache;
    cb_io_st* in = cb->input;
    if (size < 0) size = 0;
    const cb_fpos pos = cb->curpos;
    int32_t count;
    if (static_cast<uint32_t>(size) > c->buffer_length) {
        count = static_cast<int32_t>(read_fs_cache(cb, dst, static_cast<size_t>(size), pos));
        const cb_off_t r = in->seek(in, static_cast<cb_off_t>(pos), CB_SEEK_SET);
        reset_fs_cache(cb, r == -1 ? static_cast<cb_fpos>(in->tell(in)) : static_cast<cb_fpos>(r));
    } else if (slots_of(cb)->count > 1) {
        // As a read that leaves curpos alone: from the slots, and a refill
        // where they fall short.
        count = static_cast<int32_t>(read_fs_cache(cb, dst, static_cast<size_t>(size), pos));
    } else {
        // One slot: keep the cached tail at its start and fill the rest of
        // the block after it, so the slot starts at curpos and the bytes
        // peeked are still there for the read that follows.
        size_t n = read_data_from_cache(cb, dst, static_cast<size_t>(size), pos);
        count = static_cast<int32_t>(n);
        if (n < static_cast<size_t>(size)) {
            if (n) memmove(c->buffer, c->buffer + (pos - c->base_pos), n);
            c->base_pos = pos;
            c->avail_size = static_cast<uint32_t>(n);
            if (input_at(cb, pos + n)) {
                const size_t k = input_read(cb, c->buffer + n, c->buffer_length - n);
                c->avail_size = static_cast<uint32_t>(n + k);
            }
            size_t total = c->avail_size;
            if (total > static_cast<size_t>(size)) total = static_cast<size_t>(size);
            memcpy(dst + n, c->buffer + n, total - n);
            count = static_cast<int32_t>(total);
        }
    }
    cb->cb_errcode = count < size ? CB_ERR_EOF : CB_ERR_OK;
    return count;
}
