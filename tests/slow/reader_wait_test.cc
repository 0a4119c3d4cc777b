// The ten-second waits of the ring and of the reader.
#include <gtest/gtest.h>

#include <chrono>

#include "../stream/reader_fixture.h"
#include "stream_internal.h"

using namespace readertest;

// Runs f and checks that it returned after about ten seconds.
template <typename F>
void takes_ten_seconds(F f) {
    const auto t0 = std::chrono::steady_clock::now();
    f();
    const std::chrono::duration<double> s = std::chrono::steady_clock::now() - t0;
    EXPECT_GE(s.count(), 8.9);
    EXPECT_LE(s.count(), 11.0);
}

TEST(RingWait, ProducerGivesUpWhenNobodyReleases) {
    Bytes storage(8);
    sys_ringbuffer rb{};
    sys_ringbuffer_init(&rb, storage.data(), 8);
    sys_ringbuffer_byte_write(&rb, storage.data(), 7);
    takes_ten_seconds([&] { EXPECT_EQ(sys_ringbuffer_walloc(&rb, 4), -2); });
    EXPECT_EQ(rb.wsize_req, 0);
    sys_ringbuffer_destroy(&rb);
}

TEST(ReaderWait, RingWithoutThreadTimesOutOnAnEmptyRingAndASeekStopsWaiting) {
    Reader r(pattern(1000), Mode::SyncRing, 64, 256);
    ASSERT_EQ(r.open(), 0);
    changeThreadType(&r.cb, 1);  // the multi-thread set, and no thread to fill the ring
    takes_ten_seconds([&] { EXPECT_EQ(r.take(10).size(), 0u); });
    EXPECT_EQ(cb_status(&r.cb), CB_ERR_TIMEDOUT);
    EXPECT_EQ(cb_tell64(&r.cb), 0u);
    const uint64_t seeks = r.in->counters().seeks;
    takes_ten_seconds([&] { EXPECT_EQ(r.seek(500, CB_SEEK_SET), 500); });
    EXPECT_EQ(r.in->counters().seeks - seeks, 2u) << "a block read there, the input put back";
    changeThreadType(&r.cb, 0);  // the caller's thread reads it through the synchronous ring
    EXPECT_EQ(r.take(100), r.slice(500, 100));
}
