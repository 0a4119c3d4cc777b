// The resync_time entry point: the host has moved its input to a time of its
// own choosing; delivery drops what it was assembling and starts on a fresh
// packet header wherever the input now stands.
#include "asf_api.h"
#include "asf_internal.h"
#include "asf_seek.h"
#include "streaming.h"

namespace {
constexpr int64_t kFlushOnly = -1;
}  // namespace

extern "C" int asf_resync_time(void* ctx, int64_t resync_time) {
    auto* d = static_cast<asf_demuxer_st*>(ctx);
    cb_buffer_st* cb = &d->s.cbuffer;
    if (resync_time == kFlushOnly) {
        cb_flush_data(cb);
        return HOVA_OK;
    }
    reset_last_thumbnail_pts(d);
    discard_pending_objects(d);
    reset_data_packet(&d->cur_data_packet, d->cur_packets);
    // A packet abandoned earlier would send delivery back to its position by
    // number; the input's new position is the one to read from.
    d->resync = 0;
    // Video starts again at an object start, as after open; a seek's wait for
    // its key frame (and that frame's time) does not hold at the new place.
    d->seeked = kAsfStartAtObject;
    // The input moves by time and the reader adopts its position as one
    // step, so that a streaming thread cannot read in between.
    cb_seek_time_reset(cb, static_cast<int>(resync_time / 1000));
    return HOVA_OK;
}
