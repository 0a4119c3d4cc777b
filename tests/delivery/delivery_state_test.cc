// What a played file does to the plug-in's state and log: the switch to
// separate parsing, the scan for a new header, track switching, spread-audio
// failures, refused memory, cut files and bad inputs, and `asfdump frames`.
#include <nlohmann/json.hpp>

#include <set>
#include <sstream>

#include "asf_internal.h"
#include "asf_modes.h"
#include "delivery_fixture.h"
#include "test_env.h"

namespace delivery {
namespace {

std::vector<asfb::Object> skewed(uint32_t n, uint32_t a, uint32_t v, uint32_t vsize = 700) {
    std::vector<asfb::Object> objs;
    for (uint32_t k = 0; k < n; ++k) {
        objs.push_back({1, a + 40 * k, asfb::pattern(150 + k % 13, k)});
        objs.push_back({2, v + 40 * k, asfb::pattern(vsize + 37 * (k % 7), 1000 + k), k % 10 == 0});
    }
    return objs;
}

TEST(Interleave, SwitchesWhenStreamsAreMoreThanTwoSecondsApart) {
    const struct { uint32_t video_ms; bool streaming, switches; } rows[] = {
        {12500, false, true}, {12000, false, false}, {12001, false, true},
        {12500, true, false}, {7500, false, true}};
    for (const auto& r : rows) {
        SCOPED_TRACE(testing::Message() << r.video_ms << " streaming " << r.streaming);
        host::InputOptions in;
        in.streaming = r.streaming;
        Player pl(av_file(asfb::mux(skewed(30, 9960, r.video_ms), 1024)), in);
        testenv::LogCapture log;
        pl.open_or_fail();
        ASSERT_EQ(pl.step(), HOVA_OK);
        ASSERT_EQ(pl.ctx()->parse_mode, PARSE_SEQ);
        ASSERT_EQ(pl.step(), HOVA_OK);
        EXPECT_EQ(pl.ctx()->parse_mode, r.switches ? PARSE_SEP : PARSE_SEQ);
        if (r.switches) {
                EXPECT_TRUE(log.contains("bad interleaved ASF detected, switch to index base, v " +
                                     std::to_string(r.video_ms * 1000) + ", a 10000000"));
            EXPECT_EQ(pl.ctx()->accept_stream_type,
                      r.video_ms > 10000 ? HOVA_STREAM_AUDIO : HOVA_STREAM_VIDEO);
        }
        pl.expect_clean_close();
    }
}

TEST(Interleave, SeparateParsingFollowsTheStreamBehindAndAudioOnEqualTimes) {
    Player pl(av_file(asfb::mux(skewed(30, 0, 3000), 1024)));
    pl.open_or_fail();
    asf_demuxer_st* d = pl.ctx();
    asf_stream_st* a = &d->stream_info[d->s.active_stream[AUD]];
    asf_stream_st* v = &d->stream_info[d->s.active_stream[VID]];
    d->parse_mode = PARSE_SEP;
    reset_data_packet(&a->cache_data_packet, 0);
    reset_data_packet(&v->cache_data_packet, 3);
    const struct { int64_t a, v; uint64_t packet; } rows[] = {
        {5000, 4000, 3}, {5000, 5000, 0}, {5000, 5001, 0}, {-1, 7, 0}, {9, -1, 3}};
    for (const auto& r : rows) {
        a->pts = r.a, v->pts = r.v;
        asf_follow_stream_behind(d);
        EXPECT_EQ(d->accept_stream_type, r.packet ? HOVA_STREAM_VIDEO : HOVA_STREAM_AUDIO);
        EXPECT_EQ(d->cur_packets, r.packet);
        EXPECT_EQ(d->s.cbuffer.curpos, d->first_packet + r.packet * d->packet_size);
    }
    pl.expect_clean_close();
}

TEST(EndOfData, ScansForANewHeaderWhenTheInputAsksForIt) {
    asfb::PacketFile f;
    f.video = false, f.packet_size = 512;
    f.packets = asfb::mux({{1, 0, asfb::pattern(100, 1)}, {1, 40, asfb::pattern(100, 2)}}, 512);
    Bytes file = asfb::build_packet_file(f);
    const cb_off_t found = cb_off_t(file.size() + 100);
    file.resize(file.size() + 100, 0x33);
    const Bytes next = asfb::build_packet_file(f);
    file.insert(file.end(), next.begin(), next.end());
    const struct { int detect; int64_t clock_step; bool finds; } rows[] = {
        {0, 0, false}, {1, 0, true}, {1, 4000000, false}};  // the clock runs past 3 s
    for (const auto& r : rows) {
        SCOPED_TRACE(testing::Message() << r.detect << " " << r.clock_step);
        host::InputOptions in;
        in.detect_discontinuity = r.detect;
        Player pl(file, in);
        testenv::LogCapture log;
        pl.open_or_fail();
        pl.host.clock_step_us = r.clock_step;
        ASSERT_EQ(pl.play(), HOVA_EndOfStream);
        EXPECT_EQ(pl.input().counters().discontinuities,
                  r.finds ? std::vector<cb_off_t>{found} : std::vector<cb_off_t>{});
        EXPECT_EQ(log.contains("asf_detect_discontinuity timed out"), r.clock_step != 0);
        EXPECT_EQ(log.contains("detect discontinuity at " + std::to_string(found)), r.finds);
        EXPECT_EQ(pl.of_kind(EventKind::Notify), 1u);
        EXPECT_EQ(pl.frames(HOVA_STREAM_AUDIO).size(), 1u);
        pl.expect_clean_close();
    }
}

TEST(Track, OnlySwitchingOffIsAccepted) {
    const struct { hova_stream_type_et type; int index, result, off;
    } rows[] = {{HOVA_STREAM_PROG, 0, HOVA_OK, -1},
                {HOVA_STREAM_PROG, 1, HOVA_InvalidParam, -1},
                {HOVA_STREAM_AUDIO, 0, HOVA_InvalidParam, -1},
                {HOVA_STREAM_VIDEO, 1, HOVA_InvalidParam, -1},
                {HOVA_STREAM_AUDIO, -1, HOVA_OK, AUD},
                {HOVA_STREAM_VIDEO, -1, HOVA_OK, VID},
                {HOVA_STREAM_SUBTITLE, -1, HOVA_OK, SUB},
                {HOVA_STREAM_NONE, -1, HOVA_InvalidParam, -1},
                {HOVA_STREAM_CLIP, -1, HOVA_InvalidParam, -1}};
    for (const auto& r : rows) {
        SCOPED_TRACE(testing::Message() << r.type << " " << r.index);
        Player pl(av_file(asfb::mux(skewed(2, 0, 0), 1024)));
        pl.open_or_fail();
        int* active = pl.ctx()->s.active_stream;
        active[SUB] = 5;  // a subtitle track pretended active
        const int before[3] = {active[0], active[1], active[2]};
        for (int twice = 0; twice < 2; ++twice)
            EXPECT_EQ(
                hova_asff_demuxer.set_track(pl.ctx(), r.type, r.index, 123, HOVA_INPUT_MASTER),
                r.result);
        for (int k = 0; k < 3; ++k) EXPECT_EQ(active[k], k == r.off ? -1 : before[k]) << k;
        active[SUB] = -1;
        pl.expect_clean_close();
    }
}

// Switched off before the first call, during separate parsing, or right after
// a packet abandoned there: the other stream gives each of its objects once.
TEST(Track, AStreamSwitchedOffLeavesTheOtherWhole) {
    const auto objs = skewed(80, 0, 3000, 900);
    std::vector<Bytes> damaged = asfb::mux(objs, 1024);
    damaged.insert(damaged.begin() + 30, asfb::damaged_packet(asfb::Damage::PaddingTooLong,
                   {asfb::media(1, 200, 0, 10, 0, asfb::pattern(10, 1))}, 1024));
    const Bytes plain = av_file(asfb::mux(objs, 1024)), broken = av_file(damaged);
    for (auto off : {HOVA_STREAM_AUDIO, HOVA_STREAM_VIDEO}) {
        for (int at : {0, 3, 40, -1}) {  // -1: at the abandoned packet
            SCOPED_TRACE(testing::Message() << off << " at " << at);
            Player pl(at == -1 ? broken : plain);
            pl.open_or_fail();
            int rc = HOVA_OK;
            for (int i = 0; at == -1 ? rc == HOVA_OK : i < at; ++i) rc = pl.step();
            ASSERT_EQ(rc, at == -1 ? HOVA_TryAgain : HOVA_OK);
            if (at) {
                ASSERT_EQ(pl.ctx()->parse_mode, PARSE_SEP);
            }
            ASSERT_EQ(hova_asff_demuxer.set_track(pl.ctx(), off, -1, 0, HOVA_INPUT_MASTER),
                      HOVA_OK);
            auto& ev = pl.host.events();
            ev.erase(std::remove_if(ev.begin(), ev.end(), [&](auto& e) { return e.type == off; }),
                     ev.end());
            EXPECT_EQ(pl.ctx()->parse_mode, PARSE_SEQ);
            EXPECT_EQ(pl.ctx()->accept_stream_type, HOVA_STREAM_NONE);
            ASSERT_EQ(pl.play(), HOVA_EndOfStream);
            std::vector<Want> want;
            for (const Want& w : all_but_last(objs))
                if ((w.stream == 1) == (off == HOVA_STREAM_VIDEO)) want.push_back(w);
            expect_frames(pl, want);
            if (!at) {
                EXPECT_TRUE(pl.configs(off).empty());
                EXPECT_EQ(pl.host.events().size(), 1 + want.size() + 1);
                EXPECT_NE(pl.last_type, off);
            }
            pl.expect_clean_close();
        }
    }
}

TEST(Spread, RefusedMemoryOrMismatchedSizeCommitsTheObjectAsReceivedAndSaysWhy) {
    for (bool refuse : {false, true}) {
        const Bytes got = asfb::pattern(refuse ? 12 : 11, 3);
        asfb::PacketFile f;
        f.video = false, f.spread = {3, 4, 2}, f.packet_size = 2048;
        f.packets = {asfb::packet({asfb::media(1, 1, 0, uint32_t(got.size()), 100, got),
                                   asfb::media(1, 2, 0, 4, 200, {1, 2, 3, 4})}, 2048)};
        Player pl(asfb::build_packet_file(f));
        testenv::LogCapture log;
        pl.open_or_fail();
        pl.host.refuse_stream_realloc = refuse;
        ASSERT_EQ(pl.step(), HOVA_OK);
        expect_frames(pl, {{1, 100000, got}});
        EXPECT_TRUE(log.contains(refuse ? "realloc for audio spread fails"
                                        : "object size 11 does not match spread len 3 x 4"));
        pl.expect_clean_close();
    }
}

TEST(Refusal, AConfigurationIsRetriedAndRefusedFrameMemoryCostsObjectsOnly) {
    Player cfg(av_file({asfb::packet({asfb::media(1, 1, 0, 10, 0, asfb::pattern(10, 1))}, 1024)}));
    cfg.open_or_fail();
    cfg.host.refuse_stream_alloc = true;
    EXPECT_EQ(cfg.step(), HOVA_NotEnoughMemory);
    EXPECT_TRUE(cfg.host.events().empty());
    cfg.host.refuse_stream_alloc = false;
    EXPECT_EQ(cfg.step(), HOVA_EndOfStream);
    EXPECT_EQ(cfg.configs(HOVA_STREAM_AUDIO).size() + cfg.configs(HOVA_STREAM_VIDEO).size(), 2u);
    cfg.expect_clean_close();
    std::vector<asfb::Object> objs;
    for (uint32_t i = 0; i < 20; ++i) {
        objs.push_back({1, i * 20, asfb::pattern(300, i)});
        objs.push_back({2, i * 20, asfb::pattern(1500, i + 100), i % 5 == 0});
    }
    for (bool realloc : {false, true}) {
        Player pl(av_file(asfb::mux(objs, 1024)));
        pl.open_or_fail();
        ASSERT_EQ(pl.step(), HOVA_OK);
        const size_t v0 = pl.frames(HOVA_STREAM_VIDEO).size();
        const size_t before = pl.frames(HOVA_STREAM_AUDIO).size() + v0;
        pl.host.refuse_stream_alloc = !realloc;
        pl.host.refuse_stream_realloc = realloc;
        ASSERT_EQ(pl.play(), HOVA_EndOfStream);
        EXPECT_EQ(pl.count(HOVA_OK), 38u);  // every completed object still ends a call
        const size_t a = pl.frames(HOVA_STREAM_AUDIO).size(),
                     v = pl.frames(HOVA_STREAM_VIDEO).size();
        EXPECT_TRUE(realloc ? a > 10 && v <= v0 + 1 : a + v <= before + 2) << a << " " << v;
        pl.expect_clean_close();
    }
}

// Cut anywhere, every frame allocation refused in turn, short reads and
// failing seeks: delivery ends with the end result, keeps only true frames.
Bytes sample_file() {
    std::vector<asfb::Object> objs = skewed(12, 0, 0, 900);
    std::vector<Bytes> packets = asfb::mux(objs, 800);
    packets.push_back(asfb::packet(
        {asfb::compressed(1, 40, 500, 20, {asfb::pattern(30, 1), asfb::pattern(40, 2)}),
         asfb::media(1, 41, 0, 20, 560, asfb::pattern(20, 3))}, 800));
    return av_file(packets, 800);
}
size_t play_to_end(Player& pl, std::set<std::pair<int64_t, uint32_t>>* known) {
    int rc = HOVA_OK;
    for (int i = 0; i < 100000 && rc != HOVA_EndOfStream; ++i) {
        rc = pl.step();
        EXPECT_TRUE(rc == HOVA_OK || rc == HOVA_TryAgain || rc == HOVA_EndOfStream ||
                    rc == HOVA_NotEnoughMemory) << rc;
    }
    EXPECT_EQ(rc, HOVA_EndOfStream);
    size_t n = 0;
    for (auto t : {HOVA_STREAM_AUDIO, HOVA_STREAM_VIDEO})
        for (const auto& e : pl.frames(t)) {
            if (known->empty() || known->count({e.pts, e.crc32})) ++n;
            else ADD_FAILURE() << "foreign frame at " << e.pts;
        }
    return n;
}

TEST(Robustness, CutFilesRefusedFramesAndBadInputsEndCleanly) {
    std::vector<Bytes> files = {sample_file()};
    for (const char* name : {"moon-timecode-short.wmv", "musicmeta-elephant.asf"})
        if (!testenv::corpus_file(name).empty())
            files.push_back(testenv::read_file_or_empty(testenv::corpus_file(name)));
    for (size_t k = 0; k < files.size(); ++k) {
        SCOPED_TRACE(k);
        const Bytes& file = files[k];
        std::set<std::pair<int64_t, uint32_t>> known, none;
        Player base(file);
        base.open_or_fail();
        const size_t whole = play_to_end(base, &known);
        for (auto t : {HOVA_STREAM_AUDIO, HOVA_STREAM_VIDEO})
            for (const auto& e : base.frames(t)) known.insert({e.pts, e.crc32});
        const uint64_t allocs = base.alloc_calls, first = base.ctx()->first_packet;
        base.expect_clean_close();
        ASSERT_GT(allocs, 20u);
        for (uint64_t n = 1; n <= allocs; ++n) {
            Player pl(file);
            pl.open_or_fail();
            pl.refuse_alloc_at(n);
            EXPECT_GE(play_to_end(pl, &known) + 1, whole) << n;
            pl.expect_clean_close();
        }
        for (size_t cut = first - 50; cut < file.size(); cut += k ? 97 : 7) {
            Player pl(Bytes(file.begin(), file.begin() + long(cut)));
            if (pl.open() == HOVA_OK) play_to_end(pl, &none);
            pl.expect_clean_close();
        }
    }
    const struct { size_t max_read; int64_t seeks, reads; } rows[] = {
        {3, -1, -1}, {1, -1, -1}, {SIZE_MAX, 5, -1}, {SIZE_MAX, 0, -1}, {SIZE_MAX, -1, 10},
        {17, 9, 40}};
    for (const auto& r : rows)
        for (bool cache : {true, false}) {
            host::InputOptions in;
            in.disable_cache = !cache;
            Player pl(files[0], in);
            std::set<std::pair<int64_t, uint32_t>> none;
            if (pl.open() == HOVA_OK) {
                pl.input().faults().max_read = r.max_read;
                pl.input().faults().fail_seeks_after = r.seeks;
                pl.input().faults().fail_reads_after = r.reads;
                play_to_end(pl, &none);
            }
            pl.expect_clean_close();
        }
}

TEST(AsfdumpFrames, PrintsEveryHostEventAndHonoursItsOptions) {
    const std::string dir = testing::TempDir() + "asfdump-frames", file = dir + "/a.asf";
    ASSERT_EQ(system(("mkdir -p " + dir).c_str()), 0);
    const auto objs = skewed(6, 1000, 1000, 900);
    const Bytes bytes = av_file(asfb::mux(objs, 1024), 1024, 500);
    FILE* out = fopen(file.c_str(), "wb");
    fwrite(bytes.data(), 1, bytes.size(), out), fclose(out);
    auto run = [&](const std::string& args, int* status = nullptr) {
        std::string text;
        const int rc = testenv::run_command(testenv::asfdump_path() + " frames " + file + args +
                                            " 2>/dev/null", &text);
        if (status) *status = rc;
        std::vector<nlohmann::ordered_json> lines;
        std::istringstream in(text);
        for (std::string l; std::getline(in, l);) lines.push_back(nlohmann::ordered_json::parse(l));
        return lines;
    };
    int status = -1;
    auto d = run("", &status);
    ASSERT_EQ(status, 0);
    ASSERT_EQ(d.size(), 2u + 10 + 2 + 1);
    EXPECT_EQ(d[0].dump().substr(0, 79),
              R"({"call":1,"event":"config","type":"audio","codec":24,"codec_name":"WMA2","size")");
    EXPECT_EQ(d[1]["codec_name"], "WMV3");
    std::vector<std::string> lines;
    for (const auto& w : all_but_last(objs, 500)) {
        char crc_hex[9];
        snprintf(crc_hex, sizeof crc_hex, "%08x", crc(w.data));
        lines.push_back(std::string(R"("event":"frame","type":")") +
                        (w.stream == 1 ? "audio" : "video") + R"(","pts":)" +
                        std::to_string(w.pts) + R"(,"size":)" + std::to_string(w.data.size()) +
                        R"(,"crc32":")" + crc_hex + "\"}");
    }
    std::vector<std::string> got;
    for (size_t i = 2; i < 12; ++i)
        got.push_back(d[i].dump().substr(d[i].dump().find(",\"event") + 1));
    std::sort(got.begin(), got.end()), std::sort(lines.begin(), lines.end());
    EXPECT_EQ(got, lines);
    EXPECT_EQ(d[12]["event"], "eos");
    EXPECT_EQ(d[12]["type"], "audio");
    EXPECT_EQ(d[13]["type"], "video");
    EXPECT_EQ(d[14].dump(), R"({"event":"end","result":)" + std::to_string(HOVA_EndOfStream) +
                                R"(,"calls":)" + d[12]["call"].dump() +
                                R"(,"blocks_outstanding":0})");
    auto count = [](const std::vector<nlohmann::ordered_json>& l, const char* ev,
                    const char* type) {
        return std::count_if(l.begin(), l.end(), [&](const auto& j) {
            return j["event"] == ev && (!type || j["type"] == type);
        });
    };
    d = run(" --no-audio");
    EXPECT_EQ(count(d, "frame", "audio") + count(d, "config", "audio"), 0);
    EXPECT_EQ(count(d, "frame", "video"), 5);
    EXPECT_EQ(count(run(" --no-video"), "eos", "video"), 0);
    d = run(" --max-frames 3", &status);
    EXPECT_EQ(status, 0);
    EXPECT_EQ(count(d, "frame", nullptr), 3);
    EXPECT_EQ(count(d, "eos", nullptr), 0);
    EXPECT_EQ(d.back()["result"], HOVA_OK);
    std::vector<int64_t> pts;  // one key frame, at 1000 ms (-500 preroll)
    for (const auto& j : run(" --thumbnail 300000"))
        if (j["event"] == "frame" && j["type"] == "video") pts.push_back(j["pts"]);
    EXPECT_EQ(pts, (std::vector<int64_t>{500000}));
    ASSERT_EQ((run(" --dump-streams " + dir, &status), status), 0);
    Bytes audio;
    for (const auto& w : all_but_last(objs))
        if (w.stream == 1) audio.insert(audio.end(), w.data.begin(), w.data.end());
    EXPECT_EQ(testenv::read_file_or_empty(dir + "/audio.bin"), audio);
    run(" --max-frames", &status);
    EXPECT_EQ(status, 2);
}

