// The buffered reader against a plain model of the file: random reads, peeks
// and seeks give the same bytes, positions and end-of-input answers in every
// mode; seeks and the host's time moves never let stale bytes through while
// the streaming thread runs; two cursors read each byte once; closing never
// frees the blocks under a waiting or stalled thread.
#include <atomic>
#include <thread>

#include "reader_fixture.h"
#include "stream_internal.h"

using namespace readertest;

namespace {

// 400 random reads (tiny to several blocks), peeks and seeks of every origin
// (near the position, often inside the buffer, or anywhere).
void run_random_ops(Mode mode, uint32_t seed) {
    std::mt19937 rng(seed);
    const size_t size = 3000 + rng() % 60000;
    const int block = 16 + static_cast<int>(rng() % 2048);
    const int ring = block + 1 + static_cast<int>(rng() % (4 * block));
    SCOPED_TRACE(testing::Message() << mode_name(mode) << " seed " << seed << " size " << size
                                    << " block " << block << " ring " << ring);
    Reader r(pattern(size, seed), options_for(mode, block, ring));
    ASSERT_EQ(r.open(mode), 0);
    uint64_t pos = 0;
    const bool ringed = mode == Mode::SyncRing || mode == Mode::Thread;
    const uint32_t max_peek = static_cast<uint32_t>(ringed ? ring - block : 3 * block);
    std::vector<uint8_t> buf;
    for (int op = 0; op < 400; ++op) {
        const unsigned kind = rng() % 10;
        if (kind < 7) {
            const bool peek = kind >= 5;
            const int32_t n = static_cast<int32_t>(peek             ? 1 + rng() % max_peek
                                                   : rng() % 3 == 0 ? rng() % (3 * block + 5)
                                                                    : rng() % 40);
            buf.assign(static_cast<size_t>(n), 0);
            const int32_t got = peek ? r.peek(buf.data(), n) : r.read(buf.data(), n);
            buf.resize(static_cast<size_t>(std::max(got, 0)));
            const auto want = r.slice(pos, static_cast<size_t>(n));
            ASSERT_EQ(buf, want) << (peek ? "peek " : "read ") << n << " at " << pos << " op "
                                 << op;
            if (!peek) pos += want.size();
            if (n > 0) {
                ASSERT_EQ(cb_status(&r.cb_),
                          want.size() < static_cast<size_t>(n) ? CB_ERR_EOF : CB_ERR_OK);
            }
        } else {
            cb_off_t target = rng() % 2 ? static_cast<cb_off_t>(pos) +
                                              static_cast<cb_off_t>(rng() % (2 * block)) - block / 2
                                        : static_cast<cb_off_t>(rng() % (size + 100));
            target = std::max<cb_off_t>(target, 0);
            cb_off_t got;
            if (kind == 7) {
                got = r.seek(target, CB_SEEK_SET);
            } else if (kind == 8) {
                got = r.seek(target - static_cast<cb_off_t>(pos), CB_SEEK_CUR);
            } else if (mode != Mode::Thread) {  // the thread's set has no seek from the end
                target = static_cast<cb_off_t>(size) - static_cast<cb_off_t>(rng() % 100);
                got = r.seek(target - static_cast<cb_off_t>(size), CB_SEEK_END);
            } else {
                got = cb_seek_multi(&r.cb_, static_cast<int32_t>(target), CB_SEEK_SET);
            }
            ASSERT_EQ(got, target) << "seek op " << op;
            pos = static_cast<uint64_t>(target);
        }
        ASSERT_EQ(cb_tell64(&r.cb_), pos) << "op " << op;
    }
}

}  // namespace

TEST(ReaderEquivalence, EveryModeMatchesThePlainFile) {
    for (Mode mode : {Mode::None, Mode::Cache, Mode::SyncRing, Mode::Thread}) {
        for (uint32_t seed = 1; seed <= 12; ++seed) {
            run_random_ops(mode, seed);
            if (HasFatalFailure()) return;
        }
    }
}

TEST(ReaderEquivalence, SeeksNeverLetStaleOrMissingBlocksThrough) {
    // Tiny blocks and ring, and an input that sometimes yields or naps inside
    // its reads, so that seeks land in every phase of the thread's loop:
    // before its read, during it, between read and store, waiting for room.
    constexpr size_t kSize = 1 << 18;
    Reader r(pattern(kSize, 99), options_for(Mode::Thread, 37, 37 * 3 + 5));
    std::atomic<uint32_t> tick{0};
    r.in_->faults().before_read = [&](uint64_t, size_t) {
        const uint32_t t = tick.fetch_add(1);
        if (t % 7 == 0) std::this_thread::yield();
        if (t % 97 == 0) std::this_thread::sleep_for(std::chrono::microseconds(50));
    };
    ASSERT_EQ(r.open(), 0);
    std::mt19937 rng(5);
    uint64_t pos = 0;
    uint8_t buf[64];
    int out_of_buffer = 0;
    for (int i = 0; i < 6000; ++i) {
        const unsigned k = rng() % 4;
        if (k == 0) {
            // Outside the buffered bytes: backward, or well beyond the ring.
            const uint64_t target =
                rng() % 2 ? rng() % (pos + 1) : std::min<uint64_t>(kSize, pos + 200 + rng() % 5000);
            const uint64_t seeks = r.in_->counters().seeks;
            ASSERT_EQ(r.seek(static_cast<cb_off_t>(target), CB_SEEK_SET),
                      static_cast<cb_off_t>(target));
            out_of_buffer += r.in_->counters().seeks != seeks;
            pos = target;
        }
        const int32_t n = 1 + static_cast<int32_t>(rng() % 60);
        const int32_t got = r.read(buf, n);
        const auto want = r.slice(pos, static_cast<size_t>(n));
        ASSERT_EQ(std::vector<uint8_t>(buf, buf + got), want) << "at " << pos << " step " << i;
        pos += want.size();
        if (pos >= kSize) {
            ASSERT_EQ(r.seek(0, CB_SEEK_SET), 0);
            pos = 0;
        }
    }
    EXPECT_GT(out_of_buffer, 1000);
}

