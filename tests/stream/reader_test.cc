// The buffered reader against the plain file: random reads, peeks and seeks
// give the same bytes, positions and end-of-input answers in every mode;
// seeks and the host's time moves never let stale bytes through while the
// streaming thread runs, and held bytes never wait for its read; visits stay
// within their block; closing never frees the blocks under a waiting or
// stalled thread.
#include <atomic>
#include <condition_variable>
#include <future>
#include <mutex>
#include <thread>

#include "reader_fixture.h"
#include "stream_internal.h"

using namespace readertest;

TEST(ReaderEquivalence, EveryModeMatchesThePlainFile) {
    // 400 random reads (tiny to several blocks), peeks and seeks of every
    // origin (near the position, often inside the buffer, or anywhere), some
    // of them as a search's probes (bytes from the buffers or straight from
    // the input, the thread held), after which the reader stands where the
    // probes began and reads on as if they had not been.
    for (Mode mode : {Mode::None, Mode::Cache, Mode::SyncRing, Mode::Thread}) {
        for (uint32_t seed = 1; seed <= 12; ++seed) {
            std::mt19937 rng(seed);
            const cb_off_t size = 3000 + rng() % 60000;
            const int block = 16 + rng() % 2048, ring = block + 1 + rng() % (4 * block);
            SCOPED_TRACE(testing::Message() << "mode " << int(mode) << " seed " << seed);
            Reader r(pattern(size, seed), mode, block, ring);
            ASSERT_EQ(r.open(), 0);
            const uint32_t max_peek = r.ringed() ? ring - block : 3 * block;
            cb_off_t pos = 0, probe_from = 0;
            cb_probe_st probes{};
            for (int op = 0; op < 400; ++op) {
                if (rng() % 25 == 0) {
                    if (!probes.active) {
                        probe_from = pos;
                        ASSERT_EQ(cb_begin_probes(&r.cb, &probes), mode != Mode::None);
                    } else {
                        cb_end_probes(&r.cb, &probes);
                        probes.active = 0;
                        pos = probe_from;
                    }
                }
                const unsigned kind = rng() % 10;
                if (kind < 7) {
                    const bool peek = kind >= 5;
                    const int32_t n = peek              ? 1 + rng() % max_peek
                                      : rng() % 3 == 0 ? rng() % (3 * block + 5)
                                                       : rng() % 40;
                    const Bytes want = r.slice(pos, n);
                    ASSERT_EQ(r.take(n, peek), want) << "op " << op << " n " << n << " at " << pos;
                    if (!peek) pos += want.size();
                    if (n > 0) {
                        ASSERT_EQ(cb_status(&r.cb), want.size() < size_t(n) ? CB_ERR_EOF : CB_ERR_OK);
                    }
                } else {
                    cb_off_t to = std::max<cb_off_t>(
                        0, rng() % 2 ? pos + cb_off_t(rng() % (2 * block)) - block / 2
                                     : cb_off_t(rng() % (size + 100)));
                    // The thread's set has no seek from the end.
                    if (kind == 9 && mode != Mode::Thread) to = size - rng() % 100;
                    const cb_off_t got = kind == 7 ? r.seek(to, CB_SEEK_SET)
                                         : kind == 8 ? r.seek(to - pos, CB_SEEK_CUR)
                                         : mode != Mode::Thread || probes.active
                                             ? r.seek(to - size, CB_SEEK_END)
                                             : cb_seek_multi(&r.cb, int32_t(to), CB_SEEK_SET);
                    ASSERT_EQ(got, to) << "seek op " << op;
                    pos = to;
                }
                ASSERT_EQ(cb_tell64(&r.cb), uint64_t(pos)) << "op " << op;
            }
            cb_end_probes(&r.cb, &probes);
        }
    }
}

