// The streaming thread: reads the input ahead of the parser, straight into
// the ring's free space, and waits on the ring's conditions (never polls)
// while there is nothing to do.
#include <time.h>

#include "dprintf.h"
#include "streaming_app.h"
#include "stream_internal.h"

namespace {

// At the end of the input the thread waits for a seek or the close; an input
// that grows is read again after this long.
constexpr long kEndOfInputRetryNs = 10L * 1000 * 1000;

void wait_for_wake(sys_ringbuffer* rb, long ns) {
    struct timespec deadline;
    clock_gettime(CLOCK_REALTIME, &deadline);
    deadline.tv_nsec += ns;
    while (deadline.tv_nsec >= 1000000000L) {
        deadline.tv_sec += 1;
        deadline.tv_nsec -= 1000000000L;
    }
    (void)pthread_cond_timedwait(&rb->ring_free_cond, &rb->ring_mutex, &deadline);
}

void wait_for_wake(sys_ringbuffer* rb) {
    struct timespec deadline;
    deadline.tv_sec = time(nullptr) + SYS_RINGBUFFER_WAIT_S;
    deadline.tv_nsec = 0;
    (void)pthread_cond_timedwait(&rb->ring_free_cond, &rb->ring_mutex, &deadline);
}

uint32_t read_ahead_limit(const sys_ringbuffer* rb, uint32_t block) {
    const uint32_t cap = rb->size - 1;
    // Half the ring stays for the history (bytes a cursor swap or a short
    // backward seek reads again) unless a consumer waits for more.
    uint32_t limit = cap / 2;
    // After a seek the read-ahead grows with what the consumer takes, so a
    // seek that is soon followed by another reads little that is never used.
    const uint64_t grown = static_cast<uint64_t>(rb->taken) / 2 + block;
    if (grown < limit) limit = static_cast<uint32_t>(grown);
    // Two blocks at least: one being consumed, one on its way.
    const uint64_t least = 2ull * block;
    if (limit < least) limit = static_cast<uint32_t>(least < cap ? least : cap);
    return limit;
}

// One pass of the thread's loop, entered with both locks held (source, then
// ring) and leaving both released: a wait, or one read and its store.
void fill_once(cb_buffer_st* cb) {
    sys_ringbuffer* rb = cb->srbuf;
    cb_io_st* in = cb->input;
    const int block_size = in->block_size;
    const uint32_t cap = rb->size - 1;
    uint32_t block = block_size > 0 ? static_cast<uint32_t>(block_size) : 1;
    // A host that raised block_size past the ring still gets whole-ring reads.
    if (block > cap) block = cap;
    const uint32_t held = rb_held(rb);
    const uint32_t room = static_cast<uint32_t>(sys_ringbuffer_free_internal(rb));
    // A consumer waiting for more than is held gets the ring's whole room.
    const bool starved = rb->rsize_req > 0 && static_cast<uint32_t>(rb->rsize_req) > held;
    const uint32_t limit = read_ahead_limit(rb, block);
    // Nothing ahead while a visit elsewhere has the input's transfer
    // (until the consumer comes back to the ring or moves it).
    const bool held_back = cb->base && ring_side(cb)->hold_ahead;
    const bool want_more = starved || (!held_back && held + block <= limit);
    const bool at_end = rb_eos(rb) && !rb->retry_read;
    if (sys_ringbuffer_source_wanted(rb) || room < block || !want_more || at_end) {
        // The input goes to whoever waits for it (a seek: it waits for at
        // most the read that was in flight); the thread is woken when the
        // input is free again, when the consumer has released enough (a
        // whole block's room, and read-ahead below its limit), when it waits
        // for data, when a seek empties the ring, or at the close. At the end
        // of the input nothing comes until a seek or the close; an input
        // that grows is read again after a short wait.
        pthread_mutex_unlock(&rb->source_mutex);
        if (at_end && !sys_ringbuffer_source_wanted(rb)) {
            wait_for_wake(rb, kEndOfInputRetryNs);
            rb->retry_read = 1;
        } else {
            rb->wsize_req = static_cast<int32_t>(want_more ? block : cap - limit + block);
            wait_for_wake(rb);
            rb->wsize_req = 0;
        }
        pthread_mutex_unlock(&rb->ring_mutex);
        return;
    }
    rb->retry_read = 0;
    // The read happens outside ring_mutex, into room the ring leaves to the
    // thread until the commit: the consumer goes on taking what is held. The
    // source lock keeps seeks, flushes and visits off the input meanwhile.
    uint8_t* at = nullptr;
    const uint32_t n_room = sys_ringbuffer_wspace_locked(rb, block, &at);
    pthread_mutex_unlock(&rb->ring_mutex);
    const size_t n = in->read(in, at, n_room);
    pthread_mutex_lock(&rb->ring_mutex);
    // Dropped when the ring was closed (or flushed) during the read.
    if (sys_ringbuffer_commit_locked(rb, static_cast<uint32_t>(n))) {
        if (n == 0) {
            rb_set_eos(rb, 1);
            if (rb->rsize_req) pthread_cond_signal(&rb->ring_avail_cond);
        } else {
            // More data after the end (growing input) reopens the stream.
            rb_set_eos(rb, 0);
            RecordWrite(at, static_cast<uint32_t>(n));
        }
    }
    pthread_mutex_unlock(&rb->ring_mutex);
    pthread_mutex_unlock(&rb->source_mutex);
}

}  // namespace

void* StreamingData(void* arg) {
    cb_buffer_st* cb = static_cast<cb_buffer_st*>(arg);
    sys_ringbuffer* rb = cb->srbuf;
    // Everything that moves the input (seeks, the host's time moves, flushes,
    // visits outside the ring) holds the source lock, and the thread holds
    // it from choosing to read to storing what it read: a block is stored
    // only if it was read from where the ring's bytes end. ring_mutex guards
    // the ring's marks only, for short moments, never across a read.
    while (cb_state_load(cb) != STATE_STOP) {
        pthread_mutex_lock(&rb->source_mutex);
        pthread_mutex_lock(&rb->ring_mutex);
        if (cb_state_load(cb) == STATE_STOP) {
            pthread_mutex_unlock(&rb->ring_mutex);
            pthread_mutex_unlock(&rb->source_mutex);
            break;
        }
        fill_once(cb);
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
    // Wake the thread wherever it waits; it sees the stop under the lock.
    pthread_mutex_lock(&cb->srbuf->ring_mutex);
    pthread_cond_signal(&cb->srbuf->ring_free_cond);
    pthread_mutex_unlock(&cb->srbuf->ring_mutex);
    pthread_join(cb->thread->handle, nullptr);
    cbs->freep(cbs->context, &cb->stream_thread_stack);
    cb->thread_type = CB_SINGLE_THREAD;
}
