// Timestamp gap repair, drop targets, and the host services: the configuration
// record, the one-shot frame, and the wrappers passing the host's answers through.
#include <climits>
#include <cstring>

#include "sys_pts.h"
#include "test_env.h"
#include "toolkit_fixture.h"

namespace {

using tkb::Bytes;
constexpr hova_stream_type_et A = HOVA_STREAM_AUDIO, V = HOVA_STREAM_VIDEO;
constexpr hova_stream_type_et S = HOVA_STREAM_SUBTITLE;

struct Step {
    hova_stream_type_et type;
    int64_t in, out;
};

TEST(PtsGapRepair, KeepsTimelineContinuousAcrossJumpsOfMoreThanThirtySecondsAndLogsThem) {
    const struct {
        int64_t start;
        std::vector<Step> steps;
        int64_t base_after;
    } cases[] = {
        {0, {{V, 0, 0}, {V, 30000000, 30000000}}, 0}, {0, {{V, 0, 0}, {V, 30000001, 0}}, 30000001},
        {9960000, {{V, 10000000, 10000000}, {V, 100000000, 10040000}, {V, 100040000, 10080000}},
         89960000},
        {50000000, {{A, 50000000, 50000000}, {A, 50020000, 50020000}, {A, 10000000, 50040000}},
         10000000 - 50040000},
        {5000000, {{A, 40000000, 5000000}}, 35000000},
        {1000000, {{A, 1500000, 1500000}, {A, 1520000, 1520000}}, 0},
        {0, {{A, 0, 0}, {V, 0, 0}, {A, 20000, 20000}, {V, 40000, 40000}, {A, 60000000, 40000},
             {V, 60040000, 80000}}, 60000000 - 40000},  // a gap on audio shifts video too
        {0, {{A, 0, 0}, {A, 100000000, 0}, {A, -1, -1}, {A, 100020000, 20000}}, 100000000},
        {0, {{V, 0, 0}, {V, 90000000, 0}, {S, 90000000, 90000000}}, 90000000},
        {0, {{V, INT64_MAX, 0}, {V, INT64_MIN, int64_t(uint64_t(INT64_MIN) - INT64_MAX)}},
         INT64_MAX}};
    for (const auto& c : cases) {
        sys_demuxer_st d;
        std::memset(&d, 0xA5, sizeof d);  // nothing may depend on fields the start leaves alone
        sys_set_pts_info(&d, c.start);
        for (size_t i = 0; i < c.steps.size(); ++i) {
            int64_t pts = c.steps[i].in;
            sys_update_and_fix_pts_gap(&d, &pts, c.steps[i].type);
            EXPECT_EQ(pts, c.steps[i].out) << "case " << (&c - cases) << " step " << i;
        }
        EXPECT_EQ(d.base_pts, c.base_after) << "case " << (&c - cases);
    }
    testenv::LogCapture log;
    sys_demuxer_st d;
    sys_set_pts_info(&d, 2000000);
    EXPECT_EQ(std::make_tuple(d.seek_time, d.last_pts[2], d.last_dur[2]),
              std::make_tuple(2000000, 2000000, -1));
    for (int64_t pts : {2040000, 99000000}) sys_update_and_fix_pts_gap(&d, &pts, V);
    EXPECT_EQ(std::make_tuple(d.last_pts[VID], d.last_dur[VID], d.last_pts[AUD], d.last_dur[AUD]),
              std::make_tuple(2080000, 40000, 2000000, -1));  // the gap moved on by the known step
    int64_t pts = 99000000;  // other kinds: entry 2 holds the raw time, its step stays reset
    sys_update_and_fix_pts_gap(&d, &pts, HOVA_STREAM_ID3_METADATA);
    EXPECT_EQ(std::make_tuple(pts, d.last_pts[2], d.last_dur[2]),
              std::make_tuple(99000000, 99000000, -1));
    ASSERT_EQ(log.lines().size(), 2u);
    EXPECT_EQ(log.lines()[0].text, "[SYS] found pts gap for type 3, pts 99000000, orignal pts "
                                   "99000000, last pts 2040000, last dur 40000\n");
    EXPECT_EQ(log.lines()[1].text, "[SYS] base change from 0 to 96920000\n");
    sys_set_pts_info(&d, 7);  // a new timeline forgets the base
    EXPECT_EQ(std::make_pair(d.base_pts, d.last_pts[VID]), std::make_pair(int64_t{0}, int64_t{7}));
}

TEST(DropTarget, OtherKindsDropUntilTheReaderReachesTheFirstTargetThenForgetIt) {
    sys_demuxer_st d{};
    sys_stream_st audio{}, video{};
    audio.stream_type = A;
    video.stream_type = V;
    sys_reset_drop_target(&audio);
    EXPECT_EQ(audio.next_pos, UINT64_MAX);
    EXPECT_EQ(sys_check_drop(&d, &audio), 0) << "no target: never drop";
    video.next_pos = 42;
    for (uint64_t at : {0x100000000ull, 5ull}) {  // above 32 bits: compared in 64; first one stays
        sys_set_drop_target(V, &audio, at);
        sys_set_drop_target(V, &video, at);  // the targeted kind has none
    }
    EXPECT_EQ(audio.next_pos, 0x100000000ull);
    EXPECT_EQ(video.next_pos, UINT64_MAX);
    for (const auto& [reader_at, drop] :
         {std::pair{0ull, 1}, {0xFFFFFFFFull, 1}, {0x100000000ull, 0}, {0ull, 0}}) {
        d.cbuffer.curpos = reader_at;
        EXPECT_EQ(sys_check_drop(&d, &audio), drop) << "reader at " << reader_at;
    }
    EXPECT_EQ(audio.next_pos, UINT64_MAX);
    d.num_streams[AUD] = 1, d.num_streams[VID] = 2, d.num_streams[SUB] = 4, d.num_streams[OTH] = 8;
    EXPECT_EQ(sys_get_cur_stream_num(&d), 15);
}

class HostServices : public HostedToolkit {
protected:
    HostServices() { host.keep_bytes = true; }
};

TEST_F(HostServices, ConfigRecordIsCodecThenConfigAtTimeZeroAndFramesAreCopied) {
    const std::tuple<hova_stream_type_et, int, Bytes> cases[] = {
        {A, CLIP_AUDIO_TYPE_WMA2, {}}, {V, CLIP_VIDEO_TYPE_WVC1, {0x0F, 0xCB, 0x01, 0x02, 0x03}},
        {A, CLIP_AUDIO_TYPE_ERROR, {0xAA}}};
    for (auto [type, codec, config] : cases) {
        sys_stream_st s{};
        s.stream_type = type;
        s.codec_type = codec;
        s.config = config.empty() ? nullptr : config.data();
        s.config_len = static_cast<uint32_t>(config.size());
        ASSERT_EQ(sys_stream_send_config(&d, &s), HOVA_OK);
        EXPECT_EQ(s.config_sent, 0) << "the caller marks the record sent";
        const host::HostEvent& e = host.events().back();
        EXPECT_EQ(std::make_tuple(e.type, e.packet_type, e.pts, e.duration),
                  std::make_tuple(type, 1, int64_t{0}, int64_t{0}));
        Bytes expected(4);
        std::memcpy(expected.data(), &codec, 4);  // host-native (little-endian) order
        EXPECT_EQ(e.bytes, tkb::cat({expected, config}));
    }
    const uint8_t bytes[] = {1, 2, 3, 4, 5};
    ASSERT_EQ(sys_stream_commit_secure_handle(&d, V, 5, bytes, 4242, 0), HOVA_OK);
    ASSERT_EQ(sys_stream_commit_secure_handle(&d, A, 0, nullptr, -1, 7), HOVA_OK);
    ASSERT_EQ(host.events().size(), 5u);
    EXPECT_EQ(host.events()[3].bytes, Bytes(bytes, bytes + 5));
    EXPECT_EQ(std::make_tuple(host.events()[3].pts, host.events()[4].size, host.events()[4].pts,
                              host.events()[4].packet_type), std::make_tuple(4242, 0, -1, 7));
    host.refuse_stream_alloc = true;
    sys_stream_st s{};
    EXPECT_EQ(sys_stream_send_config(&d, &s), HOVA_NotEnoughMemory);
    EXPECT_EQ(sys_stream_commit_secure_handle(&d, V, 3, "abc", 5, 0), HOVA_NotEnoughMemory);
    EXPECT_EQ(host.events().size(), 5u);
    EXPECT_EQ(host.protocol_errors(), 0u);
}

TEST_F(HostServices, WrappersPassTheContextAndTheHostsAnswers) {
    void* p = sys_malloc(&d, 100);
    ASSERT_NE(p, nullptr);
    p = sys_realloc(&d, p, 200);
    EXPECT_EQ(std::make_pair(host.outstanding_blocks(), host.outstanding_bytes()),
              std::make_pair(size_t{1}, size_t{200}));
    sys_freep(&d, &p);
    EXPECT_EQ(p, nullptr) << "freep leaves the caller's pointer null";
    host.fail_malloc_at(1);
    EXPECT_EQ(sys_malloc(&d, 8), nullptr);
    void* frame = nullptr;
    ASSERT_EQ(sys_stream_alloc(&d, A, &frame, 10), 0);
    std::memset(frame, 0x5A, 10);
    ASSERT_EQ(sys_stream_realloc(&d, A, &frame, 20), 0);
    EXPECT_EQ(static_cast<uint8_t*>(frame)[9], 0x5A) << "realloc keeps the content";
    EXPECT_EQ(sys_stream_discard(&d, A) + sys_stream_check_rbuf_size(&d, A), 0);
    host.notify_result = 9;
    EXPECT_EQ(sys_notify(&d, V, HOVA_EVENT_EOS), 9);
    ASSERT_EQ(host.events().size(), 2u);
    EXPECT_EQ(std::make_pair(host.events()[1].kind, host.events()[1].type),
              std::make_pair(host::EventKind::Notify, V));
    EXPECT_EQ(host.protocol_errors(), 0u);
}

}  // namespace
