/* Every host interface header, included together, compiles as strict C. */
#include "asf_demuxer.h"
#include "cb_buffer.h"
#include "cb_io.h"
#include "hova_codec.h"
#include "hova_dmx.h"
#include "sys_demuxer.h"

_Static_assert(HOVA_EndOfStream == 8 && CLIP_VIDEO_TYPE_WVC1 == 19 && CLIP_AUDIO_TYPE_WMA2 == 24, "host codes");
_Static_assert(sizeof(asf_packet_st) == 56, "packet record");
