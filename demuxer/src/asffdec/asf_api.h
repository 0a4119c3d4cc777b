/* Entry points of the ASF demuxer, as the descriptor lists them. */
#ifndef ASF_API_H
#define ASF_API_H

#include "asf_demuxer.h"
#include "hova_dmx.h"

#ifdef __cplusplus
extern "C" {
#endif

int asf_probe(const uint8_t* header, int len, cb_io_st* cbio, hova_probe_method_et method);
int asf_init_demuxer(void** ctx, cb_io_st* cbio, void* buffer, int bufsize, int ringbuf_size,
                     const hova_callback_st* cb);
int asf_close_demuxer(void* ctx);
int asf_get_information(void* ctx, hova_stream_type_et type, int index, void* info);
int asf_deliver_frame(void* ctx, hova_stream_type_et* type, int* bufsize, int64_t* pts);
int asf_seek_time(void* ctx, int dir, int64_t* pts, int query_only);
int asf_resync_time(void* ctx, int64_t resync_time);
int asf_set_track(void* ctx, hova_stream_type_et type, int index, int64_t pts,
                  hova_input_type_et input_type);
int asf_set_drop_level(void* ctx, hova_drop_level_et level);
int asf_set_multi_thumb(void* ctx, int64_t interval);
int asf_dmx_notify_event(void* ctx, hova_player_notify_et event, void* data);

__attribute__((visibility("default"))) extern const hova_dmx_func_st hova_asff_demuxer;

#ifdef __cplusplus
}
#endif

#endif /* ASF_API_H */
