#include "ringbuffer_api.h"

#include <string.h>
#include <time.h>

namespace {

// Deadline in whole calendar seconds: a wait ends at the latest at the start
// of the tenth second after the call, and every new wait starts a new one.
int rb_cond_timed_wait(rb_cond_t* cond, rb_mutex_t* mutex) {
    struct timespec deadline;
    deadline.tv_sec = time(nullptr) + SYS_RINGBUFFER_WAIT_S;
    deadline.tv_nsec = 0;
    return pthread_cond_timedwait(cond, mutex, &deadline);
}

// pkt_cnt and buf_eos are read without the lock by single-thread callers and
// by the reader's in-buffer test, so every access goes through atomics.
inline uint32_t load_cnt(const sys_ringbuffer* rb) {
    return __atomic_load_n(&rb->pkt_cnt, __ATOMIC_ACQUIRE);
}
inline void store_cnt(sys_ringbuffer* rb, uint32_t v) {
    __atomic_store_n(&rb->pkt_cnt, v, __ATOMIC_RELEASE);
}
inline void store_eos(sys_ringbuffer* rb, int16_t v) {
    __atomic_store_n(&rb->buf_eos, v, __ATOMIC_RELEASE);
}
inline int16_t load_eos(const sys_ringbuffer* rb) {
    return __atomic_load_n(&rb->buf_eos, __ATOMIC_ACQUIRE);
}

// Bytes just written, or reserved for a fill in flight, took room that the
// history may have counted on.
void trim_history(sys_ringbuffer* rb) {
    const uint32_t free_room = static_cast<uint32_t>(sys_ringbuffer_free_internal(rb));
    const uint32_t room = free_room > rb->filling ? free_room - rb->filling : 0;
    if (rb->hist > room) rb->hist = room;
}

// A reset, flush or close while a fill is in flight: its bytes were asked
// for before, and the commit drops them.
void drop_fill_in_flight(sys_ringbuffer* rb) {
    if (rb->wlock) rb->rlock = 1;
}

void copy_in(sys_ringbuffer* rb, const uint8_t* src, uint32_t len) {
    const uint32_t tail = rb->size - rb->pwrite;
    if (len > tail) {
        memcpy(rb->data + rb->pwrite, src, tail);
        memcpy(rb->data, src + tail, len - tail);
        rb->pwrite = len - tail;
    } else {
        memcpy(rb->data + rb->pwrite, src, len);
        rb->pwrite += len;
        if (rb->pwrite == rb->size) rb->pwrite = 0;
    }
}

}  // namespace

int32_t sys_ringbuffer_free_internal(const sys_ringbuffer* rb) {
    if (rb->pread > rb->pwrite) return static_cast<int32_t>(rb->pread - rb->pwrite - 1);
    return static_cast<int32_t>(rb->pread + rb->size - rb->pwrite - 1);
}

int32_t sys_ringbuffer_avail_internal(const sys_ringbuffer* rb) {
    if (rb->pwrite >= rb->pread) return static_cast<int32_t>(rb->pwrite - rb->pread);
    return static_cast<int32_t>(rb->pwrite + rb->size - rb->pread);
}

void sys_ringbuffer_init(sys_ringbuffer* rb, uint8_t* data, uint32_t len) {
    rb->data = data;
    rb->size = len;
    rb->pread = 0;
    rb->pwrite = 0;
    store_cnt(rb, 0);
    store_eos(rb, 0);
    rb->wsize_req = 0;
    rb->rsize_req = 0;
    rb->error = 0;
    rb->rlock = 0;
    rb->wlock = 0;
    __atomic_store_n(&rb->slock, 0, __ATOMIC_RELAXED);
    rb->srlock = 0;
    rb->hist = 0;
    rb->taken = 0;
    rb->retry_read = 0;
    rb->unreleased = 0;
    rb->filling = 0;
    __atomic_store_n(&rb->source_waiters, 0, __ATOMIC_RELAXED);
    pthread_mutex_init(&rb->source_mutex, nullptr);
    pthread_mutex_init(&rb->ring_mutex, nullptr);
    pthread_cond_init(&rb->ring_avail_cond, nullptr);
    pthread_cond_init(&rb->ring_free_cond, nullptr);
}

