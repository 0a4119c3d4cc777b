// Resynchronisation: -1 only flushes the reader; any other time drops what
// delivery was assembling, hands the time in milliseconds to the input and
// reads on from wherever the input then stands, with or without the
// streaming thread reading ahead.
#include <gtest/gtest.h>

#include <cstring>

#include "seek_fixture.h"

namespace {

using seektest::Clip;
using seektest::Player;

TEST(Resync, FlushOnlyForMinusOneOtherwiseRestartAtTheInputsPosition) {
    struct Case {
        int64_t time;
        bool host_seek_time;
        bool flush_only;
        std::vector<int> host_gets;  // what the input's seek_time receives
    } cases[] = {
        {-1, true, true, {-1}},
        {1999, true, false, {1}},
        {-1500, true, false, {-1}},  // truncated toward zero, not a flush
        {0, true, false, {0}},
        {5000000, false, false, {}},
    };
    for (const Case& c : cases) {
        for (bool thread : {false, true}) {
            // A threaded input is moved only through its own time seek.
            if (thread && !c.host_seek_time) continue;
            SCOPED_TRACE(testing::Message()
                         << "time " << c.time << (c.host_seek_time ? "" : ", no seek_time")
                         << (thread ? ", streaming thread" : ", cache"));
            Clip clip;
            clip.index = false;  // the input ends with the data
            host::InputOptions in;
            if (thread) {
                in.rbuf_mode = CBIO_APPLY_RBUF;
                in.use_thread = true;
                in.block_size = 700;
            }
            Player p(seektest::build(clip), in, 4096);
            p.input().set_seek_time_available(c.host_seek_time);
            p.open_or_fail();
            for (int i = 0; i < 7; ++i) ASSERT_EQ(p.step(), HOVA_OK);
            ASSERT_TRUE(p.host.pending(HOVA_STREAM_VIDEO));
            asf_demuxer_st* d = p.ctx();
            const uint64_t packets = d->cur_packets;
            const asf_packet_st cursor = d->cur_data_packet;
            // The host moves its input to packet 40, as its own time seek would.
            const uint64_t moved_to = d->first_packet + 40u * 1024u;
            if (c.host_seek_time)
                p.input().time_to_position = [&](int) { return static_cast<int64_t>(moved_to); };
            else
                ASSERT_EQ(p.input().io()->seek(p.input().io(), static_cast<cb_off_t>(moved_to),
                                               CB_SEEK_SET),
                          static_cast<cb_off_t>(moved_to));
            const size_t events = p.host.events().size();

            ASSERT_EQ(hova_asff_demuxer.resync_time(d, c.time), HOVA_OK);
            EXPECT_EQ(p.input().counters().seek_times, c.host_gets);
            EXPECT_EQ(d->s.cbuffer.curpos, moved_to);
            EXPECT_EQ(d->cur_packets, packets);
            if (c.flush_only) {
                EXPECT_EQ(p.host.events().size(), events);
                EXPECT_TRUE(p.host.pending(HOVA_STREAM_VIDEO));
                EXPECT_EQ(std::memcmp(&d->cur_data_packet, &cursor, sizeof cursor), 0);
            } else {
                EXPECT_FALSE(p.host.pending(HOVA_STREAM_VIDEO));
                EXPECT_FALSE(p.host.pending(HOVA_STREAM_AUDIO));
                EXPECT_EQ(d->cur_data_packet.num_payloads, 0u);
                EXPECT_EQ(d->cur_data_packet.parsed_size, 0u);
                EXPECT_EQ(d->cur_data_packet.num, packets);
                // Delivery reads on at packet 40 and commits whole frames only.
                p.host.events().clear();
                ASSERT_EQ(p.play(), HOVA_EndOfStream);
                const auto v = p.frames(HOVA_STREAM_VIDEO);
                ASSERT_FALSE(v.empty());
                EXPECT_EQ(v.front().pts, 4000000);
            }
            p.expect_clean_close();
        }
    }
}

}  // namespace
