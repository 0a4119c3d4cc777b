// The search without index: three interpolation probes narrow the packet
// range around the target (a probe that meets nothing before the end of the
// data ends the range at its start), a fourth gives the start of a
// packet-by-packet scan, which walks forward until it has times on both
// sides of the target, turning back to walk earlier packets when it first
// meets a later time, or when it reaches the end without an answer on the
// asked side. A walk that meets nothing up to the end lowers the seek's
// bound (see get_packet_pts_with_number), and no walk goes past the bound or
// walks a packet of the scan twice: a seek reads each packet at most a few
// times, however the times lie.
#include "asf_seek.h"

#include "asf_packet.h"
#include "asf_timestamp.h"
#include "dprintf.h"
#include "streaming.h"

namespace {

constexpr int kNarrowingProbes = 3;

// The search's reads go straight to the input while it lasts (see
// cb_begin_probes): it parses a packet header here and there, and a buffered
// read would fetch a block from each packet it steps back to.
class ProbeReads {
public:
    ProbeReads(cb_buffer_st* cb, bool on) : cb_(cb) {
        if (on) (void)cb_begin_probes(cb_, &saved_);
    }
    ~ProbeReads() { cb_end_probes(cb_, &saved_); }
    ProbeReads(const ProbeReads&) = delete;
    ProbeReads& operator=(const ProbeReads&) = delete;

private:
    cb_buffer_st* cb_;
    cb_probe_st saved_{};
};

struct Candidate {
    uint64_t packet = 0;
    int64_t pts = -1;
};

// Packet at which the target lies if time grows evenly over [lower, upper).
// The quotient is kept whole and the target held inside the range, so a far
// or early target lands on the range's edge, never on a wrapped-around
// packet. Only absurd sizes overflow the exact 64-bit product; they are
// worked out in floating point, which is exact enough to pick a start.
uint64_t interpolate(int64_t target, uint64_t lower, uint64_t upper, int64_t start_time,
                     int64_t stop_time, uint64_t num_packets) {
    uint64_t q = 0;
    if (target > start_time) {
        const uint64_t span = static_cast<uint64_t>(stop_time) - static_cast<uint64_t>(start_time);
        const uint64_t along = static_cast<uint64_t>(target) - static_cast<uint64_t>(start_time);
        const uint64_t range = upper - lower;
        uint64_t product = 0;
        if (!__builtin_mul_overflow(along, range, &product)) {
            q = product / span;
        } else {
            const long double v = static_cast<long double>(along) * range / span;
            q = v >= static_cast<long double>(UINT64_MAX) ? UINT64_MAX : static_cast<uint64_t>(v);
        }
        if (q > UINT64_MAX - lower) q = UINT64_MAX - lower;
    }
    const uint64_t packet = lower + q;
    return packet < num_packets - 1 ? packet : num_packets - 1;
}

}  // namespace

