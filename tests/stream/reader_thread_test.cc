// The multi-thread set over the ring the streaming thread fills, and the
// synchronous ring of the single-thread set.
#include <atomic>
#include <thread>

#include "reader_fixture.h"
#include "stream_internal.h"

using namespace readertest;

TEST(ReaderThread, ReadingToTheEndThenPastIt) {
    Reader r(pattern(10000), options_for(Mode::Thread, 512, 4096));
    ASSERT_EQ(r.open(), 0);
    EXPECT_EQ(r.read(nullptr, 0), 0);
    EXPECT_EQ(cb_status(&r.cb_), CB_ERR_OK);
    EXPECT_EQ(r.read_vec(9000), r.slice(0, 9000)) << "larger than the ring: served in pieces";
    EXPECT_EQ(r.read_vec(1000), r.slice(9000, 1000));
    EXPECT_EQ(cb_status(&r.cb_), CB_ERR_OK) << "exactly the remaining bytes";
    EXPECT_EQ(r.read_vec(10).size(), 0u);
    EXPECT_EQ(cb_status(&r.cb_), CB_ERR_EOF);
    EXPECT_EQ(cb_tell64(&r.cb_), 10000u);
}

TEST(ReaderThread, ForwardSeekInsideTheRingOnlySkips) {
    Reader r(pattern(100000), options_for(Mode::Thread, 256, 4096));
    ASSERT_EQ(r.open(), 0);
    EXPECT_EQ(r.read_vec(100), r.slice(0, 100));
    uint8_t ahead[2000];
    ASSERT_EQ(r.peek(ahead, 2000), 2000);  // the ring now holds them
    const uint64_t seeks = r.in_->counters().seeks;
    EXPECT_EQ(r.seek(1500, CB_SEEK_SET), 1500);
    EXPECT_EQ(r.seek(400, CB_SEEK_CUR), 1900);
    EXPECT_EQ(r.in_->counters().seeks, seeks);
    EXPECT_EQ(r.read_vec(50), r.slice(1900, 50));
    EXPECT_EQ(r.seek(-7, CB_SEEK_END), 1950) << "from the end: no effect";
    EXPECT_EQ(r.seek(0, 9), -1);
}

TEST(ReaderThread, SeeksMoveTheInputOnlyOutsideWhatTheRingKeeps) {
    // The ring keeps released bytes (its history) until the thread needs
    // their room: a seek back into them reads them again without the input.
    // Elsewhere a seek reads one block there and puts the input back (two
    // input seeks); reading on past that block moves the ring there.
    const struct {
        const char* what;
        size_t read_first;
        cb_off_t off;
        int whence;
        uint64_t target;
        bool moves;
    } cases[] = {
        {"back into the history", 100, 10, CB_SEEK_SET, 10, false},
        {"back by offset into the history", 100, -50, CB_SEEK_CUR, 50, false},
        {"back to the first byte kept", 1500, -1, CB_SEEK_CUR, 1499, false},
        {"back beyond the history", 6000, 10, CB_SEEK_SET, 10, true},
        {"far forward", 100, 70000, CB_SEEK_SET, 70000, true},
        {"past the end", 100, 200000, CB_SEEK_SET, 200000, true},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        Reader r(pattern(100000), options_for(Mode::Thread, 256, 2048));
        ASSERT_EQ(r.open(), 0);
        ASSERT_EQ(r.read_vec(static_cast<int32_t>(c.read_first)), r.slice(0, c.read_first));
        const uint64_t seeks = r.in_->counters().seeks;
        EXPECT_EQ(r.seek(c.off, c.whence), static_cast<cb_off_t>(c.target));
        EXPECT_EQ(r.in_->counters().seeks, seeks + (c.moves ? 2 : 0));
        EXPECT_EQ(r.read_vec(3000), r.slice(c.target, 3000));
        if (c.moves && c.target < 100000) {
            EXPECT_EQ(r.in_->counters().seeks, seeks + 3) << "the ring moved once";
        }
        EXPECT_EQ(cb_tell64(&r.cb_), std::min<uint64_t>(c.target + 3000, std::max<uint64_t>(c.target, 100000)));
    }
    // While a visit is out, the thread reads nothing more at the ring's old
    // place (over a network that would be a request of its own).
    Reader r(pattern(100000), options_for(Mode::Thread, 256, 4096));
    r.in_->faults().read_delay_us = 2000;
    ASSERT_EQ(r.open(), 0);
    r.read_vec(3000);
    r.read_vec(1000);  // held bytes: released when the seek settles, room for the thread
    ASSERT_EQ(r.seek(70000, CB_SEEK_SET), 70000);
    const uint64_t reads = r.in_->counters().reads; fprintf(stderr, "TMP reads %lu held %u\n", (unsigned long)reads, r.cb_.srbuf->pkt_cnt);
    std::this_thread::sleep_for(std::chrono::milliseconds(30));
    EXPECT_EQ(r.in_->counters().reads, reads);
    EXPECT_EQ(r.read_vec(3000), r.slice(70000, 3000));
}

