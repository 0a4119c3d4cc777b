// The single-thread set without buffering and with the file cache.
#include <cstring>

#include "reader_fixture.h"
#include "stream_internal.h"

using namespace readertest;

namespace {

host::InputOptions unbuffered() { return options_for(Mode::None, 4096, 1 << 16); }
host::InputOptions cached(int block = 4096) { return options_for(Mode::Cache, block, 1 << 16); }

}  // namespace

// Reads, peeks and seeks of every origin against the plain file are the
// random walk of reader_equivalence_test.cc; here what it cannot see.

TEST(ReaderSingle, SeekOriginsAndFailures) {
    for (Mode m : {Mode::None, Mode::Cache}) {
        SCOPED_TRACE(mode_name(m));
        Reader r(pattern(1000), options_for(m, 64, 1 << 12));
        ASSERT_EQ(r.open(m), 0);
        r.read_vec(10);
        EXPECT_EQ(r.seek(5, 3), -1) << "unknown whence";
        EXPECT_EQ(cb_tell64(&r.cb_), 10u);
        EXPECT_EQ(cb_seek_single(&r.cb_, 300, CB_SEEK_SET), 300);
        EXPECT_EQ(r.read_vec(3), r.slice(300, 3));

        // A refused seek (to bytes no cache slot holds) leaves the reader
        // where the input really is.
        r.in_->faults().refuse_seek = true;
        EXPECT_EQ(r.seek(700, CB_SEEK_SET), -1);
        EXPECT_EQ(cb_tell64(&r.cb_), r.in_->position());
        r.in_->faults().refuse_seek = false;
        const uint64_t at = cb_tell64(&r.cb_);
        EXPECT_EQ(r.read_vec(5), r.slice(at, 5));
    }
}

TEST(ReaderUnbuffered, SeekByZeroDoesNotMoveTheInput) {
    Reader r(pattern(100), unbuffered());
    ASSERT_EQ(r.open(), 0);
    r.read_vec(30);
    const uint64_t seeks = r.in_->counters().seeks;
    EXPECT_EQ(r.seek(0, CB_SEEK_CUR), 30);
    EXPECT_EQ(r.in_->counters().seeks, seeks);
}

// An input of 7 GiB whose bytes are a function of their position.
namespace {
struct BigInput {
    struct Holder {
        cb_io_st io;
        BigInput* self;
    } h{};
    uint64_t pos = 0;
    static constexpr uint64_t kSize = 7ull << 30;
    static uint8_t at(uint64_t p) { return static_cast<uint8_t>((p * 2654435761u) >> 13); }
    BigInput() {
        h.self = this;
        h.io.read = [](cb_io_st* io, void* dst, size_t len) -> size_t {
            BigInput* b = reinterpret_cast<Holder*>(io)->self;
            size_t n = 0;
            for (; n < len && b->pos < kSize; ++n, ++b->pos) static_cast<uint8_t*>(dst)[n] = at(b->pos);
            return n;
        };
        h.io.seek = [](cb_io_st* io, cb_off_t off, int whence) -> cb_off_t {
            BigInput* b = reinterpret_cast<Holder*>(io)->self;
            const cb_off_t base = whence == CB_SEEK_SET ? 0
                                  : whence == CB_SEEK_CUR ? static_cast<cb_off_t>(b->pos)
                                                          : static_cast<cb_off_t>(kSize);
            b->pos = static_cast<uint64_t>(base + off);
            return base + off;
        };
        h.io.tell = [](cb_io_st* io) -> cb_off_t {
            return static_cast<cb_off_t>(reinterpret_cast<Holder*>(io)->self->pos);
        };
        h.io.block_size = 4096;
    }
};
}  // namespace

TEST(ReaderSingle, PositionsPastTwoGigabytes) {
    const struct {
        uint64_t pos;
        int expect32;
    } cases[] = {
        {(1ull << 31) - 1, 0x7fffffff},
        {1ull << 31, INT32_MIN},
        {(1ull << 32) + 5, 5},
        {(1ull << 32) + (1ull << 31) + 1, INT32_MIN + 1},
    };
    for (bool cache : {false, true}) {
        for (const auto& c : cases) {
            SCOPED_TRACE(testing::Message() << "cache " << cache << " pos " << c.pos);
            BigInput in;
            in.h.io.disable_cache = cache ? 0 : 1;
            host::HostCallbacks host;
            cb_buffer_st cb{};
            ASSERT_EQ(OpenURL(&cb, &in.h.io, 0, host.table()), 0);
            ASSERT_EQ(cb.cb_seek64(&cb, static_cast<cb_off_t>(c.pos), CB_SEEK_SET),
                      static_cast<cb_off_t>(c.pos));
            EXPECT_EQ(cb_tell64(&cb), c.pos);
            EXPECT_EQ(cb_tell(&cb), c.expect32);
            uint8_t b[3];
            ASSERT_EQ(cb.cb_read(&cb, b, 3), 3);
            for (int i = 0; i < 3; ++i) EXPECT_EQ(b[i], BigInput::at(c.pos + i));
            EXPECT_EQ(cb_get_file_size(&cb), BigInput::kSize);
            EXPECT_EQ(cb_tell64(&cb), 0u) << "size query leaves the reader at 0";
            CloseURL(&cb, host.table());
            EXPECT_EQ(host.outstanding_blocks(), 0u);
        }
    }
}