// Packets shifted by inserted or lost bytes: every frame delivered is exactly one
// object's bytes, and from two packets after the damage on nothing is missing.
TEST(Resync, PacketsOffTheirGridNeverLendBytesToOtherObjects) {
    std::vector<asfb::Object> objs;
    for (uint32_t i = 0; i < 40; ++i)
        objs.push_back({static_cast<uint8_t>(1 + i % 2), 40 * i,
                        asfb::pattern(150 + 53 * (i % 5), 700 + i), i % 2 == 1});
    asfb::PacketLayout single;
    single.multiple = false;
    const Bytes junk = {0x90, 0x11, 0x22, 0x33, 0x44, 0x55, 0x66};
    const uint32_t kSize = 512, kAt = 4;
    for (bool multiple : {true, false}) {
        const auto packets = asfb::mux(objs, kSize, multiple ? asfb::PacketLayout{} : single, 1, 480);
        for (int kind = 0; kind < 3; ++kind) {  // inserted, inserted with the slot kept, lost
            std::vector<Bytes> damaged = packets;
            Bytes& d = damaged[kAt];
            if (kind < 2) d.insert(d.begin(), junk.begin(), junk.end());
            d.resize(kind == 0 ? d.size() : kind == 1 ? kSize : kSize - junk.size());
            asfb::PacketFile f;
            f.packet_size = kSize;
            f.packets = damaged;
            f.packet_count = packets.size();
            const Bytes file = asfb::build_packet_file(f);
            for (int m = 0; m < 2; ++m) {
                SCOPED_TRACE(testing::Message() << kind << multiple << m);
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
                size_t bytes = 0, missing = 0;
                for (size_t i = 0; i + 2 < objs.size(); ++i) {
                    bytes += objs[i].data.size();
                    if (bytes > (kAt + 3) * 480 && !seen.count(int64_t(objs[i].pts_ms) * 1000))
                        ++missing;
                }
                EXPECT_EQ(missing, 0u);
                pl.expect_clean_close();
            }
        }
    }
}

}  // namespace
}  // namespace delivery