TEST(ReaderThread, RefusedSeekKeepsTheBufferedBytes) {
    Reader r(pattern(100000), options_for(Mode::Thread, 256, 2048));
    ASSERT_EQ(r.open(), 0);
    r.read_vec(6000);
    r.in_->faults().refuse_seek = true;
    EXPECT_EQ(r.seek(0, CB_SEEK_SET), -1);
    EXPECT_EQ(cb_tell64(&r.cb_), 6000u);
    EXPECT_EQ(r.read_vec(3000), r.slice(6000, 3000));
}

TEST(ReaderThread, PeekShowsTheNextReadAndIsBoundedByTheRing) {
    Reader r(pattern(50000), options_for(Mode::Thread, 256, 1024));
    ASSERT_EQ(r.open(), 0);
    r.read_vec(5);
    std::vector<uint8_t> p(1024);
    EXPECT_EQ(r.peek(p.data(), 0), 0);
    EXPECT_EQ(r.peek(p.data(), 700), 700);
    EXPECT_EQ(std::vector<uint8_t>(p.begin(), p.begin() + 700), r.slice(5, 700));
    EXPECT_EQ(cb_tell64(&r.cb_), 5u);
    // The thread tops up only whole blocks: 1023 - 256 + 1 bytes are sure to come.
    EXPECT_EQ(r.peek(p.data(), 1024), 768);
    EXPECT_EQ(r.read_vec(768), std::vector<uint8_t>(p.begin(), p.begin() + 768));
}

TEST(ReaderThread, GrowingInputIsPickedUpAfterTheEnd) {
    Reader r(pattern(6000), options_for(Mode::Thread, 512, 4096));
    r.in_->faults().visible_start = 1000;
    r.in_->faults().grow_per_read = 100;
    ASSERT_EQ(r.open(), 0);
    std::vector<uint8_t> got;
    while (got.size() < 6000) {
        auto v = r.read_vec(333);
        got.insert(got.end(), v.begin(), v.end());
    }
    EXPECT_EQ(got, r.data_);
}

TEST(ReaderSyncRing, ReadsPeeksAndSeeksOnTheCallersThread) {
    Reader r(pattern(5000), options_for(Mode::SyncRing, 512, 1024));
    ASSERT_EQ(r.open(Mode::SyncRing), 0);
    EXPECT_EQ(r.read_vec(100), r.slice(0, 100));
    EXPECT_EQ(r.in_->counters().reads, 1u) << "one block topped up";
    // Measuring the input keeps what the ring holds: nothing is read twice.
    EXPECT_EQ(cb_get_file_size(&r.cb_), 5000u);
    EXPECT_EQ(r.read_vec(100), r.slice(0, 100));
    EXPECT_EQ(r.in_->counters().reads, 1u);
    uint8_t p[600];
    EXPECT_EQ(r.peek(p, 600), 600);
    EXPECT_EQ(std::vector<uint8_t>(p, p + 600), r.slice(100, 600));
    // Inside what the ring holds a forward seek consumes, and the consumed
    // bytes stay readable as history; beyond both it moves the input.
    const uint64_t seeks = r.in_->counters().seeks;
    EXPECT_EQ(r.seek(700, CB_SEEK_SET), 700);
    EXPECT_EQ(r.in_->counters().seeks, seeks);
    const cb_off_t kept = sys_ringbuffer_history(r.cb_.srbuf);
    ASSERT_GT(kept, 600);
    EXPECT_EQ(seek_out_of_buffer(&r.cb_, 700 - kept, CB_SEEK_SET), 0);
    EXPECT_EQ(seek_out_of_buffer(&r.cb_, 699 - kept, CB_SEEK_SET), 1);
    EXPECT_EQ(seek_out_of_buffer(&r.cb_, 700 + r.cb_.srbuf->pkt_cnt, CB_SEEK_SET), 0);
    EXPECT_EQ(seek_out_of_buffer(&r.cb_, 701 + r.cb_.srbuf->pkt_cnt, CB_SEEK_SET), 1);
    EXPECT_EQ(seek_out_of_buffer(&r.cb_, -kept, CB_SEEK_CUR), 0);
    EXPECT_EQ(seek_out_of_buffer(&r.cb_, -kept - 1, CB_SEEK_CUR), 1);
    EXPECT_EQ(seek_out_of_buffer(&r.cb_, r.cb_.srbuf->pkt_cnt, CB_SEEK_CUR), 0);
    EXPECT_EQ(r.seek(700 - kept, CB_SEEK_SET), 700 - kept);
    EXPECT_EQ(r.in_->counters().seeks, seeks) << "read again from the history";
    EXPECT_EQ(r.read_vec(1000), r.slice(static_cast<size_t>(700 - kept), 1000));
    r.read_vec(2500);  // byte 3 leaves the history
    EXPECT_EQ(r.seek(3, CB_SEEK_SET), 3);
    EXPECT_EQ(r.in_->counters().seeks, seeks + 2) << "a block read there, the input put back";
    EXPECT_EQ(r.read_vec(3000), r.slice(3, 3000));
    // More than the input still holds: the rest, then the end.
    EXPECT_EQ(r.read_vec(4000), r.slice(3003, 4000));
    EXPECT_EQ(cb_status(&r.cb_), CB_ERR_EOF);
    EXPECT_EQ(r.read_vec(1).size(), 0u);
    EXPECT_EQ(r.seek(-10, CB_SEEK_END), 4990);
    EXPECT_EQ(r.read_vec(20), r.slice(4990, 20));
}
