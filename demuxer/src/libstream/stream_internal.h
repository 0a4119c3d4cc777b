// Pieces shared by the reader's files; not for the parsers.
#pragma once

#include <stddef.h>
#include <stdint.h>

#include "ringbuffer_api.h"
#include "streaming.h"

// `state` is written by open/close on the demuxer thread and polled by the
// streaming thread.
inline int cb_state_load(const cb_buffer_st* cb) {
    return __atomic_load_n(&cb->state, __ATOMIC_ACQUIRE);
}
inline void cb_state_store(cb_buffer_st* cb, int v) {
    __atomic_store_n(&cb->state, v, __ATOMIC_RELEASE);
}
inline uint32_t rb_held(const sys_ringbuffer* rb) {
    return __atomic_load_n(&rb->pkt_cnt, __ATOMIC_ACQUIRE);
}
inline bool rb_eos(const sys_ringbuffer* rb) {
    return __atomic_load_n(&rb->buf_eos, __ATOMIC_ACQUIRE) != 0;
}
inline void rb_set_eos(sys_ringbuffer* rb, int16_t v) {
    __atomic_store_n(&rb->buf_eos, v, __ATOMIC_RELEASE);
}
inline bool rb_paused(const sys_ringbuffer* rb) {
    return __atomic_load_n(&rb->slock, __ATOMIC_ACQUIRE) != 0;
}

// Operation-set installers.
void init_single_thread_plugin(cb_buffer_st* cb);
void init_multi_thread_plugin(cb_buffer_st* cb);
void init_es_plugin(cb_buffer_st* cb);
void init_thread_plugin(cb_buffer_st* cb, int rbuf_mode);

// File cache: the reader's `base` block holds this record, then the slots.
constexpr uint32_t CB_CACHE_SLOTS = 3;
struct cache_slots_st {
    uint32_t count;    // slots in the block
    uint32_t active;   // the slot fs_cache describes
    uint32_t clock;    // use stamps, for picking the slot to refill
    bool track_input;  // false: the input is moved by others (elementary-stream mode)
    cb_fpos input_pos; // where the input stands
    struct {
        cb_fpos base_pos;
        uint32_t avail;
        uint32_t used;
    } slot[CB_CACHE_SLOTS];
};
constexpr size_t CB_CACHE_HEAD = (sizeof(cache_slots_st) + 15) & ~static_cast<size_t>(15);
// Bytes to allocate for the cache of `block`-byte slots, and how many slots.
size_t cache_block_bytes(uint32_t block, uint32_t* slots);
void init_fs_cache(cb_buffer_st* cb, uint32_t len, uint32_t slots, bool track_input);
// Drops every slot; the input stands at `input_pos`.
void reset_fs_cache(cb_buffer_st* cb, cb_fpos input_pos);
// The input was moved to `input_pos`; what the slots hold stays valid.
void cache_input_moved(cb_buffer_st* cb, cb_fpos input_pos);
bool cache_holds(const cb_buffer_st* cb, cb_fpos pos);
// Copies what a slot holds from `pos` on (up to `size` bytes) without making
// it the slot in use; 0 when none holds `pos`.
size_t cache_copy_held(const cb_buffer_st* cb, uint8_t* dst, size_t size, cb_fpos pos);
size_t read_fs_cache(cb_buffer_st* cb, uint8_t* dst, size_t size, cb_fpos pos);
int32_t peek_fs_cache(cb_buffer_st* cb, uint8_t* dst, int32_t size);

// Synchronous ring.
void WriteData(cb_buffer_st* cb, uint32_t wanted);
int32_t read_rbuf_data(cb_buffer_st* cb, uint8_t* dst, int32_t size);
int32_t peek_rbuf_data(cb_buffer_st* cb, uint8_t* dst, int32_t size);

// Seeking helpers of the single-thread set.
int seek_out_of_buffer(cb_buffer_st* cb, cb_off_t offset, int whence);
void seek_reset_buffer(cb_buffer_st* cb, cb_off_t pos);

// Sleeps in 1 ms steps while the ring's pause mark is set.
void wait_while_paused(sys_ringbuffer* rb);

// Moves the input to `target` (CB_SEEK_SET) and empties the ring so that it
// holds nothing read before the move and receives every block read after it,
// whether or not a streaming thread runs. Returns the input's answer.
cb_off_t reposition_ring_input(cb_buffer_st* cb, cb_off_t target, int whence);

// Moves the read position back to `target` when the ring's history still
// holds the bytes from there; false (nothing changed) otherwise.
bool rewind_ring(cb_buffer_st* cb, cb_off_t target);

// A short visit outside the ring (reader_side.cc). The record sits in front
// of the side block in the reader's base block.
struct ring_side_st {
    int active;         // curpos is in the side block, not in the ring
    int valid;          // the side block holds bytes (kept after a visit)
    uint32_t side_len;  // bytes in the side block
    cb_fpos side_pos;   // input position of its first byte
    cb_fpos ring_pos;   // the ring's read position while the visit lasts
    // A seek from the end left the input there; the synchronous ring's next
    // read moves it back to input_back (where the ring's bytes end) first.
    // Whatever else moves the input or empties the ring clears it.
    int input_away;
    cb_fpos input_back;
    // A visit read its block elsewhere and the consumer has not come back to
    // the ring since: the streaming thread reads no further ahead meanwhile.
    // Written under ring_mutex (the thread reads it there).
    int hold_ahead;
    int side_short;     // the read that filled the side block came back short
    uint32_t side_cap;  // bytes the side block was allocated with
};
ring_side_st* ring_side(const cb_buffer_st* cb);
bool side_active(const cb_buffer_st* cb);
// Copies what the side block holds from `pos` on (up to `size` bytes); 0 when
// it holds nothing there.
size_t side_copy_held(const cb_buffer_st* cb, uint8_t* dst, size_t size, cb_fpos pos);
// Serves a read from the side block; *more when the rest is to come from the
// ring (the visit has ended at the block's end).
int32_t side_read(cb_buffer_st* cb, uint8_t* dst, int32_t size, bool* more);
// Serves a peek from the side block (read again at curpos when it falls
// short); *use_ring when the ring now stands at curpos and serves it.
int32_t side_peek(cb_buffer_st* cb, uint8_t* dst, int32_t size, bool* use_ring);
// A read served without the ring's lock: from the side block of a visit (and
// on through `rest` past its end), or wholly from what the ring holds. -1 when
// neither applies and the caller reads from the ring.
int32_t ring_read_quick(cb_buffer_st* cb, uint8_t* dst, int32_t size,
                        int32_t (*rest)(cb_buffer_st*, uint8_t*, int32_t));
// Seek of a ring-buffered reader, either set: inside the ring, its history,
// the side block, or a visit elsewhere. The new position or -1.
cb_off_t ring_seek_to(cb_buffer_st* cb, cb_off_t target);
// The consumer is back in the ring: the streaming thread may read ahead again.
void end_hold_locked(cb_buffer_st* cb);
void end_hold(cb_buffer_st* cb);
// Seek from the end (a caller measuring the input) of the synchronous ring:
// the ring keeps its bytes for the seek back that follows, and the input is
// put back only when the ring reads again. The new position or -1 (nothing
// changed).
cb_off_t ring_seek_end(cb_buffer_st* cb, cb_off_t offset);

// Starts / stops the streaming thread.
int OpenStream(cb_buffer_st* cb, const hova_callback_st* cbs);
void CloseStream(cb_buffer_st* cb, const hova_callback_st* cbs);
