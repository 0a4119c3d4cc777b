// Fault sweeps over whole sessions (open, queries, delivery, seeks, resync,
// close) in every buffering mode, on built and real files. Each sweep first
// runs the session clean to count how often the host's service is used, then
// arms the fault at each of those uses in turn. Whatever fails, every call
// gives a result its entry point may give, the frame callbacks are used by
// the rules, and the host holds nothing after close.
//
// Already swept elsewhere, and not repeated here: the data cut and each
// stream_alloc refused with the default buffering (tests/delivery).
#include <gtest/gtest.h>

#include <algorithm>
#include <string>
#include <vector>

#include "asf_packets.h"
#include "fault_session.h"
#include "test_env.h"

namespace {

using namespace faults;

constexpr Buffering kAllModes[] = {Buffering::Cache, Buffering::None, Buffering::Ring,
                                   Buffering::RingThread};

// Audio and video with an index, objects split over packets, a compressed
// payload: every path of open, delivery and both seek methods is reached.
Bytes built_file() {
    std::vector<asfb::Object> objs;
    for (uint32_t i = 0; i < 16; ++i) {
        objs.push_back({1, 2000 + 100 * i, asfb::pattern(250 + 31 * i, i), true});
        objs.push_back({2, 2040 + 100 * i, asfb::pattern(1300 + 97 * i, 50 + i), i % 4 == 0});
    }
    asfb::PacketFile pf;
    pf.packet_size = 800;
    pf.preroll_ms = 2000;
    pf.packets = asfb::mux(objs, pf.packet_size);
    pf.packets.push_back(asfb::packet(
        {asfb::compressed(1, 40, 3700, 20, {asfb::pattern(30, 1), asfb::pattern(40, 2)})}, 800));
    const uint32_t n = static_cast<uint32_t>(pf.packets.size());
    pf.trailing = {asfb::simple_index(5000000, {{0, 1}, {n / 3, 1}, {2 * n / 3, 1}, {n - 1, 1}})};
    return asfb::build_packet_file(pf);
}

struct Subject {
    std::string name;
    Bytes bytes;
};

// The built file, and real files when the corpus is there: one with video
// and an index, one audio only with a cover picture.
std::vector<Subject> subjects() {
    std::vector<Subject> out = {{"built", built_file()}};
    for (const char* name : {"moon-timecode-short.wmv", "musicmeta-issue_57-cover.wma"}) {
        const std::string path = testenv::corpus_file(name);
        if (!path.empty()) out.push_back({name, testenv::read_file_or_empty(path)});
    }
    return out;
}

// Arms `arm(n)` for n = 1..count, where count comes from the clean run.
template <typename Count, typename Arm>
void sweep(const Subject& s, Buffering b, Count count, Arm arm, uint64_t stride = 1) {
    const Report clean = faults::run_session(s.bytes, b);
    ASSERT_EQ(clean.open_rc, HOVA_OK) << s.name;
    ASSERT_TRUE(clean.clean()) << faults::describe(clean);
    const uint64_t total = count(clean);
    if (total == 0) return;  // e.g. no stream_realloc for a file of small frames
    for (uint64_t n = 1; n <= total + 1; n += (n < 64 ? 1 : stride)) {
        SCOPED_TRACE(testing::Message() << s.name << ", " << faults::name_of(b) << ", at " << n
                                        << " of " << total);
        Fault f;
        arm(f, n);
        const Report r = faults::run_session(s.bytes, b, f);
        EXPECT_TRUE(r.clean()) << faults::describe(r);
    }
}

TEST(FaultSweep, EveryHostAllocationFailsInTurnThroughAWholeSession) {
    for (const Subject& s : subjects())
        for (Buffering b : kAllModes)
            sweep(s, b, [](const Report& r) { return r.mallocs; },
                  [](Fault& f, uint64_t n) { f.fail_malloc = n; });
}

// stream_realloc refused at each call in every mode, and stream_alloc
// refused at each call in the modes the delivery tests do not sweep; the
// session's seeks come between the refusals.
TEST(FaultSweep, EveryFrameBufferRefusalInTurn) {
    for (const Subject& s : subjects()) {
        for (Buffering b : kAllModes) {
            // The thread only changes how bytes arrive: a sample is enough there.
            const uint64_t stride = b == Buffering::RingThread ? 17 : 1;
            sweep(s, b, [](const Report& r) { return r.reallocs; },
                  [](Fault& f, uint64_t n) { f.refuse_realloc = n; }, stride);
            if (b != Buffering::Cache)
                sweep(s, b, [](const Report& r) { return r.allocs; },
                      [](Fault& f, uint64_t n) { f.refuse_alloc = n; }, stride * 3);
        }
    }
}

// The input ends early: at every byte of the header (and the data object's
// header) in every buffering mode (sampled past 4 KiB),
// at a sample of data offsets in every mode, then the whole session runs on
// what there is.
TEST(FaultSweep, InputEndingAtEveryHeaderByteAndAtDataSamples) {
    for (const Subject& s : subjects()) {
        // Where the first packet starts: past the header and the data object's header.
        uint64_t hsize = 0;
        for (int i = 7; i >= 0; --i) hsize = (hsize << 8) | s.bytes[16 + i];
        const uint64_t header_end = std::min<uint64_t>(hsize + 50, s.bytes.size());
        for (Buffering b : kAllModes) {
            std::vector<uint64_t> cuts;
            // Every byte of the first 4 KiB (every fifth with the thread,
            // whose start and stop dominate), then every 97th: a cover
            // picture makes a header of tens of kilobytes.
            const uint64_t near = b == Buffering::RingThread ? 5 : 1;
            for (uint64_t c = 0; c <= header_end; c += (c < 4096 ? near : 97))
                cuts.push_back(c);
            const uint64_t step = std::max<uint64_t>(1, (s.bytes.size() - header_end) / 40);
            for (uint64_t c = header_end + 1; c < s.bytes.size(); c += step) cuts.push_back(c);
            for (uint64_t cut : cuts) {
                SCOPED_TRACE(testing::Message() << s.name << ", " << faults::name_of(b)
                                                << ", input ends after " << cut);
                Fault f;
                f.end_after = cut;
                const Report r = faults::run_session(s.bytes, b, f);
                EXPECT_TRUE(r.clean()) << faults::describe(r);
                if (cut < header_end) {
                    EXPECT_NE(r.open_rc, HOVA_OK);
                }
            }
        }
    }
}

TEST(FaultSweep, InputSeeksRefusedFromEveryCallOn) {
    for (const Subject& s : subjects())
        for (Buffering b : kAllModes)
            sweep(s, b, [](const Report& r) { return r.input_seeks; },
                  [](Fault& f, uint64_t n) { f.fail_seeks_after = static_cast<int64_t>(n - 1); });
}

}  // namespace
