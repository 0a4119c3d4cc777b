// The byte ring: wrap-around, the history, in-place commits, and the wake-ups
// between one producer and one consumer.
#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <cstring>
#include <random>
#include <thread>
#include <vector>

#include "ringbuffer_api.h"

namespace {

struct Ring {
    explicit Ring(uint32_t size) : storage(size) { sys_ringbuffer_init(&rb, storage.data(), size); }
    ~Ring() { sys_ringbuffer_destroy(&rb); }
    std::vector<uint8_t> peek(int32_t n) {
        std::vector<uint8_t> v(static_cast<size_t>(n));
        v.resize(static_cast<size_t>(sys_ringbuffer_byte_read_peek(&rb, v.data(), n)));
        return v;
    }
    void write(std::vector<uint8_t> v) {
        sys_ringbuffer_byte_write(&rb, v.data(), static_cast<uint32_t>(v.size()));
    }
    std::vector<uint8_t> storage;
    sys_ringbuffer rb{};
};

// Waits until a producer has announced its request (read under the lock).
void wait_for_producer(sys_ringbuffer* rb, int32_t len) {
    for (;;) {
        pthread_mutex_lock(&rb->ring_mutex);
        const int32_t req = rb->wsize_req;
        pthread_mutex_unlock(&rb->ring_mutex);
        if (req == len) return;
        std::this_thread::yield();
    }
}

std::vector<uint8_t> seq(uint8_t first, size_t n) {
    std::vector<uint8_t> v(n);
    for (size_t i = 0; i < n; ++i) v[i] = static_cast<uint8_t>(first + i);
    return v;
}

}  // namespace

TEST(Ring, WritesAndPeeksWrapAroundTheEnd) {
    // (pread/pwrite before, bytes written) -> pwrite after
    const struct {
        uint32_t start, len, pwrite_after;
    } cases[] = {
        {6, 5, 3},  // 2 at the end, 3 at the start
        {6, 2, 0},  // ends exactly at the end
        {0, 7, 7}, {7, 1, 0}, {7, 7, 6}, {3, 4, 7},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(testing::Message() << "start " << c.start << " len " << c.len);
        Ring r(8);
        r.rb.pread = r.rb.pwrite = c.start;
        r.write(seq(10, c.len));
        EXPECT_EQ(r.rb.pwrite, c.pwrite_after);
        EXPECT_EQ(sys_ringbuffer_avail(&r.rb), static_cast<int32_t>(c.len));
        EXPECT_EQ(sys_ringbuffer_free(&r.rb), static_cast<int32_t>(7 - c.len));
        EXPECT_EQ(r.peek(static_cast<int32_t>(c.len)), seq(10, c.len));
        // The bytes sit where the wrap puts them.
        for (uint32_t i = 0; i < c.len; ++i)
            EXPECT_EQ(r.storage[(c.start + i) % 8], static_cast<uint8_t>(10 + i));
        // A partial release then a peek that crosses the end.
        sys_ringbuffer_byte_release(&r.rb, 1);
        EXPECT_EQ(r.rb.pread, (c.start + 1) % 8);
        EXPECT_EQ(r.peek(static_cast<int32_t>(c.len - 1)), seq(11, c.len - 1));
    }
}

TEST(Ring, InPlaceCommitMovesTheOverflowToTheStart) {
    std::vector<uint8_t> storage(8 + 4);
    sys_ringbuffer rb{};
    sys_ringbuffer_init(&rb, storage.data(), 8);
    rb.pread = rb.pwrite = 6;
    for (int i = 0; i < 5; ++i) storage[6 + i] = static_cast<uint8_t>(40 + i);
    EXPECT_EQ(sys_ringbuffer_byte_write2(&rb, 5), 5);
    EXPECT_EQ(rb.pwrite, 3u);
    uint8_t out[5];
    EXPECT_EQ(sys_ringbuffer_byte_read_peek(&rb, out, 5), 5);
    EXPECT_EQ(std::vector<uint8_t>(out, out + 5), seq(40, 5));
    sys_ringbuffer_destroy(&rb);
}

TEST(Ring, ReleaseWakesTheProducerOnlyOnceItsRequestFits) {
    Ring r(8);
    r.write(seq(1, 7));
    std::atomic<int32_t> result{-100};
    std::thread producer([&] { result = sys_ringbuffer_walloc(&r.rb, 6); });
    wait_for_producer(&r.rb, 6);
    sys_ringbuffer_byte_release(&r.rb, 3);  // 3 free: not enough
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
    EXPECT_EQ(result.load(), -100) << "woken although 6 bytes do not fit";
    sys_ringbuffer_byte_release(&r.rb, 3);  // 6 free
    producer.join();
    EXPECT_EQ(result.load(), 6);
    EXPECT_EQ(r.rb.wsize_req, 0);
}