TEST(ReaderSingle, FileSizeOfStreamingInputIsTheHostsFigure) {
    auto o = cached();
    o.streaming = true;
    Reader r(pattern(777), o);
    ASSERT_EQ(r.open(), 0);
    r.read_vec(10);
    r.in_->io()->input_size = 12345;
    EXPECT_EQ(cb_get_file_size(&r.cb_), 12345u);
    EXPECT_EQ(cb_tell64(&r.cb_), 10u) << "no seek for a streaming input";
}

// ---- file cache ----

TEST(ReaderCache, LargeReadGoesStraightInWholeBlocksThenRefills) {
    Reader r(pattern(50000), cached(4096));
    ASSERT_EQ(r.open(), 0);
    std::vector<uint8_t> buf(10000);
    ASSERT_EQ(r.read(buf.data(), 10000), 10000);
    EXPECT_EQ(buf, r.slice(0, 10000));
    EXPECT_EQ(r.in_->counters().reads, 2u) << "one direct read of 8192, one refill";
    EXPECT_EQ(r.in_->counters().bytes_read, 8192u + 4096u);
    EXPECT_EQ(r.cb_.fs_cache.base_pos, 8192u);
    EXPECT_EQ(r.cb_.fs_cache.avail_size, 4096u);
    EXPECT_EQ(r.read_vec(2288), r.slice(10000, 2288));
    EXPECT_EQ(r.in_->counters().reads, 2u) << "served from the cache";
    EXPECT_EQ(r.in_->position(), 12288u);
    // One byte more needs the input again, at the cache's end.
    EXPECT_EQ(r.read_vec(1), r.slice(12288, 1));
    EXPECT_EQ(r.in_->counters().reads, 3u);
    EXPECT_EQ(r.cb_.fs_cache.base_pos, 12288u);
}

TEST(ReaderCache, ReadArithmeticAtBlockBoundaries) {
    // (start, size) -> input reads, cache window afterwards.
    const struct {
        uint32_t start, size;
        uint64_t reads;
        uint64_t base;
        uint32_t avail;
    } cases[] = {
        {0, 4096, 2, 4096, 4096},      // exact multiple still refills
        {0, 8192, 2, 8192, 4096},
        {0, 4095, 1, 0, 4096},
        {0, 4097, 2, 4096, 4096},
        {100, 4096, 2, 4196, 4096},
        {0, 0, 0, 0, 0},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(testing::Message() << "start " << c.start << " size " << c.size);
        Reader r(pattern(30000), cached(4096));
        ASSERT_EQ(r.open(), 0);
        if (c.start) {
            ASSERT_EQ(r.seek(c.start, CB_SEEK_SET), c.start);
        }
        const uint64_t reads0 = r.in_->counters().reads;
        EXPECT_EQ(r.read_vec(static_cast<int32_t>(c.size)), r.slice(c.start, c.size));
        EXPECT_EQ(r.in_->counters().reads - reads0, c.reads);
        EXPECT_EQ(r.cb_.fs_cache.base_pos, c.base);
        EXPECT_EQ(r.cb_.fs_cache.avail_size, c.avail);
        EXPECT_EQ(cb_status(&r.cb_), CB_ERR_OK);
    }
}

TEST(ReaderCache, EndOfInputGivesShortCountsAndEof) {
    // (file size, start, size) -> count
    const struct {
        uint32_t file, start, size, count;
    } cases[] = {
        {1000, 990, 100, 10},
        {1000, 0, 5000, 1000},    // end inside the direct part
        {8192, 0, 8192, 8192},    // exact end: ok, the refill finds nothing
        {8192, 4096, 8192, 4096},
        {1000, 1000, 1, 0},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(testing::Message() << c.file << "/" << c.start << "/" << c.size);
        Reader r(pattern(c.file), cached(4096));
        ASSERT_EQ(r.open(), 0);
        r.seek(c.start, CB_SEEK_SET);
        EXPECT_EQ(r.read_vec(static_cast<int32_t>(c.size)), r.slice(c.start, c.size));
        EXPECT_EQ(cb_status(&r.cb_), c.count < c.size ? CB_ERR_EOF : CB_ERR_OK);
        EXPECT_EQ(cb_tell64(&r.cb_), c.start + c.count);
        EXPECT_EQ(r.read_vec(1).size(), c.start + c.count < c.file ? 1u : 0u);
    }
}

