// Seeks without an index: the interpolated first probe, the scan in both
// directions, exact matches, the turn back to packet 0, and audio-only files
// on local and network input.
#include <gtest/gtest.h>

#include "seek_fixture.h"
#include "test_env.h"

namespace {

using seektest::Clip;
using seektest::Player;

Clip no_index() {
    Clip c;
    c.index = false;
    return c;
}

// Raw input positions of the reads a seek makes (no reader buffering, so
// each of the reader's reads is one input read at its own position).
struct ReadLog {
    std::vector<uint64_t> positions;
    void attach(Player& p) {
        p.input().faults().before_read = [this](uint64_t pos, size_t) { positions.push_back(pos); };
    }
};

host::InputOptions unbuffered() {
    host::InputOptions in;
    in.disable_cache = true;
    return in;
}

TEST(SearchWithoutIndex, FindsTheNearestObjectStartInTheAskedDirection) {
    Clip late_key = no_index();
    late_key.key_first = 5;  // key frames at 0.5 s, 1.5 s, ...
    Clip audio_only = no_index();
    audio_only.video = false;
    Clip sparse_keys = no_index();
    sparse_keys.packets = 40;
    sparse_keys.key_every = 20;
    sparse_keys.play_duration_100ns = 30000000;  // 3 s: 1.8 s interpolates past packet 20
    struct Case {
        const char* what;
        Clip clip;
        int dir;
        int64_t target;
        int rc;
        int64_t found;
    } cases[] = {
        {"between key frames", no_index(), HOVA_SEEK_BACKWARD, 2350000, HOVA_OK, 2000000},
        {"between key frames", no_index(), HOVA_SEEK_FORWARD, 2350000, HOVA_OK, 3000000},
        {"exact", no_index(), HOVA_SEEK_BACKWARD, 3000000, HOVA_OK, 3000000},
        {"exact", no_index(), HOVA_SEEK_FORWARD, 3000000, HOVA_OK, 3000000},
        // Probes that start after the last key frame (packet 90) meet nothing
        // up to the end: backward finds that key frame by walking back,
        // forward has nothing to find.
        {"past the end", no_index(), HOVA_SEEK_BACKWARD, 60000000, HOVA_OK, 9000000},
        {"past the end", no_index(), HOVA_SEEK_FORWARD, 60000000, HOVA_SeekFailed, 60000000},
        {"after the last key frame", no_index(), HOVA_SEEK_BACKWARD, 9200000, HOVA_OK, 9000000},
        {"after the last key frame", no_index(), HOVA_SEEK_FORWARD, 9200000, HOVA_SeekFailed,
         9200000},
        // Key frames at 0 and 2 s only: narrowing probes between them run to
        // the end of the data and end the range there.
        {"two key frames", sparse_keys, HOVA_SEEK_BACKWARD, 1807000, HOVA_OK, 0},
        {"two key frames", sparse_keys, HOVA_SEEK_FORWARD, 1807000, HOVA_OK, 2000000},
        {"two key frames", sparse_keys, HOVA_SEEK_BACKWARD, 3700000, HOVA_OK, 2000000},
        // Nothing at or before the target: the scan reaches packet 0, which
        // is reported with time 0.
        {"before the first key frame", late_key, HOVA_SEEK_BACKWARD, 200000, HOVA_OK, 0},
        {"before the first key frame", late_key, HOVA_SEEK_FORWARD, 200000, HOVA_OK, 500000},
        {"negative target", no_index(), HOVA_SEEK_FORWARD, -700000, HOVA_OK, 0},
        // Audio: every object start counts.
        {"audio", audio_only, HOVA_SEEK_BACKWARD, 2350000, HOVA_OK, 2300000},
        {"audio", audio_only, HOVA_SEEK_FORWARD, 2350000, HOVA_OK, 2400000},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(testing::Message() << c.what << ", dir " << c.dir);
        Player p(seektest::build(c.clip));
        p.open_or_fail();
        int64_t t = c.target;
        ASSERT_EQ(seektest::seek(p, c.dir, &t), c.rc);
        EXPECT_EQ(t, c.found);
        if (c.rc == HOVA_OK) {
            ASSERT_EQ(p.play(), HOVA_EndOfStream);
            const auto kind = c.clip.video ? HOVA_STREAM_VIDEO : HOVA_STREAM_AUDIO;
            const auto f = p.frames(kind);
            ASSERT_FALSE(f.empty());
            EXPECT_EQ(f.front().pts, c.found);
        }
        p.expect_clean_close();
    }
}

// Network audio takes the first object after that one probe, either way.
TEST(SearchWithoutIndex, FirstProbeIsInterpolatedFromTheDuration) {
    struct Case {
        const char* what;
        uint32_t packets;
        std::optional<uint64_t> duration_100ns;
        bool broadcast, network;
        int dir;
        int64_t target;
        uint64_t first_packet_read;
        int64_t found;
    } cases[] = {
        // 100 s over 1000 packets: 25 s lies at packet 250.
        {"quarter", 1000, 1000000000, false, false, HOVA_SEEK_BACKWARD, 25000000, 250, 25000000},
        {"beyond the duration", 1000, 1000000000, false, false, HOVA_SEEK_BACKWARD, 500000000,
         999, 99000000},
        // Without a duration the search starts at packet 0.
        {"no duration", 200, {}, true, false, HOVA_SEEK_BACKWARD, 5000000, 0, 5000000},
        // 2.35 s of 10 s over 100 packets: packet 23.
        {"network audio", 100, {}, false, true, HOVA_SEEK_BACKWARD, 2350000, 23, 2300000},
        {"network audio", 100, {}, false, true, HOVA_SEEK_FORWARD, 2350000, 23, 2300000},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        Clip clip = no_index();
        clip.packets = c.packets;
        if (c.duration_100ns || c.broadcast) clip.play_duration_100ns = c.duration_100ns;
        clip.broadcast = c.broadcast;
        clip.video = !c.network;
        host::InputOptions in = unbuffered();
        in.streaming = c.network;
        Player p(seektest::build(clip), in);
        p.open_or_fail();
        ReadLog reads;
        reads.attach(p);
        int64_t t = c.target;
        const int rc = seektest::seek(p, c.dir, &t);
        ASSERT_FALSE(reads.positions.empty());
        const uint64_t first = p.ctx()->first_packet;
        EXPECT_EQ(reads.positions.front(), first + uint64_t{1024} * c.first_packet_read);
        if (c.network) {
            EXPECT_EQ(rc, HOVA_OK);
            EXPECT_EQ(t, c.found);
            EXPECT_LE(reads.positions.back(), first + 24u * 1024u);
        }
        p.expect_clean_close();
    }
}

TEST(SearchWithoutIndex, TimeZeroGoesToPacketZeroWithoutProbing) {
    for (bool index : {false, true}) {
        SCOPED_TRACE(index ? "with index" : "without index");
        Clip c;
        c.index = index;
        Player p(seektest::build(c), unbuffered());
        p.open_or_fail();
        for (int i = 0; i < 30; ++i) p.step();
        testenv::LogCapture log;
        ReadLog reads;
        reads.attach(p);
        int64_t t = 0;
        ASSERT_EQ(seektest::seek(p, HOVA_SEEK_FORWARD, &t), HOVA_OK);
        EXPECT_EQ(t, 0);
        EXPECT_TRUE(reads.positions.empty());
        EXPECT_FALSE(log.contains("[ASF] seek without index, type 3\n"));
        EXPECT_EQ(p.ctx()->cur_packets, 0u);
        p.host.events().clear();
        ASSERT_EQ(p.play(), HOVA_EndOfStream);
        EXPECT_EQ(p.frames(HOVA_STREAM_VIDEO).front().pts, 0);
        EXPECT_EQ(p.frames(HOVA_STREAM_AUDIO).front().pts, 0);
        p.expect_clean_close();
    }
}

}  // namespace
