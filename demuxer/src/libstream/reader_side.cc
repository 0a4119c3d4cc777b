// Excursions outside the ring: a seek to bytes the ring neither holds nor
// keeps reads one block there into the side block (the reader's base block)
// and puts the input back where the ring's producer left it, so the ring and
// its read-ahead survive a short visit (open reading the index behind the
// data, a timestamp probe, the far cursor of separate parsing). Reading on
// past the side block's end continues in the ring when the ring starts there,
// else the ring moves there: no byte is read twice.
#include <string.h>

#include "stream_internal.h"

namespace {

static_assert(sizeof(ring_side_st) <= CB_CACHE_HEAD, "the side record fits the head of the base block");

uint8_t* side_memory(const cb_buffer_st* cb) { return cb->base + CB_CACHE_HEAD; }

cb_fpos side_end(const ring_side_st* s) { return s->side_pos + s->side_len; }

// Takes the input from the streaming thread (waiting for the read in flight,
// if any) and settles the ring: with the source held nothing more is stored,
// so what the ring holds is final until source_unlock. Gives the position of
// the ring's first byte (kept aside while a visit is out).
cb_fpos lock_for_visit(cb_buffer_st* cb) {
    const ring_side_st* s = ring_side(cb);
    const cb_fpos ring_pos = s->active ? s->ring_pos : cb->curpos;
    sys_ringbuffer_source_lock(cb->active_rbuf);
    sys_ringbuffer_settle(cb->active_rbuf);
    return ring_pos;
}

// Bytes a visit reads: a block, but never more than the side block was
// allocated with (the host may raise block_size after open).
uint32_t side_read_len(const cb_buffer_st* cb) {
    const int block = cb->input->block_size;
    if (block <= 0) return 0;
    const uint32_t cap = ring_side(cb)->side_cap;
    return static_cast<uint32_t>(block) < cap ? static_cast<uint32_t>(block) : cap;
}

// The reader stands at `pos` in a visit; the side block holds `len` bytes
// read there (`valid`), or nothing was read (an empty visit).
void enter_visit(cb_buffer_st* cb, cb_fpos pos, uint32_t len, int valid) {
    ring_side_st* s = ring_side(cb);
    s->active = 1;
    s->valid = valid;
    s->side_pos = pos;
    s->side_len = len;
    cb->curpos = pos;
}

// Reads a block at `target` into the side block; the input goes back to the
// end of what the ring holds. -1 (nothing changed) when the input refuses
// to go to `target`.
cb_off_t fetch_side(cb_buffer_st* cb, cb_fpos target) {
    ring_side_st* s = ring_side(cb);
    sys_ringbuffer* rb = cb->active_rbuf;
    cb_io_st* in = cb->input;
    // The way back below is the end of what the ring holds.
    const cb_fpos ring_pos = lock_for_visit(cb);
    if (in->seek(in, static_cast<cb_off_t>(target), CB_SEEK_SET) == -1) {
        sys_ringbuffer_source_unlock(rb);
        return -1;
    }
    const uint32_t asked = side_read_len(cb);
    const size_t n = asked ? in->read(in, side_memory(cb), asked) : 0;
    cb_fpos back = ring_pos + rb_held(rb);
    s->input_away = 0;
    const bool back_refused = in->seek(in, static_cast<cb_off_t>(back), CB_SEEK_SET) == -1;
    pthread_mutex_lock(&rb->ring_mutex);
    if (back_refused) {
        // The input stays behind the side block: the ring starts there.
        back = target + n;
        sys_ringbuffer_reset_locked(rb);
        s->ring_pos = back;
    } else {
        s->ring_pos = ring_pos;
        // The input's transfer is here now: ring bytes read ahead at the old
        // place would cost a request of their own, and the seek that made
        // this visit often lands here (and reads on from the block's end) or
        // elsewhere, dropping them.
        s->hold_ahead = 1;
    }
    pthread_mutex_unlock(&rb->ring_mutex);
    sys_ringbuffer_source_unlock(rb);
    enter_visit(cb, target, static_cast<uint32_t>(n), 1);
    s->side_short = n < asked;
    return static_cast<cb_off_t>(target);
}

// The ring, whose read position is `from`, goes back to `target` when its
// history still holds the bytes from there (curpos is `target` then);
// nothing changes otherwise.
bool rewind_ring_from(cb_buffer_st* cb, cb_fpos from, cb_fpos target) {
    const cb_fpos was = cb->curpos;
    cb->curpos = from;
    if (rewind_ring(cb, static_cast<cb_off_t>(target))) return true;
    cb->curpos = was;
    return false;
}

// At the side block's end: back to the ring, which moves there unless it
// already starts there or keeps the bytes from there. False when the input
// refuses the move.
bool leave_side_at_end(cb_buffer_st* cb) {
    ring_side_st* s = ring_side(cb);
    const cb_fpos end = side_end(s);
    if (s->ring_pos != end) {
        // A seek back into the block of an earlier visit, after the ring read
        // on past it, finds the bytes from its end in the ring's history.
        sys_ringbuffer_settle(cb->active_rbuf);
        if (!rewind_ring_from(cb, s->ring_pos, end) &&
            reposition_ring_input(cb, static_cast<cb_off_t>(end), CB_SEEK_SET) == -1)
            return false;
    }
    s->active = 0;
    end_hold(cb);
    cb->curpos = end;
    return true;
}

}  // namespace

