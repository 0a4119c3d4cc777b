// Separate parsing of badly interleaved files, the end of the data with the
// scan for a new header, and the thumbnail rule.
#include <optional>

#include "asf_internal.h"
#include "asf_modes.h"
#include "asf_packet.h"
#include "delivery_fixture.h"
#include "test_env.h"

namespace delivery {
namespace {

// Audio objects at a_start + 40k ms and video objects at v_start + 40k ms,
// n of each, alternating in the file (audio first).
std::vector<asfb::Object> skewed(uint32_t n, uint32_t a_start, uint32_t v_start) {
    std::vector<asfb::Object> objs;
    for (uint32_t k = 0; k < n; ++k) {
        objs.push_back({1, a_start + 40 * k, asfb::pattern(150 + k % 13, k)});
        objs.push_back({2, v_start + 40 * k, asfb::pattern(700 + 37 * (k % 7), 1000 + k), k % 10 == 0});
    }
    return objs;
}

// Every object of each stream but its last arrives, whole, in order.
void expect_all_but_last(const Player& pl, const std::vector<asfb::Object>& objs) {
    for (uint8_t stream : {1, 2}) {
        std::vector<const asfb::Object*> want;
        for (const auto& o : objs)
            if (o.stream == stream) want.push_back(&o);
        const auto frames = pl.frames(stream == 1 ? HOVA_STREAM_AUDIO : HOVA_STREAM_VIDEO);
        ASSERT_EQ(frames.size(), want.size() - 1) << "stream " << int(stream);
        for (size_t i = 0; i < frames.size(); ++i) {
            EXPECT_EQ(frames[i].crc32, crc(want[i]->data)) << "stream " << int(stream) << " object " << i;
            EXPECT_EQ(frames[i].pts, int64_t(want[i]->pts_ms) * 1000);
        }
    }
}

TEST(Interleave, SwitchesWhenStreamsAreMoreThanTwoSecondsApart) {
    struct Row {
        uint32_t video_ms;
        bool streaming;
        bool switches;
    };
    const Row rows[] = {{12500, false, true}, {12000, false, false}, {12001, false, true},
                        {12500, true, false}, {7500, false, true}};
    for (const Row& r : rows) {
        SCOPED_TRACE(testing::Message() << "video at " << r.video_ms << " streaming " << r.streaming);
        // Audio 9960, 10000, ... ms; video video_ms, +40, ...: after the first
        // object the audio stream stands at 10.0 s.
        const auto objs = skewed(30, 9960, r.video_ms);
        host::InputOptions in;
        in.streaming = r.streaming;
        Player pl(av_file(asfb::mux(objs, 1024), 1024), in);
        testenv::LogCapture log;
        pl.open_or_fail();
        ASSERT_EQ(pl.step(), HOVA_OK);
        ASSERT_EQ(pl.ctx()->parse_mode, PARSE_SEQ);
        ASSERT_EQ(pl.step(), HOVA_OK);
        EXPECT_EQ(pl.ctx()->parse_mode, r.switches ? PARSE_SEP : PARSE_SEQ);
        if (r.switches) {
            const std::string msg = "bad interleaved ASF detected, switch to index base, v " +
                                    std::to_string(int64_t(r.video_ms) * 1000) + ", a 10000000";
            EXPECT_TRUE(log.contains(msg)) << msg;
            // The stream that is behind is followed.
            EXPECT_EQ(pl.ctx()->accept_stream_type,
                      r.video_ms > 10000 ? HOVA_STREAM_AUDIO : HOVA_STREAM_VIDEO);
        }
        ASSERT_EQ(pl.play(), HOVA_EndOfStream);
        expect_all_but_last(pl, objs);
        pl.expect_clean_close();
    }
}

TEST(Interleave, SeparateParsingFollowsTheStreamBehindAndAudioOnEqualTimes) {
    const auto objs = skewed(30, 0, 3000);
    Player pl(av_file(asfb::mux(objs, 1024), 1024));
    pl.open_or_fail();
    asf_demuxer_st* d = pl.ctx();
    asf_stream_st* a = &d->stream_info[d->s.active_stream[AUD]];
    asf_stream_st* v = &d->stream_info[d->s.active_stream[VID]];
    d->parse_mode = PARSE_SEP;
    reset_data_packet(&a->cache_data_packet, 0);
    reset_data_packet(&v->cache_data_packet, 3);
    d->accept_stream_type = HOVA_STREAM_AUDIO;
    struct Row {
        int64_t a_pts, v_pts;
        hova_stream_type_et want;
        uint64_t packet;
    };
    const Row rows[] = {{5000, 4000, HOVA_STREAM_VIDEO, 3},
                        {5000, 5000, HOVA_STREAM_AUDIO, 0},
                        {5000, 5001, HOVA_STREAM_AUDIO, 0},
                        {-1, 7, HOVA_STREAM_AUDIO, 0},
                        {9, -1, HOVA_STREAM_VIDEO, 3}};
    for (const Row& r : rows) {
        SCOPED_TRACE(testing::Message() << r.a_pts << " " << r.v_pts);
        a->pts = r.a_pts;
        v->pts = r.v_pts;
        asf_follow_stream_behind(d);
        EXPECT_EQ(d->accept_stream_type, r.want);
        EXPECT_EQ(d->cur_packets, r.packet);
        EXPECT_EQ(d->s.cbuffer.curpos, d->first_packet + r.packet * d->packet_size);
    }
    pl.expect_clean_close();
}

TEST(Interleave, VideoRunningOffTheEndResumesAudioAndStaysSequential) {
    // Video is behind in time all along, so it is followed and reaches the
    // end of the data first; audio then finishes from its own cursor.
    const auto objs = skewed(60, 3000, 0);
    Player pl(av_file(asfb::mux(objs, 1024), 1024));
    pl.open_or_fail();
    bool saw_sep = false;
    for (int i = 0; i < 10000; ++i) {
        const int rc = pl.step();
        saw_sep |= pl.ctx()->parse_mode == PARSE_SEP;
        if (pl.ctx()->parse_file_end) {
            EXPECT_EQ(pl.ctx()->parse_mode, PARSE_SEQ);
            EXPECT_EQ(pl.ctx()->accept_stream_type, HOVA_STREAM_AUDIO);
        }
        if (rc == HOVA_EndOfStream) break;
    }
    EXPECT_TRUE(saw_sep);
    EXPECT_EQ(pl.ctx()->parse_file_end, 1);
    expect_all_but_last(pl, objs);
    pl.expect_clean_close();
}

TEST(EndOfData, ScansForANewHeaderWhenTheInputAsksForIt) {
    asfb::PacketFile f;
    f.video = false;
    f.packet_size = 512;
    f.packets = asfb::mux({{1, 0, asfb::pattern(100, 1)}, {1, 40, asfb::pattern(100, 2)}}, 512);
    Bytes junk(100, 0x33);
    Bytes next = asfb::build_packet_file(f);
    Bytes file = asfb::build_packet_file(f);
    const size_t data_end = file.size();
    file.insert(file.end(), junk.begin(), junk.end());
    file.insert(file.end(), next.begin(), next.end());
    struct Row {
        int detect;
        int64_t clock_step;
        std::vector<cb_off_t> want;
    };
    const Row rows[] = {{0, 0, {}},
                        {1, 0, {static_cast<cb_off_t>(data_end + 100)}},
                        {1, 4000000, {}}};  // the host clock runs past the 3 s budget
    for (const Row& r : rows) {
        SCOPED_TRACE(testing::Message() << r.detect << " " << r.clock_step);
        host::InputOptions in;
        in.detect_discontinuity = r.detect;
        Player pl(file, in);
        testenv::LogCapture log;
        pl.open_or_fail();
        pl.host.clock_step_us = r.clock_step;
        ASSERT_EQ(pl.play(), HOVA_EndOfStream);
        EXPECT_EQ(pl.input().counters().discontinuities, r.want);
        EXPECT_EQ(log.contains("asf_detect_discontinuity timed out"), r.clock_step != 0);
        if (!r.want.empty()) {
            EXPECT_TRUE(log.contains("detect discontinuity at " + std::to_string(r.want[0])));
        }
        // Whatever the scan found, the stream ends with the audio notice.
        const auto notes = pl.of_kind(EventKind::Notify);
        ASSERT_EQ(notes.size(), 1u);
        EXPECT_EQ(notes[0].type, HOVA_STREAM_AUDIO);
        EXPECT_EQ(pl.frames(HOVA_STREAM_AUDIO).size(), 1u);
        pl.expect_clean_close();
    }
}

// A recorded live stream: packet count 0 in the file properties. The packets
// are counted from the data object's size, else from the input's size (whole
// packets), else delivery goes on until the input ends, in either parsing
// mode. Every buffering mode plays every object but each stream's last, and a
// seek either lands on a key frame on its side of the target or fails.
TEST(EndOfData, UncountedPacketsPlayToTheEndOfTheInputInEveryMode) {
    const auto interleaved = skewed(30, 0, 40);
    const auto apart = skewed(30, 0, 3000);  // separate parsing
    // Half a packet at the end: objects of its own, cut short.
    Bytes half = asfb::packet({asfb::media(1, 99, 0, 300, 5000, asfb::pattern(300, 9)),
                               asfb::media(2, 99, 0, 600, 5000, asfb::pattern(600, 9), true)},
                              1024);
    half.resize(512);
    const struct {
        const char* what;
        const std::vector<asfb::Object>* objs;
        std::optional<uint64_t> data_size;
        bool cut;
        bool broadcast = true;
    } files[] = {
        {"data object counts the packets", &interleaved, std::nullopt, false},
        {"data object size 50", &interleaved, 50, false},
        {"data object size 50, half a packet at the end", &interleaved, 50, true},
        {"data object size 50, separate parsing", &apart, 50, false},
        {"not broadcast: a duration to interpolate over", &interleaved, 50, false, false},
    };
    const struct {
        const char* what;
        bool disable_cache, ring, thread, streaming;
    } modes[] = {{"cache", false, false, false, false}, {"none", true, false, false, false},
                 {"ring", false, true, false, false},   {"ring+thread", false, true, true, false},
                 {"streaming", false, false, false, true}};
    for (const auto& f : files) {
        asfb::PacketFile pf;
        pf.packets = asfb::mux(*f.objs, 1024);
        if (f.cut) pf.packets.push_back(half);
        pf.packet_count = 0;
        pf.broadcast = f.broadcast;
        pf.data_object_size = f.data_size;
        const Bytes bytes = asfb::build_packet_file(pf);
        for (const auto& m : modes) {
            SCOPED_TRACE(testing::Message() << f.what << ", " << m.what);
            host::InputOptions in;
            in.disable_cache = m.disable_cache;
            in.rbuf_mode = m.ring ? CBIO_APPLY_RBUF : CBIO_NO_RBUF;
            in.use_thread = m.thread;
            in.streaming = m.streaming;
            {
                Player pl(bytes, in);
                pl.open_or_fail();
                if (f.broadcast) {
                    EXPECT_EQ(pl.ctx()->s.duration, 0);
                }
                ASSERT_EQ(pl.play(), HOVA_EndOfStream);
                // Half a packet may complete the last whole objects, never
                // more: its own objects stay pending.
                for (uint8_t stream : {1, 2}) {
                    std::vector<const asfb::Object*> want;
                    for (const auto& o : *f.objs)
                        if (o.stream == stream) want.push_back(&o);
                    const auto frames = pl.frames(stream == 1 ? HOVA_STREAM_AUDIO : HOVA_STREAM_VIDEO);
                    ASSERT_GE(frames.size(), want.size() - 1) << int(stream);
                    ASSERT_LE(frames.size(), want.size() - (f.cut ? 0 : 1)) << int(stream);
                    for (size_t i = 0; i < frames.size(); ++i) {
                        EXPECT_EQ(frames[i].crc32, crc(want[i]->data)) << int(stream) << " " << i;
                        EXPECT_EQ(frames[i].pts, int64_t(want[i]->pts_ms) * 1000);
                    }
                }
                EXPECT_EQ(pl.of_kind(EventKind::Notify).size(), 2u) << "end events once each";
                pl.expect_clean_close();
            }
            for (int dir : {HOVA_SEEK_BACKWARD, HOVA_SEEK_FORWARD}) {
                Player pl(bytes, in);
                pl.open_or_fail();
                const int64_t target = int64_t((*f.objs)[1].pts_ms) * 1000 + 610000;
                int64_t t = target;
                const int rc = hova_asff_demuxer.seek_time(pl.ctx(), dir, &t, 0);
                if (rc == HOVA_OK) {
                    EXPECT_TRUE(dir == HOVA_SEEK_BACKWARD ? t <= target : t >= target) << t;
                    EXPECT_EQ(pl.play(), HOVA_EndOfStream);
                    const auto v = pl.frames(HOVA_STREAM_VIDEO);
                    ASSERT_FALSE(v.empty());
                    EXPECT_EQ(v.front().pts, t);
                    bool key = false;
                    for (const auto& o : *f.objs) key |= o.stream == 2 && o.key && int64_t(o.pts_ms) * 1000 == t;
                    EXPECT_TRUE(key) << t << " is no key frame";
                } else {
                    EXPECT_EQ(rc, HOVA_SeekFailed);
                }
                pl.expect_clean_close();
            }
        }
    }
}

TEST(Thumbnail, DeliversKeyFramesSpacedByTheInterval) {
    struct Obj {
        uint32_t ms;
        bool key;
    };
    const Obj objs[] = {{0, true},    {1000, false}, {2000, true},  {4000, true},  {6000, true},
                        {7000, false}, {12000, true}, {13000, true}};
    std::vector<asfb::Object> list;
    for (size_t i = 0; i < std::size(objs); ++i)
        list.push_back({2, objs[i].ms, asfb::pattern(600, static_cast<uint32_t>(i)), objs[i].key});
    asfb::PacketFile f;
    f.audio = false;
    f.packets = asfb::mux(list, 1024);
    for (int64_t interval : {int64_t{5000000}, int64_t{-1}}) {
        SCOPED_TRACE(interval);
        Player pl(asfb::build_packet_file(f));
        pl.open_or_fail();
        ASSERT_EQ(hova_asff_demuxer.set_multi_thumb(pl.ctx(), interval), HOVA_OK);
        ASSERT_EQ(pl.play(), HOVA_EndOfStream);
        std::vector<int64_t> got;
        for (const auto& e : pl.frames(HOVA_STREAM_VIDEO)) got.push_back(e.pts / 1000000);
        const std::vector<int64_t> want =
            interval == -1 ? std::vector<int64_t>{0, 1, 2, 4, 6, 7, 12} : std::vector<int64_t>{0, 6, 12};
        EXPECT_EQ(got, want);
        pl.expect_clean_close();
    }
}

TEST(Thumbnail, RuleFollowsKeyFramesTimesAndTheLastDeliveredFrame) {
    Player pl(av_file(asfb::mux(skewed(2, 0, 0), 1024), 1024));
    pl.open_or_fail();
    asf_demuxer_st* d = pl.ctx();
    asf_stream_st* v = &d->stream_info[d->s.active_stream[VID]];
    struct Row {
        int64_t interval, last;
        hova_stream_type_et type;
        int key;
        int64_t pts;
        int drop;
    };
    const Row rows[] = {
        {-1, 0, HOVA_STREAM_VIDEO, 0, 5, 0},          // mode off
        {100, 0, HOVA_STREAM_AUDIO, 0, 5, 0},         // audio is never dropped
        {100, 0, HOVA_STREAM_VIDEO, 0x80, -1, 1},     // unknown time
        {100, -1, HOVA_STREAM_VIDEO, 0, 5, 0},        // first after a reset
        {100, 0, HOVA_STREAM_VIDEO, 0, 500, 1},       // not a key frame
        {100, 0, HOVA_STREAM_VIDEO, 0x80, 99, 1},     // too close
        {100, 0, HOVA_STREAM_VIDEO, 0x80, 100, 0},
    };
    for (const Row& r : rows) {
        d->s.thumbnail_interval = r.interval;
        v->s.last_thumbnail_pts = r.last;
        EXPECT_EQ(asf_need_drop_frame(d, r.type, r.key, r.pts), r.drop) << r.pts << " " << r.last;
    }
    d->s.thumbnail_interval = -1;
    pl.expect_clean_close();
}

}  // namespace
}  // namespace delivery
