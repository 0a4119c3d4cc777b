#include "sys_output.h"

#include <cstring>

extern "C" {

int sys_notify(sys_demuxer_st* d, hova_stream_type_et type, hova_event_et event) {
    return d->callback.notify(d->callback.context, type, event);
}

void* sys_malloc(sys_demuxer_st* d, size_t size) {
    return d->callback.malloc(d->callback.context, size);
}

void* sys_realloc(sys_demuxer_st* d, void* ptr, size_t size) {
    return d->callback.realloc(d->callback.context, ptr, size);
}

void sys_freep(sys_demuxer_st* d, void* pptr) { d->callback.freep(d->callback.context, pptr); }

int sys_stream_alloc(sys_demuxer_st* d, hova_stream_type_et type, void** buffer, int size) {
    return d->callback.stream_alloc(d->callback.context, type, buffer, size);
}

int sys_stream_realloc(sys_demuxer_st* d, hova_stream_type_et type, void** buffer, int size) {
    return d->callback.stream_realloc(d->callback.context, type, buffer, size);
}

int sys_stream_discard(sys_demuxer_st* d, hova_stream_type_et type) {
    return d->callback.stream_discard(d->callback.context, type);
}

int sys_stream_commit(sys_demuxer_st* d, hova_stream_type_et type, int size, int64_t pts,
                      int64_t duration, int packet_type) {
    return d->callback.stream_commit(d->callback.context, type, size, pts, duration, packet_type);
}

int sys_stream_check_rbuf_size(sys_demuxer_st* d, hova_stream_type_et type) {
    return d->callback.stream_check_rbuf_size(d->callback.context, type);
}

int sys_stream_send_config(sys_demuxer_st* d, sys_stream_st* s) {
    const int size = static_cast<int>(s->config_len) + 4;
    void* frame = nullptr;
    if (sys_stream_alloc(d, s->stream_type, &frame, size) != 0) return HOVA_NotEnoughMemory;
    const int32_t codec = s->codec_type;
    std::memcpy(frame, &codec, 4);
    if (s->config_len != 0) std::memcpy(static_cast<uint8_t*>(frame) + 4, s->config, s->config_len);
    sys_stream_commit(d, s->stream_type, size, 0, 0, SYS_PACKET_CONFIG);
    return HOVA_OK;
}

int sys_stream_commit_secure_handle(sys_demuxer_st* d, hova_stream_type_et type, int size,
                                    const void* src, int64_t pts, int packet_type) {
    void* frame = nullptr;
    if (sys_stream_alloc(d, type, &frame, size) != 0) return HOVA_NotEnoughMemory;
    if (size > 0) std::memcpy(frame, src, static_cast<size_t>(size));
    sys_stream_commit(d, type, size, pts, 0, packet_type);
    return HOVA_OK;
}

}  // extern "C"