TEST(ReaderEquivalence, TwoCursorsReadEachByteOnce) {
    // Separate parsing: one cursor for audio, one for video, read in turns
    // about a block apart (the file cache's slots) or far apart (the ring's
    // history). Every mode returns the file's bytes at each
    // cursor, and no byte comes from the input twice.
    const struct {
        Mode mode;
        size_t gap;
    } cases[] = {
        {Mode::Cache, 3000},     {Mode::Cache, 5000},  {Mode::SyncRing, 3000},
        {Mode::SyncRing, 14000}, {Mode::Thread, 3000}, {Mode::Thread, 14000},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(testing::Message() << mode_name(c.mode) << " gap " << c.gap);
        constexpr size_t kSize = 120000;
        Reader r(pattern(kSize, 11), options_for(c.mode, 4096, 32768));
        ASSERT_EQ(r.open(c.mode), 0);
        uint64_t at[2] = {0, c.gap};
        uint8_t buf[700];
        std::mt19937 rng(c.gap);
        while (at[1] < kSize) {
            // Both cursors move by the same amount, so the gap stays.
            const int32_t n = 1 + static_cast<int32_t>(rng() % 700);
            for (uint64_t& pos : at) {
                ASSERT_EQ(r.seek(static_cast<cb_off_t>(pos), CB_SEEK_SET),
                          static_cast<cb_off_t>(pos));
                uint8_t head[40];
                const int32_t p = r.peek(head, 40);
                ASSERT_EQ(std::vector<uint8_t>(head, head + p), r.slice(pos, 40));
                const int32_t got = r.read(buf, n);
                ASSERT_EQ(std::vector<uint8_t>(buf, buf + got),
                          r.slice(pos, static_cast<size_t>(n)));
                pos += static_cast<uint64_t>(got);
            }
        }
        EXPECT_LE(r.in_->counters().bytes_read, kSize + 4096) << "a block at most beyond the end";
    }
}

TEST(ReaderEquivalence, TimeMovesWhileTheThreadReadsLoseNothing) {
    // The host's time seek and the reader's reset are one step for the
    // streaming thread: after each, the reader returns exactly the input's
    // bytes from the new position, whatever the thread was doing. Tiny blocks
    // and an input that naps now and then put the move in every phase of the
    // thread's loop.
    constexpr size_t kSize = 1 << 17;
    Reader r(pattern(kSize, 7), options_for(Mode::Thread, 41, 41 * 3 + 3));
    std::atomic<uint32_t> tick{0};
    r.in_->faults().before_read = [&](uint64_t, size_t) {
        const uint32_t t = tick.fetch_add(1);
        if (t % 5 == 0) std::this_thread::yield();
        if (t % 89 == 0) std::this_thread::sleep_for(std::chrono::microseconds(30));
    };
    r.in_->time_to_position = [](int ms) -> int64_t { return ms; };
    ASSERT_EQ(r.open(), 0);
    std::mt19937 rng(3);
    uint8_t buf[200];
    for (int i = 0; i < 3000; ++i) {
        const int ms = static_cast<int>(rng() % kSize);
        if (rng() % 2) {
            cb_seek_time_reset(&r.cb_, ms);
        } else {
            // A flush: the host puts its input where it likes.
            r.in_->time_to_position = [ms](int) -> int64_t { return ms; };
            cb_flush_data(&r.cb_);
            r.in_->time_to_position = [](int t) -> int64_t { return t; };
        }
        ASSERT_EQ(cb_tell64(&r.cb_), static_cast<uint64_t>(ms)) << "step " << i;
        uint64_t pos = static_cast<uint64_t>(ms);
        for (int k = 0; k < 3; ++k) {
            const int32_t n = 1 + static_cast<int32_t>(rng() % 200);
            const int32_t got = r.read(buf, n);
            ASSERT_EQ(std::vector<uint8_t>(buf, buf + got), r.slice(pos, static_cast<size_t>(n)))
                << "at " << pos << " step " << i;
            pos += static_cast<uint64_t>(got);
        }
    }
}

TEST(ReaderClose, CloseWhileTheThreadWaitsForRoomEndsTheThread) {
    // A peek fills the ring and nobody reads: the thread waits for room.
    Reader r(pattern(100000), options_for(Mode::Thread, 64, 256));
    ASSERT_EQ(r.open(), 0);
    uint8_t p[192];
    ASSERT_EQ(r.peek(p, 192), 192);
    r.close();
    EXPECT_EQ(r.host_.outstanding_blocks(), 0u);
    EXPECT_EQ(r.cb_.thread_type, CB_SINGLE_THREAD);
}

TEST(ReaderClose, CloseWhileTheInputStallsWaitsForTheReadToReturn) {
    Reader r(pattern(100000), options_for(Mode::Thread, 64, 4096));
    std::atomic<bool> in_read{false}, release{false};
    r.in_->faults().before_read = [&](uint64_t pos, size_t) {
        if (pos == 0) return;
        in_read = true;
        while (!release) sched_yield();
    };
    ASSERT_EQ(r.open(), 0);
    while (!in_read) sched_yield();
    std::thread releaser([&] {
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
        release = true;
    });
    r.close();  // must not free the blocks under the thread's read
    EXPECT_TRUE(release.load());
    releaser.join();
}