void sys_ringbuffer_destroy(sys_ringbuffer* rb) {
    pthread_cond_destroy(&rb->ring_avail_cond);
    pthread_cond_destroy(&rb->ring_free_cond);
    pthread_mutex_destroy(&rb->ring_mutex);
    pthread_mutex_destroy(&rb->source_mutex);
}

void sys_ringbuffer_source_lock(sys_ringbuffer* rb) {
    __atomic_add_fetch(&rb->source_waiters, 1, __ATOMIC_ACQ_REL);
    pthread_mutex_lock(&rb->source_mutex);
    __atomic_sub_fetch(&rb->source_waiters, 1, __ATOMIC_ACQ_REL);
}

void sys_ringbuffer_source_unlock(sys_ringbuffer* rb) {
    pthread_mutex_unlock(&rb->source_mutex);
    // A producer that stood back for us waits for room on this condition.
    pthread_mutex_lock(&rb->ring_mutex);
    pthread_cond_signal(&rb->ring_free_cond);
    pthread_mutex_unlock(&rb->ring_mutex);
}

int sys_ringbuffer_source_wanted(const sys_ringbuffer* rb) {
    return __atomic_load_n(&rb->source_waiters, __ATOMIC_ACQUIRE) != 0;
}

void sys_ringbuffer_close(sys_ringbuffer* rb) {
    pthread_mutex_lock(&rb->ring_mutex);
    drop_fill_in_flight(rb);
    store_eos(rb, 1);
    store_cnt(rb, 0);
    rb->pread = rb->pwrite;
    rb->unreleased = 0;
    rb->error = 0;
    rb->hist = 0;
    pthread_cond_signal(&rb->ring_avail_cond);
    pthread_cond_signal(&rb->ring_free_cond);
    pthread_mutex_unlock(&rb->ring_mutex);
}

int sys_ringbuffer_empty(sys_ringbuffer* rb) {
    return rb->pread == rb->pwrite ? 1 : 0;
}

int32_t sys_ringbuffer_free(sys_ringbuffer* rb) {
    pthread_mutex_lock(&rb->ring_mutex);
    const int32_t n = sys_ringbuffer_free_internal(rb);
    pthread_mutex_unlock(&rb->ring_mutex);
    return n;
}

int32_t sys_ringbuffer_avail(sys_ringbuffer* rb) {
    pthread_mutex_lock(&rb->ring_mutex);
    const int32_t n = sys_ringbuffer_avail_internal(rb);
    pthread_mutex_unlock(&rb->ring_mutex);
    return n;
}

void sys_ringbuffer_flush(sys_ringbuffer* rb) {
    pthread_mutex_lock(&rb->ring_mutex);
    drop_fill_in_flight(rb);
    store_cnt(rb, 0);
    rb->error = 1;
    rb->pread = rb->pwrite;
    rb->unreleased = 0;
    rb->hist = 0;
    pthread_cond_signal(&rb->ring_avail_cond);
    pthread_cond_signal(&rb->ring_free_cond);
    pthread_mutex_unlock(&rb->ring_mutex);
}

void sys_ringbuffer_reset_locked(sys_ringbuffer* rb) {
    drop_fill_in_flight(rb);
    store_cnt(rb, 0);
    rb->pread = 0;
    rb->pwrite = 0;
    rb->unreleased = 0;
    rb->hist = 0;
    rb->taken = 0;
    store_eos(rb, 0);
    __atomic_store_n(&rb->slock, 0, __ATOMIC_RELAXED);
    pthread_cond_signal(&rb->ring_avail_cond);
    pthread_cond_signal(&rb->ring_free_cond);
}

