// Seeking in built files: one audio object (stream 1) and one video object
// (stream 2) per 1024-byte packet, frame i in packet i at i x 100 ms, with a
// simple index written the way encoders write it (entry j names the packet
// of the last key frame at or before j seconds) or given entry by entry.
#include <gtest/gtest.h>

#include <array>
#include <cstring>
#include <optional>

#include "../delivery/delivery_fixture.h"
#include "streaming.h"
#include "test_env.h"

namespace {

using asfb::Bytes;
using delivery::Player;
using host::Buffering;
using host::EventKind;
constexpr int B = HOVA_SEEK_BACKWARD, F = HOVA_SEEK_FORWARD;
constexpr hova_stream_type_et kAudio = HOVA_STREAM_AUDIO, kVideo = HOVA_STREAM_VIDEO;

struct Clip {
    const char* name = "";
    uint32_t key_every = 10, key_first = 0, packets = 100, preroll_ms = 0;
    bool audio = true, video = true, index = true;
    int64_t audio_lag_ms = 0;                            // audio object i at i x 100 ms + lag
    std::optional<std::vector<uint32_t>> entries;        // packet numbers
    uint32_t declared_entries = 0;                       // 0: as many as written
    uint64_t interval_100ns = 10000000, duration_100ns = 0;  // 0: the packets' span + preroll
};

bool is_key(const Clip& c, uint32_t i) { return i >= c.key_first && (i - c.key_first) % c.key_every == 0; }

Bytes build(const Clip& c) {
    asfb::File f;
    asfb::FileProps fp;
    fp.packet_count = c.packets;
    fp.min_packet_size = fp.max_packet_size = 1024;
    fp.preroll = c.preroll_ms;
    fp.play_duration = c.duration_100ns ? c.duration_100ns : (c.packets * 100ull + c.preroll_ms) * 10000;
    f.header_children = {asfb::file_properties(fp)};
    if (c.audio) f.header_children.push_back(asfb::audio_stream(1));
    if (c.video) f.header_children.push_back(asfb::video_stream(2));
    std::vector<asfb::IndexEntry> entries;
    for (uint32_t i = 0, last_key = c.key_first; i < c.packets; ++i) {
        std::vector<asfb::Payload> pl;
        const uint32_t ms = i * 100 + c.preroll_ms, num = i + 1;
        if (c.audio) pl.push_back(asfb::media(1, num, 0, 100, uint32_t(ms + c.audio_lag_ms), asfb::pattern(100, 0xA000 + i)));
        if (c.video) pl.push_back(asfb::media(2, num, 0, 200, ms, asfb::pattern(200, 0x5000 + i), is_key(c, i)));
        f.packets.push_back(asfb::packet(pl, 1024));
        last_key = is_key(c, i) ? i : last_key;
        if (i % 10 == 0) entries.push_back({last_key, 1});
    }
    if (c.entries) {
        entries.clear();
        for (uint32_t p : *c.entries) entries.push_back({p, 1});
    }
    if (c.index && c.video) {
        Bytes idx = asfb::simple_index(c.interval_100ns, entries);
        for (int k = 0; k < 4 && c.declared_entries; ++k) idx[52 + k] = uint8_t(c.declared_entries >> (8 * k));
        f.trailing.push_back(idx);
    }
    return asfb::build(f);
}

int seek(Player& p, int dir, int64_t* t, int query = 0) { return hova_asff_demuxer.seek_time(p.ctx(), dir, t, query); }

struct Frame {
    int64_t pts;
    uint32_t crc;
    bool key;
    bool operator==(const Frame& o) const { return pts == o.pts && crc == o.crc; }
};
using Frames = std::vector<Frame>;

// Every object of a stream as the clip holds it (the last stays pending).
Frames objects(const Clip& c, hova_stream_type_et t) {
    Frames out;
    for (uint32_t i = 0; i < c.packets; ++i)
        out.push_back(t == kVideo ? Frame{i * 100000ll, delivery::crc(asfb::pattern(200, 0x5000 + i)), is_key(c, i)}
                                  : Frame{(i * 100 + c.audio_lag_ms) * 1000, delivery::crc(asfb::pattern(100, 0xA000 + i)), true});
    return out;
}

Frames committed(Player& p, hova_stream_type_et t, size_t from, size_t to) {
    Frames out;
    for (size_t i = from; i < to; ++i) {
        const host::HostEvent& e = p.host.events()[i];
        if (e.kind == host::EventKind::Commit && !e.packet_type && e.type == t) out.push_back({e.pts, e.crc32, false});
    }
    return out;
}

// Where a seek to `t` lands among `all`: the last key frame at or before it
// backward (the first key frame when there is none), the first at or after
// it forward (none: -1). Time 0 is the first object either way.
int land(const Frames& all, int64_t t, int dir) {
    if (t == 0) return 0;
    int at = -1;
    for (size_t i = 0; i < all.size(); ++i)
        if (all[i].key && (dir == B ? all[i].pts <= t || at < 0 : all[i].pts >= t && at < 0)) at = int(i);
    return at;
}
// Video resumes at the first key frame from there.
int first_key(const Frames& all, int from) {
    while (size_t(from) < all.size() && !all[size_t(from)].key) ++from;
    return from;
}

// Many targets, both directions, with and without a usable index, in every
// buffering mode, right after the open, during delivery (in separate parsing
// when audio lies 3 s behind video) and after the end of the stream. A query
// answers as the seek after it and changes nothing, a failed seek changes
// nothing; an applied seek drops what was pending and delivery resumes with
// the key frame found, byte for byte, and every frame after it; the other
// stream resumes at the same packet, or in separate parsing at its own object
// on the asked side.
TEST(SeekSweep, LandsOnTheKeyFrameOnTheAskedSideInEveryMode) {
    auto named = [](const char* n) { Clip c; c.name = n; return c; };
    Clip late = named("late key frames, no index"), sparse = named("two key frames, 3 s announced"),
         audio = named("audio only"), apart = named("audio 3 s late"), held = named("preroll, index read entry by entry"),
         past = named("index past the data"), zero = named("index interval 0"), plain = named("no index");
    late.key_first = 5, late.index = false;
    sparse.packets = 40, sparse.key_every = 20, sparse.duration_100ns = 30000000, sparse.index = false;
    audio.video = false;
    apart.audio_lag_ms = 3000;
    held.preroll_ms = 500, held.declared_entries = 11;
    past.entries = std::vector<uint32_t>(10, 5000);
    zero.interval_100ns = 0;
    plain.index = false;
    for (const Clip& c : {named("encoder index"), plain, late, sparse, audio, apart, held, past, zero}) {
        const Bytes file = build(c);
        const hova_stream_type_et own = c.video ? kVideo : kAudio, other = c.video ? kAudio : kVideo;
        const Frames all = objects(c, own), others = c.audio && c.video ? objects(c, other) : Frames{};
        for (int m = 0; m < 4; ++m)
            for (int64_t target : {-700000ll, 0ll, 150000ll, 1807000ll, 2350000ll, 3000000ll, 4550000ll, 9200000ll, 60000000ll})
                for (int dir : {B, F}) {
                    // Forward, the index passes over a key frame at the target.
                    if (c.index && target == 3000000 && dir == F) continue;
                    const int steps = std::vector<int>{0, 10, 100000}[size_t(target / 1000 + dir) % 3];
                    SCOPED_TRACE(testing::Message() << c.name << ", " << host::buffering_name(host::kBufferings[m])
                                                    << ", target " << target << ", dir " << dir << ", after " << steps);
                    Player p(file, host::with_buffering(host::kBufferings[m]));
                    p.open_or_fail();
                    for (int i = 0; i < steps && p.step() != HOVA_EndOfStream; ++i) {}
                    EXPECT_TRUE(!c.audio_lag_ms || steps != 10 || p.ctx()->parse_mode == PARSE_SEP);
                    int64_t asked = target, t = target;
                    const int rq = seek(p, dir, &asked, 1);
                    for (int i = 0; i < 3; ++i) p.step();
                    const size_t before = p.host.events().size();
                    const int rc = seek(p, dir, &t);
                    const bool sep = p.ctx()->parse_mode == PARSE_SEP;
                    const size_t from = p.host.events().size();
                    EXPECT_FALSE(rc == HOVA_OK && (p.host.pending(kVideo) || p.host.pending(kAudio)));
                    p.play();
                    const size_t end = p.host.events().size();
                    EXPECT_EQ(rq, rc);
                    EXPECT_EQ(asked, t);
                    for (auto [ref, kind] : {std::pair{&all, own}, std::pair{&others, other}}) {
                        if (ref->empty()) continue;
                        const Frames head = committed(p, kind, 0, before), tail = committed(p, kind, from, end);
                        ASSERT_LE(head.size(), ref->size());
                        EXPECT_TRUE(std::equal(head.begin(), head.end(), ref->begin()));  // delivery so far
                        if (rc != HOVA_OK) {  // goes on where it was
                            ASSERT_EQ(head.size() + tail.size() + 1, ref->size());
                            EXPECT_TRUE(std::equal(tail.begin(), tail.end(), ref->begin() + long(head.size())));
                            continue;
                        }
                        int at = kind == own || !sep ? land(all, t, dir) : land(*ref, t, dir);
                        ASSERT_GE(at, 0);
                        if (kind == kVideo) at = first_key(*ref, at);
                        EXPECT_EQ(tail, Frames(ref->begin() + at, ref->end() - 1)) << (kind == own ? "own" : "other");
                    }
                    const int at = land(all, target, dir);
                    EXPECT_EQ(rc, at < 0 ? HOVA_SeekFailed : HOVA_OK);
                    EXPECT_EQ(t, at < 0 ? target : all[size_t(at)].pts);
                    p.expect_clean_close();
                }
    }
}

// Every frame from the first key frame on a key frame, so the index alone
// decides where a seek lands. Entry 0's time is worked out from the first
// entry naming another packet; the walk goes from the target's entry to the
// next one naming another packet and steps on until the key frame lies on
// the asked side (backward, entry 0's key frame when none is earlier), and a
// forward seek back while an earlier named key frame is still after the
// target; an index that cannot answer (a forward target in the last entry's
// interval) leaves the seek to the search without index, and fails it on a
// network input.
TEST(IndexSeek, WalksFromTheTargetsEntryToTheNextDistinctKeyFrame) {
    constexpr int64_t kFails = -1;
    const struct {
        std::vector<uint32_t> entries;
        int64_t start_offset;
        std::vector<std::array<int64_t, 4>> seeks;  // direction, target, time found, on a network
        uint32_t key_first = 0;
    } cases[] = {
        {{0, 10, 20, 25, 28, 40, 40, 70, 80, 90}, 0,
         {{B, 2200000, 2000000, 2000000}, {F, 2200000, 2500000, 2500000}, {B, 2900000, 2500000, 2500000},
          {F, 2900000, 4000000, 4000000}, {B, 2000000, 2000000, 2000000},
          {F, 2000000, 2500000, 2500000},  // passed over
          {B, 5500000, 4000000, 4000000}, {F, 5500000, 7000000, 7000000},  // over the repeat
          {B, 9500000, 9000000, 9000000}, {F, 9500000, 9500000, kFails}, {B, -3000000, 0, 0}}},
        {{0, 0, 0, 0, 5, 30, 30, 30, 60, 60}, -3500000,  // entry 0 at -3.5 s
         {{B, 5800000, 3000000, 3000000}, {B, 2900000, 500000, 500000}, {F, 2900000, 3000000, 3000000},
          {F, 400000, 500000, 500000}, {B, -3300000, 0, 0}, {F, -3300000, 0, 0}}},
        {{0, 0, 40, 40, 40, 45, 60, 70, 80, 90}, 2000000,
         {{F, 5500000, 6000000, 6000000}, {B, 5500000, 4000000, 4000000}}},
        {std::vector<uint32_t>(10, 30), 0, {{B, 4550000, 3000000, 3000000}, {F, 4550000, 4600000, kFails}}},
        // The last entry's key frame, worked out with the start offset: a
        // forward seek onto it has no next entry to take.
        {{0, 0, 0, 0, 0, 0, 0, 0, 0, 90}, 0, {{F, 9000000, 9000000, kFails}, {B, 9000000, 9000000, 9000000}}},
        // Before the first key frame (at 0.5 s), on either side.
        {{5, 10, 20, 30, 40, 50, 60, 70, 80, 90}, 0,
         {{B, 499999, 500000, 500000}, {F, 499999, 500000, 500000}, {B, -10, 500000, 500000}}, 5},
    };
    for (const auto& c : cases)
        for (const auto& [dir, target, found, on_network] : c.seeks)
            for (bool network : {false, true}) {
                SCOPED_TRACE(testing::Message() << "dir " << dir << " target " << target << " network " << network);
                Clip clip;
                clip.key_every = 1, clip.key_first = c.key_first, clip.entries = c.entries;
                host::InputOptions in;
                in.streaming = network;
                Player p(build(clip), in);
                p.open_or_fail();
                int64_t t = target;
                const int64_t want = network ? on_network : found;
                EXPECT_EQ(seek(p, int(dir), &t), want == kFails ? HOVA_SeekFailed : HOVA_OK);
                EXPECT_EQ(p.ctx()->index_start_offset, c.start_offset);
                ASSERT_EQ(p.play(), HOVA_EndOfStream);
                const auto v = p.frames(kVideo);
                EXPECT_EQ(v.empty() ? -1 : v.front().pts, want == kFails ? c.key_first * 100000ll : want);
                if (want != kFails) {
                    EXPECT_EQ(t, want);
                }
                p.expect_clean_close();
            }
}

// An index naming packets in descending order over frames without the
// key-frame bit: every probe finds nothing up to the end of the data. One
// seek still reads each packet once, with the index held (5 460 entries) or
// read entry by entry from the input.
TEST(IndexSeek, ReadsEachPacketOnceWhateverTheIndexNames) {
    for (uint32_t count : {5460u, 5461u})
        for (int dir : {B, F}) {
            SCOPED_TRACE(testing::Message() << count << " entries, dir " << dir);
            Clip c;
            c.packets = 546, c.key_first = c.packets;
            std::vector<uint32_t> entries;
            for (uint32_t i = 0; i < count; ++i) entries.push_back(i / 10 < c.packets ? c.packets - 1 - i / 10 : 0);
            c.entries = entries;
            host::InputOptions in;
            in.disable_cache = true;  // the input sees every byte the seek reads
            Player p(build(c), in);
            p.open_or_fail();
            const uint64_t before = p.input().counters().bytes_read;
            int64_t t = 30000000;
            EXPECT_EQ(seek(p, dir, &t), HOVA_SeekFailed);
            EXPECT_LE(p.input().counters().bytes_read - before, 2 * (c.packets * 1024ull + count * 6ull));
            p.expect_clean_close();
        }
}

// Without an index a backward seek steps back packet by packet from the
// interpolated start to the key frame (here 900 packets of 1 KiB): in every
// buffering mode it reads the headers it parses, not a block from each packet
// it steps back to, and answers as unbuffered. The streaming thread may fill
// its ring meanwhile.
TEST(SearchWithoutIndex, ReadsThePacketHeadersNotABlockPerStepInEveryMode) {
    Clip c;
    c.packets = 2000, c.key_every = 1000, c.index = false;
    const Bytes file = build(c);
    constexpr int kRing = 1 << 18;
    for (int query : {1, 0})
        for (Buffering m : host::kBufferings) {
            SCOPED_TRACE(testing::Message() << host::buffering_name(m) << (query ? ", query" : ""));
            Player p(file, host::with_buffering(m), kRing);
            p.open_or_fail();
            const uint64_t before = p.input().counters().bytes_read;
            int64_t t = 190000000;
            ASSERT_EQ(seek(p, B, &t, query), HOVA_OK);
            EXPECT_EQ(t, 100000000);
            const uint64_t read = p.input().counters().bytes_read - before;
            // About 100 bytes of headers a packet; the ring the thread fills
            // and (applied) the block delivery starts from come on top.
            const uint64_t bound = file.size() / 8 + (m == Buffering::Thread ? kRing : 0) + (query ? 0 : 32768);
            EXPECT_LE(read, bound);
            p.expect_clean_close();
        }
}

// After a seek the first video frame is the key frame the seek reported
// (a seek to 0: the file's first key frame), though its packet also holds the
// end of the group before it or earlier key frames: what comes before is
// never handed to the host. In thumbnail mode the same; audio resumes with
// the packet's first object start.
TEST(SeekDelivery, FirstVideoFrameIsTheReportedKeyFrame) {
    using asfb::Object;
    std::vector<Object> one, gop;
    for (uint32_t k = 0; k < 10; ++k) {  // one packet, key frames at 0, 120, 240 and 360 ms
        one.push_back({1, 40 * k, asfb::pattern(50, k)});
        one.push_back({2, 40 * k, asfb::pattern(100, 100 + k), k % 3 == 0});
    }
    for (uint32_t k = 0; k < 60; ++k) {  // key frames from 120 ms, every 400 ms
        gop.push_back({1, 40 * k, asfb::pattern(40, k)});
        gop.push_back({2, 40 * k, asfb::pattern(200 + 7 * (k % 5), 100 + k), k % 10 == 3});
    }
    const struct {
        const char* name;
        const std::vector<Object>* objects;
        uint32_t packet_size;
        std::vector<std::pair<int, int64_t>> seeks;
    } shapes[] = {
        {"one packet", &one, 8192, {{B, 250000}, {F, 130000}, {B, 120000}, {F, 0}}},
        {"groups", &gop, 1024, {{B, 0}, {B, 100000}, {F, 520000}, {B, 520000}, {F, 900000}, {B, 1300000}, {B, 1700000}}},
    };
    for (const auto& sh : shapes) {
        asfb::PacketFile f;
        f.packet_size = sh.packet_size, f.packets = asfb::mux(*sh.objects, sh.packet_size);
        const Bytes file = asfb::build_packet_file(f);
        std::vector<asfb::Object> video, audio;
        for (const auto& o : *sh.objects) (o.stream == 2 ? video : audio).push_back(o);
        for (host::Buffering b : host::kBufferings)
            for (int64_t thumbs : {-1ll, 200000ll})
                for (const auto& [dir, target] : sh.seeks) {
                    SCOPED_TRACE(testing::Message() << sh.name << ", " << host::buffering_name(b) << ", thumbnails "
                                                    << thumbs << ", dir " << dir << ", target " << target);
                    Player p(file, host::with_buffering(b));
                    p.open_or_fail();
                    hova_asff_demuxer.set_multi_thumb(p.ctx(), thumbs);
                    for (int i = 0; i < 5; ++i) p.step();
                    int64_t t = target;
                    ASSERT_EQ(seek(p, dir, &t), HOVA_OK);
                    const size_t from = p.host.events().size();
                    ASSERT_EQ(p.play(), HOVA_EndOfStream);
                    const auto& ev = p.host.events();
                    const auto first = std::find_if(ev.begin() + long(from), ev.end(), [](const host::HostEvent& e) {
                        return e.type == kVideo && !e.packet_type;
                    });
                    ASSERT_NE(first, ev.end());
                    const auto key = std::find_if(video.begin(), video.end(), [&](const Object& o) {
                        return o.key && (t == 0 || int64_t(o.pts_ms) * 1000 >= t);
                    });
                    ASSERT_NE(key, video.end());
                    EXPECT_EQ(first->kind, EventKind::Commit);
                    EXPECT_EQ(first->pts, int64_t(key->pts_ms) * 1000);
                    EXPECT_EQ(first->crc32, delivery::crc(key->data));
                    // Audio is not held back to the key frame.
                    const Frames a = committed(p, kAudio, from, ev.size());
                    ASSERT_FALSE(a.empty());
                    EXPECT_LE(a.front().pts, first->pts);
                    const auto in_file = std::find_if(audio.begin(), audio.end(), [&](const Object& o) {
                        return int64_t(o.pts_ms) * 1000 == a.front().pts;
                    });
                    ASSERT_NE(in_file, audio.end());
                    EXPECT_EQ(size_t(audio.end() - in_file) - 1, a.size());  // every later one, the last pending
                    EXPECT_TRUE(sh.objects != &one || a.front().pts == 0);
                    p.expect_clean_close();
                }
    }
}

// -1 only flushes the reader; any other time drops what delivery was
// assembling, hands the time in milliseconds to the input and reads on from
// wherever the input then stands, with or without the streaming thread.
TEST(Resync, FlushOnlyForMinusOneOtherwiseRestartAtTheInputsPosition) {
    // With what the input's seek_time receives; none: the host has no time seek.
    const std::pair<int64_t, std::vector<int>> cases[] = {{-1, {-1}}, {1999, {1}}, {-1500, {-1}}, {0, {0}}, {5000000, {}}};
    for (const auto& [time, host_gets] : cases)
        for (bool thread : {false, true}) {
            const bool host_seek_time = !host_gets.empty();
            if (thread && !host_seek_time) continue;  // a threaded input moves only by its time seek
            SCOPED_TRACE(testing::Message() << "time " << time << ", thread " << thread);
            Clip clip;
            clip.index = false;
            host::InputOptions in;
            if (thread) in.rbuf_mode = CBIO_APPLY_RBUF, in.use_thread = true, in.block_size = 700;
            Player p(build(clip), in, 4096);
            p.input().set_seek_time_available(host_seek_time);
            p.open_or_fail();
            for (int i = 0; i < 7; ++i) ASSERT_EQ(p.step(), HOVA_OK);
            ASSERT_TRUE(p.host.pending(kVideo));
            asf_demuxer_st* d = p.ctx();
            const uint64_t packets = d->cur_packets, moved_to = d->first_packet + 40u * 1024u;
            const asf_packet_st cursor = d->cur_data_packet;
            if (host_seek_time)  // the host moves its input to packet 40, as its own time seek would
                p.input().time_to_position = [&](int) { return int64_t(moved_to); };
            else
                ASSERT_EQ(p.input().io()->seek(p.input().io(), cb_off_t(moved_to), CB_SEEK_SET), cb_off_t(moved_to));
            const size_t events = p.host.events().size();
            ASSERT_EQ(hova_asff_demuxer.resync_time(d, time), HOVA_OK);
            EXPECT_EQ(p.input().counters().seek_times, host_gets);
            EXPECT_EQ(d->s.cbuffer.curpos, moved_to);
            EXPECT_EQ(d->cur_packets, packets);
            if (time == -1) {
                EXPECT_EQ(p.host.events().size(), events);
                EXPECT_TRUE(p.host.pending(kVideo));
                EXPECT_EQ(std::memcmp(&d->cur_data_packet, &cursor, sizeof cursor), 0);
            } else {
                EXPECT_FALSE(p.host.pending(kVideo) || p.host.pending(kAudio));
                const size_t from = p.host.events().size();
                ASSERT_EQ(p.play(), HOVA_EndOfStream);  // on at packet 40, whole frames only
                const Frames v = committed(p, kVideo, from, p.host.events().size());
                EXPECT_EQ(v.empty() ? -1 : v.front().pts, 4000000);
                EXPECT_EQ(v.size(), 59u);
                // The packets are where they were: a seek lands as without the resync.
                int64_t t = 2350000;
                const size_t at = p.host.events().size();
                ASSERT_EQ(seek(p, B, &t), HOVA_OK);
                EXPECT_EQ(t, 2000000);
                ASSERT_EQ(p.play(), HOVA_EndOfStream);
                const Frames w = committed(p, kVideo, at, p.host.events().size());
                EXPECT_EQ(w.empty() ? -1 : w.front().pts, 2000000);
            }
            p.expect_clean_close();
        }
}

}  // namespace
