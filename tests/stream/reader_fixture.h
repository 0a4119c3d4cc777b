// A reader opened over the reference host's raw input (a patterned file in
// memory), closed and checked for leaked host blocks at the end of every test.
#pragma once

#include <gtest/gtest.h>

#include <memory>
#include <random>
#include <vector>

#include "callbacks.h"
#include "raw_input.h"
#include "streaming.h"

namespace readertest {

using Bytes = std::vector<uint8_t>;

// Bytes that tell their own position apart: no two nearby positions agree.
inline Bytes pattern(size_t n, uint32_t seed = 1) {
    Bytes v(n);
    std::mt19937 rng(seed);
    for (auto& b : v) b = static_cast<uint8_t>(rng());
    return v;
}

enum class Mode { None, Cache, SyncRing, Thread };

inline host::InputOptions options_for(Mode m, int block_size, int ring_size) {
    host::InputOptions o;
    o.block_size = block_size;
    o.ring_size = ring_size;
    o.disable_cache = m == Mode::None;
    o.rbuf_mode = (m == Mode::SyncRing || m == Mode::Thread) ? CBIO_APPLY_RBUF : CBIO_NO_RBUF;
    o.use_thread = m == Mode::Thread;
    return o;
}

struct Reader {
    Reader(Bytes bytes, const host::InputOptions& o)
        : data(std::move(bytes)),
          in(host::RawInput::borrow_memory(data.data(), data.size(), o)),
          ring_size(o.ring_size) {}
    ~Reader() {
        close();
        EXPECT_EQ(host.outstanding_blocks(), 0u);
    }
    // Opens; SyncRing then hands the ring to the caller's thread.
    int open(Mode m = Mode::Cache) {
        const int r = OpenURL(&cb, in->io(), ring_size, host.table());
        is_open = r == 0;
        if (is_open && m == Mode::SyncRing) changeThreadType(&cb, 0);
        return r;
    }
    void close() {
        if (is_open) CloseURL(&cb, host.table());
        is_open = false;
    }
    int32_t read(uint8_t* dst, int32_t n) { return cb.cb_read(&cb, dst, n); }
    int32_t peek(uint8_t* dst, int32_t n) { return cb.cb_peek(&cb, dst, n); }
    cb_off_t seek(cb_off_t off, int whence) { return cb.cb_seek64(&cb, off, whence); }
    // Reads (or peeks) n bytes and returns what came.
    Bytes take(int32_t n, bool peeking = false) {
        Bytes v(static_cast<size_t>(n));
        const int32_t got = peeking ? peek(v.data(), n) : read(v.data(), n);
        v.resize(static_cast<size_t>(std::max(got, 0)));
        return v;
    }
    // What the file holds at pos: at most n bytes.
    Bytes slice(uint64_t pos, size_t n) const {
        if (pos >= data.size()) return {};
        n = std::min<size_t>(n, data.size() - pos);
        return {data.begin() + static_cast<long>(pos), data.begin() + static_cast<long>(pos + n)};
    }

    cb_buffer_st cb{};
    host::HostCallbacks host;
    Bytes data;
    std::unique_ptr<host::RawInput> in;
    int ring_size;
    bool is_open = false;
};

}  // namespace readertest
