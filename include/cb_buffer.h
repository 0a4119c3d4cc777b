/*
 * The buffered reader over the host's raw input, embedded in the demuxer
 * context. The blocks it points to come from the host's malloc callback.
 */
#ifndef CB_BUFFER_H
#define CB_BUFFER_H

#include <pthread.h>
#include <stdint.h>

#include "cb_io.h"

#ifdef __cplusplus
extern "C" {
#endif

struct sys_ringbuffer;

typedef struct fs_cache_s {
    uint8_t* buffer;        /* cache block (the reader's base block) */
    uint32_t buffer_length; /* = block_size */
    cb_fpos base_pos;       /* input offset of buffer[0] */
    uint32_t avail_size;    /* valid bytes in buffer */
} fs_cache_s, fs_cache_st;

typedef struct sys_thread_s {
    pthread_t handle;
} sys_thread_s, sys_thread_st;

typedef struct cb_buffer_s cb_buffer_s, cb_buffer_st;

struct cb_buffer_s {
    int32_t (*cb_read)(cb_buffer_st* cb, uint8_t* dst, int32_t size);
    int32_t (*cb_peek)(cb_buffer_st* cb, uint8_t* dst, int32_t size);
    int32_t (*cb_seek)(cb_buffer_st* cb, int32_t offset, int whence);
    cb_off_t (*cb_seek64)(cb_buffer_st* cb, cb_off_t offset, int whence);
    cb_fpos curpos;
    cb_io_st* input;
    CB_ThreadType thread_type;
    CB_BufferType buffer_type;
    CB_ErrCode cb_errcode;
    uint8_t* stream_ringbuf;
    uint8_t* base;
    struct sys_ringbuffer* srbuf;
    struct sys_ringbuffer* active_rbuf;
    fs_cache_st fs_cache;
    int state;
    sys_thread_st* thread;
    void* stream_thread_stack;
};

#ifdef __cplusplus
}
#endif

#endif /* CB_BUFFER_H */
