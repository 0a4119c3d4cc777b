// What the host records do not carry but the summary and stats report: the
// packet count, the simple index the plug-in found, each stream record's
// stream number, channels and bit rate, which records are active and whether
// delivery switched to separate parsing. Read from the context record that
// include/asf_demuxer.h declares (the host owns that buffer), never written.
#pragma once

#include <cstdint>
#include <vector>

#include "hova_dmx.h"

namespace asfdump {

struct StreamView {
    int stream_num = 0;      // the ASF stream number
    uint32_t channels = 0;   // audio only
    uint32_t bit_rate = 0;   // from the stream's own bit rate record, bits per second
    bool active = false;
};

struct ContextView {
    uint64_t packets = 0;             // the file properties' packet count; 0 for a broadcast capture
    uint32_t packet_size = 0;
    uint32_t index_entries = 0;       // 0: no simple index found (or not looked for)
    int64_t index_interval_us = 0;
    int64_t index_start_us = -1;      // time of entry 0; -1 until the plug-in worked it out (first seek)
    bool separate_parsing = false;    // delivery switched (bad interleaving)
    std::vector<StreamView> audio, video;  // in the order of get_info's indexes
};

// The view of the context open_file returned.
ContextView view_context(const void* ctx);

}  // namespace asfdump
