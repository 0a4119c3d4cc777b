// Seeks over the real files: a sweep of targets in both directions, with the
// file's index and with the index hidden (the copy cut after the data
// object). Every seek that succeeds lands on a key frame of ffprobe's packet
// list on the asked side of the target, and delivery then hands over that
// key frame byte for byte among its first video frames. The sweep is printed
// as a table (frames delivered before the key frame included).
#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include <cinttypes>
#include <cstdio>
#include <fstream>
#include <set>

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

struct Target {
    const char* name;
    double fraction;
};
constexpr Target kTargets[] = {{"start", 0.0}, {"10%", 0.1}, {"1/3", 1.0 / 3},
                               {"1/2", 0.5},   {"3/4", 0.75}, {"past end", 1.25}};
constexpr int kVideoFramesLooked = 120;

struct Outcome {
    int rc = -1;
    int64_t found = 0;
    int before = -1;        // video frames delivered before the key frame; -1: not seen
    bool bytes_match = false;
    // The index as the seek saw it.
    int64_t index_start = -1;
    uint64_t index_interval = 0;
};

// Opens, seeks, and plays until the frame carrying the found time shows up.
Outcome seek_and_play(const std::vector<uint8_t>& file, int dir, int64_t target, bool video,
                      const RefPacket* (*lookup)(int64_t, const void*), const void* ref) {
    Outcome o;
    Player p(file);
    if (p.open() != HOVA_OK) return o;
    o.found = target;
    o.rc = hova_asff_demuxer.seek_time(p.ctx(), dir, &o.found, 0);
    o.index_start = p.ctx()->index_start_offset;
    o.index_interval = p.ctx()->index_time_interval;
    if (o.rc == HOVA_OK) {
        const hova_stream_type_et kind = video ? HOVA_STREAM_VIDEO : HOVA_STREAM_AUDIO;
        for (int calls = 0; calls < 100000; ++calls) {
            const int r = p.step();
            const auto frames = p.frames(kind);
            bool done = r != HOVA_OK && r != HOVA_TryAgain;
            for (size_t i = 0; i < frames.size() && o.before < 0; ++i) {
                if (frames[i].pts != o.found) continue;
                o.before = static_cast<int>(i);
                const RefPacket* k = lookup(o.found, ref);
                o.bytes_match = k && k->size == static_cast<uint32_t>(frames[i].size) &&
                                k->crc == frames[i].crc32;
            }
            if (o.before >= 0 || frames.size() > kVideoFramesLooked) done = true;
            if (done) break;
        }
    }
    p.expect_clean_close();
    return o;
}

