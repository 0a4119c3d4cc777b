// Fault sweeps over whole sessions (open, queries, deliveries, a seek forward
// and back, a resync, delivery to the end, close) in every buffering mode, on
// a built file and real ones. Each sweep runs the session clean to count how
// often the faulted service is used, then arms the fault at each use in turn.
// Whatever fails, every call gives a result its entry point may give, the
// frame callbacks are used by the rules and the host holds nothing after
// close; a refused frame buffer costs one frame at most, and memory faults
// never bring a frame the clean session did not have.
#include <array>
#include <functional>
#include <set>

#include "../delivery/delivery_fixture.h"
#include "test_env.h"

namespace {

using namespace delivery;
using Frames = std::multiset<std::pair<int64_t, uint32_t>>;

bool in(int rc, std::initializer_list<int> ok) { return std::find(ok.begin(), ok.end(), rc) != ok.end(); }

struct Use {
    std::array<uint64_t, 8> uses{};  // of what each kind of fault is armed on, in kKinds' order
    uint64_t header = 0;
    Frames frames;
};

Use session(const Bytes& file, host::Buffering b, const std::function<void(Player&)>& arm) {
    Player p(file, host::with_buffering(b), 65536);
    arm(p);
    Use u;
    const int orc = p.open();
    EXPECT_TRUE(in(orc, {HOVA_OK, HOVA_NotEnoughMemory, HOVA_OpenFailed, HOVA_EndOfStream})) << orc;
    if (orc == HOVA_OK) {
        const hova_dmx_func_st& d = hova_asff_demuxer;
        void* ctx = p.ctx();
        u.header = p.ctx()->first_packet;
        hova_program_info_st prog{};
        hova_audio_info_st audio{};
        hova_video_info_st video{};
        EXPECT_EQ(d.get_info(ctx, HOVA_STREAM_PROG, 0, &prog), HOVA_OK);
        EXPECT_TRUE(in(d.get_info(ctx, HOVA_STREAM_AUDIO, 0, &audio), {HOVA_OK, HOVA_InvalidParam}));
        EXPECT_TRUE(in(d.get_info(ctx, HOVA_STREAM_VIDEO, 0, &video), {HOVA_OK, HOVA_InvalidParam}));
        const int64_t duration = prog.duration > 0 ? prog.duration : 4000000;
        auto deliver = [&](int n) {
            for (int i = 0, rc = HOVA_OK; i < n && rc != HOVA_EndOfStream; ++i)
                EXPECT_TRUE(in(rc = p.step(), {HOVA_OK, HOVA_TryAgain, HOVA_EndOfStream,
                                               HOVA_NotEnoughMemory})) << rc;
        };
        for (auto [dir, part] : {std::pair{HOVA_SEEK_FORWARD, 2}, {HOVA_SEEK_BACKWARD, 4}}) {
            deliver(30);
            int64_t pts = duration / part;
            EXPECT_TRUE(in(d.seek_time(ctx, dir, &pts, 0), {HOVA_OK, HOVA_SeekFailed}));
        }
        EXPECT_EQ(d.resync_time(ctx, 0), HOVA_OK);
        deliver(20000);
    }
    p.expect_clean_close();
    for (auto t : {HOVA_STREAM_AUDIO, HOVA_STREAM_VIDEO})
        for (const auto& e : p.frames(t)) u.frames.insert({e.pts, e.crc32});
    u.uses = {p.host.malloc_calls(), p.calls[0], p.calls[1], p.input().counters().seeks,
              p.input().counters().reads, 17, file.size(), file.size()};
    return u;
}

// Audio and video with an index, objects split over packets, a compressed
// payload: every path of open, delivery and both seek methods is reached.
Bytes built_file() {
    std::vector<asfb::Object> objs;
    for (uint32_t i = 0; i < 16; ++i) {
        objs.push_back({1, 2000 + 100 * i, asfb::pattern(250 + 31 * i, i), true});
        objs.push_back({2, 2040 + 100 * i, asfb::pattern(1300 + 97 * i, 50 + i), i % 4 == 0});
    }
    asfb::PacketFile pf;
    pf.packet_size = 800, pf.preroll_ms = 2000, pf.packets = asfb::mux(objs, 800);
    pf.packets.push_back(asfb::packet(
        {asfb::compressed(1, 40, 3700, 20, {asfb::pattern(30, 1), asfb::pattern(40, 2)})}, 800));
    const uint32_t n = uint32_t(pf.packets.size());
    pf.trailing = {asfb::simple_index(5000000, {{0, 1}, {n / 3, 1}, {2 * n / 3, 1}, {n - 1, 1}})};
    return asfb::build_packet_file(pf);
}

// Every byte of the header's first 4 KiB (every fifth with the thread), then
// every 97th (a cover picture makes a header of tens of kilobytes), then 40
// places in the data.
uint64_t next_cut(uint64_t n, const Use& u, bool thread) {
    if (n < std::min<uint64_t>(u.header, 4096)) return n + (thread ? 5 : 1);
    return n + (n < u.header ? 97 : std::max<uint64_t>(1, (u.uses[7] - u.header) / 40));
}

struct Kind {
    const char* what;
    void (*arm)(Player&, uint64_t n);
    uint64_t stride = 1;       // every use up to the 64th, then every stride-th
    int frames = 0;            // 1: frames are the clean session's; 2: and one at most lost
};
const Kind kKinds[] = {  // the last one cuts the file itself after n - 1 bytes
    {"malloc fails", [](Player& p, uint64_t n) { p.host.fail_malloc_at(n); }, 1, 1},
    {"stream_alloc refused", [](Player& p, uint64_t n) { p.refuse_at(0, n); }, 1, 2},
    {"stream_realloc refused", [](Player& p, uint64_t n) { p.refuse_at(1, n); }, 1, 2},
    {"seeks fail after",
     [](Player& p, uint64_t n) { p.input().faults().fail_seeks_after = int64_t(n) - 1; }},
    {"reads end after",
     [](Player& p, uint64_t n) { p.input().faults().fail_reads_after = int64_t(n) - 1; }},
    {"reads shorter than", [](Player& p, uint64_t n) { p.input().faults().max_read = n; }},
    {"input ends after", [](Player& p, uint64_t n) { p.input().faults().end_after = n - 1; }, 0},
    {"file cut at", [](Player&, uint64_t) {}, 0}};

TEST(FaultSweep, EveryFaultAtEveryUseThroughAWholeSession) {
    std::vector<std::pair<std::string, Bytes>> files = {{"built", built_file()}};
    for (const char* name : {"moon-timecode-short.wmv", "musicmeta-issue_57-cover.wma"})
        if (!testenv::corpus_file(name).empty())
            files.push_back({name, testenv::read_file_or_empty(testenv::corpus_file(name))});
    for (const auto& [name, file] : files) {
        for (host::Buffering b : host::kBufferings) {
            const bool thread = b == host::Buffering::Thread;
            const Use clean = session(file, b, [](Player&) {});
            ASSERT_GT(clean.frames.size(), 5u) << name;
            for (const Kind& k : kKinds) {
                const bool cut = &k == std::end(kKinds) - 1;
                const uint64_t total = clean.uses[size_t(&k - kKinds)];
                for (uint64_t n = 1; n <= total + 1;
                     n = k.stride ? n + (n < 64 ? 1 : k.stride * (thread ? 17 : 1))
                                  : next_cut(n, clean, thread)) {
                    SCOPED_TRACE(testing::Message() << name << ", " << host::buffering_name(b) << ", "
                                                    << k.what << " " << n << " of " << total);
                    const Bytes part(file.begin(), file.begin() + long(cut ? n - 1 : 0));
                    const Use u = session(cut ? part : file, b, [&](Player& p) { k.arm(p, n); });
                    size_t known = 0;
                    for (const auto& f : u.frames) known += clean.frames.count(f) > 0;
                    EXPECT_TRUE(k.stride || n > clean.header || u.frames.empty());
                    EXPECT_TRUE(!k.frames || known == u.frames.size()) << known;
                    EXPECT_TRUE(k.frames < 2 || u.frames.size() + 1 >= clean.frames.size());
                }
            }
        }
    }
}

// On the device (32-bit ARM, run by scripts/test-arm) the host gives exactly
// 2536 bytes of context, room for the fixed record and two stream records:
// the sweeps above open audio and video in a buffer of exactly that size.
TEST(DeviceContext, MinContextSizeIs2536BytesOn32BitArm) {
    if (sizeof(void*) != 4) GTEST_SKIP() << "a 64-bit build has its own sizes";
    EXPECT_EQ(hova_asff_demuxer.min_context_size, 2536);
    EXPECT_EQ(sizeof(asf_demuxer_st) + 2 * sizeof(asf_stream_st), 2536u);
}

}  // namespace
