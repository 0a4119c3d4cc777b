// Timestamp probes: which payloads give a time, what the time is, where the
// reader is left, and the key-frame probe by packet number.
#include <gtest/gtest.h>

#include "asf_timestamp.h"
#include "seek_fixture.h"
#include "streaming.h"

namespace {

using asfb::Bytes;
using seektest::Player;

constexpr uint32_t kPacket = 1024;

// Packet 0: an audio start, a video start without key flag, a key-flagged
// video continuation, a key frame of an inactive stream, then a key frame.
// Packet 1: audio only, compressed. Packet 2: a key frame. Preroll 150 ms.
Bytes probe_file() {
    const std::vector<asfb::Payload> p0 = {
        asfb::media(1, 1, 0, 30, 100, asfb::pattern(30, 1)),
        asfb::media(2, 1, 0, 40, 110, asfb::pattern(40, 2)),
        asfb::media(2, 2, 20, 60, 115, asfb::pattern(40, 3), true),
        asfb::media(5, 1, 0, 30, 118, asfb::pattern(30, 4), true),
        asfb::media(2, 3, 0, 40, 120, asfb::pattern(40, 5), true),
    };
    const std::vector<asfb::Payload> p1 = {
        asfb::compressed(1, 2, 200, 10, {asfb::pattern(20, 6), asfb::pattern(25, 7)})};
    const std::vector<asfb::Payload> p2 = {
        asfb::media(2, 4, 0, 40, 400, asfb::pattern(40, 8), true)};
    asfb::PacketFile f;
    f.packet_size = kPacket;
    f.preroll_ms = 150;
    f.packets = {asfb::packet(p0, kPacket), asfb::packet(p1, kPacket), asfb::packet(p2, kPacket)};
    return asfb::build_packet_file(f);
}

TEST(TimestampProbe, GivesTimesOnlyForObjectStartsOfTheWantedKind) {
    struct Case {
        hova_stream_type_et kind;
        std::vector<int64_t> times;  // per step over packets 0 and 1
    } cases[] = {
        // Audio needs no key flag; a compressed payload gives its stored time.
        {HOVA_STREAM_AUDIO, {-50000, -1, -1, -1, -1, 50000}},
        // Video: only the key-flagged object start counts; before the preroll
        // the time is negative.
        {HOVA_STREAM_VIDEO, {-1, -1, -1, -1, -30000, -1}},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.kind == HOVA_STREAM_AUDIO ? "audio" : "video");
        Player p(probe_file());
        p.open_or_fail();
        asf_demuxer_st* d = p.ctx();
        cb_buffer_st* cb = &d->s.cbuffer;
        ASSERT_EQ(cb_tell64(cb), d->first_packet);
        asf_packet_st cursor{};
        for (size_t step = 0; step < c.times.size(); ++step) {
            int64_t t = 7;
            ASSERT_EQ(get_packet_pts(d, &cursor, &t, c.kind), HOVA_OK) << "step " << step;
            EXPECT_EQ(t, c.times[step]) << "step " << step;
            // After a packet's last payload the reader is on the next packet.
            if (step == 4) {
                EXPECT_EQ(cb_tell64(cb), d->first_packet + kPacket);
            }
        }
        EXPECT_EQ(cb_tell64(cb), d->first_packet + 2 * kPacket);
        int64_t t = 7;
        ASSERT_EQ(get_packet_pts(d, &cursor, &t, c.kind), HOVA_OK);
        EXPECT_EQ(t, c.kind == HOVA_STREAM_VIDEO ? 250000 : -1);
        // The end of the input ends the probe, with no time.
        EXPECT_EQ(get_packet_pts(d, &cursor, &t, c.kind), HOVA_EndOfStream);
        EXPECT_EQ(t, -1);
        p.expect_clean_close();
    }
}

}  // namespace
