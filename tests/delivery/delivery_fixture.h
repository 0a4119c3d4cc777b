// Plays a built file through the reference host, the way the framework
// drives the descriptor, and keeps what the host saw. Faults are armed on
// `host` (memory), `input().faults()` (the input) or by refusing the Nth
// frame buffer.
#pragma once

#include <gtest/gtest.h>
#include <zlib.h>

#include <algorithm>
#include <memory>
#include <vector>

#include "asf_api.h"
#include "asf_demuxer.h"
#include "asf_packets.h"
#include "callbacks.h"
#include "loader.h"
#include "raw_input.h"

namespace delivery {

using asfb::Bytes;
using host::EventKind;

class Player {
public:
    explicit Player(Bytes file, const host::InputOptions& in = {}, int ring_size = 1 << 20)
        : input_(host::RawInput::from_memory(std::move(file), in)),
          buffer_(size_t(hova_asff_demuxer.min_context_size), 0), ring_size_(ring_size) {
        table_ = *host.table(), table_.stream_alloc = &shim<0>, table_.stream_realloc = &shim<1>;
        current_ = this;
    }
    ~Player() {
        close();
        if (current_ == this) current_ = nullptr;
    }
    // The Nth stream_alloc (1: stream_realloc) from now on is refused (0: none).
    void refuse_at(int realloc, uint64_t n) { refuse_at_[realloc] = n ? calls[realloc] + n : 0; }
    uint64_t calls[2] = {0, 0};  // stream_alloc, stream_realloc

    int open() {
        const int rc = hova_asff_demuxer.open_file(&ctx_, input_->io(), buffer_.data(),
                                                   buffer_.size(), ring_size_, &table_);
        open_ = rc == HOVA_OK;
        return rc;
    }
    void open_or_fail() { ASSERT_EQ(open(), HOVA_OK); }
    int step() {  // one get_data call
        hova_stream_type_et type = HOVA_STREAM_NONE;
        int size = -7;
        int64_t pts = -7;
        host.call++;
        return results.emplace_back(hova_asff_demuxer.get_data(ctx_, &type, &size, &pts));
    }
    // Calls get_data until it reports something other than OK or TryAgain.
    int play(size_t max_calls = 100000) {
        for (size_t i = 0; i < max_calls; ++i)
            if (const int rc = step(); rc != HOVA_OK && rc != HOVA_TryAgain) return rc;
        return -1;
    }
    int close() { return open_ ? (open_ = false, hova_asff_demuxer.close_file(ctx_)) : HOVA_OK; }
    // Every test ends here: closed, nothing held by the plug-in, no misuse.
    void expect_clean_close() {
        EXPECT_EQ(close(), HOVA_OK);
        EXPECT_EQ(host.outstanding_blocks(), 0u);
        EXPECT_EQ(host.protocol_errors(), 0u);
        EXPECT_EQ(host.foreign_frees(), 0u);
    }
    size_t count(int rc) const { return size_t(std::count(results.begin(), results.end(), rc)); }
    asf_demuxer_st* ctx() { return static_cast<asf_demuxer_st*>(ctx_); }
    host::RawInput& input() { return *input_; }
    std::vector<host::HostEvent> frames(hova_stream_type_et t) const { return host.commits(t, 0); }
    std::vector<host::HostEvent> configs(hova_stream_type_et t) const { return host.commits(t, 1); }
    size_t of_kind(EventKind k) {
        return size_t(std::count_if(host.events().begin(), host.events().end(),
                                    [k](const host::HostEvent& e) { return e.kind == k; }));
    }

    host::HostCallbacks host;
    std::vector<int> results;

private:
    static inline Player* current_ = nullptr;  // the one whose frame buffers are asked for
    template <int Realloc>
    static int shim(void* c, hova_stream_type_et t, void** buffer, int size) {
        Player* p = current_;
        if (++p->calls[Realloc] == p->refuse_at_[Realloc]) return *buffer = nullptr, -1;
        const hova_callback_st* h = p->host.table();
        return (Realloc ? h->stream_realloc : h->stream_alloc)(c, t, buffer, size);
    }
    hova_callback_st table_{};
    uint64_t refuse_at_[2] = {0, 0};
    std::unique_ptr<host::RawInput> input_;
    host::ContextBuffer buffer_;
    int ring_size_;
    void* ctx_ = nullptr;
    bool open_ = false;
};

inline uint32_t crc(const Bytes& b) { return uint32_t(crc32_z(0, b.data(), b.size())); }

}  // namespace delivery
