// A reader opened over the reference host's raw input, closed and checked
// for leaked host blocks at the end of every test.
#pragma once

#include <gtest/gtest.h>

#include <array>
#include <cstdint>
#include <memory>
#include <random>
#include <vector>

#include "callbacks.h"
#include "raw_input.h"
#include "streaming.h"

namespace readertest {

// Bytes that tell their own position apart: no two nearby positions agree.
inline std::vector<uint8_t> pattern(size_t n, uint32_t seed = 1) {
    std::vector<uint8_t> v(n);
    std::mt19937 rng(seed);
    for (auto& b : v) b = static_cast<uint8_t>(rng());
    return v;
}

enum class Mode { None, Cache, SyncRing, Thread };

inline const char* mode_name(Mode m) {
    return std::array{"none", "cache", "sync-ring", "thread"}[static_cast<size_t>(m)];
}

inline host::InputOptions options_for(Mode m, int block_size, int ring_size) {
    host::InputOptions o;
    o.block_size = block_size;
    o.ring_size = ring_size;
    o.disable_cache = m == Mode::None;
    o.rbuf_mode = (m == Mode::SyncRing || m == Mode::Thread) ? CBIO_APPLY_RBUF : CBIO_NO_RBUF;
    o.use_thread = m == Mode::Thread;
    return o;
}

class Reader {
public:
    Reader(std::vector<uint8_t> data, const host::InputOptions& o)
        : data_(std::move(data)),
          in_(host::RawInput::borrow_memory(data_.data(), data_.size(), o)),
          ring_size_(o.ring_size) {}
    ~Reader() {
        close();
        EXPECT_EQ(host_.outstanding_blocks(), 0u);
    }
    // Opens; for SyncRing switches the ring reader to the caller's thread.
    int open(Mode m = Mode::Cache) {
        const int r = OpenURL(&cb_, in_->io(), ring_size_, host_.table());
        if (r == 0) {
            open_ = true;
            if (m == Mode::SyncRing) changeThreadType(&cb_, 0);
        }
        return r;
    }
    void close() {
        if (open_) CloseURL(&cb_, host_.table());
        open_ = false;
    }
    int32_t read(uint8_t* dst, int32_t n) { return cb_.cb_read(&cb_, dst, n); }
    int32_t peek(uint8_t* dst, int32_t n) { return cb_.cb_peek(&cb_, dst, n); }
    cb_off_t seek(cb_off_t off, int whence) { return cb_.cb_seek64(&cb_, off, whence); }
    std::vector<uint8_t> read_vec(int32_t n) {
        std::vector<uint8_t> v(static_cast<size_t>(n));
        v.resize(static_cast<size_t>(read(v.data(), n)));
        return v;
    }
    std::vector<uint8_t> slice(size_t pos, size_t n) const {
        if (pos >= data_.size()) return {};
        n = std::min(n, data_.size() - pos);
        return {data_.begin() + static_cast<long>(pos), data_.begin() + static_cast<long>(pos + n)};
    }

    cb_buffer_st cb_{};
    host::HostCallbacks host_;
    std::vector<uint8_t> data_;
    std::unique_ptr<host::RawInput> in_;
    int ring_size_;
    bool open_ = false;
};

}  // namespace readertest
