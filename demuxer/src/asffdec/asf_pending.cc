// Entry points whose parsing is not built yet: they log and refuse.
#include "asf_api.h"
#include "dprintf.h"

extern "C" {

int asf_seek_time(void*, int, int64_t*, int) { return HOVA_InvalidParam; }
int asf_resync_time(void*, int64_t) { return HOVA_InvalidParam; }

}  // extern "C"
