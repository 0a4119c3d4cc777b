// Built files played in every buffering mode: each shape gives exactly its
// frames (bytes and times), configurations first, one end notice per stream.
#include <functional>

#include "delivery_fixture.h"

namespace delivery {
namespace {

using asfb::media;
using asfb::pattern;
using asfb::Object;

Bytes one(const asfb::Payload& p, uint32_t size) { return asfb::packet({p}, size); }
Bytes cut(const Bytes& b, size_t from, size_t to) {
    return Bytes(b.begin() + from, b.begin() + to);
}
Bytes cat(std::initializer_list<Bytes> parts) {
    Bytes out;
    for (const Bytes& p : parts) out.insert(out.end(), p.begin(), p.end());
    return out;
}
Bytes pfile(std::vector<Bytes> packets, uint32_t size,
            const std::function<void(asfb::PacketFile&)>& tweak) {
    asfb::PacketFile f;
    f.packet_size = size;
    f.packets = std::move(packets);
    tweak(f);
    return asfb::build_packet_file(f);
}
// Audio at a + 40k ms, video at v + 40k ms, alternating in the file.
std::vector<Object> skewed(uint32_t n, uint32_t a, uint32_t v) {
    std::vector<Object> objs;
    for (uint32_t k = 0; k < n; ++k) {
        objs.push_back({1, a + 40 * k, pattern(150 + k % 13, k)});
        objs.push_back({2, v + 40 * k, pattern(700 + 37 * (k % 7), 1000 + k), k % 10 == 0});
    }
    return objs;
}
Bytes chunks(std::initializer_list<int> order) {
    Bytes out;
    for (int c : order) out.insert(out.end(), {uint8_t(c * 16), uint8_t(c * 16 + 1)});
    return out;
}

struct Shape {
    std::string what;
    Bytes file;
    std::vector<Want> want;
    size_t try_again = 0, discards = 0;
    bool video = true;
    int64_t thumbnail = -1;
    bool audio = true;
};

std::vector<Shape> shapes() {
    std::vector<Shape> s;
    const Bytes obj = pattern(9000, 7);
    s.push_back({"object over three payloads, preroll 200",
                 av_file({one(media(2, 7, 0, 9000, 1200, cut(obj, 0, 4000), true), 4200),
                          one(media(2, 7, 4000, 9000, 1200, cut(obj, 4000, 8000), true), 4200),
                          one(media(2, 7, 8000, 9000, 1200, cut(obj, 8000, 9000), true), 4200),
                          one(media(2, 8, 0, 10, 1300, pattern(10, 1)), 4200)}, 4200, 200),
                 {{2, 1000000, obj}}});
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
        const Bytes o = pattern(300, 1);
        const auto first = t.rep >= 8 ? media(1, 1, 0, 300, t.ms, o, false, t.rep - 8)
                                      : asfb::untimed(1, 1, 0, o, t.rep);
        s.push_back(
            {"time " + std::to_string(t.want),
             pfile({asfb::packet({first, media(1, 2, 0, 10, t.ms + 50, pattern(10, 2))}, 1024)},
                   1024,
                   [&](asfb::PacketFile& f) {
                       f.preroll_ms = t.preroll;
                       f.audio_time_offset = t.offset;
                   }),
             {{1, t.want, o}}});
    }
    const Bytes v5 = pattern(200, 5);
    s.push_back({"video joined in an object's middle",
                 av_file({asfb::packet({media(2, 4, 100, 300, 0, pattern(200, 4)),
                                        media(1, 1, 0, 50, 0, pattern(50, 1))}, 1024),
                          asfb::packet({media(2, 5, 0, 200, 40, v5, true),
                                        media(2, 6, 0, 20, 80, pattern(20, 6))}, 1024)}),
                 {{2, 40000, v5}}});
    s.push_back({"other streams skipped",
                 av_file({asfb::packet({media(5, 1, 0, 100, 0, pattern(100, 1)),
                                        media(1, 1, 0, 10, 0, pattern(10, 3)),
                                        media(5, 3, 0, 100, 0, pattern(100, 2))}, 1024),
                          asfb::packet({media(5, 4, 0, 100, 0, pattern(100, 4))}, 1024)}),
                 {}});
    const Bytes a = pattern(100, 1), b = pattern(120, 2), c = pattern(80, 3), h = pattern(60, 4);
    s.push_back({"compressed payload joins the current object",
                 av_file({asfb::packet({asfb::compressed(1, 3, 1000, 40, {h}),
                                        asfb::compressed(1, 3, 1040, 40, {a, b, c}),
                                        media(1, 4, 0, 10, 2000, pattern(10, 5))}, 1024)}),
                 {{1, 1000000, cat({h, a, b, c})}}});
    // The video payload leaves a size of 5000 behind: compressed objects are not judged by it.
    s.push_back({"compressed after an announced size",
                 av_file({asfb::packet({media(2, 1, 0, 5000, 0, pattern(500, 9)),
                                        asfb::compressed(1, 1, 0, 20, {a}),
                                        asfb::compressed(1, 2, 20, 20, {b}),
                                        asfb::compressed(1, 3, 40, 20, {a})}, 1024)}),
                 {{1, 0, a}, {1, 20000, b}}});
    for (auto how : {asfb::Damage::PacketLenTooLong, asfb::Damage::PaddingTooLong,
                     asfb::Damage::NoPayloads, asfb::Damage::PayloadTooLong}) {
        std::vector<Bytes> packets;
        std::vector<Want> want;
        for (uint32_t i = 0; i < 6; ++i) {
            const auto p = media(1, i + 1, 0, 100, i * 10, pattern(100, i));
            packets.push_back(i == 2 ? asfb::damaged_packet(how, {p}, 512)
                                     : asfb::packet({p}, 512));
            if (i != 2 && i != 5) want.push_back({1, i * 10000, p.data});
        }
        s.push_back({"damaged packet " + std::to_string(int(how)), av_file(packets, 512), want, 1});
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
    for (const auto& l : layouts) {
        asfb::PacketLayout pl;
        pl.error_correction = l.ec, pl.multiple = l.multiple, pl.packet_len_type = l.len;
        pl.sequence_type = l.seq, pl.padding_len_type = l.pad, pl.replicated_len_type = l.rep;
        pl.offset_type = l.off, pl.object_num_type = l.num, pl.payload_len_type = l.plen;
        s.push_back({"layout " + std::to_string(s.size()),
                     av_file(asfb::mux(objs, 700, pl, 1, 650), 700),
                     all_but_last(objs)});
    }
    // Packets off their grid: found again by the resync scan, the partial object kept.
    const Bytes v1 = pattern(900, 1), v2 = pattern(100, 2);
    const Bytes junk = {0x90, 0x11, 0x22, 0x33, 0x44};
    const Bytes tail = asfb::packet({media(2, 2, 0, 100, 40, v2, true),
                                     media(2, 3, 0, 10, 80, pattern(10, 3))}, 1024);
    s.push_back({"misplaced packet ends an object",
                 av_file({one(media(2, 1, 0, 900, 0, cut(v1, 0, 500), true), 1024),
                          asfb::misaligned_packet(junk, {media(2, 1, 500, 900, 0, cut(v1, 500, 900),
                                                               true)}, 1024), tail}),
                 {{2, 0, v1}, {2, 40000, v2}}});
    s.push_back(
        {"misplaced packet holds an object",
         av_file({one(media(1, 1, 0, 10, 0, pattern(10, 9)), 1024),
                  asfb::misaligned_packet(junk,
                                          {media(2, 1, 0, 900, 0, cut(v1, 0, 450), true),
                                           media(2, 1, 450, 900, 0, cut(v1, 450, 900), true)},
                                          1024),
                  tail}),
         {{2, 0, v1}, {2, 40000, v2}},
         0,
         1});
    Bytes zeros(1024, 0);
    zeros[0] = 0x91;  // error correction in an unusual form; nothing plausible after it
    s.push_back({"packet without a plausible start",
                 av_file({one(media(1, 1, 0, 50, 0, cut(a, 0, 50)), 1024), zeros,
                          one(media(1, 3, 0, 50, 20, cut(b, 0, 50)), 1024),
                          one(media(1, 4, 0, 50, 30, cut(a, 0, 50)), 1024)}),
                 {{1, 0, cut(a, 0, 50)}, {1, 20000, cut(b, 0, 50)}}, 0, 1});
    // Badly interleaved: separate parsing follows the stream behind.
    for (auto o : {skewed(30, 0, 3000), skewed(60, 3000, 0), skewed(30, 9960, 12500)})
        s.push_back({"interleaving", av_file(asfb::mux(o, 1024)), all_but_last(o)});
    // Uncounted packets: from the data object's size, else the input's size.
    const auto inter = skewed(30, 0, 40), apart = skewed(30, 0, 3000);
    const struct { const std::vector<Object>* o; std::optional<uint64_t> size; bool bc; } unc[] = {
        {&inter, {}, true}, {&inter, 50, true}, {&apart, 50, true}, {&inter, 50, false}};
    for (const auto& u : unc)
        s.push_back({"uncounted", pfile(asfb::mux(*u.o, 1024), 1024, [&](asfb::PacketFile& f) {
                         f.packet_count = 0, f.broadcast = u.bc, f.data_object_size = u.size;
                     }), all_but_last(*u.o)});
    s.push_back(
        {"no packets", pfile({}, 1024, [](asfb::PacketFile& f) { f.packet_count = 0; }), {}});
    // Spread audio written back column by column.
    const struct { uint8_t span; uint16_t plen, clen; Bytes got, want; } spread[] = {
        {2, 4, 2, chunks({0, 1, 2, 3}), chunks({0, 2, 1, 3})},
        {3, 4, 2, chunks({0, 1, 2, 3, 4, 5}), chunks({0, 3, 1, 4, 2, 5})},
        {1, 4, 2, chunks({0, 1, 2, 3}), chunks({0, 1, 2, 3})},
        {3, 4, 2, pattern(11, 3), pattern(11, 3)},  // size does not match: as received
        {5, 1000, 100, asfb::spread_scramble(pattern(5000, 4), 5, 1000, 100), pattern(5000, 4)}};
    for (const auto& r : spread) {
        const uint32_t n = uint32_t(r.got.size());
        s.push_back({"spread " + std::to_string(r.span),
                     pfile({asfb::packet({media(1, 1, 0, n, 100, r.got), media(1, 2, 0, 4, 200, a)},
                                         6000)}, 6000, [&](asfb::PacketFile& f) {
                         f.video = false, f.spread = {r.span, r.plen, r.clen};
                     }), {{1, 100000, r.want}}, 0, 0, false});
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
        s.push_back({"thumbnails", pfile(asfb::mux(th, 1024), 1024,
                                         [](asfb::PacketFile& f) { f.audio = false; }),
                     w, 0, interval < 0 ? 0u : 5u, true, interval, false});
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
            pl.open_or_fail();
            ASSERT_EQ(hova_asff_demuxer.set_multi_thumb(pl.ctx(), sh.thumbnail), HOVA_OK);
            ASSERT_EQ(pl.play(), HOVA_EndOfStream);
            const auto& ev = pl.host.events();
            ASSERT_GE(ev.size(), 2u);
            EXPECT_EQ(ev[0].packet_type, 1);
            EXPECT_EQ(ev[0].type, sh.audio ? HOVA_STREAM_AUDIO : HOVA_STREAM_VIDEO);
            EXPECT_EQ(pl.configs(HOVA_STREAM_AUDIO).size(), sh.audio ? 1u : 0u);
            EXPECT_EQ(pl.configs(HOVA_STREAM_VIDEO).size(), sh.video ? 1u : 0u);
            expect_frames(pl, sh.want);
            EXPECT_EQ(pl.count(HOVA_TryAgain), sh.try_again);
            EXPECT_EQ(pl.of_kind(EventKind::Discard), sh.discards);
            EXPECT_EQ(pl.of_kind(EventKind::Notify), size_t(sh.video + sh.audio));
            EXPECT_EQ(ev.back().kind, EventKind::Notify);
            pl.expect_clean_close();
        }
    }
}

}  // namespace
}  // namespace delivery
