// A host for benchmarks that only hands out memory and frame buffers (one
// growing block per stream type) and remembers the last media commit, so
// that the demuxer's own cost is what gets measured.
#pragma once

#include <algorithm>
#include <cstdint>
#include <cstdlib>

#include "hova_dmx.h"

namespace plimo_bench {

class LeanHost {
public:
    LeanHost() {
        table_.notify = [](void*, hova_stream_type_et, hova_event_et) { return 0; };
        // Each block carries its size in front so that the peak of what the
        // plug-in holds can be reported.
        table_.malloc = [](void* c, size_t n) -> void* {
            LeanHost* h = self(c);
            auto* p = static_cast<size_t*>(std::malloc(n + kHead));
            if (!p) return nullptr;
            *p = n;
            h->blocks++;
            h->bytes += n;
            h->peak_bytes = std::max(h->peak_bytes, h->bytes);
            return reinterpret_cast<uint8_t*>(p) + kHead;
        };
        table_.realloc = [](void*, void*, size_t) -> void* { return nullptr; };
        table_.freep = [](void* c, void* pp) {
            void** p = static_cast<void**>(pp);
            if (*p) {
                auto* head = reinterpret_cast<size_t*>(static_cast<uint8_t*>(*p) - kHead);
                self(c)->blocks--;
                self(c)->bytes -= *head;
                std::free(head);
            }
            *p = nullptr;
        };
        table_.get_time = [](void*) -> int64_t { return 0; };
        table_.stream_alloc = [](void* c, hova_stream_type_et t, void** b, int n) {
            return self(c)->frame(t, b, n);
        };
        table_.stream_realloc = [](void* c, hova_stream_type_et t, void** b, int n) {
            return self(c)->frame(t, b, n);
        };
        table_.stream_discard = [](void*, hova_stream_type_et) { return 0; };
        table_.stream_commit = [](void* c, hova_stream_type_et t, int, int64_t pts, int64_t,
                                  int kind) {
            LeanHost* h = self(c);
            h->commits++;
            if (kind == 0) {
                h->last_type = t;
                h->last_pts = pts;
            }
            return 0;
        };
        table_.stream_check_rbuf_size = [](void*, hova_stream_type_et) { return 0; };
        table_.context = this;
    }
    ~LeanHost() {
        for (auto& f : frames_) std::free(f.base);
    }
    LeanHost(const LeanHost&) = delete;
    LeanHost& operator=(const LeanHost&) = delete;

    const hova_callback_st* table() const { return &table_; }
    uint64_t commits = 0;
    int blocks = 0;
    size_t bytes = 0;       // held by the plug-in now
    size_t peak_bytes = 0;  // most it held at once
    hova_stream_type_et last_type = HOVA_STREAM_NONE;
    int64_t last_pts = -1;

private:
    static constexpr size_t kHead = 16;  // keeps the blocks 16-byte aligned
    static LeanHost* self(void* c) { return static_cast<LeanHost*>(c); }
    int frame(hova_stream_type_et t, void** b, int n) {
        Frame& f = frames_[t & 15];
        if (static_cast<size_t>(n) > f.cap) {
            const size_t cap = std::max<size_t>(static_cast<size_t>(n), f.cap * 2 + 65536);
            f.base = static_cast<uint8_t*>(std::realloc(f.base, cap));
            f.cap = cap;
        }
        *b = f.base;
        return 0;
    }
    struct Frame {
        uint8_t* base = nullptr;
        size_t cap = 0;
    };
    Frame frames_[16];
    hova_callback_st table_{};
};

}  // namespace plimo_bench
