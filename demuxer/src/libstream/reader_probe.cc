// Probes: while a search parses a few bytes here and there (the search
// without index steps back over thousands of packets, reading a header in
// each), reads take what a buffer already holds and read the rest straight
// from the input, only what is asked. A buffered read there would fetch a
// whole block that starts at each packet, to use a few dozen bytes of it. What the buffers hold, where the reader
// stands and where the input stands for them are put back at the end, so
// delivery afterwards reads as it would have without the probes.
#include "stream_internal.h"

namespace {

// Copies what the ring holds from `pos` on (its history behind the read
// position, and what is held ahead of it), up to `size` bytes. While probes
// run nothing is consumed or stored, and the read position is in ring_pos.
size_t ring_copy_held(cb_buffer_st* cb, uint8_t* dst, size_t size, cb_fpos pos) {
    sys_ringbuffer* rb = cb->active_rbuf;
    const cb_fpos rp = ring_side(cb)->ring_pos;
    const uint32_t behind = sys_ringbuffer_history(rb);
    const uint32_t ahead = rb_held(rb);
    if (pos + behind < rp || pos >= rp + ahead) return 0;
    const uint64_t left = rp + ahead - pos;
    const uint32_t n = static_cast<uint32_t>(left < size ? left : size);
    // Bytes behind the read position are reached the other way round the storage.
    const uint32_t skip = pos >= rp ? static_cast<uint32_t>(pos - rp) : rb->size - static_cast<uint32_t>(rp - pos);
    pthread_mutex_lock(&rb->ring_mutex);
    (void)sys_ringbuffer_read_peek(rb, dst, n, skip);
    pthread_mutex_unlock(&rb->ring_mutex);
    return n;
}

// What a buffer already holds at `pos`, copied (up to `size` bytes).
size_t copy_held(cb_buffer_st* cb, uint8_t* dst, size_t size, cb_fpos pos) {
    if (cb->active_rbuf) {
        const size_t n = side_copy_held(cb, dst, size, pos);
        return n ? n : ring_copy_held(cb, dst, size, pos);
    }
    return cache_copy_held(cb, dst, size, pos);
}

// The input to `pos`; false when it refuses.
bool input_to(cb_buffer_st* cb, cb_fpos pos) {
    cb_io_st* in = cb->input;
    const cb_off_t at = static_cast<cb_off_t>(pos);
    return in->tell(in) == at || in->seek(in, at, CB_SEEK_SET) == at;
}

// Bytes at curpos from what the buffers hold, the rest straight from the input.
int32_t probe_read(cb_buffer_st* cb, uint8_t* dst, int32_t size, bool advance) {
    if (size <= 0) {
        cb->cb_errcode = CB_ERR_OK;
        return 0;
    }
    size_t n = 0;
    if (!dst) {
        n = advance ? static_cast<size_t>(size) : 0;  // a read that keeps nothing is a skip
    } else {
        for (;;) {
            const size_t k = copy_held(cb, dst + n, static_cast<size_t>(size) - n, cb->curpos + n);
            n += k;
            if (k == 0 || n == static_cast<size_t>(size)) break;
        }
        if (n < static_cast<size_t>(size) && input_to(cb, cb->curpos + n))
            n += cb->input->read(cb->input, dst + n, static_cast<size_t>(size) - n);
    }
    cb->cb_errcode = n < static_cast<size_t>(size) ? CB_ERR_EOF : CB_ERR_OK;
    if (advance) cb->curpos += n;
    return static_cast<int32_t>(n);
}

int32_t probe_read_op(cb_buffer_st* cb, uint8_t* dst, int32_t size) { return probe_read(cb, dst, size, true); }
int32_t probe_peek_op(cb_buffer_st* cb, uint8_t* dst, int32_t size) { return probe_read(cb, dst, size, false); }

cb_off_t probe_seek64_op(cb_buffer_st* cb, cb_off_t offset, int whence) {
    cb_io_st* in = cb->input;
    cb_off_t target = 0;
    switch (whence) {
        case CB_SEEK_SET:
            target = offset;
            break;
        case CB_SEEK_CUR:
            // Moving on inside what is being parsed: the next read places the input.
            target = static_cast<cb_off_t>(cb->curpos) + offset;
            if (target < 0) return -1;
            cb->curpos = static_cast<cb_fpos>(target);
            return target;
        case CB_SEEK_END:
            target = in->seek(in, offset, CB_SEEK_END);
            if (target == -1) return -1;
            cb->curpos = static_cast<cb_fpos>(target);
            return target;
        default:
            return -1;
    }
    // A new place: the input says whether it can go there, as it would for a
    // seek outside the buffer.
    if (target < 0 || in->seek(in, target, CB_SEEK_SET) == -1) return -1;
    cb->curpos = static_cast<cb_fpos>(target);
    return target;
}

int32_t probe_seek_op(cb_buffer_st* cb, int32_t offset, int whence) {
    return static_cast<int32_t>(
        static_cast<uint32_t>(probe_seek64_op(cb, static_cast<cb_off_t>(offset), whence)));
}

// Where the buffering expects the input to stand: the end of what the ring
// holds (the ring's read position while a visit is out is kept aside).
cb_fpos ring_input_end(const cb_buffer_st* cb) {
    const ring_side_st* s = ring_side(cb);
    const cb_fpos ring_pos = s->active ? s->ring_pos : cb->curpos;
    return ring_pos + rb_held(cb->active_rbuf);
}

void set_slots(cb_buffer_st* cb, const cb_probe_st& from) {
    cb->cb_read = from.cb_read;
    cb->cb_peek = from.cb_peek;
    cb->cb_seek = from.cb_seek;
    cb->cb_seek64 = from.cb_seek64;
}

}  // namespace

