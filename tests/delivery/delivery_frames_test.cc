// Reassembly of media objects from payloads, their times, and what a damaged
// packet or a refusing host costs.
#include <set>

#include "asf_packet.h"
#include "delivery_fixture.h"

namespace delivery {
namespace {

using asfb::Payload;

Bytes one(const Payload& p, uint32_t size) { return asfb::packet({p}, size); }

TEST(Delivery, SendsConfigurationsFirstAndTheObjectSplitOverThreePayloads) {
    const Bytes obj = asfb::pattern(9000, 7);
    const uint32_t size = 4200;
    const Bytes a(obj.begin(), obj.begin() + 4000), b(obj.begin() + 4000, obj.begin() + 8000),
        c(obj.begin() + 8000, obj.end());
    Player pl(av_file({one(asfb::media(2, 7, 0, 9000, 1200, a, true), size),
                       one(asfb::media(2, 7, 4000, 9000, 1200, b, true), size),
                       one(asfb::media(2, 7, 8000, 9000, 1200, c, true), size),
                       one(asfb::media(2, 8, 0, 10, 1300, asfb::pattern(10, 1)), size)},
                      size, 200));
    pl.open_or_fail();
    ASSERT_EQ(pl.step(), HOVA_OK);
    EXPECT_EQ(pl.last_type, HOVA_STREAM_VIDEO);
    const auto& ev = pl.host.events();
    ASSERT_EQ(ev.size(), 3u);
    EXPECT_EQ(ev[0].type, HOVA_STREAM_AUDIO);
    EXPECT_EQ(ev[0].packet_type, 1);
    EXPECT_EQ(ev[1].type, HOVA_STREAM_VIDEO);
    EXPECT_EQ(ev[1].packet_type, 1);
    EXPECT_EQ(ev[2].kind, EventKind::Commit);
    EXPECT_EQ(ev[2].size, 9000);
    EXPECT_EQ(ev[2].crc32, crc(obj));
    EXPECT_EQ(ev[2].pts, 1000000);  // (1200 - 200) ms
    // The last object stays pending at the end of the data.
    EXPECT_EQ(pl.play(), HOVA_EndOfStream);
    EXPECT_EQ(pl.frames(HOVA_STREAM_VIDEO).size(), 1u);
    pl.expect_clean_close();
}

TEST(Delivery, DropsAnObjectWhoseMiddlePayloadIsLost) {
    const uint32_t size = 4200;
    Player pl(av_file({one(asfb::media(2, 7, 0, 9000, 0, asfb::pattern(4000, 1)), size),
                       one(asfb::media(2, 7, 8000, 9000, 0, asfb::pattern(1000, 2)), size),
                       one(asfb::media(2, 8, 0, 10, 40, asfb::pattern(10, 1)), size)},
                      size));
    pl.open_or_fail();
    ASSERT_EQ(pl.step(), HOVA_OK);
    EXPECT_EQ(pl.last_type, HOVA_STREAM_VIDEO);
    EXPECT_TRUE(pl.frames(HOVA_STREAM_VIDEO).empty());
    EXPECT_EQ(pl.of_kind(EventKind::Discard).size(), 1u);
    pl.expect_clean_close();
}

TEST(Delivery, TimesComeFromThePrerollTheOffsetAndTheFirstPayload) {
    struct Row {
        uint32_t pts_ms;
        uint64_t preroll;
        uint64_t offset_100ns;
        bool timed;
        int64_t want;
    };
    const Row rows[] = {
        {1500, 3000, 0, true, -1500000},
        {5000, 3000, 0, true, 2000000},
        {5000, 3000, 5000000, true, 2500000},
        {0, 0, 0, false, -1},  // replicated data shorter than 8 bytes
    };
    for (const Row& r : rows) {
        SCOPED_TRACE(r.want);
        const Bytes o1 = asfb::pattern(300, 1);
        Payload first = r.timed ? asfb::media(1, 1, 0, 300, r.pts_ms, o1)
                                : asfb::untimed(1, 1, 0, o1, 5);
        asfb::PacketFile f;
        f.preroll_ms = r.preroll;
        f.audio_time_offset = r.offset_100ns;
        f.packets = {asfb::packet({first, asfb::media(1, 2, 0, 10, r.pts_ms + 50, asfb::pattern(10, 2))},
                                  1024)};
        Player pl(asfb::build_packet_file(f));
        pl.open_or_fail();
        ASSERT_EQ(pl.step(), HOVA_OK);
        const auto frames = pl.frames(HOVA_STREAM_AUDIO);
        ASSERT_EQ(frames.size(), 1u);
        EXPECT_EQ(frames[0].pts, r.want);
        EXPECT_EQ(frames[0].crc32, crc(o1));
        pl.expect_clean_close();
    }
}

TEST(Delivery, AfterOpenVideoStartsAtTheBeginningOfAnObject) {
    // Video object 4 is joined in its middle; object 5 is whole.
    const Bytes v5 = asfb::pattern(200, 5);
    Player pl(av_file({asfb::packet({asfb::media(2, 4, 100, 300, 0, asfb::pattern(200, 4)),
                                     asfb::media(1, 1, 0, 50, 0, asfb::pattern(50, 1))},
                                    1024),
                       asfb::packet({asfb::media(2, 5, 0, 200, 40, v5, true),
                                     asfb::media(2, 6, 0, 20, 80, asfb::pattern(20, 6))},
                                    1024)}));
    pl.open_or_fail();
    ASSERT_EQ(pl.play(), HOVA_EndOfStream);
    const auto frames = pl.frames(HOVA_STREAM_VIDEO);
    ASSERT_EQ(frames.size(), 1u);
    EXPECT_EQ(frames[0].crc32, crc(v5));
    EXPECT_EQ(pl.ctx()->seeked, 0);
    pl.expect_clean_close();
}

TEST(Delivery, PayloadsOfOtherStreamsAreSkippedWithoutNamingAType) {
    Player pl(av_file({asfb::packet({asfb::media(5, 1, 0, 100, 0, asfb::pattern(100, 1)),
                                     asfb::media(5, 2, 0, 100, 0, asfb::pattern(100, 2)),
                                     asfb::media(1, 1, 0, 10, 0, asfb::pattern(10, 3)),
                                     asfb::media(5, 3, 0, 100, 0, asfb::pattern(100, 2))},
                                    1024),
                       asfb::packet({asfb::media(5, 4, 0, 100, 0, asfb::pattern(100, 4))}, 1024)}));
    pl.open_or_fail();
    EXPECT_EQ(pl.step(), HOVA_EndOfStream);
    EXPECT_EQ(pl.last_type, HOVA_STREAM_AUDIO);  // the one audio payload named it, nothing after
    EXPECT_TRUE(pl.frames(HOVA_STREAM_AUDIO).empty());
    pl.expect_clean_close();
}

TEST(Delivery, ACompressedPayloadJoinsTheCurrentObject) {
    const Bytes a = asfb::pattern(100, 1), b = asfb::pattern(120, 2), c = asfb::pattern(80, 3);
    const Bytes head = asfb::pattern(60, 4);
    Player pl(av_file({asfb::packet({asfb::compressed(1, 3, 1000, 40, {head}),
                                     asfb::compressed(1, 3, 1040, 40, {a, b, c}),
                                     asfb::media(1, 4, 0, 10, 2000, asfb::pattern(10, 5))},
                                    1024)}));
    pl.open_or_fail();
    ASSERT_EQ(pl.step(), HOVA_OK);
    const auto frames = pl.frames(HOVA_STREAM_AUDIO);
    ASSERT_EQ(frames.size(), 1u);
    EXPECT_EQ(frames[0].size, 360);
    EXPECT_EQ(frames[0].crc32, crc(concat({head, a, b, c})));
    EXPECT_EQ(frames[0].pts, 1000000);
    pl.expect_clean_close();
}

TEST(Delivery, CompressedObjectsAreDeliveredWhenAnEarlierPayloadAnnouncedASize) {
    // The video payload leaves an object size of 5000 behind; the compressed
    // audio objects announce none and must not be judged by it.
    const Bytes a1 = asfb::pattern(90, 1), a2 = asfb::pattern(70, 2);
    Player pl(av_file({asfb::packet({asfb::media(2, 1, 0, 5000, 0, asfb::pattern(500, 9)),
                                     asfb::compressed(1, 1, 0, 20, {a1}),
                                     asfb::compressed(1, 2, 20, 20, {a2}),
                                     asfb::compressed(1, 3, 40, 20, {a1})},
                                    1024)}));
    pl.open_or_fail();
    ASSERT_EQ(pl.play(), HOVA_EndOfStream);
    const auto frames = pl.frames(HOVA_STREAM_AUDIO);
    ASSERT_EQ(frames.size(), 2u);
    EXPECT_EQ(frames[0].crc32, crc(a1));
    EXPECT_EQ(frames[1].crc32, crc(a2));
    EXPECT_EQ(frames[1].pts, 20000);
    pl.expect_clean_close();
}

TEST(Delivery, ADamagedPacketCostsThatPacketOnly) {
    const asfb::Damage kinds[] = {asfb::Damage::PacketLenTooLong, asfb::Damage::PaddingTooLong,
                                  asfb::Damage::NoPayloads, asfb::Damage::PayloadTooLong};
    for (asfb::Damage how : kinds) {
        SCOPED_TRACE(static_cast<int>(how));
        std::vector<Bytes> packets;
        std::vector<Bytes> objects;
        for (uint32_t i = 0; i < 6; ++i) {
            objects.push_back(asfb::pattern(100, i));
            const Payload p = asfb::media(1, i + 1, 0, 100, i * 10, objects.back());
            packets.push_back(i == 2 ? asfb::damaged_packet(how, {p}, 512) : asfb::packet({p}, 512));
        }
        Player pl(av_file(packets, 512));
        pl.open_or_fail();
        ASSERT_EQ(pl.play(), HOVA_EndOfStream);
        EXPECT_EQ(std::count(pl.results.begin(), pl.results.end(), HOVA_TryAgain), 1);
        // Object 2 is lost with its packet; 0, 1, 3 and 4 arrive (5 stays pending).
        const auto frames = pl.frames(HOVA_STREAM_AUDIO);
        ASSERT_EQ(frames.size(), 4u);
        const int want[] = {0, 1, 3, 4};
        for (size_t k = 0; k < 4; ++k) EXPECT_EQ(frames[k].crc32, crc(objects[want[k]]));
        pl.expect_clean_close();
    }
}

TEST(Delivery, RefusedFrameMemoryDropsObjectsButDeliveryGoesOn) {
    std::vector<asfb::Object> objs;
    std::set<uint32_t> crcs;
    for (uint32_t i = 0; i < 20; ++i) {
        objs.push_back({1, i * 20, asfb::pattern(300, i)});
        objs.push_back({2, i * 20, asfb::pattern(1500, i + 100), i % 5 == 0});
        crcs.insert(crc(objs[objs.size() - 2].data));
        crcs.insert(crc(objs.back().data));
    }
    const Bytes file = av_file(asfb::mux(objs, 1024), 1024);
    for (int mode = 0; mode < 2; ++mode) {
        SCOPED_TRACE(mode);
        Player pl(file);
        pl.open_or_fail();
        ASSERT_EQ(pl.step(), HOVA_OK);  // configurations and the first object
        const size_t video_before = pl.frames(HOVA_STREAM_VIDEO).size();
        const size_t before = pl.frames(HOVA_STREAM_AUDIO).size() + video_before;
        pl.host.refuse_stream_alloc = mode == 0;
        pl.host.refuse_stream_realloc = mode == 1;
        ASSERT_EQ(pl.play(), HOVA_EndOfStream);
        const size_t oks = static_cast<size_t>(std::count(pl.results.begin(), pl.results.end(), HOVA_OK));
        EXPECT_EQ(oks, 38u);  // every completed object still ends a call
        const auto audio = pl.frames(HOVA_STREAM_AUDIO), video = pl.frames(HOVA_STREAM_VIDEO);
        if (mode == 0) {
            // Only objects that had their memory before the refusal arrive.
            EXPECT_LE(audio.size() + video.size(), before + 2);
        } else {
            // Objects that fit one payload need no growth and still arrive;
            // every video object spans packets and is lost unless it was
            // whole before the refusal began.
            EXPECT_GT(audio.size(), 10u);
            EXPECT_LE(video.size(), video_before + 1);
        }
        for (const auto& f : audio) EXPECT_TRUE(crcs.count(f.crc32));
        for (const auto& f : video) EXPECT_TRUE(crcs.count(f.crc32));
        pl.expect_clean_close();
    }
}

TEST(Delivery, MuxedStreamsArriveWholeAndInOrder) {
    std::vector<asfb::Object> objs;
    for (uint32_t i = 0; i < 30; ++i) {
        objs.push_back({1, i * 23, asfb::pattern(200 + i * 7, i), false});
        objs.push_back({2, i * 40, asfb::pattern(2500 + i * 31, 1000 + i), i % 10 == 0});
    }
    const asfb::PacketLayout layouts[] = {
        [] { asfb::PacketLayout l; return l; }(),
        [] { asfb::PacketLayout l; l.error_correction = false; l.payload_len_type = 3; return l; }(),
        [] { asfb::PacketLayout l; l.replicated_len_type = 2; l.offset_type = 2; l.object_num_type = 3; l.padding_len_type = 1; return l; }(),
        [] { asfb::PacketLayout l; l.multiple = false; return l; }(),
        [] { asfb::PacketLayout l; l.multiple = false; l.padding_len_type = 0; l.packet_len_type = 2; return l; }(),
    };
    int row = 0;
    struct Buffering {
        bool cache;
        int block_size;
    };
    // Small cache blocks put headers across block ends, where they are
    // parsed from a peek instead of in place.
    const Buffering buffering[] = {{true, 32768}, {true, 61}, {true, 333}, {true, 1000}, {true, 4099}, {false, 32768}};
    for (const asfb::PacketLayout& l : layouts) {
      for (const Buffering& b : buffering) {
        SCOPED_TRACE(testing::Message() << "layout " << row << " cache " << b.cache << " block " << b.block_size);
        host::InputOptions in;
        in.disable_cache = !b.cache;
        in.block_size = b.block_size;
        // Packets keep some padding, so that a misplaced end of packet shows.
        Player pl(av_file(asfb::mux(objs, 700, l, 1, 650), 700), in);
        pl.open_or_fail();
        ASSERT_EQ(pl.play(), HOVA_EndOfStream);
        // A sound file never costs a packet.
        EXPECT_EQ(std::count(pl.results.begin(), pl.results.end(), HOVA_TryAgain), 0);
        for (uint8_t stream : {1, 2}) {
            const auto frames = pl.frames(stream == 1 ? HOVA_STREAM_AUDIO : HOVA_STREAM_VIDEO);
            ASSERT_EQ(frames.size(), 29u);
            for (uint32_t i = 0; i < 29; ++i) {
                const asfb::Object& o = objs[2 * i + (stream - 1)];
                EXPECT_EQ(frames[i].crc32, crc(o.data));
                EXPECT_EQ(frames[i].pts, int64_t(o.pts_ms) * 1000);
            }
        }
        pl.expect_clean_close();
      }
      ++row;
    }
}

TEST(Delivery, NoPacketsEndsAtTheFirstCall) {
    asfb::PacketFile f;
    f.packet_count = 0;
    Player pl(asfb::build_packet_file(f));
    pl.open_or_fail();
    EXPECT_EQ(pl.step(), HOVA_EndOfStream);
    ASSERT_EQ(pl.host.events().size(), 4u);  // two configurations, two end events
    EXPECT_EQ(pl.host.events()[2].kind, EventKind::Notify);
    EXPECT_EQ(pl.host.events()[2].type, HOVA_STREAM_AUDIO);
    EXPECT_EQ(pl.host.events()[3].type, HOVA_STREAM_VIDEO);
    // The end is reported again at every further call.
    EXPECT_EQ(pl.step(), HOVA_EndOfStream);
    EXPECT_EQ(pl.of_kind(EventKind::Notify).size(), 4u);
    pl.expect_clean_close();
}

TEST(Delivery, RefusedConfigurationIsRetriedAtTheNextCall) {
    Player pl(av_file({asfb::packet({asfb::media(1, 1, 0, 10, 0, asfb::pattern(10, 1))}, 1024)}));
    pl.open_or_fail();
    pl.host.refuse_stream_alloc = true;
    EXPECT_EQ(pl.step(), HOVA_NotEnoughMemory);
    EXPECT_TRUE(pl.host.events().empty());
    pl.host.refuse_stream_alloc = false;
    EXPECT_EQ(pl.step(), HOVA_EndOfStream);
    EXPECT_EQ(pl.configs(HOVA_STREAM_AUDIO).size(), 1u);
    EXPECT_EQ(pl.configs(HOVA_STREAM_VIDEO).size(), 1u);
    pl.expect_clean_close();
}

TEST(Resync, FindsAPacketStartingOffItsPlaceAndKeepsThePartialObject) {
    // Video object 1 (900 bytes) is either started in packet 0 and ended in
    // packet 1, or wholly in packet 1; packet 1's slot begins with 5 bytes of
    // junk; packet 2 is on the grid again.
    const Bytes v1 = asfb::pattern(900, 1), v2 = asfb::pattern(100, 2), v3 = asfb::pattern(10, 3);
    const Bytes junk = {0x90, 0x11, 0x22, 0x33, 0x44};
    auto part = [&](size_t from, size_t to) { return Bytes(v1.begin() + from, v1.begin() + to); };
    for (bool partial : {true, false}) {
        SCOPED_TRACE(partial);
        std::vector<Bytes> packets;
        if (partial) {
            packets.push_back(asfb::packet({asfb::media(2, 1, 0, 900, 0, part(0, 500), true)}, 1024));
            packets.push_back(asfb::misaligned_packet(
                junk, {asfb::media(2, 1, 500, 900, 0, part(500, 900), true)}, 1024));
        } else {
            packets.push_back(asfb::packet({asfb::media(1, 1, 0, 10, 0, asfb::pattern(10, 9))}, 1024));
            packets.push_back(asfb::misaligned_packet(
                junk, {asfb::media(2, 1, 0, 900, 0, part(0, 450), true),
                       asfb::media(2, 1, 450, 900, 0, part(450, 900), true)}, 1024));
        }
        packets.push_back(asfb::packet({asfb::media(2, 2, 0, 100, 40, v2, true),
                                        asfb::media(2, 3, 0, 10, 80, v3)}, 1024));
        Player pl(av_file(packets, 1024));
        pl.open_or_fail();
        ASSERT_EQ(pl.play(), HOVA_EndOfStream);
        const auto frames = pl.frames(HOVA_STREAM_VIDEO);
        ASSERT_EQ(frames.size(), 2u);
        EXPECT_EQ(frames[0].crc32, crc(v1));
        EXPECT_EQ(frames[0].size, 900);
        EXPECT_EQ(frames[1].crc32, crc(v2));
        // Without a partial object the scan borrowed a fresh frame and gave it back.
        EXPECT_EQ(pl.of_kind(EventKind::Discard).size(), partial ? 0u : 1u);
        EXPECT_EQ(std::count(pl.results.begin(), pl.results.end(), HOVA_TryAgain), 0);
        pl.expect_clean_close();
    }
}

// Damage that moves packets off their grid: bytes inserted before a packet
// (it and every later packet shifted), the same with the packet's tail cut so
// that later packets stay on the grid, and bytes lost from a packet (every
// later packet earlier). Single- and multiple-payload packets, every buffering
// mode. No frame carries bytes that are not its own, and every object lying
// wholly in the packets from two after the damage on arrives.
TEST(Resync, PacketsOffTheirGridNeverLendBytesToOtherObjects) {
    std::vector<asfb::Object> objs;
    for (uint32_t i = 0; i < 40; ++i)
        objs.push_back({static_cast<uint8_t>(1 + i % 2), 40 * i, asfb::pattern(150 + 53 * (i % 5), 700 + i),
                        i % 2 == 1});
    asfb::PacketLayout single;
    single.multiple = false;
    const Bytes junk = {0x90, 0x11, 0x22, 0x33, 0x44, 0x55, 0x66};
    enum Kind { kInserted, kInsertedSlotKept, kLost };
    const char* kind_names[] = {"inserted", "inserted, slot kept", "lost"};
    const uint32_t kSize = 512, kAt = 4;
    for (bool multiple : {true, false}) {
        const std::vector<Bytes> packets = asfb::mux(objs, kSize, multiple ? asfb::PacketLayout{} : single, 1, 480);
        for (Kind kind : {kInserted, kInsertedSlotKept, kLost}) {
            std::vector<Bytes> damaged = packets;
            Bytes& d = damaged[kAt];
            if (kind == kInserted) d.insert(d.begin(), junk.begin(), junk.end());
            if (kind == kInsertedSlotKept) {
                d.insert(d.begin(), junk.begin(), junk.end());
                d.resize(kSize);
            }
            if (kind == kLost) d.resize(kSize - junk.size());
            asfb::PacketFile f;
            f.packet_size = kSize;
            f.packets = damaged;
            f.packet_count = packets.size();
            const Bytes file = asfb::build_packet_file(f);
            // Objects wholly in packets from kAt + 3 on: their first fragment's
            // packet is found by muxing again up to them.
            for (int m = 0; m < 2; ++m) {
                SCOPED_TRACE(testing::Message() << kind_names[kind] << (multiple ? ", multiple" : ", single")
                                                << (m ? ", none" : ", cache"));
                host::InputOptions in;
                in.disable_cache = m == 1;
                Player pl(file, in);
                pl.open_or_fail();
                ASSERT_EQ(pl.play(), HOVA_EndOfStream);
                std::set<int64_t> seen;
                for (hova_stream_type_et t : {HOVA_STREAM_AUDIO, HOVA_STREAM_VIDEO})
                    for (const auto& fr : pl.frames(t)) {
                        const asfb::Object* o = nullptr;
                        for (const auto& c : objs)
                            if (int64_t(c.pts_ms) * 1000 == fr.pts) o = &c;
                        ASSERT_NE(o, nullptr) << fr.pts;
                        EXPECT_EQ(fr.crc32, crc(o->data)) << "frame at " << fr.pts;
                        EXPECT_EQ(fr.size, int(o->data.size())) << "frame at " << fr.pts;
                        seen.insert(fr.pts);
                    }
                // From two packets after the damage on, objects arrive whole.
                size_t bytes = 0, missing = 0;
                for (size_t i = 0; i + 2 < objs.size(); ++i) {
                    bytes += objs[i].data.size();
                    if (bytes > (kAt + 3) * 480 && !seen.count(int64_t(objs[i].pts_ms) * 1000)) ++missing;
                }
                EXPECT_EQ(missing, 0u);
                pl.expect_clean_close();
            }
        }
    }
}

TEST(Resync, APacketWithoutAPlausibleStartCostsOnePacket) {
    Bytes junk(1024, 0x00);
    junk[0] = 0x91;  // announces error correction, in an unusual form; nothing matches after it
    const Bytes a1 = asfb::pattern(50, 1), a3 = asfb::pattern(50, 3);
    Player pl(av_file({asfb::packet({asfb::media(1, 1, 0, 50, 0, a1)}, 1024), junk,
                       asfb::packet({asfb::media(1, 3, 0, 50, 20, a3)}, 1024),
                       asfb::packet({asfb::media(1, 4, 0, 50, 30, a1)}, 1024)}));
    pl.open_or_fail();
    ASSERT_EQ(pl.play(), HOVA_EndOfStream);
    const auto frames = pl.frames(HOVA_STREAM_AUDIO);
    ASSERT_EQ(frames.size(), 2u);
    EXPECT_EQ(frames[0].crc32, crc(a1));
    EXPECT_EQ(frames[1].crc32, crc(a3));
    pl.expect_clean_close();
}

}  // namespace
}  // namespace delivery
