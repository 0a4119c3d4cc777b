// Entry points whose parsing is not built yet: they log and refuse.
#include "asf_api.h"
#include "dprintf.h"

extern "C" {

int asf_deliver_frame(void*, hova_stream_type_et*, int*, int64_t*) { return HOVA_InvalidParam; }
int asf_seek_time(void*, int, int64_t*, int) { return HOVA_InvalidParam; }
int asf_resync_time(void*, int64_t) { return HOVA_InvalidParam; }
int asf_set_track(void*, hova_stream_type_et, int, int64_t, hova_input_type_et) {
    return HOVA_InvalidParam;
}

}  // extern "C"
