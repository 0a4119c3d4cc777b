#include "sys_pts.h"

#include "dprintf.h"
#include "streaming.h"

namespace {

constexpr cb_fpos kNoTarget = ~cb_fpos{0};

// Source timestamps are untrusted: arithmetic on them wraps instead of
// overflowing, as the 32-bit target's code always did in practice.
constexpr int64_t wrap_add(int64_t a, int64_t b) {
    return static_cast<int64_t>(static_cast<uint64_t>(a) + static_cast<uint64_t>(b));
}
constexpr int64_t wrap_sub(int64_t a, int64_t b) {
    return static_cast<int64_t>(static_cast<uint64_t>(a) - static_cast<uint64_t>(b));
}
constexpr uint64_t magnitude(int64_t v) {
    return v < 0 ? 0 - static_cast<uint64_t>(v) : static_cast<uint64_t>(v);
}

}  // namespace

extern "C" {

int sys_get_cur_stream_num(const sys_demuxer_st* d) {
    return d->num_streams[AUD] + d->num_streams[VID] + d->num_streams[SUB] + d->num_streams[OTH];
}

void sys_set_pts_info(sys_demuxer_st* d, int64_t seek_time) {
    d->seek_time = seek_time;
    d->base_pts = 0;
    for (int k = 0; k < 3; ++k) {
        d->last_pts[k] = seek_time;
        d->last_dur[k] = -1;
    }
}

void sys_update_and_fix_pts_gap(sys_demuxer_st* d, int64_t* pts, hova_stream_type_et type) {
    if (*pts == -1) return;
    if (type != HOVA_STREAM_AUDIO && type != HOVA_STREAM_VIDEO) {
        d->last_pts[2] = *pts;
        return;
    }
    const int k = type == HOVA_STREAM_AUDIO ? AUD : VID;
    const int64_t p = wrap_sub(*pts, d->base_pts);
    *pts = p;
    const int64_t delta = wrap_sub(p, d->last_pts[k]);
    if (magnitude(delta) <= static_cast<uint64_t>(SYS_PTS_GAP_THRESHOLD)) {
        d->last_dur[k] = delta;
        d->last_pts[k] = p;
        return;
    }
    // Continue the stream where it left off (one more step when the step is
    // known) and shift every later timestamp of both kinds by the same amount.
    int64_t expected = d->last_pts[k];
    if (d->last_dur[k] != -1) expected = wrap_add(expected, d->last_dur[k]);
    const int64_t arrived = wrap_add(p, d->base_pts);
    DPRINTF("[SYS] found pts gap for type %d, pts %lld, orignal pts %lld, last pts %lld, last dur %lld\n",
            static_cast<int>(type), static_cast<long long>(p), static_cast<long long>(arrived),
            static_cast<long long>(d->last_pts[k]), static_cast<long long>(d->last_dur[k]));
    const int64_t new_base = wrap_sub(arrived, expected);
    DPRINTF("[SYS] base change from %lld to %lld\n", static_cast<long long>(d->base_pts),
            static_cast<long long>(new_base));
    d->base_pts = new_base;
    *pts = expected;
    d->last_pts[k] = expected;
}

void sys_reset_drop_target(sys_stream_st* s) { s->next_pos = kNoTarget; }

void sys_set_drop_target(hova_stream_type_et target_type, sys_stream_st* s, cb_fpos current_pos) {
    if (s->stream_type == target_type) {
        s->next_pos = kNoTarget;
    } else if (s->next_pos == kNoTarget) {
        s->next_pos = current_pos;
    }
}

int sys_check_drop(sys_demuxer_st* d, sys_stream_st* s) {
    if (s->next_pos == kNoTarget) return 0;
    if (cb_tell64(&d->cbuffer) < s->next_pos) return 1;
    s->next_pos = kNoTarget;
    return 0;
}

}  // extern "C"
