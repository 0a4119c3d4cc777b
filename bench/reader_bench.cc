// Sequential read throughput of the buffered reader in each buffering mode,
// over a 256 MiB input held in memory, beside a plain memcpy of the same
// bytes in the same pieces (the floor). Prints one line per measurement:
// MB/s, input calls per MB, the memcpy figure and the ratio.
#include <chrono>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <random>
#include <vector>

#include "callbacks.h"
#include "raw_input.h"
#include "streaming.h"

namespace {

using Clock = std::chrono::steady_clock;
constexpr size_t kInput = 256u << 20;
constexpr uint64_t kMaxCalls = 16u << 20;  // keeps the 1-byte runs short

enum class Mode { None, Cache, SyncRing, Thread };
const char* name(Mode m) {
    switch (m) {
        case Mode::None: return "none";
        case Mode::Cache: return "cache";
        case Mode::SyncRing: return "sync-ring";
        case Mode::Thread: return "thread";
    }
    return "?";
}

double mb(uint64_t bytes) { return static_cast<double>(bytes) / 1e6; }

double memcpy_mbps(const uint8_t* src, size_t total, size_t piece, uint8_t* dst) {
    const auto t0 = Clock::now();
    for (size_t pos = 0; pos < total; pos += piece) {
        const size_t n = std::min(piece, total - pos);
        std::memcpy(dst, src + pos, n);
        asm volatile("" : : "r"(dst) : "memory");
    }
    return mb(total) / std::chrono::duration<double>(Clock::now() - t0).count();
}

struct Result {
    double mbps = 0;
    double calls_per_mb = 0;
    bool ok = false;
};

Result run_reader(Mode m, const std::vector<uint8_t>& data, size_t total, int32_t piece,
                  uint8_t* dst) {
    host::InputOptions o;
    o.block_size = 32768;
    o.ring_size = 1 << 20;
    o.disable_cache = m == Mode::None;
    o.rbuf_mode = (m == Mode::SyncRing || m == Mode::Thread) ? CBIO_APPLY_RBUF : CBIO_NO_RBUF;
    o.use_thread = m == Mode::Thread;
    auto in = host::RawInput::borrow_memory(data.data(), data.size(), o);
    host::HostCallbacks host;
    cb_buffer_st cb{};
    Result r;
    const auto t0 = Clock::now();
    if (OpenURL(&cb, in->io(), o.ring_size, host.table()) != 0) return r;
    if (m == Mode::SyncRing) changeThreadType(&cb, 0);
    size_t done = 0;
    while (done < total) {
        const int32_t want = static_cast<int32_t>(std::min<size_t>(piece, total - done));
        const int32_t got = cb.cb_read(&cb, dst, want);
        if (got != want) break;
        done += static_cast<size_t>(got);
    }
    const double secs = std::chrono::duration<double>(Clock::now() - t0).count();
    CloseURL(&cb, host.table());
    // The last piece must match what was read from the input.
    const size_t tail = total % static_cast<size_t>(piece) ? total % static_cast<size_t>(piece)
                                                           : static_cast<size_t>(piece);
    r.ok = done == total && std::memcmp(dst, data.data() + done - tail, tail) == 0;
    r.mbps = mb(done) / secs;
    r.calls_per_mb = static_cast<double>(in->counters().reads) / mb(done);
    return r;
}

}  // namespace

int main() {
    std::vector<uint8_t> data(kInput);
    std::mt19937_64 rng(1);
    for (size_t i = 0; i < kInput; i += 8) {
        const uint64_t v = rng();
        std::memcpy(&data[i], &v, 8);
    }
    std::vector<uint8_t> dst(65536);
    std::printf("reader_bench: sequential reads, block 32768, ring 1 MiB, input %zu MiB in memory\n",
                kInput >> 20);
    for (int32_t piece : {1, 4, 17, 3200, 65536}) {
        const size_t total = std::min<size_t>(kInput, static_cast<size_t>(piece) * kMaxCalls);
        const double floor = memcpy_mbps(data.data(), total, static_cast<size_t>(piece), dst.data());
        for (Mode m : {Mode::None, Mode::Cache, Mode::SyncRing, Mode::Thread}) {
            const Result r = run_reader(m, data, total, piece, dst.data());
            std::printf("read %6d B  %-9s %9.1f MB/s  %10.2f input calls/MB  | memcpy %9.1f MB/s  "
                        "| %5.2fx slower  (%zu MiB)%s\n",
                        piece, name(m), r.mbps, r.calls_per_mb, floor, floor / r.mbps, total >> 20,
                        r.ok ? "" : "  WRONG BYTES");
        }
    }
    return 0;
}
