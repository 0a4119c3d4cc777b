// Track selection: the host can only switch the active streams off.
#include "asf_api.h"
#include "asf_modes.h"
#include "asf_packet.h"

namespace {

// Separate parsing needs both streams. When one goes, delivery returns to a
// single cursor: the remaining stream's own, so that it neither skips nor
// repeats anything.
void leave_separate_parsing(asf_demuxer_st* d, sys_stream_type_et removed) {
    if (d->parse_mode != PARSE_SEP) return;
    const hova_stream_type_et removed_type =
        removed == AUD ? HOVA_STREAM_AUDIO : HOVA_STREAM_VIDEO;
    asf_stream_st* remaining = asf_active_stream(d, removed == AUD ? VID : AUD);
    if (d->accept_stream_type == removed_type && remaining) {
        d->cur_data_packet = remaining->cache_data_packet;
        d->cur_packets = d->cur_data_packet.num;
        (void)asf_seek_to_packet_with_parsed(d, &d->cur_data_packet);
        // A packet the removed stream's cursor abandoned is no business of
        // this cursor: re-aiming at its packet start would read again what
        // it already delivered.
        d->resync = 0;
    }
    d->parse_mode = PARSE_SEQ;
    d->accept_stream_type = HOVA_STREAM_NONE;
}

}  // namespace

extern "C" int asf_set_track(void* ctx, hova_stream_type_et type, int index, int64_t,
                             hova_input_type_et) {
    asf_demuxer_st* d = static_cast<asf_demuxer_st*>(ctx);
    if (type == HOVA_STREAM_PROG) return index == 0 ? HOVA_OK : HOVA_InvalidParam;
    if (index != -1) return HOVA_InvalidParam;
    switch (type) {
        case HOVA_STREAM_AUDIO:
            if (d->s.active_stream[AUD] >= 0) leave_separate_parsing(d, AUD);
            d->s.active_stream[AUD] = -1;
            return HOVA_OK;
        case HOVA_STREAM_VIDEO:
            if (d->s.active_stream[VID] >= 0) leave_separate_parsing(d, VID);
            d->s.active_stream[VID] = -1;
            return HOVA_OK;
        case HOVA_STREAM_SUBTITLE:
            d->s.active_stream[SUB] = -1;
            return HOVA_OK;
        default:
            return HOVA_InvalidParam;
    }
}
