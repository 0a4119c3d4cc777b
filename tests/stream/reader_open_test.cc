// Opening and closing in every mode, the failure paths, and what each input
// flag combination turns into.
#include "reader_fixture.h"
#include "stream_internal.h"

using namespace readertest;

TEST(ReaderOpen, FlagsChooseTheOperationSetBufferingAndThread) {
    const struct {
        const char* what;
        uint8_t rbuf_mode;
        bool disable_cache, use_thread;
        CB_BufferType buffer;
        decltype(&cb_read_single) read;
        CB_ThreadType thread;
        size_t blocks;
    } cases[] = {
        {"none", CBIO_NO_RBUF, true, false, CB_NO_BUF, cb_read_single, CB_SINGLE_THREAD, 0},
        {"cache", CBIO_NO_RBUF, false, false, CB_FS_CACHE, cb_read_single, CB_SINGLE_THREAD, 1},
        {"odd mode caches", 7, false, false, CB_FS_CACHE, cb_read_single, CB_SINGLE_THREAD, 1},
        // Without its thread a ring is filled by the reader itself.
        {"ring", CBIO_APPLY_RBUF, false, false, CB_STREAM_RBUF, cb_read_single, CB_SINGLE_THREAD, 4},
        {"thread", CBIO_APPLY_RBUF, false, true, CB_STREAM_RBUF, cb_read_multi, CB_MULTI_THREAD, 5},
        {"es", CBIO_APPLY_ES_BUF, false, false, CB_FS_CACHE, cb_read_es_mode, CB_SINGLE_THREAD, 1},
        {"es none", CBIO_APPLY_ES_BUF, true, false, CB_NO_BUF, cb_read_es_mode, CB_SINGLE_THREAD, 0},
        // A thread needs a ring; without one the reader stays on the caller's thread.
        {"thread without ring", CBIO_NO_RBUF, false, true, CB_FS_CACHE, cb_read_single,
         CB_SINGLE_THREAD, 1},
        // A ring reader with buffering off reads the input directly.
        {"ring, cache off", CBIO_APPLY_RBUF, true, true, CB_NO_BUF, cb_read_single,
         CB_SINGLE_THREAD, 0},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        host::InputOptions o;
        o.block_size = 1024;
        o.ring_size = 8192;
        o.rbuf_mode = c.rbuf_mode;
        o.disable_cache = c.disable_cache;
        o.use_thread = c.use_thread;
        Reader r(pattern(5000), o);
        ASSERT_EQ(r.open(), 0);
        EXPECT_EQ(r.cb_.buffer_type, c.buffer);
        EXPECT_EQ(r.cb_.cb_read, c.read);
        EXPECT_EQ(r.cb_.thread_type, c.thread);
        EXPECT_EQ(r.host_.outstanding_blocks(), c.blocks);
        EXPECT_EQ(r.cb_.active_rbuf, r.cb_.srbuf);
        EXPECT_EQ(r.cb_.curpos, 0u);
        EXPECT_EQ(r.read_vec(3000), r.slice(0, 3000));
        r.close();
        EXPECT_EQ(r.host_.outstanding_blocks(), 0u);
        EXPECT_EQ(r.host_.foreign_frees(), 0u);
    }
}

TEST(ReaderOpen, EachFailedAllocationFailsCleanly) {
    for (Mode m : {Mode::Cache, Mode::SyncRing, Mode::Thread}) {
        for (uint64_t n = 1;; ++n) {
            SCOPED_TRACE(testing::Message() << mode_name(m) << " allocation " << n);
            Reader r(pattern(100), options_for(m, 64, 256));
            r.host_.fail_malloc_at(n);
            const uint64_t before = r.host_.malloc_calls();
            const int rc = r.open(m);
            const uint64_t made = r.host_.malloc_calls() - before;
            if (made < n) {
                // Every allocation of open has been failed once; this one succeeds.
                EXPECT_EQ(rc, 0);
                EXPECT_GT(n, 1u);
                break;
            }
            EXPECT_EQ(rc, -1);
            EXPECT_EQ(r.host_.outstanding_blocks(), 0u);
            EXPECT_EQ(r.host_.foreign_frees(), 0u);
        }
    }
}

TEST(ReaderOpen, RefusesBlocksTheBufferingCannotHold) {
    const struct {
        Mode mode;
        int block, ring;
    } cases[] = {
        {Mode::Cache, 0, 0},
        {Mode::Cache, -5, 0},
        {Mode::Thread, 256, 256},  // capacity 255 < block
        {Mode::SyncRing, 100, 0},
    };
    for (const auto& c : cases) {
        Reader r(pattern(10), options_for(c.mode, c.block, c.ring));
        EXPECT_EQ(r.open(c.mode), -1) << mode_name(c.mode) << " " << c.block << "/" << c.ring;
        EXPECT_EQ(r.host_.outstanding_blocks(), 0u);
    }
    Reader ok(pattern(10), options_for(Mode::Thread, 255, 256));
    EXPECT_EQ(ok.open(), 0) << "a block that just fits";
}

TEST(ReaderOpen, ChangeThreadTypeSwapsOnlyTheOperations) {
    Reader r(pattern(100), options_for(Mode::Thread, 16, 64));
    ASSERT_EQ(r.open(), 0);
    changeThreadType(&r.cb_, 0);
    EXPECT_EQ(r.cb_.cb_read, cb_read_single);
    EXPECT_EQ(r.cb_.cb_seek64, cb_seek_single64);
    EXPECT_EQ(r.cb_.thread_type, CB_MULTI_THREAD);
    EXPECT_EQ(r.cb_.buffer_type, CB_STREAM_RBUF);
    changeThreadType(&r.cb_, 1);
    EXPECT_EQ(r.cb_.cb_peek, cb_peek_multi);
    EXPECT_EQ(r.cb_.cb_seek, cb_seek_multi);
}

TEST(ReaderOpen, CloseWhileTheThreadWaitsForRoomEndsTheThread) {
    // A peek fills the ring and nobody reads: the thread waits for room.
    Reader r(pattern(100000), options_for(Mode::Thread, 64, 256));
    ASSERT_EQ(r.open(), 0);
    uint8_t p[192];
    ASSERT_EQ(r.peek(p, 192), 192);
    r.close();
    EXPECT_EQ(r.host_.outstanding_blocks(), 0u);
    EXPECT_EQ(r.cb_.thread_type, CB_SINGLE_THREAD);
}

TEST(ReaderOpen, CloseWhileTheInputStallsWaitsForTheReadToReturn) {
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