bool cb_begin_probes(cb_buffer_st* cb, cb_probe_st* saved) {
    saved->active = 0;
    const bool sets = cb->cb_read == cb_read_single || cb->cb_read == cb_read_multi;
    const bool ring = cb->buffer_type == CB_STREAM_RBUF && cb->active_rbuf && cb->base;
    const bool cache = cb->buffer_type == CB_FS_CACHE && cb->fs_cache.buffer && !cb->active_rbuf;
    // Unbuffered reads already read what they are asked.
    if (!sets || !(ring || cache)) return false;
    saved->active = 1;
    saved->cb_read = cb->cb_read, saved->cb_peek = cb->cb_peek;
    saved->cb_seek = cb->cb_seek, saved->cb_seek64 = cb->cb_seek64;
    saved->buffer_type = cb->buffer_type;
    saved->curpos = cb->curpos;
    if (ring) {
        // The streaming thread reads nothing while the input is the probes';
        // nothing is stored meanwhile, so the ring's end stays where it is.
        sys_ringbuffer_source_lock(cb->active_rbuf);
        sys_ringbuffer_settle(cb->active_rbuf);
        ring_side_st* s = ring_side(cb);
        // An input left at the end by a seek from there goes back to the
        // ring's end with the rest below.
        saved->input_back = s->input_away ? s->input_back : ring_input_end(cb);
        // Where the ring reads, for the probes to find its bytes (the field
        // means nothing else outside a visit).
        if (!s->active) s->ring_pos = cb->curpos;
    }
    cb_probe_st probes{};
    probes.cb_read = probe_read_op, probes.cb_peek = probe_peek_op;
    probes.cb_seek = probe_seek_op, probes.cb_seek64 = probe_seek64_op;
    set_slots(cb, probes);
    // Parsers read in place only from buffers: none serves the probes.
    cb->buffer_type = CB_NO_BUF;
    return true;
}

void cb_end_probes(cb_buffer_st* cb, const cb_probe_st* saved) {
    if (!saved->active) return;
    set_slots(cb, *saved);
    cb->buffer_type = saved->buffer_type;
    cb->curpos = saved->curpos;
    cb_io_st* in = cb->input;
    if (cb->buffer_type == CB_FS_CACHE) {
        // The cache knows where the input stands and moves it when it must.
        const cb_off_t at = in->tell(in);
        cache_input_moved(cb, static_cast<cb_fpos>(at < 0 ? 0 : at));
        return;
    }
    sys_ringbuffer* rb = cb->active_rbuf;
    ring_side_st* s = ring_side(cb);
    if (in->seek(in, static_cast<cb_off_t>(saved->input_back), CB_SEEK_SET) == -1) {
        // The input cannot go back: the ring starts over where it stands.
        const cb_off_t at = in->tell(in);
        pthread_mutex_lock(&rb->ring_mutex);
        sys_ringbuffer_reset_locked(rb);
        if (cb->base) end_hold_locked(cb);
        pthread_mutex_unlock(&rb->ring_mutex);
        s->active = s->input_away = 0;
        cb->curpos = static_cast<cb_fpos>(at < 0 ? 0 : at);
    } else {
        s->input_away = 0;
    }
    sys_ringbuffer_source_unlock(rb);
}