const RefPacket* find_key(int64_t pts, const void* ref) {
    for (const RefPacket& r : *static_cast<const std::vector<RefPacket>*>(ref))
        if (r.key && r.pts_us == pts) return &r;
    return nullptr;
}
const RefPacket* find_start(int64_t pts, const void* ref) {
    for (const RefPacket& r : *static_cast<const std::vector<RefPacket>*>(ref))
        if (r.pts_us == pts) return &r;
    return nullptr;
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

// Packet numbers of the file's simple index entries (empty without one).
std::vector<uint32_t> index_entries(const std::vector<uint8_t>& file, uint64_t at, uint32_t count) {
    std::vector<uint32_t> out;
    for (uint64_t i = 0; i < count && at != 0 && at + 6 * (i + 1) <= file.size(); ++i)
        out.push_back(plimo::load_le<uint32_t>(file.data() + at + 6 * i));
    return out;
}

TEST(CorpusSeek, SweepLandsOnReferenceKeyFramesAndDeliversThem) {
    int files = 0;
    std::printf("%-40s %-8s %-8s %-9s %12s %3s %12s %7s\n", "file", "index", "dir", "target",
                "target_us", "rc", "found_us", "before");
    for (const std::string& path : testenv::corpus_files()) {
        std::ifstream refin(path + ".ffprobe.json");
        if (!refin.good()) continue;
        const nlohmann::json ref = nlohmann::json::parse(refin);
        const std::string name = path.substr(path.find_last_of('/') + 1);
        std::vector<uint8_t> file;
        ASSERT_TRUE(testenv::read_file(path, &file));
        const std::vector<RefPacket> video = reference(ref, "video");
        const std::vector<RefPacket> audio = reference(ref, "audio");
        const bool has_video = !video.empty();

        Player probe(file);
        ASSERT_EQ(probe.open(), HOVA_OK) << name;
        const int64_t duration = probe.ctx()->s.duration;
        const uint32_t first_packet = probe.ctx()->first_packet;
        const bool had_index = probe.ctx()->index_packet != 0;
        const bool no_packets = probe.ctx()->num_packets == 0;
        const uint64_t num_packets = probe.ctx()->num_packets;
        const uint32_t packet_size = probe.ctx()->packet_size;
        const std::vector<uint32_t> entries =
            index_entries(file, probe.ctx()->index_packet, probe.ctx()->index_count);
        probe.expect_clean_close();
        ++files;

        std::vector<std::pair<const char*, std::vector<uint8_t>>> variants = {{had_index ? "index" : "none", file}};
        if (has_video && had_index) variants.push_back({"hidden", without_index(file, first_packet)});
        const std::vector<RefPacket>& own = has_video ? video : audio;
        int64_t last_key = -1, first_key = INT64_MAX;
        uint64_t last_key_packet = 0;
        for (const RefPacket& r : own) {
            if (!r.key && has_video) continue;
            last_key = std::max(last_key, r.pts_us);
            first_key = std::min(first_key, r.pts_us);
            last_key_packet = std::max(last_key_packet, (r.pos - first_packet) / packet_size);
        }

        for (const auto& [variant, bytes] : variants) {
            for (const Target& tg : kTargets) {
                const int64_t target = static_cast<int64_t>(duration * tg.fraction);
                for (int dir : {HOVA_SEEK_BACKWARD, HOVA_SEEK_FORWARD}) {
                    SCOPED_TRACE(testing::Message() << name << " " << variant << " " << tg.name
                                                    << " dir " << dir);
                    const Outcome o = seek_and_play(bytes, dir, target, has_video,
                                                    has_video ? find_key : find_start,
                                                    has_video ? &video : &audio);
                    std::printf("%-40s %-8s %-8s %-9s %12" PRId64 " %3d %12" PRId64 " %7d\n", name.c_str(),
                                variant, dir == HOVA_SEEK_BACKWARD ? "backward" : "forward", tg.name,
                                target, o.rc, o.rc == HOVA_OK ? o.found : -1, o.before);
                    if (target == 0) {
                        // Time 0 is packet 0 without a search, whatever time
                        // its first frame carries.
                        EXPECT_EQ(o.rc, HOVA_OK);
                        EXPECT_EQ(o.found, 0);
                        continue;
                    }
                    if (o.rc != HOVA_OK) {
                        // The search fails past the last key frame, and when
                        // its first (interpolated) probe starts after it,
                        // since every probe scans forward.
                        const uint64_t first_probe = std::min<uint64_t>(
                            static_cast<uint64_t>(static_cast<double>(target) * num_packets / duration),
                            num_packets - 1);
                        EXPECT_TRUE(no_packets || target > last_key || first_probe > last_key_packet)
                            << "target " << target << " last key " << last_key;
                        continue;
                    }
                    if (no_packets) continue;
                    if (dir == HOVA_SEEK_FORWARD && o.found < target) {
                        // Only the index answers with an earlier key frame:
                        // when it names one packet from the target's entry on.
                        ASSERT_STRNE(variant, "hidden");
                        ASSERT_GT(o.index_interval, 0u);
                        const uint64_t slot = target < o.index_start
                                                  ? 0
                                                  : (target - o.index_start) / o.index_interval;
                        ASSERT_LT(slot, entries.size());
                        for (uint64_t e = slot; e < entries.size(); ++e) EXPECT_EQ(entries[e], entries[slot]);
                    }
                    // Backward lands at or before the target, unless no key
                    // frame lies there (then on the first, or on packet 0).
                    if (dir == HOVA_SEEK_BACKWARD && o.found != 0 && target >= first_key) {
                        EXPECT_LE(o.found, target);
                    }
                    if (o.found == 0 && target > 0) continue;  // the scan's turn back to packet 0
                    const RefPacket* k = has_video ? find_key(o.found, &video) : find_start(o.found, &audio);
                    EXPECT_NE(k, nullptr) << "found " << o.found << " is no reference key frame";
                    // The stream's last object stays pending at the end.
                    if (o.found == own.back().pts_us) continue;
                    EXPECT_GE(o.before, 0) << "the frame at " << o.found << " was not delivered";
                    if (has_video) {
                        EXPECT_TRUE(o.bytes_match);
                        EXPECT_LE(o.before, 8);
                    }
                }
            }
        }
    }
    if (files == 0) GTEST_SKIP() << "no corpus in " << testenv::corpus_dir();
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
                    const RefPacket* k = find_key(t, &video);
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
