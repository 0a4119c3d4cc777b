#include <gtest/gtest.h>

#include <climits>
#include <cstring>
#include <string>
#include <vector>

#include "sys_pts.h"
#include "test_env.h"

namespace {

constexpr hova_stream_type_et A = HOVA_STREAM_AUDIO;
constexpr hova_stream_type_et V = HOVA_STREAM_VIDEO;
constexpr hova_stream_type_et S = HOVA_STREAM_SUBTITLE;

sys_demuxer_st fresh_state(int64_t start) {
    sys_demuxer_st d;
    std::memset(&d, 0xA5, sizeof d);  // nothing may depend on fields the start leaves alone
    sys_set_pts_info(&d, start);
    return d;
}

struct Step {
    hova_stream_type_et type;
    int64_t in;
    int64_t out;
};

struct GapCase {
    const char* name;
    int64_t start;
    std::vector<Step> steps;
    int64_t base_after;
};

TEST(PtsGapRepair, KeepsTimelineContinuousAcrossJumpsOfMoreThanThirtySeconds) {
    const GapCase cases[] = {
        {"step of exactly 30 s is no gap", 0, {{V, 0, 0}, {V, 30000000, 30000000}}, 0},
        {"step of 30 s + 1 us is a gap", 0, {{V, 0, 0}, {V, 30000001, 0}}, 30000001},
        {"forward jump continues with last step",
         9960000,
         {{V, 10000000, 10000000}, {V, 100000000, 10040000}, {V, 100040000, 10080000}},
         89960000},
        {"backward jump is a gap too",
         50000000,
         {{A, 50000000, 50000000}, {A, 50020000, 50020000}, {A, 10000000, 50040000}},
         10000000 - 50040000},
        {"gap before any step maps to last time", 5000000, {{A, 40000000, 5000000}}, 35000000},
        {"first frame within 30 s of the start is taken as is",
         1000000,
         {{A, 1500000, 1500000}, {A, 1520000, 1520000}},
         0},
        {"a gap on audio shifts video too",
         0,
         {{A, 0, 0}, {V, 0, 0}, {A, 20000, 20000}, {V, 40000, 40000},
          {A, 60000000, 40000}, {V, 60040000, 80000}},
         60000000 - 40000},
        {"unknown time passes untouched",
         0,
         {{A, 0, 0}, {A, 100000000, 0}, {A, -1, -1}, {A, 100020000, 20000}},
         100000000},
        {"subtitles are never rebased",
         0,
         {{V, 0, 0}, {V, 90000000, 0}, {S, 90000000, 90000000}},
         90000000},
        {"extreme timestamps wrap instead of overflowing",
         0,
         {{V, INT64_MAX, 0}, {V, INT64_MIN, static_cast<int64_t>(static_cast<uint64_t>(INT64_MIN) - INT64_MAX)}},
         INT64_MAX},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.name);
        sys_demuxer_st d = fresh_state(c.start);
        for (size_t i = 0; i < c.steps.size(); ++i) {
            int64_t pts = c.steps[i].in;
            sys_update_and_fix_pts_gap(&d, &pts, c.steps[i].type);
            EXPECT_EQ(pts, c.steps[i].out) << "step " << i;
        }
        EXPECT_EQ(d.base_pts, c.base_after);
    }
}

