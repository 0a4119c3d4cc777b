// The multi-thread operation set: reads, peeks and seeks served from the ring
// that the streaming thread fills.
#include <unistd.h>

#include "stream_internal.h"

namespace {

// Largest request the ring is sure to satisfy at once: the thread stores
// only whole blocks, so it stops topping up when less than a block is free.
int32_t ring_capacity(const cb_buffer_st* cb) {
    const int32_t cap = static_cast<int32_t>(cb->active_rbuf->size - 1);
    const int32_t block = cb->input->block_size;
    return (block > 0 && block <= cap) ? cap - block + 1 : cap;
}

CB_ErrCode short_outcome(const sys_ringbuffer* rb) {
    return rb_eos(rb) ? CB_ERR_EOF : CB_ERR_TIMEDOUT;
}

bool ring_has_thread(const cb_buffer_st* cb) { return cb->thread_type == CB_MULTI_THREAD; }

}  // namespace

bool rewind_ring(cb_buffer_st* cb, cb_off_t target) {
    const cb_off_t cur = static_cast<cb_off_t>(cb->curpos);
    if (target >= cur || cur - target > static_cast<cb_off_t>(UINT32_MAX)) return false;
    if (!sys_ringbuffer_rewind(cb->active_rbuf, static_cast<uint32_t>(cur - target))) return false;
    cb->curpos = static_cast<cb_fpos>(target);
    return true;
}

uint32_t cb_ring_span(cb_buffer_st* cb, const uint8_t** at) {
    sys_ringbuffer* rb = cb->active_rbuf;
    if (!rb || cb->buffer_type != CB_STREAM_RBUF || side_active(cb) || rb_paused(rb)) return 0;
    return sys_ringbuffer_held_span(rb, at);
}

void init_multi_thread_plugin(cb_buffer_st* cb) {
    cb->cb_read = cb_read_multi;
    cb->cb_peek = cb_peek_multi;
    cb->cb_seek = cb_seek_multi;
    cb->cb_seek64 = cb_seek_multi64;
}

cb_off_t reposition_ring_input(cb_buffer_st* cb, cb_off_t target, int whence) {
    sys_ringbuffer* rb = cb->active_rbuf;
    cb_io_st* in = cb->input;
    // The input moves and the ring empties under the source lock, which the
    // thread holds from each read to the store of its block: every block is
    // either wholly before this point (and emptied here) or wholly after it.
    // The move itself is outside ring_mutex, like every input call.
    sys_ringbuffer_source_lock(rb);
    const cb_off_t r = in->seek(in, target, whence);
    if (r != -1) {
        pthread_mutex_lock(&rb->ring_mutex);
        sys_ringbuffer_reset_locked(rb);
        if (cb->base) end_hold_locked(cb);
        pthread_mutex_unlock(&rb->ring_mutex);
    }
    sys_ringbuffer_source_unlock(rb);
    // A visit outside the ring ends with any move of the ring.
    if (r != -1 && cb->base) ring_side(cb)->active = ring_side(cb)->input_away = 0;
    return r;
}

int32_t cb_read_multi(cb_buffer_st* cb, uint8_t* dst, int32_t size) {
    sys_ringbuffer* rb = cb->active_rbuf;
    if (!rb) return cb_read_single(cb, dst, size);
    if (size <= 0) return 0;
    const int32_t quick = ring_read_quick(cb, dst, size, cb_read_multi);
    if (quick >= 0) return quick;
    // Requests beyond the ring's capacity are served in pieces that fit.
    const int32_t cap = ring_capacity(cb);
    int32_t total = 0;
    cb->cb_errcode = CB_ERR_OK;
    while (total < size) {
        int32_t want = size - total;
        if (want > cap) want = cap;
        const int32_t n = sys_ringbuffer_byte_read(rb, dst ? dst + total : nullptr, want);
        total += n;
        if (n < want) {
            cb->cb_errcode = short_outcome(rb);
            break;
        }
    }
    cb->curpos += static_cast<cb_fpos>(total);
    wait_while_paused(rb);
    return total;
}

int32_t cb_peek_multi(cb_buffer_st* cb, uint8_t* dst, int32_t size) {
    sys_ringbuffer* rb = cb->active_rbuf;
    if (!rb) return cb_peek_single(cb, dst, size);
    if (size <= 0) return 0;
    if (side_active(cb)) {
        bool use_ring = false;
        const int32_t n = side_peek(cb, dst, size, &use_ring);
        if (!use_ring) return n;
    }
    // A peek can show at most what the ring can hold.
    if (size > ring_capacity(cb)) size = ring_capacity(cb);
    if (!rb_paused(rb) && sys_ringbuffer_peek_held(rb, dst, static_cast<uint32_t>(size)) == size) {
        cb->cb_errcode = CB_ERR_OK;
        return size;
    }
    const int32_t n = sys_ringbuffer_byte_read_peek(rb, dst, size);
    cb->cb_errcode = n < size ? short_outcome(rb) : CB_ERR_OK;
    pthread_mutex_lock(&rb->ring_mutex);
    rb->srlock = 0;
    pthread_mutex_unlock(&rb->ring_mutex);
    wait_while_paused(rb);
    return n;
}

cb_off_t cb_seek_multi64(cb_buffer_st* cb, cb_off_t offset, int whence) {
    sys_ringbuffer* rb = cb->active_rbuf;
    if (!rb) return cb_seek_single64(cb, offset, whence);
    if (whence != CB_SEEK_SET && whence != CB_SEEK_CUR && whence != CB_SEEK_END) return -1;
    if (whence == CB_SEEK_END) return static_cast<cb_off_t>(cb->curpos);

    // Nothing fills a ring without a thread; a target beyond what it holds
    // is waited for only as long as the ring waits for data, then the input
    // is moved as for any target outside the buffer.
    if (!ring_has_thread(cb) && cb->input->rbuf_mode == CBIO_APPLY_RBUF) {
        const time_t give_up = time(nullptr) + SYS_RINGBUFFER_WAIT_S;
        while (seek_out_of_buffer(cb, offset, whence)) {
            if (rb_eos(rb)) return -1;
            if (time(nullptr) >= give_up) break;
            usleep(1000);
        }
    }

    const cb_off_t cur = static_cast<cb_off_t>(cb->curpos);
    const cb_off_t target = whence == CB_SEEK_SET ? offset : cur + offset;
    // A refused move changes nothing: the ring still holds the bytes at curpos.
    return ring_seek_to(cb, target);
}

int32_t cb_seek_multi(cb_buffer_st* cb, int32_t offset, int whence) {
    return static_cast<int32_t>(
        static_cast<uint32_t>(cb_seek_multi64(cb, static_cast<cb_off_t>(offset), whence)));
}
