/*
 * The toolkit's path to the host: memory, per-stream frame buffers, event
 * notification, and the two services that build a whole frame from bytes in
 * hand. Every call passes the callback table's context first.
 */
#ifndef SYS_OUTPUT_H
#define SYS_OUTPUT_H

#include <stddef.h>
#include <stdint.h>

#include "sys_demuxer.h"

#ifdef __cplusplus
extern "C" {
#endif

/* Packet types of stream_commit. */
enum { SYS_PACKET_MEDIA = 0, SYS_PACKET_CONFIG = 1 };

int sys_notify(sys_demuxer_st* d, hova_stream_type_et type, hova_event_et event);
void* sys_malloc(sys_demuxer_st* d, size_t size);
void* sys_realloc(sys_demuxer_st* d, void* ptr, size_t size);
void sys_freep(sys_demuxer_st* d, void* pptr);
int sys_stream_alloc(sys_demuxer_st* d, hova_stream_type_et type, void** buffer, int size);
int sys_stream_realloc(sys_demuxer_st* d, hova_stream_type_et type, void** buffer, int size);
int sys_stream_discard(sys_demuxer_st* d, hova_stream_type_et type);
int sys_stream_commit(sys_demuxer_st* d, hova_stream_type_et type, int size, int64_t pts,
                      int64_t duration, int packet_type);
int sys_stream_check_rbuf_size(sys_demuxer_st* d, hova_stream_type_et type);

/* Sends the codec configuration record (codec_type, then config) as a type-1 frame. */
int sys_stream_send_config(sys_demuxer_st* d, sys_stream_st* s);

/* Allocates, fills from `src` and commits one frame of `size` bytes. */
int sys_stream_commit_secure_handle(sys_demuxer_st* d, hova_stream_type_et type, int size,
                                    const void* src, int64_t pts, int packet_type);

#ifdef __cplusplus
}
#endif

#ifdef __cplusplus
// Typed helper for the freep convention: releases *p and leaves it null.
template <typename T>
inline void sys_free(sys_demuxer_st* d, T*& p) {
    sys_freep(d, static_cast<void*>(&p));
}
#endif

#endif /* SYS_OUTPUT_H */
