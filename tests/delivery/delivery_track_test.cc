// Track selection: streams can only be switched off.
#include "delivery_fixture.h"

namespace delivery {
namespace {

std::vector<asfb::Object> objects(uint32_t n, uint32_t video_start) {
    std::vector<asfb::Object> objs;
    for (uint32_t k = 0; k < n; ++k) {
        objs.push_back({1, 40 * k, asfb::pattern(120, k)});
        objs.push_back({2, video_start + 40 * k, asfb::pattern(900, 500 + k), k % 8 == 0});
    }
    return objs;
}

TEST(Track, OnlySwitchingOffIsAccepted) {
    struct Row {
        hova_stream_type_et type;
        int index;
        int result;
        int audio, video, subtitle;  // active entries afterwards (-1 off, 1 unchanged)
    };
    const Row rows[] = {
        {HOVA_STREAM_PROG, 0, HOVA_OK, 1, 1, 1},
        {HOVA_STREAM_PROG, 1, HOVA_InvalidParam, 1, 1, 1},
        {HOVA_STREAM_AUDIO, 0, HOVA_InvalidParam, 1, 1, 1},
        {HOVA_STREAM_VIDEO, 1, HOVA_InvalidParam, 1, 1, 1},
        {HOVA_STREAM_AUDIO, -1, HOVA_OK, -1, 1, 1},
        {HOVA_STREAM_VIDEO, -1, HOVA_OK, 1, -1, 1},
        {HOVA_STREAM_SUBTITLE, -1, HOVA_OK, 1, 1, -1},
        {HOVA_STREAM_NONE, -1, HOVA_InvalidParam, 1, 1, 1},
        {HOVA_STREAM_CLIP, -1, HOVA_InvalidParam, 1, 1, 1},
    };
    for (const Row& r : rows) {
        SCOPED_TRACE(testing::Message() << r.type << " " << r.index);
        Player pl(av_file(asfb::mux(objects(2, 0), 1024), 1024));
        pl.open_or_fail();
        int before[3];
        std::copy(pl.ctx()->s.active_stream, pl.ctx()->s.active_stream + 3, before);
        before[SUB] = 5;
        pl.ctx()->s.active_stream[SUB] = 5;  // pretend a subtitle track is active
        for (int twice = 0; twice < 2; ++twice)
            EXPECT_EQ(hova_asff_demuxer.set_track(pl.ctx(), r.type, r.index, 123, HOVA_INPUT_MASTER), r.result);
        const int want[] = {r.audio, r.video, r.subtitle};
        for (int k = 0; k < 3; ++k)
            EXPECT_EQ(pl.ctx()->s.active_stream[k], want[k] == -1 ? -1 : before[k]) << k;
        pl.ctx()->s.active_stream[SUB] = -1;
        pl.expect_clean_close();
    }
}

TEST(Track, AStreamSwitchedOffGetsNoConfigurationFramesOrNotice) {
    const auto objs = objects(10, 0);
    for (hova_stream_type_et off : {HOVA_STREAM_AUDIO, HOVA_STREAM_VIDEO}) {
        SCOPED_TRACE(off);
        const hova_stream_type_et on = off == HOVA_STREAM_AUDIO ? HOVA_STREAM_VIDEO : HOVA_STREAM_AUDIO;
        Player pl(av_file(asfb::mux(objs, 1024), 1024));
        pl.open_or_fail();
        ASSERT_EQ(hova_asff_demuxer.set_track(pl.ctx(), off, -1, 0, HOVA_INPUT_MASTER), HOVA_OK);
        ASSERT_EQ(pl.play(), HOVA_EndOfStream);
        EXPECT_TRUE(pl.configs(off).empty());
        EXPECT_TRUE(pl.frames(off).empty());
        EXPECT_EQ(pl.frames(on).size(), 9u);
        for (const auto& e : pl.host.events()) EXPECT_NE(e.type, off);
        EXPECT_NE(pl.last_type, off);
        pl.expect_clean_close();
    }
}

TEST(Track, SwitchingOffDuringSeparateParsingLetsTheOtherStreamFinishWhole) {
    // Video runs 3 s ahead: separate parsing follows audio first.
    const auto objs = objects(80, 3000);
    for (hova_stream_type_et off : {HOVA_STREAM_AUDIO, HOVA_STREAM_VIDEO}) {
        for (int at_call : {3, 40}) {
            SCOPED_TRACE(testing::Message() << off << " at call " << at_call);
            const hova_stream_type_et on = off == HOVA_STREAM_AUDIO ? HOVA_STREAM_VIDEO : HOVA_STREAM_AUDIO;
            Player pl(av_file(asfb::mux(objs, 1024), 1024));
            pl.open_or_fail();
            for (int i = 0; i < at_call; ++i) ASSERT_EQ(pl.step(), HOVA_OK);
            ASSERT_EQ(pl.ctx()->parse_mode, PARSE_SEP);
            ASSERT_EQ(hova_asff_demuxer.set_track(pl.ctx(), off, -1, 0, HOVA_INPUT_MASTER), HOVA_OK);
            EXPECT_EQ(pl.ctx()->parse_mode, PARSE_SEQ);
            EXPECT_EQ(pl.ctx()->accept_stream_type, HOVA_STREAM_NONE);
            ASSERT_EQ(pl.play(), HOVA_EndOfStream);
            // The remaining stream's objects arrive once each, in order, all
            // but its last.
            const auto frames = pl.frames(on);
            ASSERT_EQ(frames.size(), 79u);
            const uint8_t stream = on == HOVA_STREAM_AUDIO ? 1 : 2;
            size_t i = 0;
            for (const auto& o : objs) {
                if (o.stream != stream || i == frames.size()) continue;
                EXPECT_EQ(frames[i].crc32, crc(o.data)) << i;
                ++i;
            }
            pl.expect_clean_close();
        }
    }
}

// A packet abandoned while separate parsing follows one stream, and a stream
// switched off in the very next breath: the remaining stream goes on from its
// own place, neither repeating what it delivered nor skipping packets.
TEST(Track, SwitchingOffRightAfterAnAbandonedPacket) {
    const auto objs = objects(80, 3000);
    std::vector<Bytes> packets = asfb::mux(objs, 1024);
    packets.insert(packets.begin() + 30,
                   asfb::damaged_packet(asfb::Damage::PaddingTooLong,
                                        {asfb::media(1, 200, 0, 10, 0, asfb::pattern(10, 1))}, 1024));
    for (hova_stream_type_et off : {HOVA_STREAM_AUDIO, HOVA_STREAM_VIDEO}) {
        SCOPED_TRACE(off);
        const hova_stream_type_et on = off == HOVA_STREAM_AUDIO ? HOVA_STREAM_VIDEO : HOVA_STREAM_AUDIO;
        Player pl(av_file(packets, 1024));
        pl.open_or_fail();
        int rc = HOVA_OK;
        for (int i = 0; i < 1000 && rc == HOVA_OK; ++i) rc = pl.step();
        ASSERT_EQ(rc, HOVA_TryAgain);
        ASSERT_EQ(pl.ctx()->parse_mode, PARSE_SEP);
        ASSERT_EQ(pl.ctx()->accept_stream_type, HOVA_STREAM_AUDIO) << "audio is behind, followed";
        ASSERT_EQ(hova_asff_demuxer.set_track(pl.ctx(), off, -1, 0, HOVA_INPUT_MASTER), HOVA_OK);
        ASSERT_EQ(pl.play(), HOVA_EndOfStream);
        // Each of the stream's objects once, in order, all but the pending last.
        const uint8_t stream = on == HOVA_STREAM_AUDIO ? 1 : 2;
        std::vector<const asfb::Object*> own;
        for (const auto& o : objs)
            if (o.stream == stream) own.push_back(&o);
        const auto frames = pl.frames(on);
        for (size_t k = 0; k < frames.size() && k < own.size(); ++k) {
            EXPECT_EQ(frames[k].pts, int64_t(own[k]->pts_ms) * 1000) << k;
            EXPECT_EQ(frames[k].crc32, crc(own[k]->data)) << k;
        }
        EXPECT_EQ(frames.size(), own.size() - 1);
        pl.expect_clean_close();
    }
}

}  // namespace
}  // namespace delivery
