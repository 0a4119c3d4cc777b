#include "streaming_app.h"

#include <string.h>

app_status_st app_status;

void init_app_status(void) { memset(&app_status, 0, sizeof(app_status)); }

int get_app_status(int selector) {
    switch (selector) {
        case RECORD_ENABLE: return app_status.record_enable;
        case TIMESHIFT_ENABLE: return app_status.time_shift_enable;
        case TIMESHIFT_BYTECNT: return static_cast<int>(app_status.ts_inst.bytecnt);
        case TIMESHIFT_RPOS: return static_cast<int>(app_status.ts_inst.rpos);
        case TIMESHIFT_WPOS: return static_cast<int>(app_status.ts_inst.wpos);
        case TIMESHIFT_FILESIZE: return static_cast<int>(app_status.ts_inst.filesize);
        default:
            // Goes to standard output on purpose: the tools read it there.
            printf("the app status (%d) is not available\n", selector);
            return -1;
    }
}

unsigned long RecordWrite(const uint8_t*, uint32_t) { return 0; }

void TimeShiftReadPos(cb_buffer_st*, int) {}

void TimeShiftSeekPos(unsigned) {}
