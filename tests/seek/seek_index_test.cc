// Seeks through the simple index: where the walk starts, the start offset,
// the walks over repeated entries in both directions, and indexes that cannot
// answer (the search without index takes over on local input).
#include <gtest/gtest.h>

#include "seek_fixture.h"
#include "test_env.h"

namespace {

using seektest::Clip;
using seektest::Player;

// Every frame is a key frame (frame i at i x 100 ms in packet i), so the
// index alone decides where a seek lands. Entries are 1 s apart.
Clip every_frame_key(std::vector<uint32_t> entries) {
    Clip c;
    c.key_every = 1;
    c.index_entries = std::move(entries);
    return c;
}

const std::vector<uint32_t> kEntries = {0, 10, 20, 25, 28, 40, 40, 70, 80, 90};

TEST(IndexSeek, StartOffsetIsWorkedOutOnceFromTheFirstEntryNamingAnotherPacket) {
    // Entries 0 and 1 name packet 0; entry 2 names packet 10 (1 s): entry 0
    // stands for -1 s, and 5.5 s falls in entry 6.
    Clip c = every_frame_key({0, 0, 10, 20, 30, 40, 50, 60, 70, 80});
    testenv::LogCapture log;
    Player p(seektest::build(c));
    p.open_or_fail();
    for (int64_t target : {5500000, 3200000}) {
        int64_t t = target;
        ASSERT_EQ(seektest::seek(p, HOVA_SEEK_BACKWARD, &t), HOVA_OK);
    }
    EXPECT_EQ(p.ctx()->index_start_offset, -1000000);
    int computed = 0;
    for (const auto& l : log.lines())
        if (l.text.find("[ASF] index_start_offset") == 0) {
            ++computed;
            EXPECT_EQ(l.text,
                      "[ASF] index_start_offset -1000000, preroll 0, first non-zero pts 1000000, "
                      "packet 10, index 2, interval 1000000\n");
        }
    EXPECT_EQ(computed, 1);
    EXPECT_TRUE(log.contains("[ASF] enter asf_find_packet_by_index, index 6\n"));
    EXPECT_TRUE(log.contains("[ASF] enter asf_find_packet_by_index, index 4\n"));
    p.expect_clean_close();
}

// Entry 0's time is worked out from the first entry naming another packet;
// when that is off, the walk still answers on the asked side, or leaves the
// seek to the search without index.
TEST(IndexSeek, WalksFromTheTargetsEntryToTheNextDistinctKeyFrame) {
    // Entry 4 names packet 5 (0.5 s): entry 0 stands for -3.5 s.
    const std::vector<uint32_t> early = {0, 0, 0, 0, 5, 30, 30, 30, 60, 60};
    // Entry 2 names packet 40 (4 s): entry 0 stands for +2 s.
    const std::vector<uint32_t> late = {0, 0, 40, 40, 40, 45, 60, 70, 80, 90};
    const int B = HOVA_SEEK_BACKWARD, F = HOVA_SEEK_FORWARD;
    const struct {
        const std::vector<uint32_t>* entries;
        int dir;
        int64_t target, found, start_offset;
    } cases[] = {
        // Entry 2 (packet 20); entry 3's key frame (2.5 s) is after 2.2 s.
        {&kEntries, B, 2200000, 2000000, 0}, {&kEntries, F, 2200000, 2500000, 0},
        // Entries 3 and 4 are at or before 2.9 s: backward takes one step on,
        // forward walks on to the first one after the target.
        {&kEntries, B, 2900000, 2500000, 0}, {&kEntries, F, 2900000, 4000000, 0},
        // A key frame exactly at the target: forward passes it over.
        {&kEntries, B, 2000000, 2000000, 0}, {&kEntries, F, 2000000, 2500000, 0},
        // Entry 5 repeats in entry 6: backward stays, forward goes past the repeats.
        {&kEntries, B, 5500000, 4000000, 0}, {&kEntries, F, 5500000, 7000000, 0},
        // The last entry's interval: forward is answered by the search (9.5 s).
        {&kEntries, B, 9500000, 9000000, 0}, {&kEntries, F, 9500000, 9500000, 0},
        {&kEntries, B, -3000000, 0, 0},  // before entry 0's time: entry 0
        {&early, B, 5800000, 3000000, -3500000},  // entry 9 gives 6 s
        {&early, B, 2900000, 500000, -3500000},   // entry 6 gives 3 s
        {&early, F, 2900000, 6000000, -3500000},
        {&late, F, 5500000, 6000000, 2000000},    // entry 5 gives 4.5 s
        {&late, B, 5500000, 4000000, 2000000},
        // Before the first key frame: the search answers packet 0.
        {&early, B, -3300000, 0, -3500000},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(testing::Message() << "dir " << c.dir << " target " << c.target);
        testenv::LogCapture log;
        Player p(seektest::build(every_frame_key(*c.entries)));
        p.open_or_fail();
        int64_t t = c.target;
        ASSERT_EQ(seektest::seek(p, c.dir, &t), HOVA_OK);
        EXPECT_EQ(t, c.found);
        EXPECT_EQ(p.ctx()->index_start_offset, c.start_offset);
        // Entry 0 stands for time 0 here: the walk starts at the target's second.
        if (c.entries == &kEntries && c.target == 5500000) {
            EXPECT_TRUE(log.contains("[ASF] enter asf_find_packet_by_index, index 5\n"));
        }
        ASSERT_EQ(p.play(), HOVA_EndOfStream);
        const auto v = p.frames(HOVA_STREAM_VIDEO);
        ASSERT_FALSE(v.empty());
        EXPECT_EQ(v.front().pts, c.found);
        p.expect_clean_close();
    }
}

TEST(IndexSeek, IndexThatCannotAnswerLeavesTheSeekToTheSearch) {
    struct Case {
        const char* what;
        Clip clip;
        bool index_answers;
    };
    std::vector<Case> cases(4, Case{"", Clip{}, false});
    cases[0].what = "past the data";
    cases[0].clip.index_entries = std::vector<uint32_t>(10, 5000);
    cases[1].what = "more entries declared than the file holds";
    cases[1].clip.index_declared_count = 1000;
    cases[1].clip.cut_after_entries = 2;
    cases[2].what = "interval 0";
    cases[2].clip.index_interval_100ns = 0;
    // Every entry names packet 30: backward answers with it; forward's key
    // frame lies before the target.
    cases[3] = {"all one packet", Clip{}, true};
    cases[3].clip.index_entries = std::vector<uint32_t>(10, 30);
    for (const Case& k : cases) {
        for (int dir : {HOVA_SEEK_BACKWARD, HOVA_SEEK_FORWARD}) {
            SCOPED_TRACE(testing::Message() << k.what << ", dir " << dir);
            testenv::LogCapture log;
            Player p(seektest::build(k.clip));
            p.open_or_fail();
            int64_t t = 4550000;
            ASSERT_EQ(seektest::seek(p, dir, &t), HOVA_OK);
            if (k.index_answers && dir == HOVA_SEEK_BACKWARD) {
                EXPECT_EQ(t, 3000000);
                EXPECT_EQ(p.ctx()->index_start_offset, 0);
            } else {
                EXPECT_EQ(t, dir == HOVA_SEEK_BACKWARD ? 4000000 : 5000000);
                EXPECT_TRUE(log.contains("[ASF] seek without index, type 3\n"));
            }
            ASSERT_EQ(p.play(), HOVA_EndOfStream);
            ASSERT_FALSE(p.frames(HOVA_STREAM_VIDEO).empty());
            EXPECT_EQ(p.frames(HOVA_STREAM_VIDEO).front().pts, t);
            p.expect_clean_close();
        }
    }
}

TEST(IndexSeek, NetworkInputSeeksVideoOnlyThroughAUsableIndex) {
    host::InputOptions net;
    net.streaming = true;
    {
        // No index: not seekable, refused before the input is touched.
        Clip c;
        c.index = false;
        Player p(seektest::build(c), net);
        p.open_or_fail();
        const uint64_t reads = p.input().counters().reads, seeks = p.input().counters().seeks;
        int64_t t = 2000000;
        EXPECT_EQ(seektest::seek(p, HOVA_SEEK_BACKWARD, &t), HOVA_SeekFailed);
        EXPECT_EQ(t, 2000000);
        EXPECT_EQ(p.input().counters().reads, reads);
        EXPECT_EQ(p.input().counters().seeks, seeks);
        p.expect_clean_close();
    }
    {
        // With an index, a target the index cannot answer fails: no search.
        Clip c = every_frame_key(kEntries);
        Player p(seektest::build(c), net);
        p.open_or_fail();
        testenv::LogCapture log;
        int64_t t = 9500000;
        EXPECT_EQ(seektest::seek(p, HOVA_SEEK_FORWARD, &t), HOVA_SeekFailed);
        EXPECT_FALSE(log.contains("[ASF] seek without index, type 3\n"));
        EXPECT_TRUE(log.contains("[ASF] seek fail\n"));
        t = 2200000;
        EXPECT_EQ(seektest::seek(p, HOVA_SEEK_BACKWARD, &t), HOVA_OK);
        EXPECT_EQ(t, 2000000);
        p.expect_clean_close();
    }
    {
        // The file ends inside a run of entries repeating the target's
        // packet: the run ends with the last entry read, whose key frame
        // (2.5 s) answers a forward seek to 2.2 s.
        Clip c = every_frame_key({0, 10, 25, 25});
        c.index_declared_count = 10;
        c.cut_after_entries = 4;
        Player p(seektest::build(c), net);
        p.open_or_fail();
        int64_t t = 2200000;
        EXPECT_EQ(seektest::seek(p, HOVA_SEEK_FORWARD, &t), HOVA_OK);
        EXPECT_EQ(t, 2500000);
        ASSERT_EQ(p.play(), HOVA_EndOfStream);
        ASSERT_FALSE(p.frames(HOVA_STREAM_VIDEO).empty());
        EXPECT_EQ(p.frames(HOVA_STREAM_VIDEO).front().pts, 2500000);
        p.expect_clean_close();
    }
}

}  // namespace
