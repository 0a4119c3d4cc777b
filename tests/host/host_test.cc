// The reference host's watchdogs and faults, on which every other suite relies:
// blocks counted, foreign frees and frame misuse recorded, the Nth allocation
// refused, and inputs that end and read short as told.
#include <gtest/gtest.h>

#include "callbacks.h"
#include "raw_input.h"

TEST(HostCallbacks, CountBlocksRecordMisuseAndFailAsAskedFor) {
    host::HostCallbacks cb;
    const hova_callback_st* t = cb.table();
    cb.fail_malloc_at(2);
    int on_stack = 0;
    void* got[] = {t->malloc(t->context, 8), t->malloc(t->context, 8), t->malloc(t->context, 0), &on_stack};
    EXPECT_TRUE(got[0] && !got[1] && got[2]);
    EXPECT_EQ(cb.outstanding_blocks() * 100 + cb.outstanding_bytes(), 208u);
    for (void*& p : got) t->freep(t->context, &p);
    EXPECT_EQ(cb.outstanding_blocks() * 100 + cb.foreign_frees(), 1u);
    void* buf = nullptr;
    EXPECT_NE(t->stream_commit(t->context, HOVA_STREAM_VIDEO, 1, 0, 0, 0), 0);  // nothing pending
    ASSERT_EQ(t->stream_alloc(t->context, HOVA_STREAM_VIDEO, &buf, 10), 0);
    t->stream_commit(t->context, HOVA_STREAM_VIDEO, 11, 0, 0, 0);  // more than was allocated
    EXPECT_EQ(cb.protocol_errors(), 2u);
    auto in = host::RawInput::from_memory(std::vector<uint8_t>(4096, 7));
    in->faults().end_after = 1000, in->faults().max_read = 300;
    uint8_t b[1000];
    for (size_t want : {300u, 300u, 300u, 100u, 0u}) EXPECT_EQ(in->io()->read(in->io(), b, 1000), want);
}
