// Elementary-stream mode, adopting the input's position, switching buffering
// off and on, and the status table.
#include <atomic>
#include <thread>

#include "es_source.h"
#include "reader_fixture.h"
#include "stream_internal.h"
#include "streaming_app.h"

using namespace readertest;

namespace {
host::InputOptions es_options(bool disable_cache) {
    host::InputOptions o = options_for(disable_cache ? Mode::None : Mode::Cache, 256, 1024);
    o.rbuf_mode = CBIO_APPLY_ES_BUF;
    return o;
}
}  // namespace

TEST(ReaderEs, ShortReadIsTheEndOnlyAfterTheSourceSaysSo) {
    for (bool disable_cache : {true, false}) {
        Reader r(pattern(500), es_options(disable_cache));
        host::EsSource src(*r.in_);
        ASSERT_EQ(r.open(), 0);
        EXPECT_EQ(r.read_vec(600), r.data_);
        EXPECT_EQ(cb_status(&r.cb_), CB_ERR_OK) << "more may still come";
        src.set_data_end(true);
        EXPECT_EQ(r.read_vec(10).size(), 0u);
        EXPECT_EQ(cb_status(&r.cb_), CB_ERR_EOF);
    }
}

TEST(ReaderEs, PeekAsksTheSourceWithTheRawInput) {
    Reader r(pattern(500), es_options(true));
    host::EsSource src(*r.in_);
    ASSERT_EQ(r.open(), 0);
    r.read_vec(100);
    r.cb_.cb_errcode = CB_ERR_TIMEDOUT;  // must survive the peek
    uint8_t p[20];
    EXPECT_EQ(r.peek(p, 20), 20);
    EXPECT_EQ(std::vector<uint8_t>(p, p + 20), r.slice(100, 20));
    ASSERT_EQ(src.peek_objects.size(), 1u);
    EXPECT_EQ(src.peek_objects[0], r.in_->io());
    EXPECT_EQ(cb_tell64(&r.cb_), 100u);
    EXPECT_EQ(cb_status(&r.cb_), CB_ERR_TIMEDOUT);
}

TEST(ReaderEs, SeeksOnlyMoveTheInputRelatively) {
    Reader r(pattern(500), es_options(true));
    host::EsSource src(*r.in_);
    ASSERT_EQ(r.open(), 0);
    r.read_vec(100);
    EXPECT_EQ(r.seek(5, CB_SEEK_SET), 0);
    EXPECT_EQ(r.seek(-5, CB_SEEK_END), 0);
    EXPECT_EQ(r.cb_.cb_seek(&r.cb_, 50, CB_SEEK_CUR), 0);
    EXPECT_EQ(r.in_->counters().seeks, 0u);
    EXPECT_EQ(r.seek(50, CB_SEEK_CUR), 150);
    EXPECT_EQ(r.in_->counters().seeks, 1u);
    EXPECT_EQ(cb_tell64(&r.cb_), 100u) << "the reader's position stays";
}

TEST(ReaderEs, FlushClearsTheEndAndHandsTheSourceItself) {
    Reader r(pattern(50), es_options(true));
    host::EsSource src(*r.in_);
    ASSERT_EQ(r.open(), 0);
    src.set_data_end(true);
    cb_flush_es_data(&r.cb_, VIDEO_DATA);
    EXPECT_FALSE(src.data_end());
    ASSERT_EQ(src.flush_objects.size(), 1u);
    EXPECT_EQ(src.flush_objects[0], src.cbio());
    EXPECT_EQ(src.flush_types[0], VIDEO_DATA);
    // Outside elementary-stream mode nothing happens.
    r.in_->io()->rbuf_mode = CBIO_NO_RBUF;
    src.set_data_end(true);
    cb_flush_es_data(&r.cb_, ALL_DATA);
    EXPECT_TRUE(src.data_end());
    EXPECT_EQ(src.flush_objects.size(), 1u);
}

TEST(ReaderBufferMode, SwitchingOffReadsTheInputDirectlyFromThePosition) {
    Reader r(pattern(5000), options_for(Mode::Cache, 512, 1024));
    ASSERT_EQ(r.open(), 0);
    r.read_vec(100);  // the input stands at 512
    ASSERT_EQ(cb_set_buffer_mode(&r.cb_, 0), 0);
    EXPECT_EQ(r.cb_.buffer_type, CB_NO_BUF);
    EXPECT_EQ(r.in_->position(), 100u);
    const uint64_t reads = r.in_->counters().reads;
    EXPECT_EQ(r.read_vec(10), r.slice(100, 10));
    EXPECT_EQ(r.in_->counters().reads, reads + 1);
    EXPECT_EQ(r.in_->counters().bytes_read, 512u + 10u);
    ASSERT_EQ(cb_set_buffer_mode(&r.cb_, 1), 0);
    EXPECT_EQ(r.cb_.buffer_type, CB_FS_CACHE);
    EXPECT_EQ(r.read_vec(700), r.slice(110, 700));
    // A refused seek leaves everything as it was.
    r.in_->faults().refuse_seek = true;
    EXPECT_EQ(cb_set_buffer_mode(&r.cb_, 0), -1);
    EXPECT_EQ(r.cb_.buffer_type, CB_FS_CACHE);
}

