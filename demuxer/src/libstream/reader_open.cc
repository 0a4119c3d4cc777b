// Opening and closing the reader, and the queries that do not depend on the
// operation set.
#include <string.h>

#include "dprintf.h"
#include "stream_internal.h"

namespace {

void* host_alloc(const hova_callback_st* cbs, size_t size) {
    return cbs->malloc(cbs->context, size);
}

template <typename T>
void host_free(const hova_callback_st* cbs, T*& p) {
    cbs->freep(cbs->context, static_cast<void*>(&p));
}

}  // namespace

void init_thread_plugin(cb_buffer_st* cb, int rbuf_mode) {
    switch (rbuf_mode) {
        case CBIO_APPLY_ES_BUF: init_es_plugin(cb); break;
        case CBIO_APPLY_RBUF: init_multi_thread_plugin(cb); break;
        default: init_single_thread_plugin(cb); break;
    }
}

int OpenURL(cb_buffer_st* cbuf, cb_io_st* input, int ringbuf_size, const hova_callback_st* cbs) {
    memset(cbuf, 0, sizeof(*cbuf));
    cbuf->input = input;
    cbuf->thread_type = CB_SINGLE_THREAD;
    if (!input->disable_cache && input->block_size <= 0) {
        SYS_LOG("reader: block size %d is not usable\n", input->block_size);
        return -1;
    }
    const bool ring_wanted = !input->disable_cache && input->rbuf_mode == CBIO_APPLY_RBUF;
    // A ring that cannot take one block could never be topped up.
    if (ring_wanted && (ringbuf_size <= 0 || ringbuf_size - 1 < input->block_size)) {
        SYS_LOG("reader: ring of %d bytes cannot hold a block of %d\n", ringbuf_size,
                input->block_size);
        return -1;
    }
    // The multi-thread set works on the ring; without one it would have
    // nothing to read from, so such a reader reads straight from the input.
    init_thread_plugin(cbuf, (input->rbuf_mode == CBIO_APPLY_RBUF && !ring_wanted)
                                 ? static_cast<int>(CBIO_NO_RBUF)
                                 : static_cast<int>(input->rbuf_mode));

    if (input->disable_cache) {
        cbuf->buffer_type = CB_NO_BUF;
    } else {
        cbuf->buffer_type = ring_wanted ? CB_STREAM_RBUF : CB_FS_CACHE;
        const uint32_t block = static_cast<uint32_t>(input->block_size);
        // The file cache keeps a block per cursor (a few slots behind a small
        // record); a ring reads in place and uses the block for visits
        // outside it (reader_side.cc).
        const bool es = input->rbuf_mode == CBIO_APPLY_ES_BUF;
        uint32_t slots = 1;
        size_t base_bytes = CB_CACHE_HEAD + block;  // a ring's side block
        if (!ring_wanted) {
            base_bytes = cache_block_bytes(block, &slots);
            // Elementary-stream mode moves the input behind the reader's back:
            // one slot, read where the input stands.
            if (es) {
                slots = 1;
                base_bytes = CB_CACHE_HEAD + block;
            }
        }
        cbuf->base = static_cast<uint8_t*>(host_alloc(cbs, base_bytes));
        if (cbuf->base) memset(cbuf->base, 0, CB_CACHE_HEAD);
        if (cbuf->base && ring_wanted) ring_side(cbuf)->side_cap = block;
        bool ok = cbuf->base != nullptr;
        if (ok && ring_wanted) {
            cbuf->stream_ringbuf =
                static_cast<uint8_t*>(host_alloc(cbs, static_cast<size_t>(ringbuf_size)));
            ok = cbuf->stream_ringbuf != nullptr;
            if (ok) {
                cbuf->srbuf = static_cast<sys_ringbuffer*>(host_alloc(cbs, sizeof(sys_ringbuffer)));
                ok = cbuf->srbuf != nullptr;
            }
            if (ok) {
                cbuf->thread = static_cast<sys_thread_st*>(host_alloc(cbs, sizeof(sys_thread_st)));
                ok = cbuf->thread != nullptr;
            }
            if (ok) {
                sys_ringbuffer_init(cbuf->srbuf, cbuf->stream_ringbuf,
                                    static_cast<uint32_t>(ringbuf_size));
                cbuf->active_rbuf = cbuf->srbuf;
            }
        } else if (ok) {
            init_fs_cache(cbuf, block, slots, !es);
        }
        if (!ok) {
            SYS_LOG("reader: out of memory opening the input\n");
            host_free(cbs, cbuf->thread);
            host_free(cbs, cbuf->srbuf);
            host_free(cbs, cbuf->stream_ringbuf);
            host_free(cbs, cbuf->base);
            return -1;
        }
    }
    cbuf->cb_errcode = CB_ERR_OK;
    cbuf->curpos = 0;

    if (!input->use_thread) {
        // Nothing but a streaming thread fills the ring for the multi-thread
        // set; without one the reader tops the ring up itself.
        if (cbuf->active_rbuf) changeThreadType(cbuf, 0);
        return 0;
    }
    // Only a ring can carry data from a thread to the reader.
    if (!cbuf->active_rbuf) {
        SYS_LOG("reader: thread asked for without a ring, reading on the caller's thread\n");
        return 0;
    }
    return OpenStream(cbuf, cbs);
}

int CloseURL(cb_buffer_st* cbuf, const hova_callback_st* cbs) {
    if (cbuf->thread_type == CB_MULTI_THREAD) {
        // Stop first so that the thread, once woken by the close below, does
        // not go on to read another block.
        cb_state_store(cbuf, STATE_STOP);
    }
    if (cbuf->srbuf) sys_ringbuffer_close(cbuf->srbuf);
    if (cbuf->thread_type == CB_MULTI_THREAD) CloseStream(cbuf, cbs);
    if (cbuf->srbuf) sys_ringbuffer_destroy(cbuf->srbuf);
    host_free(cbs, cbuf->stream_ringbuf);
    host_free(cbs, cbuf->base);
    host_free(cbs, cbuf->srbuf);
    host_free(cbs, cbuf->thread);
    cbuf->active_rbuf = nullptr;
    cbuf->fs_cache.buffer = nullptr;
    cbuf->buffer_type = CB_NO_BUF;
    return 0;
}

cb_fpos cb_tell64(const cb_buffer_st* cbuf) { return cbuf->curpos; }

int cb_tell(const cb_buffer_st* cbuf) { return static_cast<int>(static_cast<uint32_t>(cbuf->curpos)); }

int cb_status(const cb_buffer_st* cbuf) { return cbuf->cb_errcode; }

cb_fpos cb_get_file_size(cb_buffer_st* cbuf) {
    if (cbuf->input->streaming) return cbuf->input->input_size;
    cb_off_t end = cbuf->cb_seek64(cbuf, 0, CB_SEEK_END);
    if (end == -1) end = 0;
    (void)cbuf->cb_seek64(cbuf, 0, CB_SEEK_SET);
    return static_cast<cb_fpos>(end);
}

void changeThreadType(cb_buffer_st* cbuf, int useRingBuf) {
    if (useRingBuf)
        init_multi_thread_plugin(cbuf);
    else
        init_single_thread_plugin(cbuf);
}
