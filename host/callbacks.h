// The host side of the callback table: accounted memory with fault injection,
// one pending frame per stream type growing in place, a record of every
// commit, discard and notification, and a clock the caller controls.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <string>
#include <vector>

#include "hova_dmx.h"

namespace host {

enum class EventKind { Commit, Discard, Notify };

struct HostEvent {
    EventKind kind = EventKind::Commit;
    hova_stream_type_et type = HOVA_STREAM_NONE;
    int size = 0;             // committed bytes
    int64_t pts = 0;
    int64_t duration = 0;
    int packet_type = 0;      // 0 media frame, 1 configuration record
    uint32_t crc32 = 0;       // zlib CRC-32 of the committed bytes
    hova_event_et event = HOVA_EVENT_EOS;  // for Notify
    uint64_t call = 0;        // value of `call` when it happened
    std::vector<uint8_t> bytes;  // kept only when keep_bytes is set
};

class HostCallbacks {
public:
    HostCallbacks();
    ~HostCallbacks();
    HostCallbacks(const HostCallbacks&) = delete;
    HostCallbacks& operator=(const HostCallbacks&) = delete;

    const hova_callback_st* table() const { return &table_; }

    // ---- memory ----
    size_t outstanding_blocks() const { return blocks_.size(); }
    size_t outstanding_bytes() const;
    uint64_t malloc_calls() const { return malloc_calls_; }
    // Fail the Nth malloc call from now on (1 = the next one); 0 disables.
    void fail_malloc_at(uint64_t n) { fail_malloc_at_ = n ? malloc_calls_ + n : 0; }
    // Frees of pointers the host never handed out (a plug-in fault).
    uint64_t foreign_frees() const { return foreign_frees_; }

    // ---- frame buffers ----
    bool refuse_stream_alloc = false;      // stream_alloc fails (address null)
    bool refuse_stream_realloc = false;
    bool keep_bytes = false;               // keep committed bytes in the events
    // Called for each commit with the committed bytes (for --dump-streams).
    std::function<void(const HostEvent&, const uint8_t*)> on_commit;
    bool pending(hova_stream_type_et type) const;
    int pending_size(hova_stream_type_et type) const;
    uint64_t stream_copies() const { return stream_copies_; }  // moves on realloc
    uint64_t protocol_errors() const { return protocol_errors_; }
    const std::vector<std::string>& protocol_error_log() const { return protocol_log_; }

    // ---- record ----
    std::vector<HostEvent>& events() { return events_; }
    uint64_t call = 0;                     // set by the driver before each get_data
    std::vector<HostEvent> commits(hova_stream_type_et type, int packet_type = 0) const;

    // ---- clock ----
    int64_t now_us = 0;
    int64_t clock_step_us = 0;             // added after each get_time

    // notify result
    int notify_result = 0;

private:
    struct Pending {
        uint8_t* base = nullptr;
        size_t capacity = 0;
        int size = 0;
        bool open = false;
    };
    Pending& slot(hova_stream_type_et type);
    const Pending* find_slot(hova_stream_type_et type) const;
    void protocol_error(const std::string& what);

    static int cb_notify(void* ctx, hova_stream_type_et type, hova_event_et event);
    static void* cb_malloc(void* ctx, size_t size);
    static void* cb_realloc(void* ctx, void* ptr, size_t size);
    static void cb_freep(void* ctx, void* pptr);
    static int64_t cb_get_time(void* ctx);
    static int cb_stream_alloc(void* ctx, hova_stream_type_et type, void** buffer, int size);
    static int cb_stream_discard(void* ctx, hova_stream_type_et type);
    static int cb_stream_commit(void* ctx, hova_stream_type_et type, int size, int64_t pts,
                                int64_t duration, int packet_type);
    static int cb_stream_realloc(void* ctx, hova_stream_type_et type, void** buffer, int size);
    static int cb_stream_check_rbuf_size(void* ctx, hova_stream_type_et type);

    hova_callback_st table_{};
    std::map<void*, size_t> blocks_;
    uint64_t malloc_calls_ = 0;
    uint64_t fail_malloc_at_ = 0;
    uint64_t foreign_frees_ = 0;
    std::map<int, Pending> pending_;
    uint64_t stream_copies_ = 0;
    uint64_t protocol_errors_ = 0;
    std::vector<std::string> protocol_log_;
    std::vector<HostEvent> events_;
};

}  // namespace host
