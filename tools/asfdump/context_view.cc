#include "context_view.h"

#include "asf_demuxer.h"

namespace asfdump {

ContextView view_context(const void* ctx) {
    const auto* d = static_cast<const asf_demuxer_st*>(ctx);
    ContextView v;
    v.packets = d->num_packets;
    v.packet_size = d->packet_size;
    v.index_entries = d->index_packet != 0 ? d->index_count : 0;
    v.index_interval_us = static_cast<int64_t>(d->index_time_interval);
    v.index_start_us = d->index_start_offset;
    v.separate_parsing = d->parse_mode == PARSE_SEP || d->parse_file_end != 0;
    for (int i = 0; i < d->s.total_streams && i < d->max_streams; ++i) {
        const asf_stream_st& r = d->stream_info[i];
        const bool audio = r.s.stream_type == HOVA_STREAM_AUDIO;
        if (!audio && r.s.stream_type != HOVA_STREAM_VIDEO) continue;
        StreamView s;
        s.stream_num = r.stream_num;
        s.channels = audio ? r.s.info.aud.ch_num : 0;
        s.bit_rate = r.stream_num >= 0 && r.stream_num < 128 ? d->stream_bitrate[r.stream_num] : 0;
        s.active = i == d->s.active_stream[audio ? AUD : VID];
        (audio ? v.audio : v.video).push_back(s);
    }
    return v;
}

}  // namespace asfdump