cb_off_t ring_seek_end(cb_buffer_st* cb, cb_off_t offset) {
    ring_side_st* s = ring_side(cb);
    sys_ringbuffer* rb = cb->active_rbuf;
    cb_io_st* in = cb->input;
    const cb_fpos ring_pos = lock_for_visit(cb);
    const cb_off_t r = in->seek(in, offset, CB_SEEK_END);
    if (r != -1 && !s->input_away) {
        // The input stays there until the ring reads again (WriteData).
        s->input_away = 1;
        s->input_back = ring_pos + rb_held(rb);
    }
    sys_ringbuffer_source_unlock(rb);
    if (r == -1) return -1;
    // An empty visit: a read there moves the ring, a seek back finds it.
    s->ring_pos = ring_pos;
    enter_visit(cb, static_cast<cb_fpos>(r), 0, 0);
    return r;
}

void end_hold_locked(cb_buffer_st* cb) {
    ring_side_st* s = ring_side(cb);
    if (!s->hold_ahead) return;
    s->hold_ahead = 0;
    pthread_cond_signal(&cb->active_rbuf->ring_free_cond);
}

void end_hold(cb_buffer_st* cb) {
    // Only the consumer sets the mark, so an unset one needs no lock.
    if (!ring_side(cb)->hold_ahead) return;
    pthread_mutex_lock(&cb->active_rbuf->ring_mutex);
    end_hold_locked(cb);
    pthread_mutex_unlock(&cb->active_rbuf->ring_mutex);
}

ring_side_st* ring_side(const cb_buffer_st* cb) { return reinterpret_cast<ring_side_st*>(cb->base); }

bool side_active(const cb_buffer_st* cb) { return cb->base && cb->active_rbuf && ring_side(cb)->active; }

size_t side_copy_held(const cb_buffer_st* cb, uint8_t* dst, size_t size, cb_fpos pos) {
    const ring_side_st* s = ring_side(cb);
    if (!s->valid || pos < s->side_pos || pos >= side_end(s)) return 0;
    const uint64_t left = side_end(s) - pos;
    const size_t n = left < size ? static_cast<size_t>(left) : size;
    memcpy(dst, side_memory(cb) + (pos - s->side_pos), n);
    return n;
}

int32_t side_read(cb_buffer_st* cb, uint8_t* dst, int32_t size, bool* more) {
    ring_side_st* s = ring_side(cb);
    *more = false;
    const cb_fpos end = side_end(s);
    int32_t n = 0;
    if (cb->curpos < end) {
        const uint64_t left = end - cb->curpos;
        n = left < static_cast<uint64_t>(size) ? static_cast<int32_t>(left) : size;
        if (dst) memcpy(dst, side_memory(cb) + (cb->curpos - s->side_pos), static_cast<size_t>(n));
        cb->curpos += static_cast<cb_fpos>(n);
    }
    // The rest comes from the ring, from the side block's end on.
    if (n < size && leave_side_at_end(cb)) *more = true;
    return n;
}

