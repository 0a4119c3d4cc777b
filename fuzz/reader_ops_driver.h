// The buffered reader alone under random sequences of operations: reads,
// peeks, 32- and 64-bit seeks from every origin, size queries, cache resets,
// buffering switched off and on, in every buffering mode (with the streaming
// thread too). Whatever a read or peek returns must be the input's own bytes
// at the reader's position, a peek must not move it, no call may run over a
// second, and close must leave the host holding nothing.
//
// Input: byte 0 mode, byte 1 number of operations (3 bytes each: op, 16-bit
// argument), the operations, then the input's bytes.
//   mode bits 0-1 buffering (cache, none, ring, ring + thread), bit 2 not
//   seekable, bit 3 streaming, bits 4-5 block size (32768, 4096, 512, 64),
//   bit 6 small ring (4 KiB), bit 7 short reads (at most 100 bytes).
#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "callbacks.h"
#include "raw_input.h"
#include "streaming.h"

namespace readerfuzz {

constexpr auto kHangLimit = std::chrono::milliseconds(1000);

[[noreturn]] inline void fail(const char* what, long a = 0, long b = 0) {
    std::fprintf(stderr, "reader fuzz: %s (%ld, %ld)\n", what, a, b);
    std::abort();
}

struct Timer {
    const char* name;
    std::chrono::steady_clock::time_point t0 = std::chrono::steady_clock::now();
    ~Timer() {
        const auto spent = std::chrono::steady_clock::now() - t0;
        if (spent > kHangLimit)
            fail(name, static_cast<long>(
                           std::chrono::duration_cast<std::chrono::milliseconds>(spent).count()));
    }
};

inline host::InputOptions options_for(uint8_t m) {
    host::InputOptions o;
    switch (m & 3) {
        case 0: break;
        case 1: o.disable_cache = true; break;
        case 2: o.rbuf_mode = CBIO_APPLY_RBUF; break;
        default:
            o.rbuf_mode = CBIO_APPLY_RBUF;
            o.use_thread = true;
            break;
    }
    o.seekable = (m & 4) == 0;
    o.streaming = (m & 8) != 0;
    static constexpr int kBlock[] = {32768, 4096, 512, 64};
    o.block_size = kBlock[(m >> 4) & 3];
    o.ring_size = (m & 0x40) ? 4096 : 65536;
    return o;
}

// The bytes a read at `pos` returned must be the input's.
inline void check_bytes(const uint8_t* file, size_t size, cb_fpos pos, const uint8_t* got, int32_t n,
                 const char* what) {
    if (n <= 0) return;
    if (pos > size || static_cast<uint64_t>(n) > size - pos) fail(what, static_cast<long>(pos), n);
    if (std::memcmp(file + pos, got, static_cast<size_t>(n)) != 0) fail(what, static_cast<long>(pos), n);
}

inline int ops_input(const uint8_t* data, size_t size) {
    if (size < 2 || size > (1u << 20)) return 0;
    const uint8_t m = data[0];
    const size_t nops = data[1] % 64;
    if (size < 2 + 3 * nops) return 0;
    const uint8_t* ops = data + 2;
    const uint8_t* file = ops + 3 * nops;
    const size_t file_size = size - 2 - 3 * nops;

    const host::InputOptions o = options_for(m);
    host::HostCallbacks host;
    auto input = host::RawInput::borrow_memory(file, file_size, o);
    if (m & 0x80) input->faults().max_read = 100;
    cb_buffer_st r{};
    int orc;
    {
        Timer t{"OpenURL"};
        orc = OpenURL(&r, input->io(), o.ring_size, host.table());
    }
    if (orc != 0) {
        if (host.outstanding_blocks() != 0) fail("blocks held after a failed open");
        return 0;
    }

    std::vector<uint8_t> buf(70000);
    // A search's probes (reads, peeks and seeks only) run between a begin
    // and an end; anything else ends them first.
    cb_probe_st probes{};
    auto end_probes = [&] {
        cb_end_probes(&r, &probes);
        probes.active = 0;
    };
    for (size_t i = 0; i < nops; ++i) {
        const uint8_t op = ops[3 * i];
        const int arg = ops[3 * i + 1] | (ops[3 * i + 2] << 8);
        const int whence = (op >> 4) % 3;
        if ((op & 7) >= 4 && !((op & 7) == 7 && (arg & 2))) end_probes();
        const cb_fpos before = cb_tell64(&r);
        switch (op & 7) {
            case 0: {
                Timer t{"cb_read"};
                const int32_t n = r.cb_read(&r, buf.data(), arg);
                if (n > arg) fail("read returned more than asked", n, arg);
                check_bytes(file, file_size, before, buf.data(), n, "read returned other bytes");
                if (n > 0 && cb_tell64(&r) != before + static_cast<cb_fpos>(n))
                    fail("read moved the position by another amount", n, static_cast<long>(cb_tell64(&r) - before));
                break;
            }
            case 1: {
                Timer t{"cb_peek"};
                const int n = arg & 0x3fff;
                const int32_t got = r.cb_peek(&r, buf.data(), n);
                if (got > n) fail("peek returned more than asked", got, n);
                check_bytes(file, file_size, before, buf.data(), got, "peek returned other bytes");
                if (cb_tell64(&r) != before) fail("peek moved the position");
                break;
            }
            case 2: {
                Timer t{"cb_seek"};
                const int32_t off = whence == 0 ? arg * 7 : (arg - 32768) * 3;
                r.cb_seek(&r, off, whence);
                break;
            }
            case 3: {
                Timer t{"cb_seek64"};
                const cb_off_t off = whence == 0 ? static_cast<cb_off_t>(arg) * 31
                                                 : static_cast<cb_off_t>(arg - 32768) * 17;
                r.cb_seek64(&r, off, whence);
                break;
            }
            case 4: {
                Timer t{"cb_get_file_size"};
                (void)cb_get_file_size(&r);
                break;
            }
            case 5: {
                Timer t{"cb_reset_cache"};
                cb_reset_cache(&r);
                break;
            }
            case 6: {
                Timer t{"cb_set_buffer_mode"};
                (void)cb_set_buffer_mode(&r, arg & 1);
                break;
            }
            default: {
                Timer t{"cb_status"};
                (void)cb_status(&r);
                (void)cb_tell(&r);
                if (arg & 2 && !probes.active) (void)cb_begin_probes(&r, &probes);
                break;
            }
        }
    }
    end_probes();
    {
        Timer t{"CloseURL"};
        CloseURL(&r, host.table());
    }
    if (host.outstanding_blocks() != 0) fail("blocks held after close", static_cast<long>(host.outstanding_blocks()));
    if (host.foreign_frees() != 0) fail("freed blocks the host never gave");
    return 0;
}

}  // namespace readerfuzz
