// The context records are shared with the host: pin their layout. The host
// was built for the 32-bit target, whose figures are the binding ones.
#include <cstddef>

#include "asf_demuxer.h"
#include "hova_dmx.h"

#if UINTPTR_MAX == 0xFFFFFFFFu
static_assert(sizeof(cb_io_st) == 128);
static_assert(sizeof(hova_callback_st) == 64);
static_assert(sizeof(cb_buffer_st) == 96);
static_assert(sizeof(sys_stream_st) == 64);
static_assert(sizeof(sys_demuxer_st) == 304);
static_assert(sizeof(asf_packet_st) == 56);
static_assert(sizeof(asf_stream_st) == 176);
static_assert(sizeof(asf_demuxer_st) == 2184);
static_assert(offsetof(asf_demuxer_st, cur_data_packet) == 2064);
static_assert(offsetof(asf_demuxer_st, stream_info) == 2184);
static_assert(ASF_MIN_CONTEXT_SIZE == 2536);
#else
static_assert(sizeof(hova_callback_st) == 128);
static_assert(sizeof(cb_buffer_st) == 152);
static_assert(sizeof(asf_packet_st) == 56);
static_assert(sizeof(asf_stream_st) == 192);
static_assert(sizeof(asf_demuxer_st) == 2352);
#endif
static_assert(offsetof(sys_demuxer_st, duration) == 0);
static_assert(offsetof(asf_demuxer_st, s) == 0);
static_assert(offsetof(asf_stream_st, s) == 0);
static_assert(offsetof(asf_demuxer_st, stream_info) == sizeof(asf_demuxer_st));
static_assert(ASF_MIN_CONTEXT_SIZE == sizeof(asf_demuxer_st) + 2 * sizeof(asf_stream_st));
static_assert(alignof(asf_demuxer_st) == 8 && alignof(asf_stream_st) == 8);
