// The reference host must itself be right for the plug-in's tests to mean
// anything: inputs that fail the way they are told to, exact memory
// accounting, and frame buffers that behave like the framework's.
#include <gtest/gtest.h>
#include <unistd.h>
#include <zlib.h>

#include <cstring>
#include <numeric>
#include <vector>

#include "callbacks.h"
#include "loader.h"
#include "raw_input.h"

namespace {

std::vector<uint8_t> iota_bytes(size_t n) {
    std::vector<uint8_t> v(n);
    std::iota(v.begin(), v.end(), uint8_t{0});
    return v;
}

size_t read_all(cb_io_st* io, std::vector<uint8_t>* out, size_t chunk) {
    std::vector<uint8_t> buf(chunk);
    size_t total = 0;
    for (;;) {
        size_t n = io->read(io, buf.data(), chunk);
        if (n == 0) break;
        out->insert(out->end(), buf.begin(), buf.begin() + static_cast<long>(n));
        total += n;
    }
    return total;
}

TEST(RawInput, ReadsSeeksAndTellsOverMemoryAndFile) {
    const std::vector<uint8_t> data = iota_bytes(1000);
    char path[] = "/tmp/plimo_host_XXXXXX";
    const int fd = ::mkstemp(path);
    ASSERT_GE(fd, 0);
    ASSERT_EQ(::write(fd, data.data(), data.size()), 1000);
    ::close(fd);

    auto mem = host::RawInput::from_memory(data);
    auto file = host::RawInput::from_file(path);
    ::unlink(path);
    ASSERT_TRUE(file);
    for (host::RawInput* in : {mem.get(), file.get()}) {
        cb_io_st* io = in->io();
        std::vector<uint8_t> got;
        EXPECT_EQ(read_all(io, &got, 77), 1000u);
        EXPECT_EQ(got, data);
        EXPECT_EQ(io->seek(io, -10, CB_SEEK_END), 990);
        EXPECT_EQ(io->tell(io), 990);
        EXPECT_EQ(io->seek(io, 5, CB_SEEK_CUR), 995);
        uint8_t b[16];
        EXPECT_EQ(io->read(io, b, 16), 5u);
        EXPECT_EQ(b[0], data[995]);
        EXPECT_EQ(io->seek(io, -1, CB_SEEK_SET), -1);
        EXPECT_EQ(io->seek(io, 2000, CB_SEEK_SET), 2000) << "seeking past the end is allowed";
        EXPECT_EQ(io->read(io, b, 1), 0u);
    }
    EXPECT_FALSE(host::RawInput::from_file("/nonexistent/file"));
}

TEST(RawInput, FaultsAreThoseAskedFor) {
    auto in = [](auto set) {
        auto r = host::RawInput::from_memory(iota_bytes(4096));
        set(r->faults());
        return r;
    };
    uint8_t b[1000];
    std::vector<uint8_t> got;
    auto a = in([](host::InputFaults& f) { f.end_after = 1000, f.max_read = 300; });
    EXPECT_EQ(read_all(a->io(), &got, 4096), 1000u);
    EXPECT_EQ(a->counters().reads, 5u) << "4 short reads of 300/300/300/100, then the end";
    auto r = in([](host::InputFaults& f) { f.refuse_seek = true; });
    EXPECT_EQ(r->io()->seek(r->io(), 0, CB_SEEK_SET), -1);
    auto s = in([](host::InputFaults& f) { f.fail_seeks_after = 2; });
    for (cb_off_t k : {1, 2}) EXPECT_EQ(s->io()->seek(s->io(), k, CB_SEEK_SET), k);
    EXPECT_EQ(s->io()->seek(s->io(), 3, CB_SEEK_SET), -1);
    auto f = in([](host::InputFaults& x) { x.fail_reads_after = 1; });
    EXPECT_EQ(f->io()->read(f->io(), b, 8), 8u);
    EXPECT_EQ(f->io()->read(f->io(), b, 8), 0u);
    // Network-like arrival: 100 bytes at first, 50 more per read call.
    auto g = in([](host::InputFaults& x) { x.visible_start = 100, x.grow_per_read = 50; });
    for (size_t want : {100u, 50u, 50u}) EXPECT_EQ(g->io()->read(g->io(), b, 1000), want);
    EXPECT_EQ(b[0], 150);
}

TEST(RawInput, FlagsAndOptionalOperations) {
    host::InputOptions o;
    o.block_size = 4096;
    o.streaming = true;
    o.seekable = false;
    o.use_thread = true;
    o.rbuf_mode = CBIO_APPLY_RBUF;
    o.disable_cache = true;
    o.detect_discontinuity = 1;
    auto in = host::RawInput::from_memory(iota_bytes(321), o);
    cb_io_st* io = in->io();
    EXPECT_EQ(io->block_size, 4096);
    EXPECT_EQ(io->streaming, 1);
    EXPECT_EQ(io->seekable, 0);
    EXPECT_EQ(io->use_thread, 1);
    EXPECT_EQ(io->rbuf_mode, CBIO_APPLY_RBUF);
    EXPECT_EQ(io->disable_cache, 1);
    EXPECT_EQ(io->detect_discontinuity, 1);
    EXPECT_EQ(io->input_size, 321u) << "streaming input announces its size";
    EXPECT_EQ(host::RawInput::of(io), in.get());

    in->seek_time_result = 7;
    EXPECT_EQ(io->seek_time(io, 1234), 7);
    io->discontinuity(io, 99);
    EXPECT_EQ(io->open_done(io, 1, 2, 3), 0);
    EXPECT_EQ(in->counters().seek_times, std::vector<int>{1234});
    EXPECT_EQ(in->counters().discontinuities, std::vector<cb_off_t>{99});
    EXPECT_EQ(in->counters().open_done_args, std::vector<uint32_t>{3});
    in->set_seek_time_available(false);
    EXPECT_EQ(io->seek_time, nullptr);
}

struct Host {
    host::HostCallbacks cb;
    const hova_callback_st* t = cb.table();
    void* ctx = t->context;
};

TEST(HostMemory, AccountsEveryBlockAndFailsTheNthAllocation) {
    Host h;
    void* a = h.t->malloc(h.ctx, 10);
    void* b = h.t->malloc(h.ctx, 0);
    ASSERT_TRUE(a && b);
    EXPECT_EQ(h.cb.outstanding_blocks(), 2u);
    EXPECT_EQ(h.cb.outstanding_bytes(), 10u);
    h.t->freep(h.ctx, &a);
    EXPECT_EQ(a, nullptr);
    h.t->freep(h.ctx, &a);  // freeing a null pointer is harmless
    EXPECT_EQ(h.cb.outstanding_blocks(), 1u);
    int on_stack = 0;
    void* foreign = &on_stack;
    h.t->freep(h.ctx, &foreign);
    EXPECT_EQ(h.cb.foreign_frees(), 1u);
    h.t->freep(h.ctx, &b);
    EXPECT_EQ(h.cb.outstanding_blocks(), 0u);

    h.cb.fail_malloc_at(3);
    std::vector<void*> got;
    for (int i = 0; i < 4; ++i) got.push_back(h.t->malloc(h.ctx, 8));
    EXPECT_TRUE(got[0] && got[1] && !got[2] && got[3]);
    for (void*& p : got) h.t->freep(h.ctx, &p);
    EXPECT_EQ(h.cb.outstanding_blocks(), 0u);
}

TEST(HostFrames, GrowInPlaceKeepContentAndRecordCommits) {
    Host h;
    h.cb.keep_bytes = true;
    void* buf = nullptr;
    ASSERT_EQ(h.t->stream_alloc(h.ctx, HOVA_STREAM_VIDEO, &buf, 100), 0);
    void* const first = buf;
    std::memset(buf, 0x11, 100);
    ASSERT_EQ(h.t->stream_realloc(h.ctx, HOVA_STREAM_VIDEO, &buf, 5000), 0);
    EXPECT_EQ(buf, first) << "small growth stays in place";
    std::memset(static_cast<uint8_t*>(buf) + 100, 0x22, 4900);
    ASSERT_EQ(h.t->stream_realloc(h.ctx, HOVA_STREAM_VIDEO, &buf, 1 << 20), 0);
    EXPECT_EQ(h.cb.stream_copies(), 1u);
    EXPECT_EQ(static_cast<uint8_t*>(buf)[99], 0x11);
    EXPECT_EQ(static_cast<uint8_t*>(buf)[4999], 0x22);
    ASSERT_EQ(h.t->stream_commit(h.ctx, HOVA_STREAM_VIDEO, 5000, 777, 0, 0), 0);
    const auto commits = h.cb.commits(HOVA_STREAM_VIDEO);
    ASSERT_EQ(commits.size(), 1u);
    EXPECT_EQ(commits[0].size, 5000);
    EXPECT_EQ(commits[0].pts, 777);
    EXPECT_EQ(commits[0].crc32, crc32_z(0, commits[0].bytes.data(), 5000));
    EXPECT_FALSE(h.cb.pending(HOVA_STREAM_VIDEO));
    EXPECT_EQ(h.cb.protocol_errors(), 0u);
}

TEST(HostFrames, MisuseIsRecordedAsAProtocolError) {
    Host h;
    void* buf = nullptr;
    EXPECT_NE(h.t->stream_commit(h.ctx, HOVA_STREAM_AUDIO, 1, 0, 0, 0), 0);
    EXPECT_NE(h.t->stream_realloc(h.ctx, HOVA_STREAM_AUDIO, &buf, 10), 0);
    EXPECT_EQ(buf, nullptr);
    ASSERT_EQ(h.t->stream_alloc(h.ctx, HOVA_STREAM_AUDIO, &buf, 10), 0);
    h.t->stream_commit(h.ctx, HOVA_STREAM_AUDIO, 11, 0, 0, 0);
    EXPECT_EQ(h.cb.protocol_errors(), 3u);
    h.cb.refuse_stream_alloc = true;
    buf = &h;
    EXPECT_NE(h.t->stream_alloc(h.ctx, HOVA_STREAM_AUDIO, &buf, 10), 0);
    EXPECT_EQ(buf, nullptr) << "a refused allocation stores null";
}

}  // namespace
