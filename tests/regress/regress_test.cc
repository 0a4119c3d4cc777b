// Findings of the fuzz targets, each rebuilt with the ASF builder as the
// smallest file that shows it, and a replay of every input kept under
// tests/regress/inputs/<target>/ through the same driver the target uses
// (the driver aborts on a wrong result code, a call over one second, a
// block left after close or a misused frame callback).
#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <limits>
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
namespace fs = std::filesystem;

// The file properties' play duration and preroll are both untrusted 64-bit
// values: their difference in microseconds once overflowed a signed 64-bit
// integer. The duration is now the wrapped difference, and open goes on.
TEST(Regress, FilePropertiesDurationAndPrerollAtTheirExtremes) {
    const std::pair<uint64_t, uint64_t> cases[] = {  // play duration, preroll
        {0xFFFFFFFFFFFFFFFFull, 0},                      // largest duration
        {50000000, (1ull << 32) + 1000},                 // preroll above 32 bits
        {0x16640000000000ull, 0xFFFFFFFFFFFFFFFFull},    // preroll * 1000 wraps
        {0, 0x7FFFFFFFFFFFFFFFull},
        {0xFFFFFFFFFFFFFFFFull, 0x8000000000000000ull},
    };
    for (const auto& [play_duration, preroll] : cases) {
        SCOPED_TRACE(preroll);
        asfb::FileProps fp;
        fp.play_duration = play_duration;
        fp.preroll = preroll;
        fp.packet_count = 2;
        auto f = testsupport::file_with({asfb::audio_stream(1)}, fp);
        auto o = testsupport::open_file(f);
        ASSERT_EQ(o.rc, HOVA_OK);
        EXPECT_EQ(o.ctx()->s.duration, static_cast<int64_t>(play_duration / 10 - preroll * 1000));
        EXPECT_TRUE(o.close_clean());
        // Every host action the seek target knows, so that a finding in any
        // entry point shows here under the test build's sanitizers.
        const plugfuzz::Op ops[] = {{0, 20}, {2, 8}, {0x0a, 200}, {0, 10}, {3, 4},
                                    {0, 10}, {4, 1}, {0, 10},     {5, 3},  {7, 0}};
        const Bytes file = asfb::build(f);
        plugfuzz::run(file.data(), file.size(), plugfuzz::Mode{}, ops, std::size(ops));
    }
}

// The corpus's damaged file (a header built to loop a parser forever) goes
// through the hang guard: every entry point in every buffering mode, with
// and without host actions, returns within a second.
TEST(Regress, DamagedCorpusFileNeverHangsAnyEntryPoint) {
    REQUIRE_CORPUS_FILE(path, "musicmeta-CWE-835.wma");
    const Bytes file = testenv::read_file_or_empty(path);
    for (uint8_t buffering = 0; buffering < 4; ++buffering) {
        SCOPED_TRACE(static_cast<int>(buffering));
        Bytes input(plugfuzz::kModeBytes + plugfuzz::kOpBytes, 0);
        input[0] = buffering;
        const uint8_t ops[] = {0, 50, 2, 8, 0x0a, 200, 3, 4, 4, 1, 7, 0};
        std::copy(std::begin(ops), std::end(ops), input.begin() + plugfuzz::kModeBytes);
        input.insert(input.end(), file.begin(), file.end());
        plugfuzz::modes_input(input.data(), input.size());
    }
    plugfuzz::play_input(file.data(), file.size());
}

std::vector<fs::path> kept_inputs(const std::string& target) {
    std::vector<fs::path> out;
    const fs::path dir = fs::path(PLIMO_SOURCE_DIR) / "tests/regress/inputs" / target;
    std::error_code ec;
    if (!fs::is_directory(dir, ec)) return out;
    for (const auto& e : fs::directory_iterator(dir, ec))
        if (e.is_regular_file()) out.push_back(e.path());
    std::sort(out.begin(), out.end());
    return out;
}

TEST(Regress, KeptFuzzInputsReplayCleanly) {
    const struct {
        const char* target;
        void (*replay)(const uint8_t*, size_t);
    } targets[] = {
        {"plugin_play", plugfuzz::play_input},
        {"plugin_seek", plugfuzz::seek_input},
        {"plugin_modes", plugfuzz::modes_input},
        {"reader_ops", [](const uint8_t* d, size_t n) { (void)readerfuzz::ops_input(d, n); }},
    };
    size_t replayed = 0;
    for (const auto& t : targets) {
        for (const auto& path : kept_inputs(t.target)) {
            SCOPED_TRACE(path.string());
            std::vector<uint8_t> bytes;
            ASSERT_TRUE(testenv::read_file(path.string(), &bytes));
            t.replay(bytes.data(), bytes.size());
            ++replayed;
        }
    }
    RecordProperty("replayed", static_cast<int>(replayed));
}

}  // namespace
