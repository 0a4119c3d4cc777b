// The streaming thread: reads the input in block_size pieces ahead of the
// parser and appends them to the ring.
#include <unistd.h>

#include "dprintf.h"
#include "streaming_app.h"
#include "stream_internal.h"

void* StreamingData(void* arg) {
    cb_buffer_st* cb = static_cast<cb_buffer_st*>(arg);
    sys_ringbuffer* rb = cb->srbuf;
    cb_io_st* in = cb->input;
    while (cb_state_load(cb) != STATE_STOP) {
        const int block = in->block_size;
        // The input is read only under ring_mutex, the lock every seek holds
        // while it moves the input and empties the ring. wlock marks a block
        // that was read but is not stored yet: a seek in that window has the
        // ring drop it (rlock), since it comes from before the seek.
        pthread_mutex_lock(&rb->ring_mutex);
        const size_t n = in->read(in, cb->base, static_cast<size_t>(block));
        if (n == 0) {
            rb_set_eos(rb, 1);
            if (rb->rsize_req) pthread_cond_signal(&rb->ring_avail_cond);
        } else {
            rb->wlock = 1;
            // More data after the end (growing input) reopens the stream.
            rb_set_eos(rb, 0);
        }
        pthread_mutex_unlock(&rb->ring_mutex);
        if (n == 0) {
            // Polls for data that arrives later without spinning on the input.
            usleep(1000);
            continue;
        }
        RecordWrite(cb->base, static_cast<uint32_t>(n));
        // Never store without room: wait until the consumer releases, the
        // ring is emptied by a seek, or the reader is closing.
        bool stopping = false;
        for (;;) {
            const int32_t room = sys_ringbuffer_walloc(rb, static_cast<uint32_t>(n));
            if (room >= static_cast<int32_t>(n)) break;
            if (cb_state_load(cb) == STATE_STOP) {
                stopping = true;
                break;
            }
            if (room >= 0) usleep(1000);  // end of stream set: walloc does not wait
        }
        if (stopping) break;
        // Clears wlock in the same critical section as the store.
        sys_ringbuffer_byte_write(rb, cb->base, static_cast<uint32_t>(n));
    }
    return nullptr;
}

int OpenStream(cb_buffer_st* cb, const hova_callback_st* cbs) {
    cb->stream_thread_stack = cbs->malloc(cbs->context, CB_STREAM_THREAD_STACK);
    if (!cb->stream_thread_stack) {
        SYS_LOG("reader: out of memory starting the streaming thread\n");
        CloseURL(cb, cbs);
        return -1;
    }
    cb_state_store(cb, STATE_PLAY);
    pthread_attr_t attr;
    pthread_attr_init(&attr);
    pthread_attr_setdetachstate(&attr, PTHREAD_CREATE_JOINABLE);
    const int rc = pthread_create(&cb->thread->handle, &attr, StreamingData, cb);
    pthread_attr_destroy(&attr);
    if (rc != 0) {
        // Without a thread nothing would fill the ring: read it on the
        // caller's thread instead (synchronous ring).
        SYS_LOG("reader: streaming thread not created (%d), reading on the caller's thread\n", rc);
        cb_state_store(cb, STATE_STOP);
        cbs->freep(cbs->context, &cb->stream_thread_stack);
        init_single_thread_plugin(cb);
        return 0;
    }
    cb->thread_type = CB_MULTI_THREAD;
    return 0;
}

void CloseStream(cb_buffer_st* cb, const hova_callback_st* cbs) {
    cb_state_store(cb, STATE_STOP);
    pthread_join(cb->thread->handle, nullptr);
    cbs->freep(cbs->context, &cb->stream_thread_stack);
    cb->thread_type = CB_SINGLE_THREAD;
}