TEST(ReaderBufferMode, ElementaryStreamModeAlwaysGoesUnbuffered) {
    Reader r(pattern(500), es_options(false));
    host::EsSource src(*r.in_);
    ASSERT_EQ(r.open(), 0);
    EXPECT_EQ(cb_set_buffer_mode(&r.cb_, 1), 0);
    EXPECT_EQ(r.cb_.buffer_type, CB_NO_BUF);
    EXPECT_EQ(r.in_->counters().seeks, 0u);
}

TEST(ReaderBufferMode, ThreadReaderResumesAtThePositionAfterSwitching) {
    Reader r(pattern(100000), options_for(Mode::Thread, 256, 2048));
    ASSERT_EQ(r.open(), 0);
    EXPECT_EQ(r.read_vec(1000), r.slice(0, 1000));
    for (int enable : {0, 1, 0, 1}) {
        ASSERT_EQ(cb_set_buffer_mode(&r.cb_, enable), 0);
        EXPECT_EQ(r.cb_.buffer_type, enable ? CB_STREAM_RBUF : CB_NO_BUF);
        const uint64_t at = cb_tell64(&r.cb_);
        EXPECT_EQ(r.read_vec(3000), r.slice(at, 3000)) << "the thread's set always uses the ring";
    }
}

TEST(ReaderResetCache, AdoptsTheInputPositionInEveryMode) {
    // The host moves its input by itself (by time); reset, flush and the
    // time move then take the reader there, the streaming thread running.
    enum class Op { Reset, Flush, TimeMove };
    for (Mode m : {Mode::None, Mode::Cache, Mode::SyncRing, Mode::Thread}) {
        for (Op op : {Op::Reset, Op::Flush, Op::TimeMove}) {
            SCOPED_TRACE(testing::Message() << mode_name(m) << " op " << static_cast<int>(op));
            Reader r(pattern(50000), options_for(m, 256, 1024));
            r.in_->time_to_position = [](int ms) -> int64_t { return ms == -1 ? 41000 : ms * 10; };
            ASSERT_EQ(r.open(m), 0);
            EXPECT_EQ(r.read_vec(10), r.slice(0, 10));
            uint64_t want = 0;
            switch (op) {
                case Op::Reset:
                    if (m == Mode::Thread) continue;  // only the reader may move a threaded input
                    r.in_->io()->seek(r.in_->io(), 3000, CB_SEEK_SET);
                    cb_reset_cache(&r.cb_);
                    want = 3000;
                    break;
                case Op::Flush:
                    cb_flush_data(&r.cb_);
                    want = 41000;
                    break;
                case Op::TimeMove:
                    cb_seek_time_reset(&r.cb_, 1234);
                    want = 12340;
                    break;
            }
            EXPECT_EQ(cb_tell64(&r.cb_), want);
            EXPECT_EQ(r.cb_.buffer_type,
                      m == Mode::None ? CB_NO_BUF : m == Mode::Cache ? CB_FS_CACHE : CB_STREAM_RBUF);
            EXPECT_EQ(r.read_vec(3000), r.slice(want, 3000));
        }
    }
}

TEST(ReaderResetCache, WithoutTheHostsTimeMoveTheReaderTakesTheInputWhereItStands) {
    for (bool available : {true, false}) {
        Reader r(pattern(5000), options_for(Mode::Cache, 256, 1024));
        r.in_->set_seek_time_available(available);
        ASSERT_EQ(r.open(), 0);
        r.read_vec(10);
        cb_flush_data(&r.cb_);
        cb_seek_time_reset(&r.cb_, 77);
        EXPECT_EQ(r.in_->counters().seek_times, available ? (std::vector<int>{-1, 77}) : std::vector<int>{});
        EXPECT_EQ(cb_tell64(&r.cb_), 256u) << "the input stood behind the cache";
        EXPECT_EQ(r.read_vec(10), r.slice(256, 10));
    }
}

TEST(ReaderResetCache, TimeMovesWhileTheThreadReadsLoseNothing) {
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

TEST(AppStatus, AnswersKnownSelectorsAndRejectsOthers) {
    init_app_status();
    for (int sel = RECORD_ENABLE; sel <= TIMESHIFT_FILESIZE; ++sel) EXPECT_EQ(get_app_status(sel), 0);
    app_status.ts_inst.filesize = 1234;
    app_status.time_shift_enable = 1;
    EXPECT_EQ(get_app_status(TIMESHIFT_FILESIZE), 1234);
    EXPECT_EQ(get_app_status(TIMESHIFT_ENABLE), 1);
    testing::internal::CaptureStdout();
    EXPECT_EQ(get_app_status(6), -1);
    EXPECT_EQ(testing::internal::GetCapturedStdout(), "the app status (6) is not available\n");
    init_app_status();
    EXPECT_EQ(get_app_status(TIMESHIFT_FILESIZE), 0);
    const uint8_t block[4] = {1, 2, 3, 4};
    EXPECT_EQ(RecordWrite(block, 4), 0ul);
}
