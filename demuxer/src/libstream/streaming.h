/*
 * The buffered reader between the parsers and the host's raw input.
 *
 * Open picks one of three operation sets from the input's `rbuf_mode`
 * (single-thread, multi-thread with a streaming thread filling a ring,
 * elementary-stream) and one of three bufferings (none, file cache, ring).
 * Parsers always call through the record's slots:
 *     cb->cb_read(cb, dst, n); cb->cb_peek(cb, dst, n);
 *     cb->cb_seek(cb, off, whence); cb->cb_seek64(cb, off, whence);
 * and ask the position with cb_tell64() / cb_tell().
 */
#ifndef PLIMO_STREAMING_H
#define PLIMO_STREAMING_H

#include <stdint.h>

#include "cb_buffer.h"
#include "cb_io.h"
#include "es_cbio.h"
#include "hova_dmx.h"

/* Bytes reserved beside the streaming thread while it runs. */
constexpr int CB_STREAM_THREAD_STACK = 6144;

/* 0 on success, -1 on failure (nothing is then held). `cb` is read only. */
int OpenURL(cb_buffer_st* cbuf, cb_io_st* input, int ringbuf_size, const hova_callback_st* cb);
/* Stops and joins the streaming thread, releases every block. Always 0. */
int CloseURL(cb_buffer_st* cbuf, const hova_callback_st* cb);

cb_fpos cb_tell64(const cb_buffer_st* cbuf);
int cb_tell(const cb_buffer_st* cbuf);      /* curpos truncated to 32 bits */
int cb_status(const cb_buffer_st* cbuf);    /* CB_ErrCode of the last read or peek */
/* Size of the input; leaves the reader at position 0 unless the input is streaming. */
cb_fpos cb_get_file_size(cb_buffer_st* cbuf);
/* Bytes at the read position that a ring already holds, one after the other
 * in memory, at *at (0 when there are none, or no ring serves the reads):
 * a parser may read them in place, then move on with cb_seek64 from the
 * current position. Valid until the next call on the reader. */
uint32_t cb_ring_span(cb_buffer_st* cbuf, const uint8_t** at);
/* Probes: from cb_begin_probes to cb_end_probes the reader's slots read,
 * peek and seek straight on the input, reading only the bytes asked, and
 * parsers see no buffer to read in place from; the buffers keep what they
 * hold, and the end puts back the position, the slots and the input (with a
 * streaming thread, which reads nothing meanwhile). For searches that parse a
 * few bytes in many places. Begin returns false (and end does nothing) when
 * the reader is unbuffered already or not one that can lend its input. */
struct cb_probe_st {
    int active;
    int32_t (*cb_read)(cb_buffer_st*, uint8_t*, int32_t);
    int32_t (*cb_peek)(cb_buffer_st*, uint8_t*, int32_t);
    int32_t (*cb_seek)(cb_buffer_st*, int32_t, int);
    cb_off_t (*cb_seek64)(cb_buffer_st*, cb_off_t, int);
    CB_BufferType buffer_type;
    cb_fpos curpos;
    cb_fpos input_back; /* ring: where its producer goes on reading */
};
bool cb_begin_probes(cb_buffer_st* cbuf, cb_probe_st* saved);
void cb_end_probes(cb_buffer_st* cbuf, const cb_probe_st* saved);
/* Non-zero installs the multi-thread set, zero the single-thread set. */
void changeThreadType(cb_buffer_st* cbuf, int useRingBuf);

/* Empties the buffer and adopts the input's position (after the host moved it). */
void cb_reset_cache(cb_buffer_st* cbuf);
/* Asks the host to drop its own data (seek_time(-1)), then cb_reset_cache. */
void cb_flush_data(cb_buffer_st* cbuf);
/* Has the host move its input to a time (seek_time, in ms, when it offers
 * it), then adopts its position like cb_reset_cache; with a streaming thread
 * both happen under the lock the thread reads the input with. */
void cb_seek_time_reset(cb_buffer_st* cbuf, int time_ms);
void cb_flush_es_data(cb_buffer_st* cbuf, es_data_type_et type);
/* 0 turns buffering off, non-zero back on; -1 when the input refuses the seek. */
int cb_set_buffer_mode(cb_buffer_st* cbuf, int enable);

/* The operation sets; installed in the slots by open and changeThreadType. */
int32_t cb_read_single(cb_buffer_st* cbuf, uint8_t* dst, int32_t size);
int32_t cb_peek_single(cb_buffer_st* cbuf, uint8_t* dst, int32_t size);
int32_t cb_seek_single(cb_buffer_st* cbuf, int32_t offset, int whence);
cb_off_t cb_seek_single64(cb_buffer_st* cbuf, cb_off_t offset, int whence);

int32_t cb_read_multi(cb_buffer_st* cbuf, uint8_t* dst, int32_t size);
int32_t cb_peek_multi(cb_buffer_st* cbuf, uint8_t* dst, int32_t size);
int32_t cb_seek_multi(cb_buffer_st* cbuf, int32_t offset, int whence);
cb_off_t cb_seek_multi64(cb_buffer_st* cbuf, cb_off_t offset, int whence);

int32_t cb_read_es_mode(cb_buffer_st* cbuf, uint8_t* dst, int32_t size);
int32_t cb_peek_es_mode(cb_buffer_st* cbuf, uint8_t* dst, int32_t size);
int32_t cb_seek_es_mode(cb_buffer_st* cbuf, int32_t offset, int whence);
cb_off_t cb_seek_es_mode64(cb_buffer_st* cbuf, cb_off_t offset, int whence);

/* The streaming thread's body; its argument is the reader. */
void* StreamingData(void* arg);

#endif /* PLIMO_STREAMING_H */
