// Drives the whole plug-in through its descriptor as the framework does,
// over an input held in memory, for the plug-in fuzz targets. Every call is
// checked for a result the entry point may give and for running longer than
// a second (the hang guard); after close the host must hold no block, must
// never have seen a frame committed past its buffer or another misuse of
// the frame callbacks.
#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <initializer_list>

#include "asf_api.h"
#include "session.h"

namespace plugfuzz {

// What the input looks like to the plug-in.
struct Mode {
    host::InputOptions input;
    host::InputFaults faults;
    int ring_size = 1048576;
    uint64_t fail_malloc_at = 0;   // 0: no allocation fails
    bool refuse_stream_alloc = false;
    bool refuse_stream_realloc = false;
};

// One host action between deliveries (two bytes of the fuzzer's input).
struct Op {
    uint8_t what;
    uint8_t arg;
};

constexpr int kMaxDeliveries = 3000;   // get_data calls per input, all told
constexpr auto kHangLimit = std::chrono::milliseconds(1000);

[[noreturn]] inline void fail(const char* what, const char* entry, long value) {
    std::fprintf(stderr, "plugin fuzz: %s: %s (%ld)\n", entry, what, value);
    std::abort();
}

// Runs `call`, aborting when it takes over a second or returns a code that
// is not in `allowed`.
template <typename F>
int guarded(const char* entry, std::initializer_list<int> allowed, F&& call) {
    const auto t0 = std::chrono::steady_clock::now();
    const int rc = call();
    const auto spent = std::chrono::steady_clock::now() - t0;
    if (spent > kHangLimit)
        fail("ran longer than one second (ms)", entry,
             static_cast<long>(std::chrono::duration_cast<std::chrono::milliseconds>(spent).count()));
    for (int a : allowed)
        if (rc == a) return rc;
    fail("returned a code it may not give", entry, rc);
}

inline void query_all(host::Session& s) {
    const hova_dmx_func_st& d = *s.dmx();
    void* ctx = s.context();
    hova_clip_info_st clip{};
    guarded("get_info(clip)", {HOVA_OK, HOVA_InvalidParam},
            [&] { return d.get_info(ctx, HOVA_STREAM_NONE, 0, &clip); });
    hova_program_info_st prog{};
    const int prc = guarded("get_info(program)", {HOVA_OK, HOVA_InvalidParam},
                            [&] { return d.get_info(ctx, HOVA_STREAM_PROG, 0, &prog); });
    const int naudio = prc == HOVA_OK ? prog.num_audio_streams : 0;
    const int nvideo = prc == HOVA_OK ? prog.num_video_streams : 0;
    // Every index the program reports, one past it, and -1 (the active one).
    for (int i = -1; i <= (naudio < 8 ? naudio : 8); ++i) {
        hova_audio_info_st a{};
        guarded("get_info(audio)", {HOVA_OK, HOVA_InvalidParam},
                [&] { return d.get_info(ctx, HOVA_STREAM_AUDIO, i, &a); });
    }
    for (int i = -1; i <= (nvideo < 8 ? nvideo : 8); ++i) {
        hova_video_info_st v{};
        guarded("get_info(video)", {HOVA_OK, HOVA_InvalidParam},
                [&] { return d.get_info(ctx, HOVA_STREAM_VIDEO, i, &v); });
    }
    uint8_t junk[64] = {};
    guarded("get_info(other)", {HOVA_InvalidParam},
            [&] { return d.get_info(ctx, HOVA_STREAM_SUBTITLE, 0, junk); });
}

// One get_data call; false at the end of the stream.
inline bool deliver_once(host::Session& s, int* budget) {
    if (*budget <= 0) return false;
    --*budget;
    s.callbacks().call++;
    hova_stream_type_et type = HOVA_STREAM_NONE;
    int size = 0;
    int64_t pts = 0;
    // NotEnoughMemory: the host refused a configuration record.
    const int rc = guarded("get_data", {HOVA_OK, HOVA_TryAgain, HOVA_EndOfStream, HOVA_NotEnoughMemory},
                           [&] { return s.dmx()->get_data(s.context(), &type, &size, &pts); });
    return rc != HOVA_EndOfStream;
}

inline void deliver_until_end(host::Session& s, int* budget, int limit) {
    for (int i = 0; i < limit; ++i)
        if (!deliver_once(s, budget)) return;
}

// A whole session: probe, open, queries, then `ops` (or delivery to the end
// when there are none), delivery to the end, close and the checks.
inline void run(const uint8_t* file, size_t size, const Mode& mode, const Op* ops, size_t nops) {
    const hova_dmx_func_st* d = &hova_asff_demuxer;
    {
        auto probe_input = host::RawInput::borrow_memory(file, size, mode.input);
        const int len = size < 4096 ? static_cast<int>(size) : 4096;
        guarded("probe", {0, 1}, [&] {
            return d->probe(file, len, probe_input->io(), HOVA_PROBE_NORMAL);
        });
    }

    host::SessionOptions so;
    so.input = mode.input;
    so.ring_size = mode.ring_size;
    auto input = host::RawInput::borrow_memory(file, size, mode.input);
    input->faults() = mode.faults;
    host::Session s(d, std::move(input), so);
    host::HostCallbacks& cb = s.callbacks();
    cb.fail_malloc_at(mode.fail_malloc_at);
    cb.refuse_stream_alloc = mode.refuse_stream_alloc;
    cb.refuse_stream_realloc = mode.refuse_stream_realloc;

    const int orc = guarded("open_file", {HOVA_OK, HOVA_NotEnoughMemory, HOVA_OpenFailed, HOVA_EndOfStream},
                            [&] { return s.open(); });
    if (orc != HOVA_OK) {
        if (s.blocks_outstanding() != 0)
            fail("blocks held after a failed open", "open_file", static_cast<long>(s.blocks_outstanding()));
        return;
    }
    query_all(s);

    int budget = kMaxDeliveries;
    void* ctx = s.context();
    for (size_t i = 0; i < nops; ++i) {
        const Op op = ops[i];
        switch (op.what & 7) {
            case 0:
            case 1:  // a run of deliveries
                deliver_until_end(s, &budget, 1 + op.arg);
                break;
            case 2: {  // seek, either direction, maybe only asking
                int64_t pts = static_cast<int64_t>(op.arg) * 250000 - 1000000;
                const int dir = (op.what >> 3) & 1;
                const int query = (op.what >> 4) & 1;
                guarded("seek_time", {HOVA_OK, HOVA_SeekFailed},
                        [&] { return d->seek_time(ctx, dir, &pts, query); });
                break;
            }
            case 3: {
                const int64_t t = static_cast<int64_t>(op.arg) * 250000 - ((op.what & 8) ? 1000000 : 0);
                guarded("resync_time", {HOVA_OK}, [&] { return d->resync_time(ctx, t); });
                break;
            }
            case 4: {  // a track turned off
                const hova_stream_type_et t = (op.arg & 1) ? HOVA_STREAM_VIDEO : HOVA_STREAM_AUDIO;
                guarded("set_track", {HOVA_OK}, [&] {
                    return d->set_track(ctx, t, -1, 0, HOVA_INPUT_MASTER);
                });
                break;
            }
            case 5: {  // thumbnail mode on or off
                const int64_t interval = (op.arg & 0x80) ? -1 : static_cast<int64_t>(op.arg) * 100000;
                guarded("set_multi_thumb", {HOVA_OK}, [&] { return d->set_multi_thumb(ctx, interval); });
                break;
            }
            case 6: {  // a request the plug-in must refuse
                guarded("set_drop", {HOVA_InvalidParam}, [&] {
                    return d->set_drop(ctx, static_cast<hova_drop_level_et>(op.arg % 6));
                });
                guarded("set_track(bad)", {HOVA_InvalidParam}, [&] {
                    return d->set_track(ctx, HOVA_STREAM_AUDIO, 1 + (op.arg >> 4), 0,
                                        HOVA_INPUT_MASTER);
                });
                break;
            }
            default:
                query_all(s);
                break;
        }
    }
    deliver_until_end(s, &budget, kMaxDeliveries);

    guarded("close_file", {HOVA_OK}, [&] { return s.close(); });
    if (s.blocks_outstanding() != 0)
        fail("blocks held after close", "close_file", static_cast<long>(s.blocks_outstanding()));
    if (cb.foreign_frees() != 0) fail("freed blocks the host never gave", "close_file", 0);
    if (cb.protocol_errors() != 0) {
        for (const auto& e : cb.protocol_error_log()) std::fprintf(stderr, "  %s\n", e.c_str());
        fail("frame callbacks misused (a commit past its buffer, ...)", "get_data",
             static_cast<long>(cb.protocol_errors()));
    }
}


// ---- the three targets' input layouts (shared with the regression replay) ----

// The file itself.
inline void play_input(const uint8_t* data, size_t size) {
    if (size > (1u << 21)) return;
    run(data, size, Mode{}, nullptr, 0);
}

constexpr size_t kOpBytes = 32;

// 32 bytes of host actions (16 pairs: action, argument), then the file.
inline void seek_input(const uint8_t* data, size_t size) {
    if (size < kOpBytes || size > (1u << 21)) return;
    Op ops[kOpBytes / 2];
    for (size_t i = 0; i < kOpBytes / 2; ++i) ops[i] = {data[2 * i], data[2 * i + 1]};
    run(data + kOpBytes, size - kOpBytes, Mode{}, ops, kOpBytes / 2);
}

constexpr size_t kModeBytes = 4;

// Modes: the whole plug-in under every way the host can buffer the input (file
// cache, none, ring filled in the demuxer's thread, ring filled by the
// streaming thread), with streaming and non-seekable inputs, short reads,
// and the host's allocations or frame buffers refused; host actions between
// deliveries as in the seek target.
//
// Input: 4 bytes of mode, 32 bytes of host actions, then the ASF file.
//   byte 0: bits 0-1 buffering (cache, none, ring, ring + thread),
//           bit 2 not seekable, bit 3 streaming, bit 4 detect discontinuity,
//           bits 5-7 block size (32768 >> n, at least 64)
//   byte 1: bits 0-1 ring size (1 MiB, 64 KiB, 8 KiB, 2 KiB),
//           bits 2-4 read limit (none, 1, 7, 100, 1000, 4096, 9000, 65536)
//   byte 2: the host malloc that fails (0: none)
//   byte 3: bit 0 stream_alloc refused, bit 1 stream_realloc refused,
//           bit 2 seeks refused, bits 3-7 the input ends early (at n * 4 KiB)
inline Mode mode_for(const uint8_t* m, size_t file_size) {
    Mode mode;
    host::InputOptions& in = mode.input;
    switch (m[0] & 3) {
        case 0: break;
        case 1: in.disable_cache = true; break;
        case 2: in.rbuf_mode = CBIO_APPLY_RBUF; break;
        default:
            in.rbuf_mode = CBIO_APPLY_RBUF;
            in.use_thread = true;
            break;
    }
    in.seekable = (m[0] & 4) == 0;
    in.streaming = (m[0] & 8) != 0;
    in.detect_discontinuity = (m[0] >> 4) & 1;
    const int shift = (m[0] >> 5) & 7;
    in.block_size = shift == 7 ? 64 : 32768 >> shift;
    static constexpr int kRing[] = {1048576, 65536, 8192, 2048};
    mode.ring_size = kRing[m[1] & 3];
    in.ring_size = mode.ring_size;
    static constexpr size_t kReadLimit[] = {SIZE_MAX, 1, 7, 100, 1000, 4096, 9000, 65536};
    mode.faults.max_read = kReadLimit[(m[1] >> 2) & 7];
    mode.fail_malloc_at = m[2];
    mode.refuse_stream_alloc = (m[3] & 1) != 0;
    mode.refuse_stream_realloc = (m[3] & 2) != 0;
    mode.faults.refuse_seek = (m[3] & 4) != 0;
    const uint64_t end = static_cast<uint64_t>(m[3] >> 3) * 4096;
    if (end != 0 && end < file_size) mode.faults.end_after = end;
    return mode;
}


// 4 bytes of mode, 32 bytes of host actions, then the file.
inline void modes_input(const uint8_t* data, size_t size) {
    if (size < kModeBytes + kOpBytes || size > (1u << 21)) return;
    const size_t file_size = size - kModeBytes - kOpBytes;
    const Mode mode = mode_for(data, file_size);
    Op ops[kOpBytes / 2];
    const uint8_t* o = data + kModeBytes;
    for (size_t i = 0; i < kOpBytes / 2; ++i) ops[i] = {o[2 * i], o[2 * i + 1]};
    run(o + kOpBytes, file_size, mode, ops, kOpBytes / 2);
}

inline void quiet_log() {
    if (!std::getenv("PLIMO_FUZZ_LOG")) setenv("PLIMO_LOG", "off", 1);
}

}  // namespace plugfuzz
