// Findings of the fuzz targets, replayed through the driver each target uses
// (it aborts on a wrong result code, a call over one second, a block left
// after close or a misused frame callback): files rebuilt as the smallest that
// shows a finding, the corpus's damaged file, and every input kept under
// tests/regress/inputs/<target>/.
#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <set>
#include <string>
#include <vector>

#include "../../fuzz/plugin_driver.h"
#include "../../fuzz/reader_ops_driver.h"
#include "asf_internal.h"
#include "asf_open.h"
#include "asf_packets.h"
#include "test_env.h"

namespace {

using asfb::Bytes;
using Replay = void (*)(const uint8_t*, size_t);
namespace fs = std::filesystem;

// Every host action the seek target knows, so that a finding in any entry
// point shows here under the test build's sanitizers.
void all_actions(const uint8_t* file, size_t size) {
    const plugfuzz::Op ops[] = {{0, 20}, {2, 8}, {0x0a, 200}, {0, 10}, {3, 4},
                                {0, 10}, {4, 1}, {0, 10},     {5, 3},  {7, 0}};
    plugfuzz::run(file, size, plugfuzz::Mode{}, ops, std::size(ops));
}

constexpr uint64_t kHostilePacketCount = 18374686479671623794ull;

// Sets the file properties' packet count; false when the file has none.
bool set_packet_count(Bytes& file, uint64_t count) {
    const size_t body = asfb::file_properties_body(file);
    for (int i = 0; body && i < 8; ++i) file[body + 32 + size_t(i)] = uint8_t(count >> (8 * i));
    return body != 0;
}

TEST(Regress, FuzzFindingsReplayCleanly) {
    std::vector<std::pair<Replay, Bytes>> rows;
    // The file properties' play duration and preroll are untrusted 64-bit
    // values: their difference in microseconds once overflowed a signed
    // integer. The duration is now the wrapped difference, and open goes on.
    const std::pair<uint64_t, uint64_t> extremes[] = {  // play duration, preroll
        {0xFFFFFFFFFFFFFFFFull, 0},                         // largest duration
        {50000000, (1ull << 32) + 1000},                    // preroll above 32 bits
        {0x16640000000000ull, 0xFFFFFFFFFFFFFFFFull},       // preroll * 1000 wraps
        {0, 0x7FFFFFFFFFFFFFFFull},
        {0xFFFFFFFFFFFFFFFFull, 0x8000000000000000ull}};
    for (const auto& [play_duration, preroll] : extremes) {
        const auto f = testsupport::file_with(
            {asfb::audio_stream(1)}, {.packet_count = 2, .play_duration = play_duration, .preroll = preroll});
        auto o = testsupport::open_file(f);
        ASSERT_EQ(o.rc, HOVA_OK);
        EXPECT_EQ(o.ctx()->s.duration, static_cast<int64_t>(play_duration / 10 - preroll * 1000));
        EXPECT_TRUE(o.close_clean());
        rows.push_back({all_actions, asfb::build(f)});
    }
    // A header built to loop a parser forever: played, and through every
    // host action in every buffering mode.
    const std::string damaged = testenv::corpus_file("musicmeta-CWE-835.wma");
    if (!damaged.empty()) {
        const Bytes file = testenv::read_file_or_empty(damaged);
        rows.push_back({plugfuzz::play_input, file});
        for (uint8_t buffering = 0; buffering < 4; ++buffering) {
            Bytes in(plugfuzz::kModeBytes + plugfuzz::kOpBytes, 0);
            in[0] = buffering;
            const uint8_t ops[] = {0, 50, 2, 8, 0x0a, 200, 3, 4, 4, 1, 7, 0};
            std::copy(std::begin(ops), std::end(ops), in.begin() + plugfuzz::kModeBytes);
            in.insert(in.end(), file.begin(), file.end());
            rows.push_back({plugfuzz::modes_input, in});
        }
    }
    // A packet count no data object holds (found by the modes target on a
    // real file): the search without index once interpolated into packets
    // whose positions wrapped around 64 bits and walked back from there one
    // packet number at a time. A built file of that shape and every real file
    // changed so, seeked both ways unbuffered and through a tiny ring.
    std::vector<Bytes> counted;
    {
        std::vector<asfb::Object> objs;
        for (uint32_t i = 0; i < 24; ++i) {
            objs.push_back({1, 100 * i, asfb::pattern(300 + 37 * i, i), true});
            objs.push_back({2, 100 * i + 50, asfb::pattern(1500 + 211 * i, 100 + i), i % 6 == 0});
        }
        asfb::PacketFile pf;
        pf.packets = asfb::mux(objs, 1024);
        pf.packet_count = kHostilePacketCount;
        const auto n = uint32_t(pf.packets.size());
        pf.trailing = {asfb::simple_index(4000000, {{0, 1}, {n / 3, 1}, {2 * n / 3, 1}})};
        for (bool index : {true, false}) {
            if (!index) pf.trailing.clear();
            counted.push_back(asfb::build_packet_file(pf));
            auto o = testsupport::open_bytes(counted.back());
            ASSERT_EQ(o.rc, HOVA_OK);
            EXPECT_EQ(o.ctx()->num_packets, n);  // what the data object holds
            EXPECT_TRUE(o.close_clean());
        }
    }
    for (const std::string& path : testenv::corpus_files()) {
        Bytes file = testenv::read_file_or_empty(path);
        if (set_packet_count(file, kHostilePacketCount)) counted.push_back(std::move(file));
    }
    // A real file with bytes gained in one packet and lost in others (packets
    // of 200 bytes, so a confirmed start lies a whole packet behind the
    // reader): the realignment once took delivery back to it, for ever.
    const std::string markers = testenv::corpus_file("moon-big-streamed-markers.wmv");
    if (Bytes m = markers.empty() ? Bytes{} : testenv::read_file_or_empty(markers); m.size() == 8462) {
        m.erase(m.begin() + 7404, m.begin() + 7688);
        m.erase(m.begin() + 4255, m.begin() + 4258);
        m.insert(m.begin() + 4255, 0x3b);
        m.insert(m.begin() + 3382, {0x1d, 0xfb});
        rows.push_back({plugfuzz::play_input, m});
        Bytes in = {0, 3, 18, 20, 26, 200, 2, 255, 0, 5, 10, 0, 0, 5, 3, 0, 0, 5, 11, 2, 0, 5, 4, 0, 0, 80, 2, 4, 0, 80, 0, 0};
        in.insert(in.end(), m.begin(), m.end());
        rows.push_back({plugfuzz::seek_input, in});
    }
    for (const Bytes& file : counted)
        for (uint8_t buffering : {uint8_t{1}, uint8_t{0xE2}})  // none; ring of 8 KiB read in 64-byte blocks
            for (uint8_t seek : {uint8_t{0x02}, uint8_t{0x0A}}) {  // forward, backward
                Bytes in(plugfuzz::kModeBytes + plugfuzz::kOpBytes, 0);
                in[0] = buffering;
                in[1] = buffering == 1 ? 0 : 2;
                const uint8_t ops[] = {seek, 8, 0, 20, seek, 40, 0, 20};  // to 1 s, to 9 s
                std::copy(std::begin(ops), std::end(ops), in.begin() + plugfuzz::kModeBytes);
                in.insert(in.end(), file.begin(), file.end());
                rows.push_back({plugfuzz::modes_input, in});
            }
    const std::pair<const char*, Replay> targets[] = {
        {"plugin_play", plugfuzz::play_input},
        {"plugin_seek", plugfuzz::seek_input},
        {"plugin_modes", plugfuzz::modes_input},
        {"reader_ops", [](const uint8_t* d, size_t n) { (void)readerfuzz::ops_input(d, n); }}};
    for (const auto& [target, replay] : targets) {
        std::error_code ec;
        std::set<fs::path> kept;  // in name order
        for (const auto& e : fs::directory_iterator(fs::path(PLIMO_SOURCE_DIR) / "tests/regress/inputs" / target, ec))
            if (e.is_regular_file()) kept.insert(e.path());
        for (const auto& path : kept) rows.push_back({replay, testenv::read_file_or_empty(path)});
    }
    for (size_t i = 0; i < rows.size(); ++i) {
        SCOPED_TRACE(i);
        rows[i].first(rows[i].second.data(), rows[i].second.size());
    }
    RecordProperty("replayed", static_cast<int>(rows.size()));
}

}  // namespace
