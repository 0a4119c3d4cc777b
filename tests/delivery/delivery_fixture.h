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
    // The Nth stream_alloc (stream_realloc) from now on is refused (0: none).
    void refuse_alloc_at(uint64_t n) { refuse_at_[0] = n ? alloc_calls + n : 0; }
    void refuse_realloc_at(uint64_t n) { refuse_at_[1] = n ? realloc_calls + n : 0; }
    uint64_t alloc_calls = 0, realloc_calls = 0;

    int open() {
        const int rc = hova_asff_demuxer.open_file(&ctx_, input_->io(), buffer_.data(),
                                                   buffer_.size(), ring_size_, &table_);
        open_ = rc == HOVA_OK;
        return rc;
    }
    void open_or_fail() { ASSERT_EQ(open(), HOVA_OK); }
    // One get_data call; `last_type` as the plug-in left it (NONE when untouched).
    int step() {
        host.call++, last_type = HOVA_STREAM_NONE;
        int bufsize = -7;
        int64_t pts = -7;
        results.push_back(hova_asff_demuxer.get_data(ctx_, &last_type, &bufsize, &pts));
        return results.back();
    }
    // Calls get_data until it reports something other than OK or TryAgain.
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
        EXPECT_EQ(host.protocol_errors(), 0u);
        EXPECT_EQ(host.foreign_frees(), 0u);
    }
    size_t count(int result) const {
        return size_t(std::count(results.begin(), results.end(), result));
    }
    asf_demuxer_st* ctx() { return static_cast<asf_demuxer_st*>(ctx_); }
    host::RawInput& input() { return *input_; }
    std::vector<host::HostEvent> frames(hova_stream_type_et t) const { return host.commits(t, 0); }
    std::vector<host::HostEvent> configs(hova_stream_type_et t) const { return host.commits(t, 1); }
    size_t of_kind(EventKind k) {
        return size_t(std::count_if(host.events().begin(), host.events().end(),
                                    [k](const host::HostEvent& e) { return e.kind == k; }));
    }

    host::HostCallbacks host;
    hova_stream_type_et last_type = HOVA_STREAM_NONE;
    std::vector<int> results;

private:
    static inline Player* current_ = nullptr;  // the one whose frame buffers are asked for
    template <int Realloc>
    static int shim(void* c, hova_stream_type_et t, void** buffer, int size) {
        Player* p = current_;
        if (++(Realloc ? p->realloc_calls : p->alloc_calls) == p->refuse_at_[Realloc])
            return *buffer = nullptr, -1;
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

// A file of one audio stream (1) and one video stream (2) around `packets`.
inline Bytes av_file(std::vector<Bytes> packets, uint32_t packet_size = 1024,
                     uint64_t preroll_ms = 0) {
    asfb::PacketFile f;
    f.packet_size = packet_size, f.preroll_ms = preroll_ms, f.packets = std::move(packets);
    return asfb::build_packet_file(f);
}

inline uint32_t crc(const Bytes& b) { return uint32_t(crc32_z(0, b.data(), b.size())); }

// Audio (stream 1) at a + 40k ms, video (2) at v + 40k ms, alternating in the file.
inline std::vector<asfb::Object> skewed(uint32_t n, uint32_t a, uint32_t v,
                                        uint32_t vsize = 700) {
    std::vector<asfb::Object> objs;
    for (uint32_t k = 0; k < n; ++k) {
        objs.push_back({1, a + 40 * k, asfb::pattern(150 + k % 13, k)});
        objs.push_back({2, v + 40 * k, asfb::pattern(vsize + 37 * (k % 7), 1000 + k), k % 10 == 0});
    }
    return objs;
}

// A frame the host must receive: stream 1 audio, 2 video; time in microseconds.
struct Want { uint8_t stream; int64_t pts; Bytes data; };
// Each stream's objects but its last (which stays pending at the end), shifted by `ms`.
inline std::vector<Want> all_but_last(const std::vector<asfb::Object>& objs, int64_t ms = 0) {
    std::vector<Want> out;
    for (uint8_t s : {1, 2}) {
        std::vector<Want> own;
        for (const auto& o : objs)
            if (o.stream == s) own.push_back({s, (int64_t(o.pts_ms) - ms) * 1000, o.data});
        if (!own.empty()) out.insert(out.end(), own.begin(), own.end() - 1);
    }
    return out;
}
// The frames of each stream are exactly `want`'s, in order.
inline void expect_frames(const Player& pl, const std::vector<Want>& want) {
    for (uint8_t s : {1, 2}) {
        std::vector<const Want*> own;
        for (const Want& w : want)
            if (w.stream == s) own.push_back(&w);
        const auto got = pl.frames(s == 1 ? HOVA_STREAM_AUDIO : HOVA_STREAM_VIDEO);
        ASSERT_EQ(got.size(), own.size()) << "stream " << int(s);
        for (size_t i = 0; i < got.size(); ++i) {
            SCOPED_TRACE(testing::Message() << "stream " << int(s) << " frame " << i);
            EXPECT_EQ(got[i].pts, own[i]->pts);
            EXPECT_EQ(got[i].size, int(own[i]->data.size()));
            EXPECT_EQ(got[i].crc32, crc(own[i]->data));
        }
    }
}

}  // namespace delivery