TEST(ReaderEquivalence, ThreadMovesNeverLetStaleOrMissingBytesThrough) {
    // Tiny blocks and ring, and an input that yields or naps inside some of
    // its reads, so that each move lands in every phase of the thread's loop
    // (before its read, during it, between read and store, waiting for room).
    // The slow input naps in every read, as a network does: the consumer
    // then mostly works while a read is out of the lock.
    // The moves: a seek outside the buffered bytes, the host's time seek with
    // the reader's reset, and a flush that lets the host put its input where
    // it likes. After each, the reader returns exactly the file from there.
    struct Input {
        const char* name;
        uint32_t nap_every;  // reads
        int nap_us;
        int steps;
    };
    for (const Input& input : {Input{"fast", 97, 50, 8000}, Input{"slow", 1, 150, 1500}}) {
        SCOPED_TRACE(input.name);
        constexpr size_t kSize = 1 << 18;
        Reader r(pattern(kSize, 99), Mode::Thread, 37, 37 * 3 + 5);
        std::atomic<uint32_t> tick{0};
        r.in->faults().before_read = [&](uint64_t, size_t) {
            const uint32_t t = tick.fetch_add(1);
            if (t % 7 == 0) std::this_thread::yield();
            if (t % input.nap_every == 0) std::this_thread::sleep_for(std::chrono::microseconds(input.nap_us));
        };
        std::atomic<int64_t> target{0};  // where the host's time seek puts its input
        r.in->time_to_position = [&](int) -> int64_t { return target; };
        ASSERT_EQ(r.open(), 0);
        std::mt19937 rng(5);
        uint64_t pos = 0;
        for (int i = 0; i < input.steps; ++i) {
            const unsigned k = rng() % 8;
            const uint64_t to = k % 2 ? rng() % (pos + 1)  // backward or far ahead
                                      : std::min<uint64_t>(kSize, pos + 200 + rng() % 5000);
            target = int64_t(to);
            if (k < 2) {
                ASSERT_EQ(r.seek(cb_off_t(to), CB_SEEK_SET), cb_off_t(to));
            } else if (k == 2) {
                cb_seek_time_reset(&r.cb, int(to));
            } else if (k == 3) {
                cb_flush_data(&r.cb);
            }
            if (k < 4) pos = to;
            ASSERT_EQ(cb_tell64(&r.cb), pos) << "step " << i;
            const int32_t n = 1 + rng() % 120;
            const Bytes want = r.slice(pos, n);
            ASSERT_EQ(r.take(n), want) << "at " << pos << " step " << i;
            pos += want.size();
            if (pos >= kSize) {
                ASSERT_EQ(r.seek(0, CB_SEEK_SET), 0);
                pos = 0;
            }
        }
        EXPECT_GT(r.in->counters().seeks, uint64_t(input.steps) / 8) << "the moves left the buffered bytes";
    }
}

TEST(ReaderThread, HeldBytesNeverWaitForTheReadInFlight) {
    // The thread's third read stalls (a network that does not answer). Until
    // it returns, what the ring holds is still read, peeked, skipped and
    // taken back from the history; a seek elsewhere waits for that one read
    // and never lets its bytes through.
    constexpr uint64_t kStallAt = 2 * 4096;
    Reader r(pattern(1 << 20, 7), Mode::Thread, 4096, 65536);
    std::mutex m;
    std::condition_variable cv;
    bool released = false;
    std::atomic<bool> stalled{false};
    r.in->faults().before_read = [&](uint64_t pos, size_t) {
        if (pos != kStallAt) return;
        std::unique_lock<std::mutex> lk(m);
        stalled = true;
        cv.wait(lk, [&] { return released; });
    };
    auto release = [&] {
        std::lock_guard<std::mutex> lk(m);
        released = true;
        cv.notify_all();
    };
    ASSERT_EQ(r.open(), 0);
    ASSERT_EQ(r.take(5000), r.slice(0, 5000));
    sys_ringbuffer_settle(r.cb.active_rbuf);  // the room goes back: the thread reads on
    for (int i = 0; i < 5000 && !stalled; ++i) std::this_thread::sleep_for(std::chrono::milliseconds(1));
    ASSERT_TRUE(stalled.load());
    auto held = std::async(std::launch::async, [&] {
        bool ok = r.take(1000) == r.slice(5000, 1000);
        ok &= r.take(100, true) == r.slice(6000, 100);
        ok &= r.seek(7000, CB_SEEK_SET) == 7000 && r.take(1192) == r.slice(7000, 1192);
        ok &= r.seek(300, CB_SEEK_SET) == 300 && r.take(4000) == r.slice(300, 4000);
        return ok;
    });
    const bool served = held.wait_for(std::chrono::seconds(5)) == std::future_status::ready;
    EXPECT_TRUE(served) << "reading held bytes waited for the input";
    if (!served) release();
    EXPECT_TRUE(held.get());
    auto far = std::async(std::launch::async, [&] {
        return r.seek(500000, CB_SEEK_SET) == 500000 && r.take(10000) == r.slice(500000, 10000);
    });
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
    release();
    EXPECT_TRUE(far.get());
}