int32_t side_peek(cb_buffer_st* cb, uint8_t* dst, int32_t size, bool* use_ring) {
    ring_side_st* s = ring_side(cb);
    *use_ring = false;
    // A side block shorter than the read that filled it ends at the end of
    // the input: a peek beyond it is short whatever reads it. (The empty
    // visit of a seek from the end has read nothing: it says nothing about
    // the end.)
    const bool at_end = s->valid && s->side_short;
    if (cb->curpos + static_cast<uint32_t>(size) > side_end(s) && !at_end) {
        if (static_cast<uint32_t>(size) > side_read_len(cb)) {
            // Larger than a side block: from the ring.
            if (reposition_ring_input(cb, static_cast<cb_off_t>(cb->curpos), CB_SEEK_SET) != -1) {
                s->active = 0;
                *use_ring = true;
                return 0;
            }
        } else if (fetch_side(cb, cb->curpos) == -1) {
            cb->cb_errcode = CB_ERR_EOF;
            return 0;
        }
    }
    uint64_t left = side_end(s) > cb->curpos ? side_end(s) - cb->curpos : 0;
    const int32_t n = left < static_cast<uint64_t>(size) ? static_cast<int32_t>(left) : size;
    if (dst && n > 0) memcpy(dst, side_memory(cb) + (cb->curpos - s->side_pos), static_cast<size_t>(n));
    cb->cb_errcode = n < size ? CB_ERR_EOF : CB_ERR_OK;
    return n;
}

cb_off_t ring_seek_to(cb_buffer_st* cb, cb_off_t target) {
    if (target < 0) return -1;
    sys_ringbuffer* rb = cb->active_rbuf;
    ring_side_st* s = ring_side(cb);
    const cb_fpos t = static_cast<cb_fpos>(target);
    if (s->valid && t >= s->side_pos && t < side_end(s)) {
        // Back into the block of an earlier visit: no input.
        if (!s->active) {
            s->ring_pos = cb->curpos;
            s->active = 1;
        }
        cb->curpos = t;
        return target;
    }
    // A short skip over held bytes (padding, a header parsed from a peek):
    // taken without the lock, like a read.
    if (!s->active && t >= cb->curpos && !rb_paused(rb) &&
        t - cb->curpos <= sys_ringbuffer_ahead(rb)) {
        (void)sys_ringbuffer_take_held(rb, nullptr, static_cast<uint32_t>(t - cb->curpos));
        cb->curpos = t;
        return target;
    }
    sys_ringbuffer_settle(rb);
    const cb_fpos rp = s->active ? s->ring_pos : cb->curpos;
    const uint64_t held = rb_held(rb);
    const int block = cb->input->block_size;
    // Inside what the ring holds, or close enough behind it that reading on
    // costs less than a visit elsewhere.
    // Reading on through the ring up to half its size keeps the bytes in
    // between for a cursor that is behind (they become history).
    uint64_t near = held + static_cast<uint64_t>(block > 0 ? block : 0);
    if (near < (rb->size - 1) / 2) near = (rb->size - 1) / 2;
    if (t >= rp && t - rp <= near) {
        s->active = 0;
        end_hold(cb);
        cb->curpos = rp;
        if (t > rp) (void)cb->cb_read(cb, nullptr, static_cast<int32_t>(t - rp));
        if (cb->curpos == t) return target;
        // The input ended first: a visit past its end, as for any far target.
    }
    if (t < rp && rewind_ring_from(cb, rp, t)) {
        s->active = 0;
        end_hold(cb);
        return target;
    }
    return fetch_side(cb, t);
}

int32_t ring_read_quick(cb_buffer_st* cb, uint8_t* dst, int32_t size,
                        int32_t (*rest)(cb_buffer_st*, uint8_t*, int32_t)) {
    if (side_active(cb)) {
        bool more = false;
        const int32_t n = side_read(cb, dst, size, &more);
        cb->cb_errcode = n < size ? CB_ERR_EOF : CB_ERR_OK;
        if (!more) return n;
        return n + rest(cb, dst ? dst + n : nullptr, size - n);
    }
    // Held already: no lock and no hand-over (the release comes later, in a
    // batch, and before any wait).
    sys_ringbuffer* rb = cb->active_rbuf;
    if (!rb_paused(rb) && sys_ringbuffer_take_held(rb, dst, static_cast<uint32_t>(size)) == size) {
        cb->curpos += static_cast<cb_fpos>(size);
        cb->cb_errcode = CB_ERR_OK;
        return size;
    }
    return -1;
}