TEST(PtsGapRepair, RecordsLastTimeAndStepPerKind) {
    sys_demuxer_st d = fresh_state(2000000);
    EXPECT_EQ(d.seek_time, 2000000);
    for (int k = 0; k < 3; ++k) {
        EXPECT_EQ(d.last_pts[k], 2000000);
        EXPECT_EQ(d.last_dur[k], -1);
    }
    int64_t pts = 2040000;
    sys_update_and_fix_pts_gap(&d, &pts, V);
    EXPECT_EQ(d.last_pts[VID], 2040000);
    EXPECT_EQ(d.last_dur[VID], 40000);
    EXPECT_EQ(d.last_pts[AUD], 2000000);  // audio untouched
    EXPECT_EQ(d.last_dur[AUD], -1);

    // A gap keeps the step that was known and moves the time on by it.
    pts = 99000000;
    sys_update_and_fix_pts_gap(&d, &pts, V);
    EXPECT_EQ(pts, 2080000);
    EXPECT_EQ(d.last_pts[VID], 2080000);
    EXPECT_EQ(d.last_dur[VID], 40000);

    // Other kinds: entry 2 holds the raw time, entry 2's step stays reset.
    pts = 99000000;
    sys_update_and_fix_pts_gap(&d, &pts, HOVA_STREAM_ID3_METADATA);
    EXPECT_EQ(pts, 99000000);
    EXPECT_EQ(d.last_pts[2], 99000000);
    EXPECT_EQ(d.last_dur[2], -1);

    // A new timeline forgets the base.
    sys_set_pts_info(&d, 7);
    EXPECT_EQ(d.base_pts, 0);
    EXPECT_EQ(d.last_pts[VID], 7);
}

TEST(PtsGapRepair, LogsTheGapAndTheNewBase) {
    testenv::LogCapture log;
    sys_demuxer_st d = fresh_state(0);
    int64_t pts = 40000;
    sys_update_and_fix_pts_gap(&d, &pts, A);
    EXPECT_TRUE(log.lines().empty());
    pts = 100000000;
    sys_update_and_fix_pts_gap(&d, &pts, A);
    ASSERT_EQ(log.lines().size(), 2u);
    EXPECT_EQ(log.lines()[0].text,
              "[SYS] found pts gap for type 2, pts 100000000, orignal pts 100000000, last pts 40000, "
              "last dur 40000\n");
    EXPECT_EQ(log.lines()[1].text, "[SYS] base change from 0 to 99920000\n");
    EXPECT_EQ(log.lines()[0].tag, "[PLIMO]");
    EXPECT_EQ(log.lines()[0].priority, 3);
}

sys_stream_st stream_of(hova_stream_type_et type) {
    sys_stream_st s;
    std::memset(&s, 0, sizeof s);
    s.stream_type = type;
    sys_reset_drop_target(&s);
    return s;
}

TEST(DropTarget, OtherKindsKeepTheFirstTargetAndTheTargetedKindHasNone) {
    sys_stream_st audio = stream_of(A);
    sys_stream_st video = stream_of(V);
    EXPECT_EQ(audio.next_pos, UINT64_MAX);

    sys_set_drop_target(V, &audio, 1000);
    sys_set_drop_target(V, &video, 1000);
    EXPECT_EQ(audio.next_pos, 1000u);
    EXPECT_EQ(video.next_pos, UINT64_MAX);

    sys_set_drop_target(V, &audio, 5000);  // an existing target stays
    EXPECT_EQ(audio.next_pos, 1000u);

    video.next_pos = 42;
    sys_set_drop_target(V, &video, 5000);  // the targeted kind loses its target
    EXPECT_EQ(video.next_pos, UINT64_MAX);

    sys_reset_drop_target(&audio);
    EXPECT_EQ(audio.next_pos, UINT64_MAX);
}

TEST(DropTarget, DropsUntilTheReaderReachesTheTargetThenForgetsIt) {
    sys_demuxer_st d;
    std::memset(&d, 0, sizeof d);
    sys_stream_st s = stream_of(A);
    struct Probe {
        cb_fpos reader_at;
        int drop;
    };
    // No target: never drop.
    d.cbuffer.curpos = 0;
    EXPECT_EQ(sys_check_drop(&d, &s), 0);

    sys_set_drop_target(V, &s, 0x100000000ull);  // above 32 bits: compared in 64
    const Probe probes[] = {{0, 1}, {0xFFFFFFFFull, 1}, {0x100000000ull, 0}, {0, 0}};
    for (const auto& p : probes) {
        d.cbuffer.curpos = p.reader_at;
        EXPECT_EQ(sys_check_drop(&d, &s), p.drop) << "reader at " << p.reader_at;
    }
    EXPECT_EQ(s.next_pos, UINT64_MAX);
}

}  // namespace
