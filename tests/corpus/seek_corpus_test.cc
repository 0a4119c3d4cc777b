// Seeks over the real files: a sweep of targets in both directions, with the
// file's index and with the index hidden (the copy cut after the data
// object). Every seek lands on a key frame of ffprobe's packet list on the
// asked side of the target, and delivery then hands over that key frame byte
// for byte among its first video frames. The sweep is printed as a table
// (frames delivered before the key frame included).
#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include <cinttypes>
#include <cstdio>
#include <fstream>
#include <set>
#include <cmath>
#include <cstdlib>
#include <unistd.h>

#include "../delivery/delivery_fixture.h"
#include "byte_reader.h"
#include "test_env.h"

namespace {

using delivery::Player;

struct RefPacket {
    int64_t pts_us;
    uint32_t size;
    uint32_t crc;
    bool key;
    uint64_t pos;
};

// ffprobe's packets of the last stream of a kind (the one the plug-in plays).
std::vector<RefPacket> reference(const nlohmann::json& ref, const char* kind) {
    int index = -1;
    for (const auto& s : ref["streams"])
        if (s["codec_type"] == kind) index = s["index"].get<int>();
    std::vector<RefPacket> out;
    for (const auto& p : ref["packets"])
        if (p["stream"].get<int>() == index && !p["pts_ms"].is_null())
            out.push_back({p["pts_ms"].get<int64_t>() * 1000, p["size"].get<uint32_t>(),
                           static_cast<uint32_t>(std::stoul(p["crc32"].get<std::string>(), nullptr, 16)),
                           p["key"].get<bool>(), p["pos"].is_null() ? 0 : p["pos"].get<uint64_t>()});
    return out;
}

constexpr int kTargets = 20;
constexpr int kVideoFramesLooked = 120;

struct Outcome {
    int rc = -1;
    int64_t found = 0;
    int before = -1;  // frames of the kind delivered before the one found; -1: not seen
    uint32_t crc = 0;
};

// Opens, seeks, and plays until the frame carrying the found time shows up.
Outcome seek_and_play(const std::vector<uint8_t>& file, const host::InputOptions& in, int dir,
                      int64_t target, hova_stream_type_et kind) {
    Outcome o;
    Player p(file, in);
    if (p.open() != HOVA_OK) return o;
    o.found = target;
    o.rc = hova_asff_demuxer.seek_time(p.ctx(), dir, &o.found, 0);
    if (o.rc == HOVA_OK) {
        for (int calls = 0; calls < 100000 && o.before < 0; ++calls) {
            const int r = p.step();
            const auto frames = p.frames(kind);
            for (size_t i = 0; i < frames.size() && o.before < 0; ++i) {
                if (frames[i].pts != o.found) continue;
                o.before = static_cast<int>(i);
                o.crc = frames[i].crc32;
            }
            if ((r != HOVA_OK && r != HOVA_TryAgain) || frames.size() > kVideoFramesLooked) break;
        }
    }
    p.expect_clean_close();
    return o;
}

// The file cut right after its data object: no index follows.
std::vector<uint8_t> without_index(const std::vector<uint8_t>& file, uint32_t first_packet) {
    constexpr uint32_t kDataHeader = 50;
    if (first_packet < kDataHeader) return file;
    const uint64_t size = plimo::load_le<uint64_t>(file.data() + first_packet - kDataHeader + 16);
    const uint64_t end = first_packet - kDataHeader + size;
    if (end >= file.size()) return file;
    return std::vector<uint8_t>(file.begin(), file.begin() + static_cast<std::ptrdiff_t>(end));
}

// A file to sweep: its bytes and the reference packets of the stream the
// plug-in seeks on (video when there is any, else audio: every object start).
struct SweepFile {
    std::string name;
    std::vector<uint8_t> bytes;
    std::vector<RefPacket> own;
    bool video;
};

// Files made by ffmpeg at test time: WMV7 and WMV8 with key frames only every
// 2 s, so that most targets lie far from a key frame.
std::vector<SweepFile> made_files() {
    std::vector<SweepFile> out;
    if (testenv::run_command("command -v ffmpeg >/dev/null && command -v ffprobe >/dev/null", nullptr) != 0)
        return out;
    char dir[] = "/tmp/plimo_seek_XXXXXX";
    if (!::mkdtemp(dir)) return out;
    for (const char* codec : {"wmv1", "wmv2"}) {
        const std::string path = std::string(dir) + "/" + codec + ".wmv";
        std::string json;
        if (testenv::run_command("ffmpeg -v error -f lavfi -i testsrc=size=160x120:rate=25:duration=7 -c:v " +
                                     std::string(codec) + " -g 50 -f asf " + path,
                                 nullptr) != 0 ||
            testenv::run_command("ffprobe -v quiet -print_format json -show_packets -show_data_hash CRC32 "
                                 "-select_streams v " + path, &json) != 0)
            continue;
        SweepFile f{std::string("ffmpeg-") + codec + ".wmv", {}, {}, true};
        if (!testenv::read_file(path, &f.bytes)) continue;
        const nlohmann::json probed = nlohmann::json::parse(json);
        for (const auto& pk : probed["packets"]) {
            const std::string hash = pk["data_hash"].get<std::string>();
            f.own.push_back({std::llround(std::stod(pk["pts_time"].get<std::string>()) * 1000) * 1000,
                             static_cast<uint32_t>(std::stoul(pk["size"].get<std::string>())),
                             static_cast<uint32_t>(std::stoul(hash.substr(hash.find(':') + 1), nullptr, 16)),
                             pk["flags"].get<std::string>().find('K') != std::string::npos, 0});
        }
        out.push_back(std::move(f));
        std::remove(path.c_str());
    }
    ::rmdir(dir);
    return out;
}

// Seeks over the real files (and two made by ffmpeg): 20 targets spread over
// each file, both directions, with the file's index and with it cut off, in
// the file cache and unbuffered. A backward seek lands on the last key frame
// at or before the target (packet 0 at time 0 when there is none), a forward
// seek on a key frame at or after it whenever one exists, else it fails.
// Delivery then hands over that key frame byte for byte among its first frames.
TEST(CorpusSeek, SweepLandsOnTheAskedSideAndDeliversTheKeyFrame) {
    std::vector<SweepFile> files;
    for (const std::string& path : testenv::corpus_files()) {
        std::ifstream refin(path + ".ffprobe.json");
        if (!refin.good()) continue;
        const nlohmann::json ref = nlohmann::json::parse(refin);
        SweepFile f{path.substr(path.find_last_of('/') + 1), {}, reference(ref, "video"), true};
        if (f.own.empty()) {
            f.own = reference(ref, "audio");
            f.video = false;
            for (RefPacket& r : f.own) r.key = true;
        }
        ASSERT_TRUE(testenv::read_file(path, &f.bytes));
        files.push_back(std::move(f));
    }
    const size_t corpus = files.size();
    for (SweepFile& f : made_files()) files.push_back(std::move(f));
    std::printf("%-40s %-6s %-6s %-8s %12s %3s %12s %7s\n", "file", "index", "buffer", "dir",
                "target_us", "rc", "found_us", "before");
    for (const SweepFile& f : files) {
        Player probe(f.bytes);
        ASSERT_EQ(probe.open(), HOVA_OK) << f.name;
        const uint32_t first_packet = probe.ctx()->first_packet;
        const bool had_index = probe.ctx()->index_packet != 0;
        probe.expect_clean_close();

        std::vector<int64_t> keys;
        for (const RefPacket& r : f.own)
            if (r.key) keys.push_back(r.pts_us);
        std::sort(keys.begin(), keys.end());
        ASSERT_FALSE(keys.empty()) << f.name;
        const int64_t span = f.own.back().pts_us;
        const hova_stream_type_et kind = f.video ? HOVA_STREAM_VIDEO : HOVA_STREAM_AUDIO;

        std::vector<std::pair<const char*, std::vector<uint8_t>>> variants = {
            {had_index ? "index" : "none", f.bytes}};
        if (had_index) variants.push_back({"cut", without_index(f.bytes, first_packet)});
        for (const auto& [variant, bytes] : variants) {
            for (bool cache : {true, false}) {
                host::InputOptions in;
                in.disable_cache = !cache;
                for (int k = 1; k <= kTargets; ++k) {
                    // Spread over the frames, a little off the frame grid.
                    const int64_t target = span * k / (kTargets + 1) + 7000;
                    for (int dir : {HOVA_SEEK_BACKWARD, HOVA_SEEK_FORWARD}) {
                        SCOPED_TRACE(testing::Message() << f.name << " " << variant << " "
                                                        << (cache ? "cache" : "none") << " target "
                                                        << target << " dir " << dir);
                        const Outcome o = seek_and_play(bytes, in, dir, target, kind);
                        std::printf("%-40s %-6s %-6s %-8s %12" PRId64 " %3d %12" PRId64 " %7d\n",
                                    f.name.c_str(), variant, cache ? "cache" : "none",
                                    dir == HOVA_SEEK_BACKWARD ? "backward" : "forward", target, o.rc,
                                    o.rc == HOVA_OK ? o.found : -1, o.before);
                        const bool earlier = keys.front() <= target, later = keys.back() >= target;
                        if (dir == HOVA_SEEK_FORWARD && !later) {
                            EXPECT_EQ(o.rc, HOVA_SeekFailed);
                            continue;
                        }
                        if (o.rc != HOVA_OK) {
                            ADD_FAILURE() << "seek failed with " << o.rc;
                            continue;
                        }
                        if (dir == HOVA_SEEK_BACKWARD) {
                            EXPECT_LE(o.found, target);
                            if (!earlier) {
                                EXPECT_EQ(o.found, 0);
                                continue;
                            }
                        } else {
                            EXPECT_GE(o.found, target);
                        }
                        const RefPacket* key = nullptr;
                        for (const RefPacket& r : f.own)
                            if (r.key && r.pts_us == o.found && !key) key = &r;
                        if (!key) {
                            ADD_FAILURE() << o.found << " is no reference key frame";
                            continue;
                        }
                        if (key == &f.own.back()) continue;  // the last object stays pending
                        EXPECT_GE(o.before, 0) << "the frame at " << o.found << " was not delivered";
                        if (f.video) {
                            EXPECT_EQ(o.crc, key->crc);
                            EXPECT_LE(o.before, 8);
                        }
                    }
                }
            }
        }
    }
    if (corpus == 0) GTEST_SKIP() << "no corpus in " << testenv::corpus_dir();
}

// Files that interleave audio and video more than 2 s apart play with two
// cursors; a seek then places both. Every video frame after it carries a
// reference time (a compressed payload's sub-payloads make one frame), the
// key frame found comes first and byte for byte, and audio resumes too.
TEST(CorpusSeek, SeekDuringSeparateParsingRestartsBothStreams) {
    int seen = 0;
    for (const std::string& path : testenv::corpus_files()) {
        std::ifstream refin(path + ".ffprobe.json");
        if (!refin.good()) continue;
        const nlohmann::json ref = nlohmann::json::parse(refin);
        const std::vector<RefPacket> video = reference(ref, "video");
        if (video.empty() || reference(ref, "audio").empty()) continue;
        std::vector<uint8_t> file;
        ASSERT_TRUE(testenv::read_file(path, &file));
        const std::string name = path.substr(path.find_last_of('/') + 1);
        SCOPED_TRACE(name);
        Player p(file);
        ASSERT_EQ(p.open(), HOVA_OK);
        for (int i = 0; i < 5000 && p.ctx()->parse_mode != PARSE_SEP; ++i)
            if (p.step() == HOVA_EndOfStream) break;
        if (p.ctx()->parse_mode != PARSE_SEP) {
            p.expect_clean_close();
            continue;
        }
        ++seen;
        p.host.events().clear();
        for (int dir : {HOVA_SEEK_BACKWARD, HOVA_SEEK_FORWARD}) {
            int64_t t = p.ctx()->s.duration / 3;
            ASSERT_EQ(hova_asff_demuxer.seek_time(p.ctx(), dir, &t, 0), HOVA_OK);
            const size_t from = p.host.events().size();
            for (int i = 0; i < 300; ++i)
                if (p.step() == HOVA_EndOfStream) break;
            std::vector<host::HostEvent> v, a;
            for (size_t i = from; i < p.host.events().size(); ++i) {
                const host::HostEvent& e = p.host.events()[i];
                if (e.kind != host::EventKind::Commit || e.packet_type != 0) continue;
                (e.type == HOVA_STREAM_VIDEO ? v : a).push_back(e);
            }
            ASSERT_FALSE(v.empty());
            EXPECT_FALSE(a.empty());
            size_t key_at = v.size();
            for (size_t i = 0; i < v.size(); ++i) {
                bool known = false;
                for (const RefPacket& r : video) known |= r.pts_us == v[i].pts;
                EXPECT_TRUE(known) << "video frame at " << v[i].pts;
                if (v[i].pts == t && key_at == v.size()) {
                    key_at = i;
                    const RefPacket* k = nullptr;
                    for (const RefPacket& r : video)
                        if (r.key && r.pts_us == t) k = &r;
                    ASSERT_NE(k, nullptr);
                    EXPECT_EQ(k->crc, v[i].crc32);
                }
            }
            EXPECT_LE(key_at, 8u) << "key frame at " << t;
        }
        p.expect_clean_close();
    }
    std::printf("files played in separate parsing: %d\n", seen);
    if (seen == 0) GTEST_SKIP() << "no badly interleaved file in " << testenv::corpus_dir();
}

}  // namespace
