/*
 * The host's raw input and the reader constants shared with the host.
 * Laid out exactly as the host declares it.
 */
#ifndef CB_IO_H
#define CB_IO_H

#include <stddef.h>
#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

typedef uint64_t cb_fpos;  /* absolute byte position */
typedef int64_t cb_off_t;  /* signed offset or position; -1 means failure */

enum { CB_SEEK_SET = 0, CB_SEEK_CUR = 1, CB_SEEK_END = 2 };

typedef enum { CB_MULTI_THREAD = 0, CB_SINGLE_THREAD = 1, CB_NO_THREAD = 2 } CB_ThreadType;
typedef enum { CB_NO_BUF = 0, CB_STREAM_RBUF = 1, CB_FS_CACHE = 2 } CB_BufferType;
typedef enum { CB_ERR_OK = 0, CB_ERR_EOF = 1, CB_ERR_TIMEDOUT = 2 } CB_ErrCode;

typedef enum cbio_buf_mode_e {
    CBIO_NO_RBUF = 0,
    CBIO_APPLY_RBUF = 1,
    CBIO_APPLY_ES_BUF = 2
} cbio_buf_mode_et;

typedef enum cbio_open_mode_e {
    CBIO_FO_RB = 0,
    CBIO_FO_WB = 1,
    CBIO_FO_AB = 2
} cbio_open_mode_et;

/* Run states of the reader's streaming thread. */
enum { STATE_STOP = 0, STATE_PLAY = 1, STATE_PAUSE = 2, STATE_ERROR = 3 };

typedef struct cb_io_s cb_io_s, cb_io_st;

/* The plug-in calls read, seek, tell (and seek_time, open_done,
 * discontinuity when set) with this pointer. With use_thread and ring
 * buffering the streaming thread calls read too, always under the reader's
 * lock: never two calls at once. */
struct cb_io_s {
    size_t (*read)(cb_io_st* io, void* dst, size_t len);
    size_t (*write)(cb_io_st* io, const void* src, size_t len);
    cb_off_t (*seek)(cb_io_st* io, cb_off_t offset, int whence);
    cb_off_t (*tell)(cb_io_st* io);
    void (*close)(cb_io_st** pio);
    size_t (*aread)(cb_io_st* io, void* dst, size_t len);
    int (*open_done)(cb_io_st* io, int a, int b, uint32_t c);
    void (*get_new_cmd)(cb_io_st* io);
    int (*seek_time)(cb_io_st* io, int time);
    int (*stop_wait_input)(cb_io_st* io);
    void (*discontinuity)(cb_io_st* io, cb_off_t pos);
    void (*release_buffer)(cb_io_st* io, void* buf, size_t len);
    int (*isNextURLAvailable)(cb_io_st* io);
    int block_size;
    uint8_t seekable;
    uint8_t streaming;
    uint8_t use_thread;
    uint8_t rbuf_mode;     /* cbio_buf_mode_e */
    uint8_t disable_cache;
    int type_hint;
    int file_type;
    int programID;
    void* context;
    const void* filename;
    cbio_open_mode_et open_mode;
    void* parent;          /* es_cbio_s in elementary-stream mode */
    int bitrate;
    cb_fpos input_size;
    int64_t input_duration;
    void* fcc_buf;
    int disable_operation;
    int detect_discontinuity;
};

#ifdef __cplusplus
}
#endif

#endif /* CB_IO_H */
