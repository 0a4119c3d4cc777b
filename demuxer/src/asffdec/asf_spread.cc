#include "asf_spread.h"

#include <cstring>

#include "dprintf.h"
#include "sys_output.h"

void asf_handle_audio_spread(asf_demuxer_st* d, asf_stream_st* s, hova_stream_type_et type) {
    const uint32_t span = d->a_spread_span;
    const uint32_t packet_len = d->a_spread_packet_len;
    const uint32_t chunk_len = d->a_spread_chunk_len;
    if (span <= 1) return;
    const uint32_t size = s->object_size;
    if (size != span * packet_len) {
        ASF_LOG("object size %d does not match spread len %d x %d\n", static_cast<int>(size),
                static_cast<int>(span), static_cast<int>(packet_len));
        return;
    }
    // Header parsing only accepts a chunk length that divides the packet
    // length; a zero one or a frame too large to double is left as it is.
    if (chunk_len == 0 || !s->buffer || size > static_cast<uint32_t>(INT32_MAX / 2)) return;
    void* frame = s->buffer;
    if (sys_stream_realloc(&d->s, type, &frame, static_cast<int>(2 * size)) != 0 || !frame) {
        ASF_LOG("realloc for audio spread fails\n");
        return;
    }
    s->buffer = static_cast<uint8_t*>(frame);
    uint8_t* obj = s->buffer;
    uint8_t* temp_buf = obj + size;
    std::memcpy(temp_buf, obj, size);
    const uint32_t chunks = size / chunk_len;
    for (uint32_t index = 0; index < chunks; ++index) {
        const uint32_t row = index / span;
        const uint32_t column = index % span;
        const uint32_t new_index = (column * packet_len) / chunk_len + row;
        const uint64_t new_offset = static_cast<uint64_t>(chunk_len) * new_index;
        if (new_offset + chunk_len <= size)
            std::memcpy(obj + new_offset, temp_buf + static_cast<size_t>(chunk_len) * index, chunk_len);
    }
}
