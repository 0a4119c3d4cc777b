// The reference host must itself be right for the plug-in's tests to mean
// anything: inputs that fail the way they are told to, exact memory
// accounting, and frame buffers whose misuse is recorded.
#include <gtest/gtest.h>

#include <numeric>

#include "callbacks.h"
#include "raw_input.h"

namespace {

std::unique_ptr<host::RawInput> input(void (*set)(host::InputFaults&)) {
    std::vector<uint8_t> v(4096);
    std::iota(v.begin(), v.end(), uint8_t{0});
    auto r = host::RawInput::from_memory(v);
    set(r->faults());
    return r;
}

TEST(RawInput, ReadsSeeksAndFailsAsAskedFor) {
    uint8_t b[1000];
    auto a = input([](host::InputFaults& f) { f.end_after = 1000, f.max_read = 300; });
    cb_io_st* io = a->io();
    for (size_t want : {300u, 300u, 300u, 100u, 0u}) EXPECT_EQ(io->read(io, b, 1000), want);
    EXPECT_EQ(io->seek(io, -10, CB_SEEK_END), 4086) << "end_after ends reads only";
    EXPECT_EQ(io->seek(io, 5, CB_SEEK_CUR) + io->seek(io, -1, CB_SEEK_SET), 4090);
    auto r = input([](host::InputFaults& f) { f.refuse_seek = true; });
    EXPECT_EQ(r->io()->seek(r->io(), 0, CB_SEEK_SET), -1);
    auto s = input([](host::InputFaults& f) { f.fail_seeks_after = 1; });
    EXPECT_EQ(s->io()->seek(s->io(), 7, CB_SEEK_SET), 7);
    EXPECT_EQ(s->io()->seek(s->io(), 8, CB_SEEK_SET), -1);
    auto f = input([](host::InputFaults& x) { x.fail_reads_after = 1; });
    EXPECT_EQ(f->io()->read(f->io(), b, 8), 8u);
    EXPECT_EQ(f->io()->read(f->io(), b, 8), 0u);
}

TEST(HostCallbacks, AccountBlocksFailTheNthAllocationAndRecordFrameMisuse) {
    host::HostCallbacks cb;
    const hova_callback_st* t = cb.table();
    cb.fail_malloc_at(3);
    std::vector<void*> got;
    for (size_t i = 0; i < 4; ++i) got.push_back(t->malloc(t->context, 8 * i));
    EXPECT_TRUE(got[0] && got[1] && !got[2] && got[3]);
    EXPECT_EQ(cb.outstanding_blocks() * 100 + cb.outstanding_bytes(), 332u);
    int on_stack = 0;
    got.push_back(&on_stack);
    for (void*& p : got) t->freep(t->context, &p);
    EXPECT_EQ(std::make_tuple(cb.outstanding_blocks(), cb.foreign_frees(), got[0]),
              std::make_tuple(size_t{0}, uint64_t{1}, nullptr));
    void* buf = nullptr;
    EXPECT_NE(t->stream_commit(t->context, HOVA_STREAM_VIDEO, 1, 0, 0, 0), 0);  // nothing pending
    ASSERT_EQ(t->stream_alloc(t->context, HOVA_STREAM_VIDEO, &buf, 10), 0);
    t->stream_commit(t->context, HOVA_STREAM_VIDEO, 11, 0, 0, 0);  // more than was allocated
    EXPECT_EQ(cb.protocol_errors(), 2u);
    cb.refuse_stream_alloc = true;
    EXPECT_NE(t->stream_alloc(t->context, HOVA_STREAM_AUDIO, &buf, 10), 0);
    EXPECT_EQ(buf, nullptr) << "a refused allocation stores null";
}

}  // namespace
