/*
 * Byte FIFO over storage its owner supplies, for one producer and one
 * consumer, guarded by one mutex with two condition variables. Consumers
 * read in two steps (read-peek, then release) so that a peek costs nothing
 * extra. The marks rlock/wlock/slock/srlock let the reader and its streaming
 * thread agree on which blocks survive a seek.
 */
#ifndef SYS_RINGBUFFER_API_H
#define SYS_RINGBUFFER_API_H

#include <pthread.h>
#include <stdint.h>

typedef pthread_mutex_t rb_mutex_t;
typedef pthread_cond_t rb_cond_t;

struct sys_ringbuffer {
    uint8_t* data;           /* storage of `size` bytes, owned by the creator */
    uint32_t size;
    uint32_t pread;          /* next byte to consume */
    uint32_t pwrite;         /* next byte to produce */
    volatile uint32_t pkt_cnt; /* bytes produced and not yet released */
    int16_t buf_eos;         /* no more data will come */
    int32_t wsize_req;       /* bytes a producer waits to write */
    int32_t rsize_req;       /* bytes a consumer waits to read */
    int32_t error;           /* flush mark for a waiting producer */
    int8_t rlock;            /* drop the next write */
    int8_t wlock;            /* the producer holds a block not yet stored */
    volatile int8_t slock;   /* readers pause while set */
    int8_t srlock;           /* a consumer is between read-peek and release */
    uint32_t hist;           /* released bytes just behind pread that are still
                                intact: a consumer may take them back (rewind)
                                until the producer needs their room */
    uint32_t taken;          /* bytes released since the last reset (saturates);
                                the streaming thread reads ahead in step with it */
    int8_t retry_read;       /* the streaming thread's next read follows a wait
                                at the end of the input */
    uint32_t unreleased;     /* consumer only: bytes taken past pread without
                                the lock, released later in a batch */
    uint32_t filling;        /* room at pwrite the producer reserved and writes
                                outside the lock (wlock set meanwhile) */
    uint32_t source_waiters; /* callers waiting for source_mutex: the producer
                                starts no new fill while there are any */
    rb_mutex_t source_mutex; /* the producer's source: held by a fill from its
                                reservation to its commit, and by whoever moves
                                the source; taken before ring_mutex */
    rb_mutex_t ring_mutex;
    rb_cond_t ring_avail_cond;
    rb_cond_t ring_free_cond;
};
typedef struct sys_ringbuffer sys_ringbuffer;

/* Seconds a waiter sleeps without a wake-up before it gives up. */
constexpr int SYS_RINGBUFFER_WAIT_S = 10;

void sys_ringbuffer_init(sys_ringbuffer* rb, uint8_t* data, uint32_t len);
void sys_ringbuffer_destroy(sys_ringbuffer* rb);
void sys_ringbuffer_close(sys_ringbuffer* rb);
int sys_ringbuffer_empty(sys_ringbuffer* rb);
int32_t sys_ringbuffer_free(sys_ringbuffer* rb);
int32_t sys_ringbuffer_avail(sys_ringbuffer* rb);
void sys_ringbuffer_flush(sys_ringbuffer* rb);
void sys_ringbuffer_reset(sys_ringbuffer* rb);
/* Waits for room for `len` bytes; free space, -1 after a flush of an empty
 * ring, -2 after the timed wait expired. */
int32_t sys_ringbuffer_walloc(sys_ringbuffer* rb, uint32_t len);
void sys_ringbuffer_byte_release(sys_ringbuffer* rb, uint32_t len);
/* Copies `len` bytes starting `skip` bytes after pread; caller holds the lock or is alone. */
int32_t sys_ringbuffer_read_peek(sys_ringbuffer* rb, uint8_t* dst, uint32_t len, uint32_t skip);
/* Waits until `len` bytes are held (or end of stream, or the wait expires);
 * copies up to `len` into dst unless it is null; pread does not move. */