TEST(ReaderCache, PeekKeepsPositionAndFillsAnotherSlot) {
    Reader r(pattern(20000), cached(4096));
    ASSERT_EQ(r.open(), 0);
    r.read_vec(4000);  // a slot holds 0..4096, position 4000
    uint8_t p[4096];
    ASSERT_EQ(r.peek(p, 300), 300);
    EXPECT_EQ(std::vector<uint8_t>(p, p + 300), r.slice(4000, 300));
    EXPECT_EQ(cb_tell64(&r.cb_), 4000u);
    // The bytes behind 4096 came into a slot of their own; the first stays.
    EXPECT_EQ(r.cb_.fs_cache.base_pos, 4096u);
    EXPECT_EQ(r.cb_.fs_cache.avail_size, 4096u);
    EXPECT_EQ(r.in_->position(), 8192u);
    const uint64_t reads = r.in_->counters().reads;
    EXPECT_EQ(r.read_vec(300), r.slice(4000, 300)) << "across both slots";
    EXPECT_EQ(r.in_->counters().reads, reads);
    EXPECT_EQ(r.seek(0, CB_SEEK_SET), 0);
    EXPECT_EQ(r.read_vec(100), r.slice(0, 100));
    EXPECT_EQ(r.in_->counters().reads, reads) << "the first slot is still there";
    // A peek of exactly one block: the input, read where the slots end.
    EXPECT_EQ(r.seek(4300, CB_SEEK_SET), 4300);
    ASSERT_EQ(r.peek(p, 4096), 4096);
    EXPECT_EQ(std::vector<uint8_t>(p, p + 4096), r.slice(4300, 4096));
    EXPECT_EQ(cb_tell64(&r.cb_), 4300u);
    EXPECT_EQ(r.read_vec(4096), r.slice(4300, 4096));
}

TEST(ReaderCache, LargePeekLeavesTheInputAtThePositionWithAnEmptyCache) {
    Reader r(pattern(20000), cached(4096));
    ASSERT_EQ(r.open(), 0);
    r.read_vec(10);
    std::vector<uint8_t> p(9000);
    ASSERT_EQ(r.peek(p.data(), 9000), 9000);
    EXPECT_EQ(p, r.slice(10, 9000));
    EXPECT_EQ(cb_tell64(&r.cb_), 10u);
    EXPECT_EQ(r.in_->position(), 10u);
    EXPECT_EQ(r.cb_.fs_cache.avail_size, 0u);
    EXPECT_EQ(r.read_vec(9000), r.slice(10, 9000));
}

TEST(ReaderCache, InBufferTestAtItsExactEdges) {
    Reader r(pattern(20000), cached(4096));
    ASSERT_EQ(r.open(), 0);
    r.seek(1000, CB_SEEK_SET);
    r.read_vec(1);  // cache 1000..5096
    ASSERT_EQ(r.cb_.fs_cache.base_pos, 1000u);
    // (whence, offset) -> inside?
    const struct {
        int whence;
        cb_off_t off;
        int out;
    } cases[] = {
        {CB_SEEK_SET, 999, 1},  {CB_SEEK_SET, 1000, 0}, {CB_SEEK_SET, 5095, 0},
        {CB_SEEK_SET, 5096, 1}, {CB_SEEK_CUR, -1, 0},   {CB_SEEK_CUR, -2, 1},
        {CB_SEEK_CUR, 4094, 0}, {CB_SEEK_CUR, 4095, 1}, {CB_SEEK_END, 0, 1},
    };
    for (const auto& c : cases) {
        EXPECT_EQ(seek_out_of_buffer(&r.cb_, c.off, c.whence), c.out)
            << "whence " << c.whence << " offset " << c.off;
    }
    const uint64_t seeks = r.in_->counters().seeks;
    EXPECT_EQ(r.seek(5095, CB_SEEK_SET), 5095);
    EXPECT_EQ(r.in_->counters().seeks, seeks) << "inside: only curpos moves";
    EXPECT_EQ(r.seek(5096, CB_SEEK_SET), 5096);
    EXPECT_EQ(r.in_->counters().seeks, seeks + 1) << "just past the cache: the input moves";
    EXPECT_EQ(r.read_vec(8), r.slice(5096, 8));
}

TEST(ReaderNoBuffer, InBufferTestIsAlwaysOutside) {
    Reader r(pattern(100), unbuffered());
    ASSERT_EQ(r.open(), 0);
    for (int whence : {CB_SEEK_SET, CB_SEEK_CUR, CB_SEEK_END})
        EXPECT_EQ(seek_out_of_buffer(&r.cb_, 0, whence), 1);
}
