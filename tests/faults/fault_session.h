// One whole session driven the way the framework drives the descriptor, with
// a fault armed: open, every query, deliveries, a seek forward, a seek back,
// a resync, delivery to the end, close. Records whether every call gave a
// result its entry point may give, what the host still holds after close
// and how often each host service was used, so that a sweep can arm the
// fault at every position a clean session reaches.
#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdint>
#include <memory>
#include <sstream>
#include <string>
#include <vector>

#include "asf_api.h"
#include "callbacks.h"
#include "loader.h"
#include "raw_input.h"

namespace faults {

using Bytes = std::vector<uint8_t>;

// How the host buffers the input.
enum class Buffering { Cache, None, Ring, RingThread };

inline const char* name_of(Buffering b) {
    static const char* const names[] = {"cache", "none", "ring", "ring+thread"};
    return names[static_cast<int>(b)];
}

inline host::InputOptions input_for(Buffering b) {
    host::InputOptions in;
    in.disable_cache = b == Buffering::None;
    in.rbuf_mode = b >= Buffering::Ring ? CBIO_APPLY_RBUF : CBIO_NO_RBUF;
    in.use_thread = b == Buffering::RingThread;
    in.ring_size = 65536;
    return in;
}

struct Fault {
    uint64_t fail_malloc = 0;        // the Nth host malloc fails (0: none)
    uint64_t refuse_alloc = 0;       // the Nth stream_alloc is refused
    uint64_t refuse_realloc = 0;     // the Nth stream_realloc is refused
    uint64_t end_after = UINT64_MAX; // the input ends after this many bytes
    int64_t fail_seeks_after = -1;   // input seeks fail after this many succeeded
};

struct Report {
    int open_rc = -1;
    std::vector<std::string> bad_results;   // "entry: code" for each result not allowed
    uint64_t blocks_after_close = 0, foreign_frees = 0, protocol_errors = 0;
    uint64_t mallocs = 0, allocs = 0, reallocs = 0, input_seeks = 0;
    bool clean() const {
        return bad_results.empty() && !blocks_after_close && !foreign_frees && !protocol_errors;
    }
};

class SessionRun {
public:
    SessionRun(const Bytes& file, Buffering b, const Fault& f) : fault_(f) {
        const host::InputOptions in = input_for(b);
        input_ = host::RawInput::borrow_memory(file.data(), file.size(), in);
        input_->faults().end_after = f.end_after;
        input_->faults().fail_seeks_after = f.fail_seeks_after;
        table_ = *host_.table();
        table_.stream_alloc = &shim<false>;
        table_.stream_realloc = &shim<true>;
        ring_size_ = in.ring_size;
    }

    Report run() {
        current() = this;
        Report& r = report_;
        host::ContextBuffer buffer(static_cast<size_t>(hova_asff_demuxer.min_context_size));
        const hova_dmx_func_st& d = hova_asff_demuxer;
        host_.fail_malloc_at(fault_.fail_malloc);
        void* ctx = nullptr;
        r.open_rc =
            d.open_file(&ctx, input_->io(), buffer.data(), buffer.size(), ring_size_, &table_);
        check(r, "open_file", r.open_rc,
              {HOVA_OK, HOVA_NotEnoughMemory, HOVA_OpenFailed, HOVA_EndOfStream});
        if (r.open_rc == HOVA_OK) {
            const std::initializer_list<int> info_rc = {HOVA_OK, HOVA_InvalidParam};
            const std::initializer_list<int> seek_rc = {HOVA_OK, HOVA_SeekFailed};
            hova_clip_info_st clip{};
            hova_program_info_st prog{};
            hova_audio_info_st audio{};
            hova_video_info_st video{};
            check(r, "get_info", d.get_info(ctx, HOVA_STREAM_NONE, 0, &clip), {HOVA_OK});
            check(r, "get_info", d.get_info(ctx, HOVA_STREAM_PROG, 0, &prog), {HOVA_OK});
            check(r, "get_info", d.get_info(ctx, HOVA_STREAM_AUDIO, 0, &audio), info_rc);
            check(r, "get_info", d.get_info(ctx, HOVA_STREAM_VIDEO, 0, &video), info_rc);
            const int64_t duration = prog.duration > 0 ? prog.duration : 4000000;
            deliver(r, ctx, 30);
            int64_t pts = duration / 2;
            check(r, "seek_time", d.seek_time(ctx, HOVA_SEEK_FORWARD, &pts, 0), seek_rc);
            deliver(r, ctx, 30);
            pts = duration / 4;
            check(r, "seek_time", d.seek_time(ctx, HOVA_SEEK_BACKWARD, &pts, 0), seek_rc);
            check(r, "resync_time", d.resync_time(ctx, 0), {HOVA_OK});
            deliver(r, ctx, 20000);
            check(r, "close_file", d.close_file(ctx), {HOVA_OK});
        }
        r.blocks_after_close = host_.outstanding_blocks();
        r.foreign_frees = host_.foreign_frees();
        r.protocol_errors = host_.protocol_errors();
        r.mallocs = host_.malloc_calls();
        r.input_seeks = input_->counters().seeks;
        current() = nullptr;
        return r;
    }

private:
    static SessionRun*& current() {
        static SessionRun* run = nullptr;
        return run;
    }
    // stream_alloc (Realloc false) or stream_realloc, refused at its armed call.
    template <bool Realloc>
    static int shim(void* c, hova_stream_type_et t, void** buffer, int size) {
        SessionRun* s = current();
        const uint64_t n = ++(Realloc ? s->report_.reallocs : s->report_.allocs);
        if (n == (Realloc ? s->fault_.refuse_realloc : s->fault_.refuse_alloc))
            return *buffer = nullptr, -1;
        const hova_callback_st* h = s->host_.table();
        return (Realloc ? h->stream_realloc : h->stream_alloc)(c, t, buffer, size);
    }

    static void check(Report& r, const char* entry, int rc, std::initializer_list<int> allowed) {
        if (std::find(allowed.begin(), allowed.end(), rc) == allowed.end())
            r.bad_results.push_back(std::string(entry) + ": " + std::to_string(rc));
    }

    void deliver(Report& r, void* ctx, int limit) {
        for (int i = 0; i < limit; ++i) {
            host_.call++;
            hova_stream_type_et type = HOVA_STREAM_NONE;
            int size = 0;
            int64_t pts = 0;
            const int rc = hova_asff_demuxer.get_data(ctx, &type, &size, &pts);
            // NotEnoughMemory: the host refused a configuration record.
            check(r, "get_data", rc,
                  {HOVA_OK, HOVA_TryAgain, HOVA_EndOfStream, HOVA_NotEnoughMemory});
            if (rc == HOVA_EndOfStream) return;
        }
    }

    Fault fault_;
    host::HostCallbacks host_;
    hova_callback_st table_{};
    std::unique_ptr<host::RawInput> input_;
    int ring_size_ = 0;
    Report report_;
};

inline Report run_session(const Bytes& file, Buffering b, const Fault& f = {}) {
    SessionRun s(file, b, f);
    return s.run();
}

// One line for a failed expectation.
inline std::string describe(const Report& r) {
    std::ostringstream s;
    s << "open " << r.open_rc << ", blocks after close " << r.blocks_after_close
      << ", protocol errors " << r.protocol_errors << ", foreign frees " << r.foreign_frees;
    for (const auto& b : r.bad_results) s << "; " << b;
    return s.str();
}

}  // namespace faults