TEST(ReaderRing, VisitsStayWithinTheirBlockWhateverBlockSizeTheHostSetsLater) {
    // Blocks of 4 KiB at open, then 64 KiB (then 512 bytes): every read lands
    // in a block allocated at open, so a visit must not fill the side block
    // (or a cache slot) with more than it holds. AddressSanitizer sees the rest.
    for (Mode mode : {Mode::Cache, Mode::SyncRing}) {
        SCOPED_TRACE(int(mode));
        Reader r(pattern(1 << 20, 11), mode, 4096, 262144);
        ASSERT_EQ(r.open(), 0);
        ASSERT_EQ(r.take(100), r.slice(0, 100));
        for (int block : {65536, 512}) {
            r.in->io()->block_size = block;
            for (cb_off_t at : {cb_off_t(700000), cb_off_t(300000), cb_off_t(900000)}) {
                ASSERT_EQ(r.seek(at, CB_SEEK_SET), at);
                ASSERT_EQ(r.take(3000, true), r.slice(uint64_t(at), 3000)) << block << " at " << at;
                ASSERT_EQ(r.take(70000), r.slice(uint64_t(at), 70000)) << block << " at " << at;
            }
        }
    }
}

TEST(ReaderRing, SeekBackIntoAVisitedBlockReadsNothingAgain) {
    // A far seek reads one block aside and the ring goes on from its end; a
    // second seek to the same place (a seek answered twice) is served from
    // that block and then from the ring's history, without moving the input.
    for (Mode mode : {Mode::SyncRing, Mode::Thread}) {
        SCOPED_TRACE(int(mode));
        Reader r(pattern(1 << 20, 3), mode, 4096, 65536);
        ASSERT_EQ(r.open(), 0);
        ASSERT_EQ(r.take(100), r.slice(0, 100));
        const cb_off_t far = 500000;
        for (int pass = 0; pass < 2; ++pass) {
            const uint64_t seeks = r.in->counters().seeks;
            ASSERT_EQ(r.seek(far, CB_SEEK_SET), far);
            ASSERT_EQ(r.take(20000), r.slice(far, 20000));
            if (pass == 1) {
                EXPECT_EQ(r.in->counters().seeks, seeks) << "input moved again";
            }
        }
    }
}

TEST(ReaderClose, EndsTheThreadWaitingForRoomOrStalledInARead) {
    for (bool stall : {false, true}) {
        Reader r(pattern(100000), Mode::Thread, 64, stall ? 4096 : 256);
        std::atomic<bool> in_read{false}, returned{false};
        if (stall) {
            r.in->faults().before_read = [&](uint64_t pos, size_t) {
                if (pos == 0) return;
                in_read = true;
                std::this_thread::sleep_for(std::chrono::milliseconds(20));
                returned = true;
            };
        }
        ASSERT_EQ(r.open(), 0);
        if (stall) {
            while (!in_read) sched_yield();
        } else {
            ASSERT_EQ(r.take(192, true).size(), 192u);  // a full ring nobody reads
        }
        r.close();  // must not free the blocks under the thread
        EXPECT_EQ(r.host.outstanding_blocks(), 0u);
        EXPECT_EQ(r.cb.thread_type, CB_SINGLE_THREAD);
        EXPECT_EQ(returned.load(), stall) << "closed before the stalled read returned";
    }
}

TEST(ReaderSetup, RefusesARingSmallerThanABlockAndAnswersItsQueries) {
    // A ring must take a block with its one byte of slack.
    for (int ring : {0, 64, 65}) {
        Reader r(pattern(1000), Mode::SyncRing, 64, ring);
        EXPECT_EQ(r.open(), ring > 64 ? 0 : -1) << "ring " << ring;
    }
    for (Mode mode : {Mode::Cache, Mode::SyncRing}) {
        Reader r(pattern(5000), mode, 256, 1024);
        ASSERT_EQ(r.open(), 0);
        EXPECT_EQ(cb_get_file_size(&r.cb), 5000u);
        ASSERT_EQ(r.take(100), r.slice(0, 100));
        // Inside the buffer from either origin; never from the end.
        EXPECT_EQ(seek_out_of_buffer(&r.cb, 50, CB_SEEK_SET), 0);
        EXPECT_EQ(seek_out_of_buffer(&r.cb, -10, CB_SEEK_CUR), 0);
        EXPECT_EQ(seek_out_of_buffer(&r.cb, 0, CB_SEEK_END), 1);
        EXPECT_EQ(seek_out_of_buffer(&r.cb, 4900, CB_SEEK_SET), 1);
        // Buffering switched off then on again loses no byte.
        for (int enable : {0, 1}) {
            EXPECT_EQ(cb_set_buffer_mode(&r.cb, enable), 0);
            EXPECT_EQ(r.take(300), r.slice(enable ? 400 : 100, 300));
        }
    }
    Reader r(pattern(1000), Mode::Es, 256, 0);
    ASSERT_EQ(r.open(), 0);
    EXPECT_EQ(cb_set_buffer_mode(&r.cb, 1), 0) << "elementary streams stay unbuffered";
}
