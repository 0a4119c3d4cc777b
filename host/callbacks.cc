#include "callbacks.h"

#include <zlib.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>

#if defined(__has_include)
#if __has_include(<sanitizer/asan_interface.h>)
#include <sanitizer/asan_interface.h>
#endif
#endif
#ifndef ASAN_POISON_MEMORY_REGION
#define ASAN_POISON_MEMORY_REGION(addr, size) ((void)(addr), (void)(size))
#define ASAN_UNPOISON_MEMORY_REGION(addr, size) ((void)(addr), (void)(size))
#endif

namespace host {

namespace {

constexpr size_t kMinFrameCapacity = 64 * 1024;

HostCallbacks* self(void* ctx) { return static_cast<HostCallbacks*>(ctx); }

// Only the frame's bytes are addressable; the spare capacity behind them is
// poisoned so that a write past the allocation is caught.
void expose(uint8_t* base, size_t capacity, size_t size) {
    ASAN_UNPOISON_MEMORY_REGION(base, capacity);
    ASAN_POISON_MEMORY_REGION(base + size, capacity - size);
}

}  // namespace

HostCallbacks::HostCallbacks() {
    table_.notify = &cb_notify;
    table_.malloc = &cb_malloc;
    table_.realloc = &cb_realloc;
    table_.freep = &cb_freep;
    table_.get_time = &cb_get_time;
    table_.stream_alloc = &cb_stream_alloc;
    table_.stream_discard = &cb_stream_discard;
    table_.stream_commit = &cb_stream_commit;
    table_.stream_realloc = &cb_stream_realloc;
    table_.stream_check_rbuf_size = &cb_stream_check_rbuf_size;
    table_.context = this;
}

HostCallbacks::~HostCallbacks() {
    for (auto& [ptr, size] : blocks_) std::free(ptr);
    for (auto& [type, p] : pending_) {
        if (p.base) {
            ASAN_UNPOISON_MEMORY_REGION(p.base, p.capacity);
            std::free(p.base);
        }
    }
}

size_t HostCallbacks::outstanding_bytes() const {
    size_t total = 0;
    for (const auto& [ptr, size] : blocks_) total += size;
    return total;
}

void HostCallbacks::protocol_error(const std::string& what) {
    protocol_errors_++;
    protocol_log_.push_back(what);
}

HostCallbacks::Pending& HostCallbacks::slot(hova_stream_type_et type) { return pending_[type]; }

const HostCallbacks::Pending* HostCallbacks::find_slot(hova_stream_type_et type) const {
    auto it = pending_.find(type);
    return it == pending_.end() ? nullptr : &it->second;
}

bool HostCallbacks::pending(hova_stream_type_et type) const {
    const Pending* p = find_slot(type);
    return p && p->open;
}

int HostCallbacks::pending_size(hova_stream_type_et type) const {
    const Pending* p = find_slot(type);
    return (p && p->open) ? p->size : -1;
}

std::vector<HostEvent> HostCallbacks::commits(hova_stream_type_et type, int packet_type) const {
    std::vector<HostEvent> out;
    for (const HostEvent& e : events_)
        if (e.kind == EventKind::Commit && e.type == type && e.packet_type == packet_type)
            out.push_back(e);
    return out;
}

int HostCallbacks::cb_notify(void* ctx, hova_stream_type_et type, hova_event_et event) {
    HostCallbacks* h = self(ctx);
    HostEvent e;
    e.kind = EventKind::Notify;
    e.type = type;
    e.event = event;
    e.call = h->call;
    h->events_.push_back(std::move(e));
    return h->notify_result;
}

void* HostCallbacks::cb_malloc(void* ctx, size_t size) {
    HostCallbacks* h = self(ctx);
    h->malloc_calls_++;
    if (h->fail_malloc_at_ && h->malloc_calls_ == h->fail_malloc_at_) return nullptr;
    void* p = std::malloc(size ? size : 1);
    if (p) h->blocks_[p] = size;
    return p;
}

void* HostCallbacks::cb_realloc(void* ctx, void* ptr, size_t size) {
    HostCallbacks* h = self(ctx);
    if (ptr && !h->blocks_.count(ptr)) {
        h->foreign_frees_++;
        return nullptr;
    }
    void* p = std::realloc(ptr, size ? size : 1);
    if (!p) return nullptr;
    if (ptr) h->blocks_.erase(ptr);
    h->blocks_[p] = size;
    return p;
}

void HostCallbacks::cb_freep(void* ctx, void* pptr) {
    HostCallbacks* h = self(ctx);
    if (!pptr) return;
    void** slot = static_cast<void**>(pptr);
    if (!*slot) return;
    auto it = h->blocks_.find(*slot);
    if (it == h->blocks_.end()) {
        h->foreign_frees_++;
    } else {
        std::free(*slot);
        h->blocks_.erase(it);
    }
    *slot = nullptr;
}

int64_t HostCallbacks::cb_get_time(void* ctx) {
    HostCallbacks* h = self(ctx);
    int64_t t = h->now_us;
    h->now_us += h->clock_step_us;
    return t;
}

int HostCallbacks::cb_stream_alloc(void* ctx, hova_stream_type_et type, void** buffer, int size) {
    HostCallbacks* h = self(ctx);
    if (h->refuse_stream_alloc || size < 0) {
        *buffer = nullptr;
        return -1;
    }
    Pending& p = h->slot(type);
    if (p.open) h->protocol_error("stream_alloc while a frame is pending");
    const size_t want = static_cast<size_t>(size);
    if (p.capacity < want || !p.base) {
        if (p.base) {
            ASAN_UNPOISON_MEMORY_REGION(p.base, p.capacity);
            std::free(p.base);
        }
        p.capacity = std::max(want, kMinFrameCapacity);
        p.base = static_cast<uint8_t*>(std::malloc(p.capacity));
    }
    expose(p.base, p.capacity, want);
    p.size = size;
    p.open = true;
    *buffer = p.base;
    return 0;
}

int HostCallbacks::cb_stream_realloc(void* ctx, hova_stream_type_et type, void** buffer,
                                     int size) {
    HostCallbacks* h = self(ctx);
    Pending& p = h->slot(type);
    if (h->refuse_stream_realloc || size < 0 || !p.open) {
        if (!p.open) h->protocol_error("stream_realloc without a pending frame");
        *buffer = nullptr;
        return -1;
    }
    const size_t want = static_cast<size_t>(size);
    if (want > p.capacity) {
        // Grow by moving, as a stream buffer does when the frame would pass
        // its end; the content is kept.
        size_t cap = std::max(want, p.capacity * 2);
        auto* fresh = static_cast<uint8_t*>(std::malloc(cap));
        ASAN_UNPOISON_MEMORY_REGION(p.base, p.capacity);
        std::memcpy(fresh, p.base, static_cast<size_t>(p.size));
        std::free(p.base);
        p.base = fresh;
        p.capacity = cap;
        h->stream_copies_++;
    }
    expose(p.base, p.capacity, want);
    p.size = size;
    *buffer = p.base;
    return 0;
}

int HostCallbacks::cb_stream_discard(void* ctx, hova_stream_type_et type) {
    HostCallbacks* h = self(ctx);
    Pending& p = h->slot(type);
    if (!p.open) h->protocol_error("stream_discard without a pending frame");
    p.open = false;
    p.size = 0;
    if (p.base) ASAN_POISON_MEMORY_REGION(p.base, p.capacity);
    HostEvent e;
    e.kind = EventKind::Discard;
    e.type = type;
    e.call = h->call;
    h->events_.push_back(std::move(e));
    return 0;
}

int HostCallbacks::cb_stream_commit(void* ctx, hova_stream_type_et type, int size, int64_t pts,
                                    int64_t duration, int packet_type) {
    HostCallbacks* h = self(ctx);
    Pending& p = h->slot(type);
    if (!p.open) {
        h->protocol_error("stream_commit without a pending frame");
        return -1;
    }
    if (size < 0 || size > p.size) {
        h->protocol_error("stream_commit larger than the pending frame");
        size = std::clamp(size, 0, p.size);
    }
    HostEvent e;
    e.kind = EventKind::Commit;
    e.type = type;
    e.size = size;
    e.pts = pts;
    e.duration = duration;
    e.packet_type = packet_type;
    e.call = h->call;
    e.crc32 = static_cast<uint32_t>(crc32_z(0L, p.base, static_cast<size_t>(size)));
    if (h->keep_bytes) e.bytes.assign(p.base, p.base + size);
    if (h->on_commit) h->on_commit(e, p.base);
    h->events_.push_back(std::move(e));
    p.open = false;
    p.size = 0;
    ASAN_POISON_MEMORY_REGION(p.base, p.capacity);
    return 0;
}

int HostCallbacks::cb_stream_check_rbuf_size(void* ctx, hova_stream_type_et) {
    (void)ctx;
    return 0;
}

}  // namespace host