int32_t sys_ringbuffer_byte_read_peek(sys_ringbuffer* rb, uint8_t* dst, int32_t len);
/* The same wait and copy followed by the release, in one critical section:
 * what a consumer that does not keep the bytes wants. */
int32_t sys_ringbuffer_byte_read(sys_ringbuffer* rb, uint8_t* dst, int32_t len);
int32_t sys_ringbuffer_byte_read_peek_single_thread(sys_ringbuffer* rb, uint8_t* dst, int32_t len);
int32_t sys_ringbuffer_byte_write(sys_ringbuffer* rb, const uint8_t* src, uint32_t len);
int32_t sys_ringbuffer_byte_write2(sys_ringbuffer* rb, uint32_t len);

/* Takes back `len` released bytes (they are read again next); 1 when the
 * history still holds them, else 0 and nothing changes. */
int sys_ringbuffer_rewind(sys_ringbuffer* rb, uint32_t len);
/* Released bytes that can still be taken back. */
uint32_t sys_ringbuffer_history(sys_ringbuffer* rb);

/* Consumer fast path, without the lock. The bytes from pread to pread +
 * pkt_cnt are the consumer's until it releases them, so it may copy them
 * while the producer writes elsewhere. take_held copies `len` bytes (dst may
 * be null) when that many are held past what it took before, counts them as
 * taken and releases the taken bytes in a batch when the lock is free; it
 * returns 0 (nothing changes) when fewer are held. peek_held copies without
 * taking. settle releases what was taken. Every locked consumer operation
 * settles first; resets, flush and close drop what was taken. */
int32_t sys_ringbuffer_take_held(sys_ringbuffer* rb, uint8_t* dst, uint32_t len);
int32_t sys_ringbuffer_peek_held(sys_ringbuffer* rb, uint8_t* dst, uint32_t len);
void sys_ringbuffer_settle(sys_ringbuffer* rb);
/* The held bytes past what the consumer took that follow each other in the
 * storage (up to where it wraps), at *at; consumer only. They stay as they
 * are until the consumer releases them. */
uint32_t sys_ringbuffer_held_span(const sys_ringbuffer* rb, const uint8_t** at);
/* Bytes held past what the consumer took; consumer only. */
uint32_t sys_ringbuffer_ahead(const sys_ringbuffer* rb);
void sys_ringbuffer_settle_locked(sys_ringbuffer* rb);

/* Both writes clear rlock and wlock: the producer's block is then stored or
 * dropped, no longer in flight. */

/* The producer's source, for a producer that fills the ring outside
 * ring_mutex: source_lock waits for the fill in flight (at most one: the
 * producer starts none while someone waits), source_unlock wakes the producer
 * again. Order: source_mutex before ring_mutex. */
void sys_ringbuffer_source_lock(sys_ringbuffer* rb);
void sys_ringbuffer_source_unlock(sys_ringbuffer* rb);
/* Non-zero while a caller waits in source_lock. */
int sys_ringbuffer_source_wanted(const sys_ringbuffer* rb);

/* Internal forms for callers that already hold ring_mutex. */
void sys_ringbuffer_reset_locked(sys_ringbuffer* rb);
int32_t sys_ringbuffer_free_internal(const sys_ringbuffer* rb);
int32_t sys_ringbuffer_avail_internal(const sys_ringbuffer* rb);
/* In-place production without a staging copy: the free bytes that follow
 * pwrite without wrapping (at most `len`), at *at; then commit what was put
 * there. The history gives up the room the producer takes. The producer may
 * drop ring_mutex in between and fill the room outside it: the room is its
 * own until the commit. A reset, flush or close in between drops the fill
 * (rlock): commit then stores nothing and returns 0, else 1. */
uint32_t sys_ringbuffer_wspace_locked(sys_ringbuffer* rb, uint32_t len, uint8_t** at);
int sys_ringbuffer_commit_locked(sys_ringbuffer* rb, uint32_t len);

#endif /* SYS_RINGBUFFER_API_H */