uint64_t asf_find_packet_with_type(asf_demuxer_st* d, int dir, int64_t* pts,
                                   hova_stream_type_et target_type, uint64_t* barren_from) {
    ASF_LOG("seek without index, type %d\n", static_cast<int>(target_type));
    // Without packets there is nothing to find (and no last packet to hold
    // a far target at).
    if (d->num_packets == 0) return kAsfNoPacket;
    cb_buffer_st* cb = &d->s.cbuffer;
    const int64_t target = *pts;
    // Network audio: one positioning and the first object start after it.
    const bool single_probe = d->s.streaming && target_type == HOVA_STREAM_AUDIO;
    // A network input keeps its buffered reads: each direct read would be a
    // request of its own.
    const ProbeReads probes(cb, !d->s.streaming);
    uint64_t lower = 0, upper = d->num_packets;
    int64_t start_time = 0, stop_time = d->s.duration;
    uint64_t curr = 0;
    int narrowing = kNarrowingProbes;
    bool backward = false, got_forward = false, got_backward = false;
    Candidate prev, next;
    auto end = [&] { return *barren_from < d->num_packets ? *barren_from : d->num_packets; };

    for (;;) {  // one interpolated positioning per pass
        if (start_time < stop_time)
            curr = interpolate(target, lower, upper, start_time, stop_time, d->num_packets);
        const uint64_t init = curr;
        bool positioned = false, timed = false;
        asf_packet_st cursor{};
        for (;;) {  // one payload per step; leaving the loop starts the next pass
            int64_t t = -1;
            bool data_end = cursor.num_payloads == 0 && curr >= end();
            if (!data_end) {
                if (!positioned &&
                    cb->cb_seek64(cb, static_cast<cb_off_t>(asf_packet_position(d, curr)), CB_SEEK_SET) == -1)
                    return kAsfNoPacket;
                positioned = true;
                const int r = get_packet_pts(d, &cursor, &t, target_type);
                if (r != HOVA_OK) {
                    // Where nothing counts the packets the input's end is the
                    // data's end; anything else ends the search.
                    if (r != HOVA_EndOfStream || cursor.num_payloads != 0 || !asf_packets_unbounded(d))
                        return kAsfNoPacket;
                    data_end = true;
                }
            }
            if (!data_end) {
                if (t != -1) {
                    timed = true;
                    if (single_probe) {
                        prev = next = {curr, t};
                        got_forward = got_backward = true;
                        goto finish;
                    }
                    if (narrowing > 0) {
                        if (t < target) {
                            lower = curr;
                            start_time = t;
                        } else {
                            upper = curr;
                            stop_time = t;
                        }
                        --narrowing;
                        break;
                    }
                    if (t < target) {
                        got_backward = true;
                        prev = {curr, t};
                    } else if (t == target) {
                        prev = next = {curr, t};
                        got_forward = true;
                        goto finish;
                    } else if (!got_forward || t < next.pts) {
                        // The earliest later time met is the forward answer
                        // (and the first key frame, walking back to packet 0).
                        got_forward = true;
                        next = {curr, t};
                    }
                    // Walking back, the first earlier time met is the one.
                    if (got_backward && (got_forward || backward)) goto finish;
                }
                if (cursor.num_payloads > 0) continue;

                if (backward) {
                    if (curr == 0) break;  // nothing earlier
                    --curr;
                    positioned = false;
                    continue;
                }
                if (got_forward) {
                    // A later time and no earlier one yet: walk back from
                    // before the scan's start (walked already).
                    backward = true;
                    if (init == 0) break;
                    curr = init - 1;
                    positioned = false;
                    continue;
                }
                ++curr;
                continue;
            }

            // A walk ran off the end of the data (or onto the bound).
            if (!timed && !backward && init < *barren_from) *barren_from = init;
            if (backward) break;
            if (narrowing > 0) {
                // Nothing to find from this probe's start on: the range ends there.
                upper = init < end() ? init : end();
                curr = lower;
                --narrowing;
                break;
            }
            if (dir == HOVA_SEEK_FORWARD ? got_forward : got_backward) goto finish;
            // Nothing on the asked side from the scan's start to the end: the
            // answer, if any, lies before it. Walk back from the start.
            backward = true;
            got_backward = false;
            cursor = asf_packet_st{};
            curr = init < end() ? init : end();
            if (curr == 0) break;
            --curr;
            positioned = false;
        }
        if (backward) {
            // Packet 0 (or the input's end) reached walking back.
            if (dir == HOVA_SEEK_FORWARD ? got_forward : got_backward) goto finish;
            if (dir == HOVA_SEEK_FORWARD || !got_forward) return kAsfNoPacket;
            // Nothing at or before the target: the first one after it.
            prev = next;
            goto finish;
        }
    }

finish:
    if (dir == HOVA_SEEK_FORWARD) {
        if (!got_forward) return kAsfNoPacket;
        *pts = next.pts;
        return next.packet;
    }
    *pts = prev.pts;
    return prev.packet;
}
