// What a seek does to delivery: a query or a failed seek changes nothing, an
// applied seek drops partial objects and resumes at the key frame found, in
// sequential and in separate parsing, also after the end of the stream.
#include <gtest/gtest.h>

#include <random>

#include "seek_fixture.h"
#include "test_env.h"

namespace {

using seektest::Clip;
using seektest::Player;

struct Frame {
    hova_stream_type_et type;
    int64_t pts;
    uint32_t crc;
    bool operator==(const Frame&) const = default;
};

std::vector<Frame> frames_of(const Player& p) {
    std::vector<Frame> out;
    for (const auto& e : const_cast<Player&>(p).host.events())
        if (e.kind == host::EventKind::Commit && e.packet_type == 0)
            out.push_back({e.type, e.pts, e.crc32});
    return out;
}

TEST(SeekEffect, QueryOrFailedSeekLeavesDeliveryWhereItWas) {
    Clip indexed;
    Clip plain;
    plain.index = false;
    Clip cut;
    cut.cut_in_packet = 60;
    struct Case {
        const char* what;
        Clip clip;
        int dir;
        int64_t target;
        int query;
        int rc;
        int64_t reported;
    } cases[] = {
        {"query through the index", indexed, HOVA_SEEK_BACKWARD, 5500000, 1, HOVA_OK, 5000000},
        {"query by search", plain, HOVA_SEEK_FORWARD, 5500000, 1, HOVA_OK, 6000000},
        {"failed search", plain, HOVA_SEEK_FORWARD, 9500000, 0, HOVA_SeekFailed, 9500000},
        {"unknown direction", indexed, 2, 5500000, 0, HOVA_SeekFailed, 5500000},
        {"target in the missing data", cut, HOVA_SEEK_BACKWARD, 7500000, 0, HOVA_SeekFailed,
         7500000},
    };
    for (const Case& c : cases) {
        for (int m = 0; m < 4; ++m) {
            SCOPED_TRACE(testing::Message() << c.what << ", buffering " << m);
            Player ref(seektest::build(c.clip), host::with_buffering(host::kBufferings[m]));
            ref.open_or_fail();
            ASSERT_EQ(ref.play(), HOVA_EndOfStream);
            Player p(seektest::build(c.clip), host::with_buffering(host::kBufferings[m]));
            p.open_or_fail();
            for (int i = 0; i < 33; ++i) p.step();
            int64_t t = c.target;
            EXPECT_EQ(seektest::seek(p, c.dir, &t, c.query), c.rc);
            EXPECT_EQ(t, c.reported);
            ASSERT_EQ(p.play(), HOVA_EndOfStream);
            EXPECT_EQ(frames_of(p), frames_of(ref));
            p.expect_clean_close();
            ref.expect_clean_close();
        }
    }
}

// Video objects of 1500 bytes in 1024-byte packets: most packets end with a
// partly assembled object.
asfb::Bytes split_objects_file() {
    std::vector<asfb::Object> objs;
    for (uint32_t i = 0; i < 60; ++i) {
        objs.push_back({1, i * 100, asfb::pattern(100, 0xA000 + i)});
        objs.push_back({2, i * 100, asfb::pattern(1500, 0x5000 + i), i % 10 == 0});
    }
    asfb::PacketFile f;
    f.packets = asfb::mux(objs, 1024);
    return asfb::build_packet_file(f);
}

TEST(SeekEffect, AppliedSeekDropsPartialObjectsAndResumesAtTheKeyFrame) {
    const asfb::Bytes file = split_objects_file();
    Player ref(file);
    ref.host.keep_bytes = true;
    ref.open_or_fail();
    ASSERT_EQ(ref.play(), HOVA_EndOfStream);
    const auto all = ref.frames(HOVA_STREAM_VIDEO);

    for (int dir : {HOVA_SEEK_BACKWARD, HOVA_SEEK_FORWARD}) {
        SCOPED_TRACE(dir);
        Player p(file);
        p.host.keep_bytes = true;
        p.open_or_fail();
        while (!p.host.pending(HOVA_STREAM_VIDEO)) ASSERT_EQ(p.step(), HOVA_OK);
        const size_t before = p.host.events().size();
        int64_t t = 3350000;
        ASSERT_EQ(seektest::seek(p, dir, &t), HOVA_OK);
        EXPECT_EQ(t, dir == HOVA_SEEK_BACKWARD ? 3000000 : 4000000);
        EXPECT_FALSE(p.host.pending(HOVA_STREAM_VIDEO));
        EXPECT_FALSE(p.host.pending(HOVA_STREAM_AUDIO));
        const auto& ev = p.host.events();
        ASSERT_GT(ev.size(), before);
        EXPECT_EQ(ev[before].kind, host::EventKind::Discard);
        EXPECT_EQ(p.ctx()->seeked, 1);
        p.host.events().clear();
        ASSERT_EQ(p.play(), HOVA_EndOfStream);
        const auto v = p.frames(HOVA_STREAM_VIDEO);
        ASSERT_FALSE(v.empty());
        const auto ref_frame = std::find_if(all.begin(), all.end(),
                                            [&](const host::HostEvent& e) { return e.pts == t; });
        ASSERT_NE(ref_frame, all.end());
        EXPECT_EQ(v.front().pts, t);
        EXPECT_EQ(v.front().bytes, ref_frame->bytes);
        p.expect_clean_close();
    }
}

TEST(SeekEffect, SeekAfterTheEndOfStreamPlaysAgain) {
    Clip c;
    Player p(seektest::build(c));
    p.open_or_fail();
    ASSERT_EQ(p.play(), HOVA_EndOfStream);
    for (int round = 0; round < 2; ++round) {
        p.host.events().clear();
        int64_t t = 2350000;
        ASSERT_EQ(seektest::seek(p, HOVA_SEEK_BACKWARD, &t), HOVA_OK);
        EXPECT_EQ(t, 2000000);
        ASSERT_EQ(p.play(), HOVA_EndOfStream);
        const auto v = p.frames(HOVA_STREAM_VIDEO);
        ASSERT_EQ(v.size(), 79u);  // 2.0 s to 9.8 s; the last stays pending
        EXPECT_EQ(v.front().pts, 2000000);
        EXPECT_EQ(p.frames(HOVA_STREAM_AUDIO).front().pts, 2000000);
    }
    p.expect_clean_close();
}

// Audio 3 s behind video: delivery switches to separate parsing.
Clip badly_interleaved() {
    Clip c;
    c.audio_lag_ms = 3000;
    return c;
}

TEST(SeekEffect, SeparateParsingPlacesBothCursors) {
    testenv::LogCapture log;
    Player p(seektest::build(badly_interleaved()));
    p.open_or_fail();
    for (int i = 0; i < 10; ++i) p.step();
    ASSERT_EQ(p.ctx()->parse_mode, PARSE_SEP);
    p.host.events().clear();
    int64_t t = 5000000;
    ASSERT_EQ(seektest::seek(p, HOVA_SEEK_BACKWARD, &t), HOVA_OK);
    EXPECT_TRUE(
        log.contains("[ASF] seek in separate mode, audio pts 5000000, packet 20, video pts "
                     "5000000, packet 50\n"));
    EXPECT_EQ(p.ctx()->accept_stream_type, HOVA_STREAM_VIDEO);
    ASSERT_EQ(p.play(), HOVA_EndOfStream);
    EXPECT_EQ(p.frames(HOVA_STREAM_VIDEO).front().pts, 5000000);
    EXPECT_EQ(p.frames(HOVA_STREAM_AUDIO).front().pts, 5000000);

    // Delivery ran off the end in separate parsing; a query already returns
    // to it, and the next seek places both cursors again.
    ASSERT_EQ(p.ctx()->parse_file_end, 1);
    t = 4000000;
    ASSERT_EQ(seektest::seek(p, HOVA_SEEK_BACKWARD, &t, 1), HOVA_OK);
    EXPECT_EQ(p.ctx()->parse_file_end, 0);
    EXPECT_EQ(p.ctx()->parse_mode, PARSE_SEP);
    log.clear();
    p.host.events().clear();
    t = 4000000;
    ASSERT_EQ(seektest::seek(p, HOVA_SEEK_BACKWARD, &t), HOVA_OK);
    EXPECT_TRUE(
        log.contains("[ASF] seek in separate mode, audio pts 4000000, packet 10, video pts "
                     "4000000, packet 40\n"));
    ASSERT_EQ(p.play(), HOVA_EndOfStream);
    EXPECT_EQ(p.frames(HOVA_STREAM_AUDIO).front().pts, 4000000);
    p.expect_clean_close();
}

TEST(SeekEffect, SeparateParsingFallsBackToSequentialWhenAudioIsNotFound) {
    Clip c = badly_interleaved();
    c.audio_packets = 30;  // audio ends at 5.9 s
    testenv::LogCapture log;
    Player p(seektest::build(c));
    p.open_or_fail();
    for (int i = 0; i < 10; ++i) p.step();
    ASSERT_EQ(p.ctx()->parse_mode, PARSE_SEP);
    p.host.events().clear();
    int64_t t = 7000000;
    ASSERT_EQ(seektest::seek(p, HOVA_SEEK_FORWARD, &t), HOVA_OK);
    EXPECT_EQ(t, 8000000);
    EXPECT_TRUE(log.contains(
        "[ASF] seek audio fails in separate mode, fall back to sequential mode\n"));
    EXPECT_EQ(p.ctx()->parse_mode, PARSE_SEQ);
    EXPECT_EQ(p.ctx()->accept_stream_type, HOVA_STREAM_NONE);
    EXPECT_EQ(p.ctx()->cur_packets, 80u);
    ASSERT_EQ(p.play(), HOVA_EndOfStream);
    EXPECT_EQ(p.frames(HOVA_STREAM_VIDEO).front().pts, 8000000);
    p.expect_clean_close();
}

// Damaged packets and index entries: seeks fail or land somewhere, but never
// crash, hang, leak or leave a partial object pending at the host.
TEST(SeekEffect, DamagedFilesNeverLeaveAnythingBehind) {
    Clip c;
    c.packet_size = 512;
    c.packets = 60;
    const asfb::Bytes clean = seektest::build(c);
    std::mt19937 rng(7);
    for (int round = 0; round < 150; ++round) {
        asfb::Bytes file = clean;
        // Damage in the data and the index (the last packets' worth of bytes).
        const size_t from = file.size() - size_t{c.packets} * c.packet_size - 200;
        for (int k = 0; k < 1 + round % 12; ++k)
            file[from + rng() % (file.size() - from)] = static_cast<uint8_t>(rng());
        SCOPED_TRACE(round);
        Player p(file);
        if (p.open() != HOVA_OK) continue;
        for (int64_t target :
             {int64_t{1700000}, int64_t{3300000}, int64_t{-500000}, int64_t{90000000}}) {
            for (int dir : {HOVA_SEEK_BACKWARD, HOVA_SEEK_FORWARD}) {
                int64_t t = target;
                const int rc = seektest::seek(p, dir, &t, static_cast<int>(rng() % 2));
                ASSERT_TRUE(rc == HOVA_OK || rc == HOVA_SeekFailed);
                for (int i = 0; i < 40; ++i) {
                    const int r = p.step();
                    if (r != HOVA_OK && r != HOVA_TryAgain) break;
                }
            }
        }
        p.expect_clean_close();
    }
}

}  // namespace
