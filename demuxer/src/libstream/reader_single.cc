// The single-thread operation set: dispatch on the buffering, the unbuffered
// branches and the seek logic shared by all three bufferings.
#include "stream_internal.h"

namespace {

size_t input_read(cb_buffer_st* cb, uint8_t* dst, size_t size) {
    return cb->input->read(cb->input, dst, size);
}

int32_t read_direct(cb_buffer_st* cb, uint8_t* dst, int32_t size) {
    if (size <= 0) {
        cb->cb_errcode = CB_ERR_OK;
        return 0;
    }
    const int32_t n = static_cast<int32_t>(input_read(cb, dst, static_cast<size_t>(size)));
    cb->cb_errcode = n < size ? CB_ERR_EOF : CB_ERR_OK;
    cb->curpos += static_cast<cb_fpos>(static_cast<int64_t>(n));
    return n;
}

// Inside the ring's held bytes or its history: forward consumes, backward
// takes released bytes back.
void skip_in_ring(cb_buffer_st* cb, cb_off_t target) {
    const cb_off_t cur = static_cast<cb_off_t>(cb->curpos);
    if (target > cur)
        (void)cb->cb_read(cb, nullptr, static_cast<int32_t>(target - cur));
    else if (target < cur)
        (void)rewind_ring(cb, target);
}

}  // namespace

void init_single_thread_plugin(cb_buffer_st* cb) {
    cb->cb_read = cb_read_single;
    cb->cb_peek = cb_peek_single;
    cb->cb_seek = cb_seek_single;
    cb->cb_seek64 = cb_seek_single64;
}

int32_t cb_read_single(cb_buffer_st* cb, uint8_t* dst, int32_t size) {
    switch (cb->buffer_type) {
        case CB_STREAM_RBUF:
            return read_rbuf_data(cb, dst, size);
        case CB_FS_CACHE: {
            if (size < 0) size = 0;
            const int32_t n = static_cast<int32_t>(
                read_fs_cache(cb, dst, static_cast<size_t>(size), cb->curpos));
            cb->cb_errcode = n < size ? CB_ERR_EOF : CB_ERR_OK;
            cb->curpos += static_cast<cb_fpos>(static_cast<int64_t>(n));
            return n;
        }
        default:
            return read_direct(cb, dst, size);
    }
}

int32_t cb_peek_single(cb_buffer_st* cb, uint8_t* dst, int32_t size) {
    switch (cb->buffer_type) {
        case CB_STREAM_RBUF:
            return peek_rbuf_data(cb, dst, size);
        case CB_FS_CACHE:
            return peek_fs_cache(cb, dst, size);
        default: {
            const int32_t n = read_direct(cb, dst, size);
            if (n > 0) (void)cb_seek_single64(cb, -static_cast<cb_off_t>(n), CB_SEEK_CUR);
            return n;
        }
    }
}

int seek_out_of_buffer(cb_buffer_st* cb, cb_off_t offset, int whence) {
    const cb_off_t cur = static_cast<cb_off_t>(cb->curpos);
    switch (cb->buffer_type) {
        case CB_STREAM_RBUF: {
            if (!cb->active_rbuf) return 1;
            if (whence != CB_SEEK_SET && whence != CB_SEEK_CUR) return 1;
            // From the oldest byte the history keeps to the end of what is held.
            sys_ringbuffer_settle(cb->active_rbuf);
            const cb_off_t held = rb_held(cb->active_rbuf);
            const cb_off_t kept = sys_ringbuffer_history(cb->active_rbuf);
            const cb_off_t delta = whence == CB_SEEK_SET ? offset - cur : offset;
            return (delta < -kept || delta > held) ? 1 : 0;
        }
        case CB_FS_CACHE: {
            if (whence != CB_SEEK_SET && whence != CB_SEEK_CUR) return 1;
            const cb_off_t target = whence == CB_SEEK_SET ? offset : cur + offset;
            return (target >= 0 && cache_holds(cb, static_cast<cb_fpos>(target))) ? 0 : 1;
        }
        default:
            return 1;
    }
}

void seek_reset_buffer(cb_buffer_st* cb, cb_off_t pos) {
    if (pos == -1) pos = cb->input->tell(cb->input);
    cb->curpos = static_cast<cb_fpos>(pos);
    if (cb->active_rbuf) {
        sys_ringbuffer_reset(cb->active_rbuf);
        if (cb->base) {
            ring_side(cb)->active = ring_side(cb)->input_away = 0;
            end_hold(cb);
        }
    }
    else if (cb->fs_cache.buffer)
        cache_input_moved(cb, static_cast<cb_fpos>(pos));  // the slots' bytes stay valid
}

cb_off_t cb_seek_single64(cb_buffer_st* cb, cb_off_t offset, int whence) {
    cb_io_st* in = cb->input;
    cb_off_t r = 0;
    if (cb->buffer_type == CB_STREAM_RBUF && cb->active_rbuf && cb->base) {
        if (whence == CB_SEEK_END) return ring_seek_end(cb, offset);
        if (whence == CB_SEEK_SET || whence == CB_SEEK_CUR) {
            const cb_off_t target =
                whence == CB_SEEK_SET ? offset : static_cast<cb_off_t>(cb->curpos) + offset;
            return ring_seek_to(cb, target);
        }
    }
    switch (whence) {
        case CB_SEEK_SET:
            if (seek_out_of_buffer(cb, offset, whence)) {
                r = in->seek(in, offset, CB_SEEK_SET);
                seek_reset_buffer(cb, r);
            } else if (cb->buffer_type == CB_FS_CACHE) {
                cb->curpos = static_cast<cb_fpos>(offset);
            } else {
                skip_in_ring(cb, offset);
            }
            break;
        case CB_SEEK_CUR:
            if (seek_out_of_buffer(cb, offset, whence)) {
                if (offset == 0) {
                    // The file cache knows where the input stands; the other
                    // bufferings take it to stand at curpos.
                    if (cb->buffer_type != CB_FS_CACHE)
                        seek_reset_buffer(cb, static_cast<cb_off_t>(cb->curpos));
                } else {
                    r = in->seek(in, static_cast<cb_off_t>(cb->curpos) + offset, CB_SEEK_SET);
                    seek_reset_buffer(cb, r);
                }
            } else if (cb->buffer_type == CB_FS_CACHE) {
                cb->curpos += static_cast<cb_fpos>(offset);
            } else {
                skip_in_ring(cb, static_cast<cb_off_t>(cb->curpos) + offset);
            }
            break;
        case CB_SEEK_END:
            r = in->seek(in, offset, CB_SEEK_END);
            seek_reset_buffer(cb, r);
            break;
        default:
            return -1;
    }
    if (r == -1) return -1;
    return static_cast<cb_off_t>(cb->curpos);
}

int32_t cb_seek_single(cb_buffer_st* cb, int32_t offset, int whence) {
    return static_cast<int32_t>(
        static_cast<uint32_t>(cb_seek_single64(cb, static_cast<cb_off_t>(offset), whence)));
}
