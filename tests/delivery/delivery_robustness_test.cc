// Bad input and a refusing host: a file cut anywhere in its data ends with
// the end-of-stream result, refused frame memory costs objects but never
// stops delivery, and nothing is committed beyond what the host handed out.
#include <set>

#include "delivery_fixture.h"
#include "test_env.h"

namespace delivery {
namespace {

// Audio and video objects of several sizes muxed into multi-payload packets,
// with a compressed payload and a spread-free layout mix.
Bytes sample_file() {
    std::vector<asfb::Object> objs;
    for (uint32_t k = 0; k < 12; ++k) {
        objs.push_back({1, 40 * k, asfb::pattern(180 + 11 * k, k)});
        objs.push_back({2, 40 * k, asfb::pattern(900 + 53 * k, 100 + k), k % 4 == 0});
    }
    std::vector<Bytes> packets = asfb::mux(objs, 800);
    packets.push_back(asfb::packet({asfb::compressed(1, 40, 500, 20, {asfb::pattern(30, 1), asfb::pattern(40, 2)}),
                                    asfb::media(1, 41, 0, 20, 560, asfb::pattern(20, 3))},
                                   800));
    return av_file(packets, 800);
}

struct Outcome {
    int last;
    size_t frames;
};

// Plays to the end; every get_data result is one of the documented ones.
Outcome play_to_end(Player& pl) {
    int last = -1;
    for (int i = 0; i < 100000; ++i) {
        last = pl.step();
        EXPECT_TRUE(last == HOVA_OK || last == HOVA_TryAgain || last == HOVA_EndOfStream ||
                    last == HOVA_NotEnoughMemory)
            << last;
        if (last == HOVA_EndOfStream) break;
    }
    return {last, pl.frames(HOVA_STREAM_AUDIO).size() + pl.frames(HOVA_STREAM_VIDEO).size()};
}

// The data object of a built or real file starts behind the header object;
// the sweep covers everything from there to the end.
size_t data_start(const Bytes& file) {
    Player pl(file);
    pl.open_or_fail();
    const size_t first = pl.ctx()->first_packet;
    pl.expect_clean_close();
    return first;
}

void sweep_truncation(const Bytes& file, size_t step) {
    const size_t start = data_start(file) - 50;  // the data object header too
    for (size_t cut = start; cut < file.size(); cut += step) {
        SCOPED_TRACE(cut);
        Bytes part(file.begin(), file.begin() + static_cast<long>(cut));
        Player pl(part);
        if (pl.open() != HOVA_OK) {
            EXPECT_EQ(pl.host.outstanding_blocks(), 0u);
            continue;
        }
        const Outcome o = play_to_end(pl);
        EXPECT_EQ(o.last, HOVA_EndOfStream);
        pl.expect_clean_close();
    }
}

// The built sample, then the real files when the corpus is present.
const char* const kRealFiles[] = {"moon-timecode-short.wmv", "musicmeta-elephant.asf"};

TEST(Robustness, AFileCutAnywhereInItsDataEnds) {
    sweep_truncation(sample_file(), 7);
    for (const char* name : kRealFiles) {
        const std::string path = testenv::corpus_file(name);
        if (path.empty()) continue;
        SCOPED_TRACE(name);
        sweep_truncation(testenv::read_file_or_empty(path), 97);
    }
}

void sweep_refusals(const Bytes& file) {
    Player base(file);
    base.open_or_fail();
    const Outcome whole = play_to_end(base);
    const uint64_t allocs = base.alloc_calls;
    std::set<std::pair<int64_t, uint32_t>> known;
    for (auto t : {HOVA_STREAM_AUDIO, HOVA_STREAM_VIDEO})
        for (const auto& e : base.frames(t)) known.insert({e.pts, e.crc32});
    base.expect_clean_close();
    ASSERT_GT(allocs, 20u);
    ASSERT_EQ(whole.last, HOVA_EndOfStream);

    for (uint64_t n = 1; n <= allocs; ++n) {
        SCOPED_TRACE(n);
        Player pl(file);
        pl.open_or_fail();
        pl.refuse_alloc_at(n);
        const Outcome o = play_to_end(pl);
        EXPECT_EQ(o.last, HOVA_EndOfStream);
        EXPECT_GE(o.frames + 1, whole.frames);
        EXPECT_LE(o.frames, whole.frames);
        for (auto t : {HOVA_STREAM_AUDIO, HOVA_STREAM_VIDEO})
            for (const auto& e : pl.frames(t)) EXPECT_TRUE(known.count({e.pts, e.crc32}));
        pl.expect_clean_close();
    }
}

TEST(Robustness, ARefusedFrameCostsAtMostItsObject) {
    sweep_refusals(sample_file());
    for (const char* name : kRealFiles) {
        const std::string path = testenv::corpus_file(name);
        if (path.empty()) continue;
        SCOPED_TRACE(name);
        sweep_refusals(testenv::read_file_or_empty(path));
    }
}

TEST(Robustness, ShortReadsAndFailingSeeksNeverHang) {
    const Bytes file = sample_file();
    struct Row {
        size_t max_read;
        int64_t fail_seeks_after;
        int64_t fail_reads_after;
    };
    const Row rows[] = {{3, -1, -1}, {1, -1, -1}, {SIZE_MAX, 5, -1}, {SIZE_MAX, 0, -1},
                        {SIZE_MAX, -1, 10}, {17, 9, 40}};
    for (const Row& r : rows) {
        for (bool cache : {true, false}) {
            SCOPED_TRACE(testing::Message() << r.max_read << " " << r.fail_seeks_after << " "
                                            << r.fail_reads_after << " cache " << cache);
            host::InputOptions in;
            in.disable_cache = !cache;
            Player pl(file, in);
            if (pl.open() != HOVA_OK) {
                EXPECT_EQ(pl.host.outstanding_blocks(), 0u);
                continue;
            }
            pl.input().faults().max_read = r.max_read;
            pl.input().faults().fail_seeks_after = r.fail_seeks_after;
            pl.input().faults().fail_reads_after = r.fail_reads_after;
            const Outcome o = play_to_end(pl);
            EXPECT_EQ(o.last, HOVA_EndOfStream);
            pl.expect_clean_close();
        }
    }
}

}  // namespace
}  // namespace delivery
