// Timestamp gap repair and drop targets.
#include <cstring>

#include "sys_pts.h"
#include "toolkit_fixture.h"

constexpr hova_stream_type_et A = HOVA_STREAM_AUDIO, V = HOVA_STREAM_VIDEO;

TEST(PtsGapRepair, KeepsTimelineContinuousAcrossJumpsOfMoreThanThirtySecondsAndLogsThem) {
    const struct { int64_t start; std::vector<std::tuple<hova_stream_type_et, int64_t, int64_t>> steps;
                   int64_t base_after; } cases[] = {
        {0, {{V, 0, 0}, {V, 30000000, 30000000}}, 0}, {0, {{V, 0, 0}, {V, 30000001, 0}}, 30000001},
        {50000000, {{A, 50000000, 50000000}, {A, 50020000, 50020000}, {A, 10000000, 50040000}},
         10000000 - 50040000},
        {0, {{A, 0, 0}, {V, 0, 0}, {A, 20000, 20000}, {V, 40000, 40000}, {A, 60000000, 40000},
             {V, 60040000, 80000}}, 60000000 - 40000},  // a gap on audio shifts video too
        {0, {{V, 0, 0}, {V, 90000000, 0}, {A, -1, -1}, {HOVA_STREAM_SUBTITLE, 90000000, 90000000}}, 90000000},
        {0, {{V, INT64_MAX, 0}, {V, INT64_MIN, int64_t(uint64_t(INT64_MIN) - INT64_MAX)}}, INT64_MAX}};
    for (const auto& c : cases) {
        sys_demuxer_st d;
        std::memset(&d, 0xA5, sizeof d);  // nothing may depend on fields the start leaves alone
        sys_set_pts_info(&d, c.start);
        for (const auto& [type, in, out] : c.steps) {
            int64_t pts = in;
            sys_update_and_fix_pts_gap(&d, &pts, type);
            EXPECT_EQ(pts, out) << "case " << (&c - cases) << " in " << in;
        }
        EXPECT_EQ(d.base_pts, c.base_after) << "case " << (&c - cases);
    }
    testenv::LogCapture log;
    sys_demuxer_st d;
    sys_set_pts_info(&d, 2000000);
    for (int64_t pts : {2040000, 99000000}) sys_update_and_fix_pts_gap(&d, &pts, V);
    EXPECT_EQ(std::make_tuple(d.last_pts[VID], d.last_dur[VID], d.last_pts[AUD], d.last_dur[AUD]),
              std::make_tuple(2080000, 40000, 2000000, -1));  // the gap moved on by the known step
    ASSERT_EQ(log.lines().size(), 2u);
    EXPECT_EQ(log.lines()[0].text + log.lines()[1].text,
              "[SYS] found pts gap for type 3, pts 99000000, orignal pts 99000000, last pts 2040000, "
              "last dur 40000\n[SYS] base change from 0 to 96920000\n");
}

TEST(DropTarget, OtherKindsDropUntilTheReaderReachesTheFirstTargetThenForgetIt) {
    sys_demuxer_st d{};
    sys_stream_st audio{}, video{};
    audio.stream_type = A, video.stream_type = V;
    sys_reset_drop_target(&audio);
    EXPECT_EQ(sys_check_drop(&d, &audio), 0) << "no target: never drop";
    video.next_pos = 42;
    for (uint64_t at : {0x100000000ull, 5ull}) {  // above 32 bits: compared in 64; first one stays
        sys_set_drop_target(V, &audio, at);
        sys_set_drop_target(V, &video, at);  // the targeted kind has none
    }
    EXPECT_EQ(video.next_pos, UINT64_MAX);
    for (const auto& [reader_at, drop] : {std::pair{0xFFFFFFFFull, 1}, {0x100000000ull, 0}, {0ull, 0}}) {
        d.cbuffer.curpos = reader_at;
        EXPECT_EQ(sys_check_drop(&d, &audio), drop) << "reader at " << reader_at;
    }
}