void sys_ringbuffer_reset(sys_ringbuffer* rb) {
    pthread_mutex_lock(&rb->ring_mutex);
    sys_ringbuffer_reset_locked(rb);
    pthread_mutex_unlock(&rb->ring_mutex);
}

int32_t sys_ringbuffer_walloc(sys_ringbuffer* rb, uint32_t len) {
    pthread_mutex_lock(&rb->ring_mutex);
    rb->wsize_req = static_cast<int32_t>(len);
    int32_t free_space = sys_ringbuffer_free_internal(rb);
    while (free_space < static_cast<int32_t>(len) && !load_eos(rb)) {
        if (rb_cond_timed_wait(&rb->ring_free_cond, &rb->ring_mutex) != 0) {
            rb->wsize_req = 0;
            pthread_mutex_unlock(&rb->ring_mutex);
            return -2;
        }
        if (rb->error) {
            rb->error = 0;
            if (load_cnt(rb) == 0 && rb->pread == rb->pwrite) {
                rb->wsize_req = 0;
                pthread_mutex_unlock(&rb->ring_mutex);
                return -1;
            }
        }
        free_space = sys_ringbuffer_free_internal(rb);
    }
    rb->wsize_req = 0;
    pthread_mutex_unlock(&rb->ring_mutex);
    return free_space;
}

int32_t sys_ringbuffer_read_peek(sys_ringbuffer* rb, uint8_t* dst, uint32_t len, uint32_t skip) {
    uint32_t start = rb->pread + skip;
    if (start >= rb->size) start -= rb->size;
    if (start + len > rb->size) {
        const uint32_t tail = rb->size - start;
        memcpy(dst, rb->data + start, tail);
        memcpy(dst + tail, rb->data, len - tail);
    } else {
        memcpy(dst, rb->data + start, len);
    }
    return static_cast<int32_t>(len);
}

namespace {

void release_locked(sys_ringbuffer* rb, uint32_t len) {
    uint32_t p = rb->pread + len;
    if (p >= rb->size) p -= rb->size;
    rb->pread = p;
    store_cnt(rb, load_cnt(rb) - len);
    // Released bytes stay readable until the producer needs their room.
    rb->hist += len;
    trim_history(rb);
    rb->taken = rb->taken > UINT32_MAX - len ? UINT32_MAX : rb->taken + len;
    if (rb->wsize_req != 0 && sys_ringbuffer_free_internal(rb) >= rb->wsize_req)
        pthread_cond_signal(&rb->ring_free_cond);
    rb->srlock = 0;
}

// Bytes a consumer takes without the lock before it releases them in one
// critical section: small enough that the producer soon gets the room back,
// large enough that the lock is rare next to the parser's small reads.
constexpr uint32_t kReleaseBatch = 16 * 1024;

uint32_t release_batch(const sys_ringbuffer* rb) {
    const uint32_t quarter = rb->size / 4;
    if (quarter == 0) return 1;
    return quarter < kReleaseBatch ? quarter : kReleaseBatch;
}

}  // namespace

void sys_ringbuffer_settle_locked(sys_ringbuffer* rb) {
    if (rb->unreleased == 0) return;
    const uint32_t n = rb->unreleased;
    rb->unreleased = 0;
    release_locked(rb, n);
}

void sys_ringbuffer_settle(sys_ringbuffer* rb) {
    if (rb->unreleased == 0) return;
    pthread_mutex_lock(&rb->ring_mutex);
    sys_ringbuffer_settle_locked(rb);
    pthread_mutex_unlock(&rb->ring_mutex);
}

uint32_t sys_ringbuffer_ahead(const sys_ringbuffer* rb) {
    const uint32_t held = load_cnt(rb);
    return held > rb->unreleased ? held - rb->unreleased : 0;
}

uint32_t sys_ringbuffer_held_span(const sys_ringbuffer* rb, const uint8_t** at) {
    const uint32_t ahead = sys_ringbuffer_ahead(rb);
    uint32_t start = rb->pread + rb->unreleased;
    if (start >= rb->size) start -= rb->size;
    *at = rb->data + start;
    const uint32_t to_end = rb->size - start;
    return ahead < to_end ? ahead : to_end;
}

