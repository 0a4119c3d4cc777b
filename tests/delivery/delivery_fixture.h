// Plays a built file through the reference host, the way the framework
// drives the descriptor, and keeps what the host saw.
#pragma once

#include <gtest/gtest.h>
#include <zlib.h>

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
using host::HostEvent;

class Player {
public:
    explicit Player(Bytes file, const host::InputOptions& in = {}, int ring_size = 1 << 20)
        : input_(host::RawInput::from_memory(std::move(file), in)),
          buffer_(static_cast<size_t>(hova_asff_demuxer.min_context_size), 0),
          ring_size_(ring_size) {
        table_ = *host.table();
        host_alloc_ = table_.stream_alloc;
        table_.stream_alloc = &counted_alloc;
        current() = this;
    }
    ~Player() {
        close();
        if (current() == this) current() = nullptr;
    }

    // The Nth stream_alloc from now on is refused (0: none).
    void refuse_alloc_at(uint64_t n) { refuse_at_ = n ? alloc_calls + n : 0; }
    uint64_t alloc_calls = 0;

    int open() {
        const int rc = hova_asff_demuxer.open_file(&ctx_, input_->io(), buffer_.data(),
                                                   buffer_.size(), ring_size_, &table_);
        open_ = rc == HOVA_OK;
        return rc;
    }
    void open_or_fail() { ASSERT_EQ(open(), HOVA_OK); }

    // One get_data call; `type` as the plug-in left it (NONE when untouched).
    int step() {
        host.call++;
        last_type = HOVA_STREAM_NONE;
        int bufsize = -7;
        int64_t pts = -7;
        const int rc = hova_asff_demuxer.get_data(ctx_, &last_type, &bufsize, &pts);
        results.push_back(rc);
        return rc;
    }
    // Calls get_data until it reports the end (or something other than OK or
    // TryAgain); returns that last result.
    int play(size_t max_calls = 100000) {
        for (size_t i = 0; i < max_calls; ++i) {
            const int rc = step();
            if (rc != HOVA_OK && rc != HOVA_TryAgain) return rc;
        }
        return -1;
    }
    int close() {
        if (!open_) return HOVA_OK;
        open_ = false;
        return hova_asff_demuxer.close_file(ctx_);
    }
    // Every test ends here: closed, nothing held by the plug-in, no misuse.
    void expect_clean_close() {
        EXPECT_EQ(close(), HOVA_OK);
        EXPECT_EQ(host.outstanding_blocks(), 0u);
        EXPECT_EQ(host.protocol_errors(), 0u) << (host.protocol_error_log().empty()
                                                      ? ""
                                                      : host.protocol_error_log().front());
    }

    asf_demuxer_st* ctx() { return static_cast<asf_demuxer_st*>(ctx_); }
    host::RawInput& input() { return *input_; }
    std::vector<HostEvent> frames(hova_stream_type_et type) const { return host.commits(type, 0); }
    std::vector<HostEvent> configs(hova_stream_type_et type) const { return host.commits(type, 1); }
    std::vector<HostEvent> of_kind(EventKind k) const {
        std::vector<HostEvent> out;
        for (const HostEvent& e : const_cast<host::HostCallbacks&>(host).events())
            if (e.kind == k) out.push_back(e);
        return out;
    }

    host::HostCallbacks host;
    hova_stream_type_et last_type = HOVA_STREAM_NONE;
    std::vector<int> results;

private:
    static Player*& current() {
        static Player* p = nullptr;
        return p;
    }
    static int counted_alloc(void* ctx, hova_stream_type_et type, void** buffer, int size) {
        Player* self = current();
        if (++self->alloc_calls == self->refuse_at_) {
            *buffer = nullptr;
            return -1;
        }
        return self->host_alloc_(ctx, type, buffer, size);
    }

    hova_callback_st table_{};
    int (*host_alloc_)(void*, hova_stream_type_et, void**, int) = nullptr;
    uint64_t refuse_at_ = 0;
    std::unique_ptr<host::RawInput> input_;
    host::ContextBuffer buffer_;
    int ring_size_;
    void* ctx_ = nullptr;
    bool open_ = false;
};

// A file of one audio stream (1) and one video stream (2) around `packets`.
inline Bytes av_file(std::vector<Bytes> packets, uint32_t packet_size = 1024,
                     uint64_t preroll_ms = 0) {
    asfb::PacketFile f;
    f.packet_size = packet_size;
    f.preroll_ms = preroll_ms;
    f.packets = std::move(packets);
    return asfb::build_packet_file(f);
}

inline uint32_t crc(const Bytes& b) { return static_cast<uint32_t>(crc32_z(0, b.data(), b.size())); }

inline Bytes concat(std::initializer_list<Bytes> parts) {
    Bytes out;
    for (const Bytes& p : parts) out.insert(out.end(), p.begin(), p.end());
    return out;
}

}  // namespace delivery
