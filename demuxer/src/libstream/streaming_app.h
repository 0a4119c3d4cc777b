// The record and time-shift status table and hooks. This plug-in records and
// time-shifts nothing; the table exists for the framework's tools, which
// query it by selector.
#pragma once

#include <stdint.h>
#include <stdio.h>

#include "cb_buffer.h"
#include "ringbuffer_api.h"

enum {
    RECORD_ENABLE = 0,
    TIMESHIFT_ENABLE = 1,
    TIMESHIFT_BYTECNT = 2,
    TIMESHIFT_RPOS = 3,
    TIMESHIFT_WPOS = 4,
    TIMESHIFT_FILESIZE = 5
};

typedef struct timeshift_s {
    uint32_t rpos;
    uint32_t wpos;
    uint32_t bytecnt;
    int32_t validfilepos;
    uint32_t filesize;
    uint32_t rloopcnt;
    uint32_t wloopcnt;
} timeshift_s, timeshift_st;

typedef struct app_status_s {
    FILE* record_fd;
    int record_ch_idx;
    uint8_t record_enable;
    sys_ringbuffer record_rbuf;
    uint32_t record_duration;
    uint8_t time_shift_enable;
    FILE* timeshift_frd;
    FILE* timeshift_fwd;
    sys_ringbuffer timeshift_rbuf;
    timeshift_st ts_inst;
    uint32_t timeshift_duration;
    uint32_t timeshift_capacity;
    sys_thread_st record_th;
    sys_thread_st timeshift_th;
} app_status_s, app_status_st;

extern app_status_st app_status;

void init_app_status(void);
int get_app_status(int selector);
/* Receives every block the streaming thread reads; records nothing. */
unsigned long RecordWrite(const uint8_t* data, uint32_t len);
void TimeShiftReadPos(cb_buffer_st* cbuf, int read_size);
void TimeShiftSeekPos(unsigned offset);