int32_t sys_ringbuffer_peek_held(sys_ringbuffer* rb, uint8_t* dst, uint32_t len) {
    // pkt_cnt is stored (release) after the producer wrote the bytes it
    // counts, and the acquire load in ahead() makes them visible here.
    if (len == 0 || sys_ringbuffer_ahead(rb) < len) return 0;
    if (dst) sys_ringbuffer_read_peek(rb, dst, len, rb->unreleased);
    return static_cast<int32_t>(len);
}

int32_t sys_ringbuffer_take_held(sys_ringbuffer* rb, uint8_t* dst, uint32_t len) {
    if (sys_ringbuffer_peek_held(rb, dst, len) == 0) return 0;
    rb->unreleased += len;
    // Never wait for the lock here: the streaming thread holds it while it
    // reads a block, and the next take tries again.
    if (rb->unreleased >= release_batch(rb) && pthread_mutex_trylock(&rb->ring_mutex) == 0) {
        sys_ringbuffer_settle_locked(rb);
        pthread_mutex_unlock(&rb->ring_mutex);
    }
    return static_cast<int32_t>(len);
}

namespace {

// Consumer side of byte_read_peek, with the lock held: waits until `len`
// bytes are held, end of stream, or the timed wait expires.
uint32_t wait_and_copy_locked(sys_ringbuffer* rb, uint8_t* dst, int32_t len) {
    sys_ringbuffer_settle_locked(rb);
    rb->rsize_req = len;
    rb->srlock = 1;
    int32_t avail = sys_ringbuffer_avail_internal(rb);
    // A producer holding back its read-ahead must know that the consumer waits.
    if (avail < len && rb->wsize_req != 0) pthread_cond_signal(&rb->ring_free_cond);
    while (avail < len && !load_eos(rb)) {
        if (rb_cond_timed_wait(&rb->ring_avail_cond, &rb->ring_mutex) != 0) break;
        avail = sys_ringbuffer_avail_internal(rb);
    }
    uint32_t count = load_cnt(rb);
    if (static_cast<uint32_t>(len) < count) count = static_cast<uint32_t>(len);
    if (dst && count) sys_ringbuffer_read_peek(rb, dst, count, 0);
    rb->rsize_req = 0;
    return count;
}

}  // namespace

int32_t sys_ringbuffer_byte_read_peek(sys_ringbuffer* rb, uint8_t* dst, int32_t len) {
    pthread_mutex_lock(&rb->ring_mutex);
    const uint32_t count = wait_and_copy_locked(rb, dst, len);
    pthread_mutex_unlock(&rb->ring_mutex);
    return static_cast<int32_t>(count);
}

int32_t sys_ringbuffer_byte_read(sys_ringbuffer* rb, uint8_t* dst, int32_t len) {
    pthread_mutex_lock(&rb->ring_mutex);
    const uint32_t count = wait_and_copy_locked(rb, dst, len);
    if (count) release_locked(rb, count);
    rb->srlock = 0;
    pthread_mutex_unlock(&rb->ring_mutex);
    return static_cast<int32_t>(count);
}

void sys_ringbuffer_byte_release(sys_ringbuffer* rb, uint32_t len) {
    pthread_mutex_lock(&rb->ring_mutex);
    sys_ringbuffer_settle_locked(rb);
    release_locked(rb, len);
    pthread_mutex_unlock(&rb->ring_mutex);
}

int32_t sys_ringbuffer_byte_read_peek_single_thread(sys_ringbuffer* rb, uint8_t* dst,
                                                    int32_t len) {
    uint32_t count = load_cnt(rb);
    if (static_cast<uint32_t>(len) < count) count = static_cast<uint32_t>(len);
    if (dst && count) sys_ringbuffer_read_peek(rb, dst, count, 0);
    return static_cast<int32_t>(count);
}

