// Built files played in every buffering mode: each shape gives exactly its
// frames (bytes and times), configurations first, one end notice per stream,
// and the log lines it must, whatever the host does in between (refuse
// memory, switch a stream off, ask for a new header at the end of the data).
#include <functional>
#include <tuple>

#include "asf_internal.h"
#include "asf_modes.h"
#include "delivery_fixture.h"
#include "test_env.h"

namespace delivery {
namespace {

using namespace asfb;

Bytes one(const asfb::Payload& p, uint32_t size) { return packet({p}, size); }
Bytes cut(const Bytes& b, size_t i, size_t j) { return Bytes(b.begin() + i, b.begin() + j); }
// A file of one audio stream (1) and one video stream (2) around `packets`.
Bytes av_file(std::vector<Bytes> packets, uint32_t size = 1024, const std::function<void(PacketFile&)>& tweak = {}) {
    asfb::PacketFile f;
    f.packet_size = size, f.packets = std::move(packets);
    if (tweak) tweak(f);
    return asfb::build_packet_file(f);
}
Bytes chunks(std::initializer_list<int> order) {
    Bytes out;
    for (int c : order) out.insert(out.end(), {uint8_t(c * 16), uint8_t(c * 16 + 1)});
    return out;
}
// Audio (stream 1) at a + 40k ms, video (2) at v + 40k ms, alternating in the file.
std::vector<Object> skewed(uint32_t n, uint32_t a, uint32_t v, uint32_t vsize = 700) {
    std::vector<Object> objs;
    for (uint32_t k = 0; k < n; ++k) {
        objs.push_back({1, a + 40 * k, pattern(150 + k % 13, k)});
        objs.push_back({2, v + 40 * k, pattern(vsize + 37 * (k % 7), 1000 + k), k % 10 == 0});
    }
    return objs;
}
// A frame the host must receive: stream 1 audio, 2 video; time in microseconds.
struct Want { uint8_t stream; int64_t pts; Bytes data; };
// Each stream's objects but its last (which stays pending at the end).
std::vector<Want> all_but_last(const std::vector<Object>& objs) {
    std::vector<Want> out;
    for (uint8_t s : {1, 2}) {
        const size_t at = out.size();
        for (const auto& o : objs)
            if (o.stream == s) out.push_back({s, int64_t(o.pts_ms) * 1000, o.data});
        if (out.size() > at) out.pop_back();
    }
    return out;
}
// The frames of each stream are exactly `want`'s, in order.
void expect_frames(const Player& pl, const std::vector<Want>& want) {
    for (uint8_t s : {1, 2}) {
        std::vector<std::tuple<int64_t, int, uint32_t>> got, wanted;
        for (const auto& e : pl.frames(s == 1 ? HOVA_STREAM_AUDIO : HOVA_STREAM_VIDEO)) got.emplace_back(e.pts, e.size, e.crc32);
        for (const Want& w : want)
            if (w.stream == s) wanted.emplace_back(w.pts, int(w.data.size()), crc(w.data));
        EXPECT_EQ(got, wanted) << "stream " << int(s);
    }
}

// Switches `off` off after `at` calls (-1: at the first packet abandoned),
// where only switching off is accepted; the host forgets what it had of it.
void switch_off(Player& p, hova_stream_type_et off, int at) {
    for (int i = 0, rc = 0; at < 0 ? rc == HOVA_OK : i < at; ++i) rc = p.step();
    const struct { hova_stream_type_et type; int index, result; } calls[] = {
        {HOVA_STREAM_PROG, 1, HOVA_InvalidParam}, {HOVA_STREAM_AUDIO, 0, HOVA_InvalidParam},
        {HOVA_STREAM_VIDEO, 1, HOVA_InvalidParam}, {HOVA_STREAM_NONE, -1, HOVA_InvalidParam},
        {HOVA_STREAM_CLIP, -1, HOVA_InvalidParam}, {HOVA_STREAM_PROG, 0, HOVA_OK},
        {HOVA_STREAM_SUBTITLE, -1, HOVA_OK}, {off, -1, HOVA_OK}, {off, -1, HOVA_OK}};
    for (const auto& c : calls)
        EXPECT_EQ(hova_asff_demuxer.set_track(p.ctx(), c.type, c.index, 1, HOVA_INPUT_MASTER),
                  c.result) << c.type << " " << c.index;
    EXPECT_EQ(p.ctx()->s.active_stream[AUD] < 0, off == HOVA_STREAM_AUDIO);
    EXPECT_EQ(p.ctx()->s.active_stream[VID] < 0, off == HOVA_STREAM_VIDEO);
    std::erase_if(p.host.events(), [&](auto& e) { return e.type == off; });
    EXPECT_EQ(p.ctx()->parse_mode, PARSE_SEQ);
    EXPECT_EQ(p.ctx()->accept_stream_type, HOVA_STREAM_NONE);
}

struct Shape {
    std::string what;
    Bytes file;
    std::vector<Want> want = {};
    int try_again = 0;                         // -1: as many as the mode makes
    size_t discards = 0;
    int streams = 3;                           // 1 audio, 2 video: configurations, end notices
    std::function<void(Player&)> setup = {};   // after open
    std::string log = {};                      // a line logged in every mode (logged 2),
    int logged = 2;                            // in all but streaming (1), or never (0)
    size_t no_memory = 0;                      // calls that ended in NotEnoughMemory
};

std::vector<Shape> shapes() {
    std::vector<Shape> s;
    const Bytes obj = pattern(9000, 7);
    std::vector<Bytes> thirds;
    for (uint32_t at : {0, 4000, 8000})
        thirds.push_back(one(media(2, 7, at, 9000, 1200, cut(obj, at, std::min(at + 4000, 9000u)), true), 4200));
    thirds.push_back(one(media(2, 8, 0, 10, 1300, pattern(10, 1)), 4200));
    s.push_back({"object over three payloads, preroll 200",
                 av_file(thirds, 4200, [](auto& f) { f.preroll_ms = 200; }), {{2, 1000000, obj}}});
    s.push_back({"middle payload lost",
                 av_file({one(media(2, 7, 0, 9000, 0, pattern(4000, 1)), 4200),
                          one(media(2, 7, 8000, 9000, 0, pattern(1000, 2)), 4200),
                          one(media(2, 8, 0, 10, 40, pattern(10, 1)), 4200)}, 4200),
                 {}, 0, 1});
    // Times: preroll, the stream's time offset, no time in short replicated data.
    const struct { uint32_t ms; uint64_t preroll, offset; int rep; int64_t want; } times[] = {
        {1500, 3000, 0, 8, -1500000}, {5000, 3000, 0, 8, 2000000},
        {5000, 3000, 5000000, 12, 2500000}, {0, 0, 0, 5, -1}, {0, 0, 0, 0, -1}};
    for (const auto& t : times) {
        const auto first = t.rep >= 8 ? media(1, 1, 0, 300, t.ms, pattern(300, 1), false, t.rep - 8)
                                      : asfb::untimed(1, 1, 0, pattern(300, 1), t.rep);
        s.push_back({"time " + std::to_string(t.want),
                     av_file({packet({first, media(1, 2, 0, 10, t.ms + 50, pattern(10, 2))}, 1024)},
                             1024, [&](auto& f) { f.preroll_ms = t.preroll, f.audio_time_offset = t.offset; }),
                     {{1, t.want, pattern(300, 1)}}});
    }
    s.push_back({"video joined in an object's middle",
                 av_file({packet({media(2, 4, 100, 300, 0, pattern(200, 4)),
                                  media(1, 1, 0, 50, 0, pattern(50, 1))}, 1024),
                          packet({media(2, 5, 0, 200, 40, pattern(200, 5), true),
                                  media(2, 6, 0, 20, 80, pattern(20, 6))}, 1024)}),
                 {{2, 40000, pattern(200, 5)}}});
    s.push_back({"other streams skipped",
                 av_file({packet({media(5, 1, 0, 100, 0, pattern(100, 1)), media(1, 1, 0, 10, 0, pattern(10, 3)),
                                  media(5, 3, 0, 100, 0, pattern(100, 2))}, 1024),
                          one(media(5, 4, 0, 100, 0, pattern(100, 4)), 1024)})});
    const Bytes a = pattern(100, 1), b = pattern(120, 2), c = pattern(80, 3), h = pattern(60, 4);
    Bytes habc = h;
    for (const Bytes* p : {&a, &b, &c}) habc.insert(habc.end(), p->begin(), p->end());
    s.push_back({"compressed payload joins the current object",
                 av_file({packet({compressed(1, 3, 1000, 40, {h}),
                                  compressed(1, 3, 1040, 40, {a, b, c}),
                                  media(1, 4, 0, 10, 2000, pattern(10, 5))}, 1024)}),
                 {{1, 1000000, habc}}});
    // The video payload leaves a size of 5000 behind: compressed objects are not judged by it.
    s.push_back({"compressed after an announced size",
                 av_file({packet({media(2, 1, 0, 5000, 0, pattern(500, 9)),
                                  compressed(1, 1, 0, 20, {a}), compressed(1, 2, 20, 20, {b}),
                                  compressed(1, 3, 40, 20, {a})}, 1024)}),
                 {{1, 0, a}, {1, 20000, b}}});
    const auto six = [](uint32_t i) { return media(1, i + 1, 0, 100, i * 10, pattern(100, i)); };
    for (auto how : {asfb::Damage::PacketLenTooLong, asfb::Damage::PaddingTooLong,
                     asfb::Damage::NoPayloads, asfb::Damage::PayloadTooLong}) {
        std::vector<Bytes> packets;
        for (uint32_t i = 0; i < 6; ++i) packets.push_back(i == 2 ? asfb::damaged_packet(how, {six(i)}, 512) : one(six(i), 512));
        s.push_back({"damaged packet " + std::to_string(int(how)), av_file(packets, 512),
                     {{1, 0, six(0).data}, {1, 10000, six(1).data}, {1, 30000, six(3).data}, {1, 40000, six(4).data}}, 1});
    }
    // Packet and payload header layouts; packets keep padding so a misplaced end shows.
    std::vector<Object> objs;
    for (uint32_t i = 0; i < 30; ++i) {
        objs.push_back({1, i * 23, pattern(200 + i * 7, i), false});
        objs.push_back({2, i * 40, pattern(2500 + i * 31, 1000 + i), i % 10 == 0});
    }
    const struct { bool ec, multiple; uint8_t len, seq, pad, rep, off, num, plen; } layouts[] = {
        {true, true, 0, 0, 2, 1, 3, 1, 2},  {false, true, 0, 1, 2, 1, 3, 1, 3},
        {true, true, 3, 2, 1, 2, 2, 3, 2},  {true, false, 0, 3, 2, 1, 3, 1, 2},
        {false, false, 2, 0, 0, 1, 3, 2, 2}};
    for (const auto& l : layouts)
        s.push_back({"layout", av_file(mux(objs, 700, {l.ec, l.multiple, l.len, l.seq, l.pad, l.rep, l.off,
                                                       l.num, l.plen, {}, {}, {}}, 1, 650), 700), all_but_last(objs)});
    // Packets off their grid: found again by the resync scan, the partial object kept.
    const Bytes v1 = pattern(900, 1), v2 = pattern(100, 2), junk = {0x90, 0x11, 0x22, 0x33, 0x44};
    const Bytes tail = packet({media(2, 2, 0, 100, 40, v2, true), media(2, 3, 0, 10, 80, pattern(10, 3))}, 1024);
    const auto part = [&](uint32_t from, size_t to) { return media(2, 1, from, 900, 0, cut(v1, from, to), true); };
    s.push_back({"misplaced packet ends an object",
                 av_file({one(part(0, 500), 1024),
                          asfb::misaligned_packet(junk, {part(500, 900)}, 1024), tail}),
                 {{2, 0, v1}, {2, 40000, v2}}});
    s.push_back({"misplaced packet holds an object",
                 av_file({one(media(1, 1, 0, 10, 0, pattern(10, 9)), 1024),
                          asfb::misaligned_packet(junk, {part(0, 450), part(450, 900)}, 1024), tail}),
                 {{2, 0, v1}, {2, 40000, v2}}, 0, 1});
    // A packet that lost the end of its padding: the next starts early, and the
    // scan takes its start, not the bytes behind its error correction flags.
    for (bool multiple : {true, false}) {
        auto short_one = mux(objs, 700, {true, multiple, 0, 0, 2, 1, 3, 1, 2, {}, {}, {}}, 1, 600);
        short_one[5].resize(700 - 7);
        s.push_back({"packet short of its padding", av_file(short_one, 700), all_but_last(objs)});
    }
    Bytes zeros(1024, 0);
    zeros[0] = 0x91;  // error correction in an unusual form; nothing plausible after it
    const auto half = [&](uint32_t num, uint32_t ms, const Bytes& x) { return one(media(1, num, 0, 50, ms, cut(x, 0, 50)), 1024); };
    s.push_back({"packet without a plausible start",
                 av_file({half(1, 0, a), zeros, half(3, 20, b), half(4, 30, a)}),
                 {{1, 0, cut(a, 0, 50)}, {1, 20000, cut(b, 0, 50)}}, 0, 1});
    // Badly interleaved: streams more than 2 s apart switch to separate parsing
    // (not when streaming), which follows the stream behind.
    const struct { uint32_t n, a, v; int switches; } skews[] = {
        {30, 0, 3000, 1}, {60, 3000, 0, 1}, {30, 9960, 12500, 1}, {30, 9960, 12000, 0},
        {30, 9960, 12001, 1}, {30, 9960, 7500, 1}};
    for (const auto& k : skews) {
        const auto o = skewed(k.n, k.a, k.v);
        s.push_back({"skew", av_file(mux(o, 1024)), all_but_last(o), 0, 0, 3, {}, "bad interleaved ASF detected, switch to index base, v " +
                     std::to_string(k.v * 1000) + ", a " + std::to_string((k.a + 40) * 1000), k.switches});
    }
    // Uncounted packets: from the data object's size, else the input's size.
    const auto inter = skewed(30, 0, 40), apart = skewed(30, 0, 3000);
    const struct { const std::vector<Object>* o; std::optional<uint64_t> size; bool bc; } unc[] = {
        {&inter, {}, true}, {&inter, 50, true}, {&apart, 50, true}, {&inter, 50, false}};
    for (const auto& u : unc)
        s.push_back({"uncounted", av_file(mux(*u.o, 1024), 1024, [&](auto& f) { f.packet_count = 0, f.broadcast = u.bc, f.data_object_size = u.size; }),
                     all_but_last(*u.o)});
    s.push_back({"no packets", av_file({}, 1024, [](auto& f) { f.packet_count = 0; }), {}});
    // Spread audio written back column by column; as received when the size
    // does not match or the host refuses the memory.
    const struct { uint8_t span; uint16_t plen, clen; Bytes got, want; const char* log; } spread[] = {
        {2, 4, 2, chunks({0, 1, 2, 3}), chunks({0, 2, 1, 3}), ""},
        {3, 4, 2, chunks({0, 1, 2, 3, 4, 5}), chunks({0, 3, 1, 4, 2, 5}), ""},
        {1, 4, 2, chunks({0, 1, 2, 3}), chunks({0, 1, 2, 3}), ""},
        {3, 4, 2, pattern(11, 3), pattern(11, 3), "object size 11 does not match spread len 3 x 4"},
        {3, 4, 2, pattern(12, 3), pattern(12, 3), "realloc for audio spread fails"},
        {5, 1000, 100, asfb::spread_scramble(pattern(5000, 4), 5, 1000, 100), pattern(5000, 4), ""}};
    for (const auto& r : spread) {
        const auto audio = [&](auto& f) { f.video = false, f.spread = {r.span, r.plen, r.clen}; };
        s.push_back({"spread", av_file({packet({media(1, 1, 0, uint32_t(r.got.size()), 100, r.got),
                                                media(1, 2, 0, 4, 200, a)}, 6000)}, 6000, audio),
                     {{1, 100000, r.want}}, 0, 0, 1,
                     [refuse = r.log[0] == 'r'](Player& p) { p.host.refuse_stream_realloc = refuse; }, r.log});
    }
    // Thumbnails: key frames spaced by the interval; -1 turns the rule off.
    std::vector<Object> th;
    for (uint32_t ms : {0, 1000, 2000, 4000, 4999, 5000, 7000, 12000, 13000})
        th.push_back({2, ms, pattern(600, ms), ms != 1000 && ms != 7000});
    for (int64_t interval : {5000000, -1}) {
        std::vector<Want> w;
        for (const auto& o : th)
            if (o.pts_ms < 13000 && (interval < 0 || o.pts_ms % 5000 == 0 || o.pts_ms == 12000))
                w.push_back({2, o.pts_ms * 1000, o.data});
        s.push_back({"thumbnails", av_file(mux(th, 1024), 1024, [](auto& f) { f.audio = false; }), w, 0, interval < 0 ? 0u : 5u, 2,
                     [interval](Player& p) { hova_asff_demuxer.set_multi_thumb(p.ctx(), interval); }});
    }
    // A refused configuration is sent again on the next call.
    s.push_back({.what = "configuration refused", .file = av_file({one(media(1, 1, 0, 10, 0, pattern(10, 1)), 1024)}),
                 .setup = [](Player& p) { p.refuse_at(0, 1); }, .no_memory = 1});
    // At the end of the data the input may ask for a scan for a new header,
    // which gives up after 3 s; the header found ends delivery all the same.
    const Bytes first = av_file(mux({{1, 0, pattern(100, 1)}, {1, 40, pattern(100, 2)}}, 512), 512, [](auto& f) { f.video = false; });
    Bytes joined = first;
    joined.resize(first.size() + 100, 0x33);
    joined.insert(joined.end(), first.begin(), first.end());
    const std::string found = std::to_string(first.size() + 100);
    const struct { int detect; int64_t clock_step; const char* log; int logged; } ends[] = {
        {0, 0, "detect discontinuity at", 0}, {1, 0, "detect discontinuity at ", 2},
        {1, 4000000, "asf_detect_discontinuity timed out", 2}};
    for (const auto& e : ends)
        s.push_back({"end of data", joined, {{1, 0, pattern(100, 1)}}, 0, 0, 1,
                     [e](Player& p) { p.input().io()->detect_discontinuity = e.detect, p.host.clock_step_us = e.clock_step; },
                     e.log + (e.logged && !e.clock_step ? found : ""), e.logged});
    // A stream switched off before the first call, during separate parsing or
    // right after a packet abandoned there: the other gives each object once.
    const auto many = skewed(80, 0, 3000, 900);
    std::vector<Bytes> broken = mux(many, 1024);
    broken.insert(broken.begin() + 30, asfb::damaged_packet(asfb::Damage::PaddingTooLong,
                                                            {media(1, 200, 0, 10, 0, a)}, 1024));
    for (auto off : {HOVA_STREAM_AUDIO, HOVA_STREAM_VIDEO}) {
        auto want = all_but_last(many);
        std::erase_if(want, [&](const Want& w) { return (w.stream == 1) == (off == HOVA_STREAM_AUDIO); });
        for (int at : {0, 3, 40, -1})  // -1: at the abandoned packet
            s.push_back({"track off", av_file(at < 0 ? broken : mux(many, 1024)), want,
                         -(at < 0), 0, off == HOVA_STREAM_AUDIO ? 2 : 1,
                         [off, at](Player& p) { switch_off(p, off, at); }});
    }
    return s;
}

TEST(Delivery, EveryShapeGivesItsFramesInEveryBufferingMode) {
    std::vector<host::InputOptions> modes;
    for (auto b : host::kBufferings) modes.push_back(host::with_buffering(b));
    for (int block : {61, 333, 4099}) modes.push_back({}), modes.back().block_size = block;
    modes.push_back({}), modes.back().streaming = true;
    for (const Shape& sh : shapes()) {
        for (size_t m = 0; m < modes.size(); ++m) {
            SCOPED_TRACE(testing::Message() << sh.what << ", mode " << m);
            Player pl(sh.file, modes[m]);
            testenv::LogCapture log;
            pl.open_or_fail();
            if (sh.setup) sh.setup(pl);
            int rc = HOVA_NotEnoughMemory;
            for (int i = 0; i < 10 && rc == HOVA_NotEnoughMemory; ++i) rc = pl.play();
            ASSERT_EQ(rc, HOVA_EndOfStream);
            EXPECT_EQ(pl.count(HOVA_NotEnoughMemory), sh.no_memory);
            const auto& ev = pl.host.events();
            ASSERT_GE(ev.size(), 2u);
            EXPECT_EQ(ev[0].packet_type, 1);
            EXPECT_EQ(ev[0].type, sh.streams & 1 ? HOVA_STREAM_AUDIO : HOVA_STREAM_VIDEO);
            EXPECT_EQ(pl.configs(HOVA_STREAM_AUDIO).size(), size_t(sh.streams & 1));
            EXPECT_EQ(pl.configs(HOVA_STREAM_VIDEO).size(), size_t(sh.streams >> 1));
            expect_frames(pl, sh.want);
            EXPECT_TRUE(sh.try_again < 0 || pl.count(HOVA_TryAgain) == size_t(sh.try_again));
            EXPECT_EQ(pl.of_kind(EventKind::Discard), sh.discards);
            EXPECT_EQ(pl.of_kind(EventKind::Notify), size_t((sh.streams & 1) + (sh.streams >> 1)));
            EXPECT_EQ(ev.back().kind, EventKind::Notify);
            EXPECT_TRUE(sh.log.empty() || log.contains(sh.log) ==
                                              (sh.logged == 2 || (sh.logged == 1 && !modes[m].streaming)));
            pl.expect_clean_close();
        }
    }
}

}  // namespace
}  // namespace delivery
