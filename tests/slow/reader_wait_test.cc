// The ten-second waits of the ring and the reader.
#include <gtest/gtest.h>

#include <chrono>
#include <vector>

#include "../stream/reader_fixture.h"
#include "stream_internal.h"

using namespace readertest;
using Clock = std::chrono::steady_clock;

namespace {
double seconds_since(Clock::time_point t0) {
    return std::chrono::duration<double>(Clock::now() - t0).count();
}
}  // namespace

TEST(RingWait, ProducerGivesUpWhenNobodyReleases) {
    std::vector<uint8_t> storage(8);
    sys_ringbuffer rb{};
    sys_ringbuffer_init(&rb, storage.data(), 8);
    const uint8_t full[7] = {};
    sys_ringbuffer_byte_write(&rb, full, 7);
    const auto t0 = Clock::now();
    EXPECT_EQ(sys_ringbuffer_walloc(&rb, 4), -2);
    const double s = seconds_since(t0);
    EXPECT_GE(s, 8.9);
    EXPECT_LE(s, 11.0);
    EXPECT_EQ(rb.wsize_req, 0);
    sys_ringbuffer_destroy(&rb);
}

TEST(ReaderWait, RingWithoutThreadTimesOutOnAnEmptyRing) {
    Reader r(pattern(1000), options_for(Mode::SyncRing, 64, 256));
    ASSERT_EQ(r.open(), 0);
    changeThreadType(&r.cb_, 1);  // the multi-thread set, and no thread to fill the ring
    const auto t0 = Clock::now();
    uint8_t b[10];
    EXPECT_EQ(r.read(b, 10), 0);
    const double s = seconds_since(t0);
    EXPECT_EQ(cb_status(&r.cb_), CB_ERR_TIMEDOUT);
    EXPECT_GE(s, 8.9);
    EXPECT_LE(s, 11.0);
    EXPECT_EQ(cb_tell64(&r.cb_), 0u);
}

TEST(ReaderWait, SeekInARingWithoutThreadStopsWaitingAndMovesTheInput) {
    Reader r(pattern(1000), options_for(Mode::SyncRing, 64, 256));
    ASSERT_EQ(r.open(), 0);
    changeThreadType(&r.cb_, 1);
    const auto t0 = Clock::now();
    EXPECT_EQ(r.seek(500, CB_SEEK_SET), 500);
    EXPECT_GE(seconds_since(t0), 8.9);
    EXPECT_EQ(r.in_->counters().seeks, 2u) << "a block read there, the input put back";
    // The caller's thread can then read it through the synchronous ring.
    changeThreadType(&r.cb_, 0);
    EXPECT_EQ(r.read_vec(100), r.slice(500, 100));
}
