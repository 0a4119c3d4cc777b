// The descriptor the framework looks up by name, and the entry points that
// need no parsing.
#include "asf_api.h"

extern "C" {

const hova_dmx_func_st hova_asff_demuxer = {
    /* probe */ asf_probe,
    /* open_file */ asf_init_demuxer,
    /* close_file */ asf_close_demuxer,
    /* get_info */ asf_get_information,
    /* get_data */ asf_deliver_frame,
    /* seek_time */ asf_seek_time,
    /* resync_time */ asf_resync_time,
    /* set_track */ asf_set_track,
    /* set_drop */ asf_set_drop_level,
    /* set_edition */ nullptr,
    /* set_multi_thumb */ asf_set_multi_thumb,
    /* release_data */ nullptr,
    /* get_frame_info */ nullptr,
    /* get_frame_data */ nullptr,
    /* reset_avframe */ nullptr,
    /* discard_avframe */ nullptr,
    /* queue_avframe */ nullptr,
    /* deliver_avframe */ nullptr,
    /* peek_avframe */ nullptr,
    /* min_context_size */ ASF_MIN_CONTEXT_SIZE,
    /* support_avframe_video */ 0,
    /* support_avframe_audio */ 0,
    /* support_fast_track_switch */ 0,
    /* notify_event */ asf_dmx_notify_event,
    /* set_unset_temi_config */ nullptr,
    /* get_timeline_info */ nullptr,
};

// Host-driven frame dropping is not offered.
int asf_set_drop_level(void*, hova_drop_level_et) { return HOVA_InvalidParam; }

int asf_set_multi_thumb(void* ctx, int64_t interval) {
    static_cast<asf_demuxer_st*>(ctx)->s.thumbnail_interval = interval;
    return HOVA_OK;
}

int asf_dmx_notify_event(void*, hova_player_notify_et, void*) { return HOVA_OK; }

}  // extern "C"
