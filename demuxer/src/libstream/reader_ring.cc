// The synchronous ring of the single-thread set: the reader tops the ring up
// from the input itself, in block_size pieces, when it needs more bytes than
// the ring holds. Must not run while a streaming thread fills the same ring.
#include <unistd.h>

#include "stream_internal.h"

void wait_while_paused(sys_ringbuffer* rb) {
    while (rb_paused(rb)) usleep(1000);
}

void WriteData(cb_buffer_st* cb, uint32_t wanted) {
    sys_ringbuffer* rb = cb->active_rbuf;
    if (sys_ringbuffer_ahead(rb) >= wanted || rb_eos(rb)) return;
    // Straight from the input into the ring's free space, a block (or what
    // is left before the storage wraps) at a time.
    pthread_mutex_lock(&rb->ring_mutex);
    sys_ringbuffer_settle_locked(rb);
    ring_side_st* s = cb->base ? ring_side(cb) : nullptr;
    if (s && s->input_away) {
        // Left at the end by a seek from there: back to where the ring's bytes end.
        if (cb->input->seek(cb->input, static_cast<cb_off_t>(s->input_back), CB_SEEK_SET) == -1) {
            rb_set_eos(rb, 1);
            pthread_mutex_unlock(&rb->ring_mutex);
            return;
        }
        s->input_away = 0;
    }
    for (;;) {
        int block = cb->input->block_size;
        // A host that raised block_size past the ring still gets whole-ring reads.
        if (block > static_cast<int>(rb->size - 1)) block = static_cast<int>(rb->size - 1);
        if (block <= 0 || sys_ringbuffer_free_internal(rb) < block) break;
        uint8_t* at = nullptr;
        const uint32_t room = sys_ringbuffer_wspace_locked(rb, static_cast<uint32_t>(block), &at);
        const size_t n = cb->input->read(cb->input, at, room);
        if (n == 0) {
            rb_set_eos(rb, 1);
            break;
        }
        sys_ringbuffer_commit_locked(rb, static_cast<uint32_t>(n));
        if (rb_held(rb) >= wanted) break;
    }
    pthread_mutex_unlock(&rb->ring_mutex);
}

int32_t read_rbuf_data(cb_buffer_st* cb, uint8_t* dst, int32_t size) {
    sys_ringbuffer* rb = cb->active_rbuf;
    if (size <= 0) return 0;
    const int32_t quick = ring_read_quick(cb, dst, size, read_rbuf_data);
    if (quick >= 0) return quick;
    sys_ringbuffer_settle(rb);
    int32_t total = 0;
    while (total < size) {
        rb->srlock = 1;
        const int32_t remain = size - total;
        int32_t want = sys_ringbuffer_avail(rb);
        if (want > remain) want = remain;
        const int32_t count1 =
            sys_ringbuffer_byte_read_peek_single_thread(rb, dst ? dst + total : nullptr, want);
        sys_ringbuffer_byte_release(rb, static_cast<uint32_t>(count1));
        int32_t count2 = 0;
        const int32_t missing = remain - count1;
        if (missing > 0) {
            WriteData(cb, static_cast<uint32_t>(missing));
            count2 = sys_ringbuffer_byte_read_peek_single_thread(
                rb, dst ? dst + total + count1 : nullptr, missing);
            sys_ringbuffer_byte_release(rb, static_cast<uint32_t>(count2));
        }
        const int32_t pass = count1 + count2;
        cb->curpos += static_cast<cb_fpos>(pass);
        total += pass;
        rb->srlock = 0;
        wait_while_paused(rb);
        if (total < size && rb_eos(rb)) {
            cb->cb_errcode = CB_ERR_EOF;
            return total;
        }
        cb->cb_errcode = CB_ERR_OK;
    }
    return total;
}

int32_t peek_rbuf_data(cb_buffer_st* cb, uint8_t* dst, int32_t size) {
    sys_ringbuffer* rb = cb->active_rbuf;
    if (size <= 0) return 0;
    if (side_active(cb)) {
        bool use_ring = false;
        const int32_t n = side_peek(cb, dst, size, &use_ring);
        if (!use_ring) return n;
    }
    if (!rb_paused(rb) && sys_ringbuffer_peek_held(rb, dst, static_cast<uint32_t>(size)) == size) {
        cb->cb_errcode = CB_ERR_OK;
        return size;
    }
    sys_ringbuffer_settle(rb);
    rb->srlock = 1;
    WriteData(cb, static_cast<uint32_t>(size));
    const int32_t count = sys_ringbuffer_byte_read_peek_single_thread(rb, dst, size);
    cb->cb_errcode = count < size ? CB_ERR_EOF : CB_ERR_OK;
    rb->srlock = 0;
    wait_while_paused(rb);
    return count;
}