TEST(Ring, FlushOrCloseEndsAWaitingProducer) {
    // flush of a ring that ends up empty: -1; close: whatever room there is.
    for (bool flush : {true, false}) {
        Ring r(8);
        r.write(seq(1, 7));
        std::atomic<int32_t> result{-100};
        std::thread producer([&] { result = sys_ringbuffer_walloc(&r.rb, 4); });
        wait_for_producer(&r.rb, 4);
        if (flush)
            sys_ringbuffer_flush(&r.rb);
        else
            sys_ringbuffer_close(&r.rb);
        producer.join();
        EXPECT_EQ(result.load(), flush ? -1 : 7);
        if (flush) {
            EXPECT_EQ(r.rb.error, 0) << "the producer consumed the flush mark";
        }
    }
}

TEST(Ring, ProducerAndConsumerPassEveryByteInOrder) {
    // A consumer's request and a producer's reservation must fit together
    // (57 + 40 <= 96 + 1), else both wait until the timed wait expires.
    Ring r(97);
    constexpr size_t kTotal = 200000;
    std::thread producer([&] {
        std::mt19937 rng(7);
        size_t sent = 0;
        std::vector<uint8_t> chunk;
        while (sent < kTotal) {
            const size_t n = std::min<size_t>(1 + rng() % 40, kTotal - sent);
            chunk.resize(n);
            for (size_t i = 0; i < n; ++i) chunk[i] = static_cast<uint8_t>((sent + i) * 31);
            while (sys_ringbuffer_walloc(&r.rb, static_cast<uint32_t>(n)) <
                   static_cast<int32_t>(n)) {
            }
            sys_ringbuffer_byte_write(&r.rb, chunk.data(), static_cast<uint32_t>(n));
            sent += n;
        }
    });
    std::mt19937 rng(11);
    size_t got = 0;
    uint8_t buf[96];
    bool ok = true;
    while (got < kTotal) {
        const int32_t want = static_cast<int32_t>(std::min<size_t>(1 + rng() % 57, kTotal - got));
        const int32_t n = sys_ringbuffer_byte_read_peek(&r.rb, buf, want);
        ASSERT_EQ(n, want);
        for (int32_t i = 0; i < n; ++i) ok &= buf[i] == static_cast<uint8_t>((got + i) * 31);
        sys_ringbuffer_byte_release(&r.rb, static_cast<uint32_t>(n));
        got += static_cast<size_t>(n);
    }
    producer.join();
    EXPECT_TRUE(ok);
    EXPECT_EQ(sys_ringbuffer_avail(&r.rb), 0);
}

TEST(Ring, HistoryGivesBackReleasedBytesUntilTheProducerNeedsTheirRoom) {
    // Ring of 16 (15 usable). Each step: (write n | release n | in-place n),
    // then the history and whether a rewind of `back` bytes gives exactly
    // the bytes released last.
    Ring r(16);
    uint8_t next = 1;  // value of the next byte produced
    auto produce = [&](uint32_t n, bool in_place) {
        if (in_place) {
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
        } else {
            r.write(seq(next, n));
            next = static_cast<uint8_t>(next + n);
        }
    };
    produce(10, false);  // bytes 1..10
    sys_ringbuffer_byte_release(&r.rb, 8);
    EXPECT_EQ(sys_ringbuffer_history(&r.rb), 8u);
    EXPECT_EQ(sys_ringbuffer_rewind(&r.rb, 9), 0) << "more than was released";
    ASSERT_EQ(sys_ringbuffer_rewind(&r.rb, 3), 1);
    EXPECT_EQ(r.peek(5), seq(6, 5)) << "bytes 6..10 are read again";
    EXPECT_EQ(sys_ringbuffer_history(&r.rb), 5u);
    sys_ringbuffer_byte_release(&r.rb, 5);  // 10 released in all, history 10
    // 15 - 0 held = 15 free; producing 8 leaves room for 7 of the history.
    produce(8, true);  // wraps the storage: bytes 11..18 in two pieces
    EXPECT_EQ(sys_ringbuffer_history(&r.rb), 7u);
    ASSERT_EQ(sys_ringbuffer_rewind(&r.rb, 7), 1);
    EXPECT_EQ(r.peek(15), seq(4, 15)) << "bytes 4..10 from the history, 11..18 new";
    sys_ringbuffer_byte_release(&r.rb, 15);
    produce(15, false);
    EXPECT_EQ(sys_ringbuffer_history(&r.rb), 0u) << "a full ring keeps nothing behind";
    EXPECT_EQ(sys_ringbuffer_rewind(&r.rb, 1), 0);
    sys_ringbuffer_byte_release(&r.rb, 4);
    sys_ringbuffer_reset(&r.rb);
    EXPECT_EQ(sys_ringbuffer_history(&r.rb), 0u) << "a reset forgets the history";
}
