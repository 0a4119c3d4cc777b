// The byte ring: the wake-ups between one producer and one consumer, and the
// history of released bytes. Bytes passing through the ring in every
// arrangement are checked by the reader's suites.
#include <gtest/gtest.h>

#include <atomic>
#include <algorithm>
#include <chrono>
#include <numeric>
#include <thread>
#include <vector>

#include "ringbuffer_api.h"

namespace {

using Bytes = std::vector<uint8_t>;

Bytes seq(uint8_t first, size_t n) {
    Bytes v(n);
    std::iota(v.begin(), v.end(), first);
    return v;
}

struct Ring {
    explicit Ring(uint32_t size) : storage(size) { sys_ringbuffer_init(&rb, storage.data(), size); }
    ~Ring() { sys_ringbuffer_destroy(&rb); }
    Bytes peek(int32_t n) {
        Bytes v(static_cast<size_t>(n));
        v.resize(static_cast<size_t>(sys_ringbuffer_byte_read_peek(&rb, v.data(), n)));
        return v;
    }
    // Produces the next n bytes (numbered from 1 as they are produced): copied
    // in, or written in place into the room the ring hands out.
    void produce(uint32_t n, bool in_place = false) {
        const Bytes v = seq(next, n);
        next = static_cast<uint8_t>(next + n);
        if (!in_place) sys_ringbuffer_byte_write(&rb, v.data(), n);
        for (uint32_t done = 0, room = 0; in_place && done < n; done += room) {
            pthread_mutex_lock(&rb.ring_mutex);
            uint8_t* at = nullptr;
            room = sys_ringbuffer_wspace_locked(&rb, n - done, &at);
            std::copy_n(v.begin() + done, room, at);
            sys_ringbuffer_commit_locked(&rb, room);
            pthread_mutex_unlock(&rb.ring_mutex);
            ASSERT_GT(room, 0u);
        }
    }
    std::vector<uint8_t> storage;
    sys_ringbuffer rb{};
    uint8_t next = 1;
};

}  // namespace

TEST(Ring, AWaitingProducerWakesWhenItsRoomIsFreeOrTheRingIsFlushedOrClosed) {
    // A full ring of 8 (7 usable); a producer asks for 6 bytes of room.
    enum Action { Release, Flush, Close };
    const int32_t results[] = {6, -1, 7};
    for (Action action : {Release, Flush, Close}) {
        SCOPED_TRACE(action);
        Ring r(8);
        r.produce(7);
        std::atomic<int32_t> result{-100};
        std::thread t([&] { result = sys_ringbuffer_walloc(&r.rb, 6); });
        for (int32_t req = 0; req != 6; std::this_thread::yield()) {
            pthread_mutex_lock(&r.rb.ring_mutex);
            req = r.rb.wsize_req;
            pthread_mutex_unlock(&r.rb.ring_mutex);
        }
        if (action == Release) {
            sys_ringbuffer_byte_release(&r.rb, 3);  // 3 free: not enough
            std::this_thread::sleep_for(std::chrono::milliseconds(50));
            EXPECT_EQ(result.load(), -100) << "woken although 6 bytes do not fit";
            sys_ringbuffer_byte_release(&r.rb, 3);
        } else if (action == Flush) {
            sys_ringbuffer_flush(&r.rb);
        } else {
            sys_ringbuffer_close(&r.rb);
        }
        t.join();
        EXPECT_EQ(result.load(), results[action]);
        EXPECT_EQ(r.rb.wsize_req, 0);
        EXPECT_EQ(sys_ringbuffer_avail(&r.rb), action == Release ? 1 : 0);
        if (action == Close) {
            EXPECT_TRUE(r.peek(4).empty()) << "a closed ring gives no more";
        }
        EXPECT_EQ(r.rb.error, 0) << "the producer consumed the flush mark";
    }
}

TEST(Ring, HistoryGivesBackReleasedBytesUntilTheProducerNeedsTheirRoom) {
    Ring r(16);  // 15 usable
    r.produce(10);
    sys_ringbuffer_byte_release(&r.rb, 8);
    EXPECT_EQ(sys_ringbuffer_history(&r.rb), 8u);
    EXPECT_EQ(sys_ringbuffer_rewind(&r.rb, 9), 0) << "more than was released";
    ASSERT_EQ(sys_ringbuffer_rewind(&r.rb, 3), 1);
    EXPECT_EQ(r.peek(5), seq(6, 5)) << "bytes 6..10 are read again";
    EXPECT_EQ(sys_ringbuffer_history(&r.rb), 5u);
    sys_ringbuffer_byte_release(&r.rb, 5);  // history 10, nothing held
    r.produce(8, true);  // bytes 11..18, across the end: room left for 7 of the history
    EXPECT_EQ(sys_ringbuffer_history(&r.rb), 7u);
    ASSERT_EQ(sys_ringbuffer_rewind(&r.rb, 7), 1);
    EXPECT_EQ(r.peek(15), seq(4, 15)) << "bytes 4..10 from the history, 11..18 new";
    EXPECT_EQ(sys_ringbuffer_avail(&r.rb), 15);
    EXPECT_EQ(sys_ringbuffer_free(&r.rb), 0);
    sys_ringbuffer_byte_release(&r.rb, 15);
    r.produce(15);
    EXPECT_EQ(sys_ringbuffer_history(&r.rb), 0u) << "a full ring keeps nothing behind";
    EXPECT_EQ(sys_ringbuffer_rewind(&r.rb, 1), 0);
    sys_ringbuffer_byte_release(&r.rb, 4);
    sys_ringbuffer_reset(&r.rb);
    EXPECT_EQ(sys_ringbuffer_history(&r.rb), 0u) << "a reset forgets the history";
}

TEST(Ring, AFillInFlightIsDroppedByAResetFlushOrClose) {
    // The producer reserves room and fills it outside the lock; a reset,
    // flush or close in between means its bytes were asked for before, so the
    // commit stores nothing.
    enum Action { None, Reset, Flush, Close };
    for (Action action : {None, Reset, Flush, Close}) {
        SCOPED_TRACE(action);
        Ring r(16);
        r.produce(10);
        sys_ringbuffer_byte_release(&r.rb, 10);
        pthread_mutex_lock(&r.rb.ring_mutex);
        uint8_t* at = nullptr;
        const uint32_t room = sys_ringbuffer_wspace_locked(&r.rb, 4, &at);
        pthread_mutex_unlock(&r.rb.ring_mutex);
        ASSERT_EQ(room, 4u);
        std::fill_n(at, room, uint8_t{0xAB});
        if (action == Reset) sys_ringbuffer_reset(&r.rb);
        if (action == Flush) sys_ringbuffer_flush(&r.rb);
        if (action == Close) sys_ringbuffer_close(&r.rb);
        pthread_mutex_lock(&r.rb.ring_mutex);
        const int stored = sys_ringbuffer_commit_locked(&r.rb, room);
        pthread_mutex_unlock(&r.rb.ring_mutex);
        EXPECT_EQ(stored, action == None ? 1 : 0);
        EXPECT_EQ(sys_ringbuffer_avail(&r.rb), action == None ? 4 : 0);
        EXPECT_EQ(r.rb.wlock, 0);
        EXPECT_EQ(r.rb.rlock, 0);
    }
}
