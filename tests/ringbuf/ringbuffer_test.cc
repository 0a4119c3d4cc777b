// The byte ring: the wake-ups between one producer and one consumer, and the
// history of released bytes. Bytes passing through the ring in every
// arrangement are checked by the reader's suites.
#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <thread>
#include <vector>

#include "ringbuffer_api.h"

namespace {

using Bytes = std::vector<uint8_t>;

Bytes seq(uint8_t first, size_t n) {
    Bytes v(n);
    for (size_t i = 0; i < n; ++i) v[i] = static_cast<uint8_t>(first + i);
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
    void write(const Bytes& v) {
        sys_ringbuffer_byte_write(&rb, v.data(), static_cast<uint32_t>(v.size()));
    }
    // Starts a producer asking for `len` bytes of room; returns once it waits.
    std::thread producer(uint32_t len, std::atomic<int32_t>& result) {
        std::thread t([this, len, &result] { result = sys_ringbuffer_walloc(&rb, len); });
        for (int32_t req = 0; req != static_cast<int32_t>(len); std::this_thread::yield()) {
            pthread_mutex_lock(&rb.ring_mutex);
            req = rb.wsize_req;
            pthread_mutex_unlock(&rb.ring_mutex);
        }
        return t;
    }
    std::vector<uint8_t> storage;
    sys_ringbuffer rb{};
};

}  // namespace

TEST(Ring, AWaitingProducerWakesWhenItsRoomIsFreeOrTheRingIsFlushedOrClosed) {
    // A full ring of 8 (7 usable); the producer asks for 6 bytes of room.
    enum Action { Release, Flush, Close };
    const struct {
        Action action;
        int32_t result;
    } cases[] = {{Release, 6}, {Flush, -1}, {Close, 7}};
    for (const auto& c : cases) {
        SCOPED_TRACE(c.action);
        Ring r(8);
        r.write(seq(1, 7));
        std::atomic<int32_t> result{-100};
        std::thread t = r.producer(6, result);
        if (c.action == Release) {
            sys_ringbuffer_byte_release(&r.rb, 3);  // 3 free: not enough
            std::this_thread::sleep_for(std::chrono::milliseconds(50));
            EXPECT_EQ(result.load(), -100) << "woken although 6 bytes do not fit";
            sys_ringbuffer_byte_release(&r.rb, 3);
        } else if (c.action == Flush) {
            sys_ringbuffer_flush(&r.rb);
        } else {
            sys_ringbuffer_close(&r.rb);
        }
        t.join();
        EXPECT_EQ(result.load(), c.result);
        EXPECT_EQ(r.rb.wsize_req, 0);
        EXPECT_EQ(sys_ringbuffer_avail(&r.rb), c.action == Release ? 1 : 0);
        if (c.action == Close) {
            EXPECT_TRUE(r.peek(4).empty()) << "a closed ring gives no more";
        }
        EXPECT_EQ(r.rb.error, 0) << "the producer consumed the flush mark";
    }
}

TEST(Ring, HistoryGivesBackReleasedBytesUntilTheProducerNeedsTheirRoom) {
    // Ring of 16 (15 usable); bytes are numbered from 1 as they are produced.
    Ring r(16);
    uint8_t next = 1;
    auto produce_in_place = [&](uint32_t n) {
        while (n) {
            pthread_mutex_lock(&r.rb.ring_mutex);
            uint8_t* at = nullptr;
            const uint32_t room = sys_ringbuffer_wspace_locked(&r.rb, n, &at);
            for (uint32_t i = 0; i < room; ++i) at[i] = next++;
            sys_ringbuffer_commit_locked(&r.rb, room);
            pthread_mutex_unlock(&r.rb.ring_mutex);
            ASSERT_GT(room, 0u);
            n -= room;
        }
    };
    r.write(seq(next, 10));  // bytes 1..10
    next = 11;
    sys_ringbuffer_byte_release(&r.rb, 8);
    EXPECT_EQ(sys_ringbuffer_history(&r.rb), 8u);
    EXPECT_EQ(sys_ringbuffer_rewind(&r.rb, 9), 0) << "more than was released";
    ASSERT_EQ(sys_ringbuffer_rewind(&r.rb, 3), 1);
    EXPECT_EQ(r.peek(5), seq(6, 5)) << "bytes 6..10 are read again";
    EXPECT_EQ(sys_ringbuffer_history(&r.rb), 5u);
    sys_ringbuffer_byte_release(&r.rb, 5);  // history 10, nothing held
    produce_in_place(8);  // bytes 11..18, across the end: room left for 7 of the history
    EXPECT_EQ(sys_ringbuffer_history(&r.rb), 7u);
    ASSERT_EQ(sys_ringbuffer_rewind(&r.rb, 7), 1);
    EXPECT_EQ(r.peek(15), seq(4, 15)) << "bytes 4..10 from the history, 11..18 new";
    EXPECT_EQ(sys_ringbuffer_avail(&r.rb), 15);
    EXPECT_EQ(sys_ringbuffer_free(&r.rb), 0);
    sys_ringbuffer_byte_release(&r.rb, 15);
    r.write(seq(next, 15));
    EXPECT_EQ(sys_ringbuffer_history(&r.rb), 0u) << "a full ring keeps nothing behind";
    EXPECT_EQ(sys_ringbuffer_rewind(&r.rb, 1), 0);
    sys_ringbuffer_byte_release(&r.rb, 4);
    sys_ringbuffer_reset(&r.rb);
    EXPECT_EQ(sys_ringbuffer_history(&r.rb), 0u) << "a reset forgets the history";
}
