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

// No buffer, file cache, ring read by the caller's thread, ring filled by the
// streaming thread; an elementary-stream input (unbuffered).
enum class Mode { None, Cache, SyncRing, Thread, Es };

struct Reader {
    Reader(Bytes bytes, Mode m, int block_size, int ring_size)
        : data(std::move(bytes)), mode(m), ring_size(ring_size) {
        host::InputOptions o;
        o.block_size = block_size;
        o.ring_size = ring_size;
        o.disable_cache = m == Mode::None || m == Mode::Es;
        o.rbuf_mode = m == Mode::Es ? CBIO_APPLY_ES_BUF : ringed() ? CBIO_APPLY_RBUF : CBIO_NO_RBUF;
        o.use_thread = m == Mode::Thread;
        in = host::RawInput::borrow_memory(data.data(), data.size(), o);
    }
    ~Reader() {
        close();
        EXPECT_EQ(host.outstanding_blocks(), 0u);
    }
    bool ringed() const { return mode == Mode::SyncRing || mode == Mode::Thread; }
    int open() {
        const int r = OpenURL(&cb, in->io(), ring_size, host.table());
        is_open = r == 0;
        return r;
    }
    void close() {
        if (is_open) CloseURL(&cb, host.table());
        is_open = false;
    }
    cb_off_t seek(cb_off_t off, int whence) { return cb.cb_seek64(&cb, off, whence); }
    // Reads (or peeks) n bytes and returns what came.
    Bytes take(int32_t n, bool peeking = false) {
        Bytes v(static_cast<size_t>(n));
        const int32_t got = (peeking ? cb.cb_peek : cb.cb_read)(&cb, v.data(), n);
        v.resize(static_cast<size_t>(std::max(got, 0)));
        return v;
    }
    // What the file holds at pos: at most n bytes.
    Bytes slice(uint64_t pos, size_t n) const {
        pos = std::min<uint64_t>(pos, data.size());
        n = std::min<size_t>(n, data.size() - pos);
        return {data.begin() + static_cast<long>(pos), data.begin() + static_cast<long>(pos + n)};
    }

    Bytes data;
    Mode mode;
    int ring_size;
    cb_buffer_st cb{};
    host::HostCallbacks host;
    std::unique_ptr<host::RawInput> in;
    bool is_open = false;
};

}  // namespace readertest
