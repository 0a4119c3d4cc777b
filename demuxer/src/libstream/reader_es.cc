// The elementary-stream operation set, and the operations that empty the
// reader's buffer or switch buffering after the host has moved the input.
#include "stream_internal.h"

namespace {

es_cbio_st* source_of(const cb_buffer_st* cb) { return static_cast<es_cbio_st*>(cb->input->parent); }

bool es_mode(const cb_buffer_st* cb) { return cb->input->rbuf_mode == CBIO_APPLY_ES_BUF; }

// Has the host move its input by time (when asked and when it can), adopts
// the input's position and empties the ring, all under the source lock: the
// streaming thread reads the input and stores each block only under it, so
// no block read from the old position survives and none read from the new
// one is lost. The input calls stay outside ring_mutex.
void reset_ring_at_input(cb_buffer_st* cb, bool move, int time_ms) {
    sys_ringbuffer* rb = cb->active_rbuf;
    cb_io_st* in = cb->input;
    sys_ringbuffer_source_lock(rb);
    if (move && in->seek_time) (void)in->seek_time(in, time_ms);
    cb->curpos = static_cast<cb_fpos>(in->tell(in));
    pthread_mutex_lock(&rb->ring_mutex);
    sys_ringbuffer_reset_locked(rb);
    if (cb->base) end_hold_locked(cb);
    pthread_mutex_unlock(&rb->ring_mutex);
    sys_ringbuffer_source_unlock(rb);
    if (cb->base) ring_side(cb)->active = ring_side(cb)->valid = ring_side(cb)->input_away = 0;
}

void reset_reader_at_input(cb_buffer_st* cb, bool move, int time_ms) {
    if (cb->active_rbuf) {
        cb->buffer_type = CB_STREAM_RBUF;
        reset_ring_at_input(cb, move, time_ms);
        return;
    }
    cb_io_st* in = cb->input;
    if (move && in->seek_time) (void)in->seek_time(in, time_ms);
    cb->curpos = static_cast<cb_fpos>(in->tell(in));
    if (cb->fs_cache.buffer) {
        reset_fs_cache(cb, cb->curpos);
        cb->buffer_type = CB_FS_CACHE;
    }
}

}  // namespace

void init_es_plugin(cb_buffer_st* cb) {
    cb->cb_read = cb_read_es_mode;
    cb->cb_peek = cb_peek_es_mode;
    cb->cb_seek = cb_seek_es_mode;
    cb->cb_seek64 = cb_seek_es_mode64;
}

int32_t cb_read_es_mode(cb_buffer_st* cb, uint8_t* dst, int32_t size) {
    const int32_t n = cb_read_single(cb, dst, size);
    // A short read is the end only once the source says it has no more.
    es_cbio_st* src = source_of(cb);
    if (es_mode(cb) && src && !src->es_is_data_end) cb->cb_errcode = CB_ERR_OK;
    return n;
}

int32_t cb_peek_es_mode(cb_buffer_st* cb, uint8_t* dst, int32_t size) {
    es_cbio_st* src = source_of(cb);
    if (!src || !src->peek || size <= 0) return 0;
    return static_cast<int32_t>(src->peek(cb->input, dst, static_cast<size_t>(size)));
}

int32_t cb_seek_es_mode(cb_buffer_st*, int32_t, int) { return 0; }

cb_off_t cb_seek_es_mode64(cb_buffer_st* cb, cb_off_t offset, int whence) {
    if (whence != CB_SEEK_CUR) return 0;
    const cb_off_t r = cb->input->seek(cb->input, offset, CB_SEEK_CUR);
    return static_cast<cb_off_t>(static_cast<int32_t>(r));
}

void cb_flush_es_data(cb_buffer_st* cb, es_data_type_et type) {
    if (!es_mode(cb)) return;
    es_cbio_st* src = source_of(cb);
    if (!src) return;
    src->es_is_data_end = 0;
    if (src->flush) src->flush(src, type);
}

void cb_reset_cache(cb_buffer_st* cb) { reset_reader_at_input(cb, false, 0); }

void cb_flush_data(cb_buffer_st* cb) { reset_reader_at_input(cb, true, -1); }

void cb_seek_time_reset(cb_buffer_st* cb, int time_ms) { reset_reader_at_input(cb, true, time_ms); }

int cb_set_buffer_mode(cb_buffer_st* cb, int enable) {
    if (es_mode(cb)) {
        cb->buffer_type = CB_NO_BUF;
        return 0;
    }
    cb_io_st* in = cb->input;
    const cb_off_t at = static_cast<cb_off_t>(cb->curpos);
    if (cb->active_rbuf) {
        // Stand the input where the caller stands and empty the ring together,
        // under the source lock the streaming thread reads the input with.
        const cb_off_t r = reposition_ring_input(cb, at, CB_SEEK_SET);
        if (r == -1) return -1;
        cb->buffer_type = enable ? CB_STREAM_RBUF : CB_NO_BUF;
        return 0;
    }
    if (in->seek(in, at, CB_SEEK_SET) == -1) return -1;
    if (!enable) {
        cb->buffer_type = CB_NO_BUF;
        return 0;
    }
    if (cb->fs_cache.buffer) {
        reset_fs_cache(cb, static_cast<cb_fpos>(at));
        cb->buffer_type = CB_FS_CACHE;
    }
    return 0;
}