int32_t sys_ringbuffer_byte_write(sys_ringbuffer* rb, const uint8_t* src, uint32_t len) {
    pthread_mutex_lock(&rb->ring_mutex);
    if (!rb->rlock) {
        copy_in(rb, src, len);
        store_cnt(rb, load_cnt(rb) + len);
        trim_history(rb);
    }
    // Stored or dropped, the producer's block is no longer in flight.
    rb->rlock = 0;
    rb->wlock = 0;
    if (rb->rsize_req != 0) pthread_cond_signal(&rb->ring_avail_cond);
    pthread_mutex_unlock(&rb->ring_mutex);
    return static_cast<int32_t>(len);
}

int32_t sys_ringbuffer_byte_write2(sys_ringbuffer* rb, uint32_t len) {
    pthread_mutex_lock(&rb->ring_mutex);
    if (!rb->rlock) {
        store_cnt(rb, load_cnt(rb) + len);
        if (rb->pwrite + len > rb->size) {
            const uint32_t over = rb->pwrite + len - rb->size;
            memmove(rb->data, rb->data + rb->size, over);
            rb->pwrite = over;
        } else {
            rb->pwrite += len;
            if (rb->pwrite == rb->size) rb->pwrite = 0;
        }
        trim_history(rb);
    }
    // Stored or dropped, the producer's block is no longer in flight.
    rb->rlock = 0;
    rb->wlock = 0;
    if (rb->rsize_req != 0) pthread_cond_signal(&rb->ring_avail_cond);
    pthread_mutex_unlock(&rb->ring_mutex);
    return static_cast<int32_t>(len);
}

uint32_t sys_ringbuffer_wspace_locked(sys_ringbuffer* rb, uint32_t len, uint8_t** at) {
    uint32_t room = static_cast<uint32_t>(sys_ringbuffer_free_internal(rb));
    const uint32_t to_end = rb->size - rb->pwrite;
    if (room > to_end) room = to_end;
    if (room > len) room = len;
    *at = rb->data + rb->pwrite;
    // The history must not count bytes the producer is about to overwrite,
    // now or (releases while the fill is out) until it commits.
    rb->filling = room;
    rb->wlock = 1;
    rb->rlock = 0;
    trim_history(rb);
    return room;
}

int sys_ringbuffer_commit_locked(sys_ringbuffer* rb, uint32_t len) {
    const bool dropped = rb->rlock != 0;
    rb->filling = 0;
    rb->rlock = 0;
    rb->wlock = 0;
    if (dropped) return 0;
    rb->pwrite += len;
    if (rb->pwrite == rb->size) rb->pwrite = 0;
    store_cnt(rb, load_cnt(rb) + len);
    trim_history(rb);
    // A waiting consumer is woken once what it asked for is there, not at
    // every block: with small blocks each wake-up would be a hand-over of the
    // lock for nothing (the end of the input wakes it separately).
    if (rb->rsize_req > 0 && load_cnt(rb) >= static_cast<uint32_t>(rb->rsize_req))
        pthread_cond_signal(&rb->ring_avail_cond);
    return 1;
}

int sys_ringbuffer_rewind(sys_ringbuffer* rb, uint32_t len) {
    pthread_mutex_lock(&rb->ring_mutex);
    sys_ringbuffer_settle_locked(rb);
    const bool held = len <= rb->hist;
    if (held) {
        rb->pread = rb->pread >= len ? rb->pread - len : rb->pread + rb->size - len;
        store_cnt(rb, load_cnt(rb) + len);
        rb->hist -= len;
    }
    pthread_mutex_unlock(&rb->ring_mutex);
    return held ? 1 : 0;
}

uint32_t sys_ringbuffer_history(sys_ringbuffer* rb) {
    pthread_mutex_lock(&rb->ring_mutex);
    sys_ringbuffer_settle_locked(rb);
    const uint32_t h = rb->hist;
    pthread_mutex_unlock(&rb->ring_mutex);
    return h;
}
