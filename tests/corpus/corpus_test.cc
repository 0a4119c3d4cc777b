// The real files of the corpus against ffprobe's view of them: information
// records (asfdump info), every active stream's frames (sizes, times, CRCs,
// bytes of ffmpeg's stream copy) in every buffering mode, a file changed by
// one field, and seek sweeps landing on a reference key frame on the asked
// side. Files are read in place; the tests skip when they are absent.
#include <unistd.h>
#include <zlib.h>

#include <cinttypes>
#include <cmath>
#include <cstdio>
#include <fstream>
#include <map>
#include <nlohmann/json.hpp>

#include "byte_reader.h"
#include "corpus_play.h"

namespace {

using corpus::Player;
using host::kBufferings;
using host::with_buffering;
using nlohmann::json;

json load_ref(const std::string& path) {
    std::ifstream f(path + ".ffprobe.json");
    return f ? json::parse(f) : json();
}

bool run(const std::string& cmd, std::string* out = nullptr) {
    return testenv::run_command(cmd, out) == 0;
}

struct Ref {
    int64_t pts_us;
    uint32_t size, crc;
    bool key;
};

// ffprobe's packets of the last stream of a kind (the one the plug-in makes
// active); an untimed packet has -1 ms, or is left out with `timed_only`.
std::vector<Ref> reference(const json& ref, const char* kind, bool timed_only, int* index) {
    *index = -1;
    for (const auto& s : ref["streams"])
        if (s["codec_type"] == kind) *index = s["index"].get<int>();
    std::vector<Ref> out;
    for (const auto& p : ref["packets"]) {
        if (p["stream"].get<int>() != *index || (timed_only && p["pts_ms"].is_null())) continue;
        out.push_back(
            {p["pts_ms"].is_null() ? -1000 : p["pts_ms"].get<int64_t>() * 1000,
             p["size"].get<uint32_t>(),
             static_cast<uint32_t>(std::stoul(p["crc32"].get<std::string>(), nullptr, 16)),
             p.value("key", false)});
    }
    return out;
}

// Each frame is one reference packet, or a run of them (the sub-payloads of
// one compressed payload) whose sizes add up to it, with the time of the
// first and the CRC of their concatenation. Returns the packets consumed.
size_t match_frames(const std::vector<host::HostEvent>& frames, const std::vector<Ref>& ref,
                    const std::string& what) {
    size_t i = 0;
    for (size_t k = 0; k < frames.size(); ++k) {
        const host::HostEvent& f = frames[k];
        if (i >= ref.size()) {
            ADD_FAILURE() << what << ": frame " << k << " has no reference packet";
            return i;
        }
        const Ref& first = ref[i];
        uint64_t size = ref[i].size;
        uLong crc = ref[i++].crc;
        for (; size < static_cast<uint64_t>(f.size) && i < ref.size(); ++i) {
            crc = crc32_combine(crc, ref[i].crc, static_cast<z_off_t>(ref[i].size));
            size += ref[i].size;
        }
        if (size != static_cast<uint64_t>(f.size) || crc != f.crc32 || first.pts_us != f.pts) {
            ADD_FAILURE() << what << ": frame " << k << " (pts " << f.pts << ", size " << f.size
                          << ") differs from the reference at " << first.pts_us << " us";
            return i;
        }
    }
    return i;
}

// ---- delivery ----

class CorpusDelivery : public testing::TestWithParam<std::string> {};

// Every active stream's frames against ffprobe's packets (every object but the
// last, which stays pending), the same events in every buffering mode, and the
// committed bytes a prefix of ffmpeg's stream copy. Damaged input (no
// reference) leaves nothing behind and plays to its end when it opens.
TEST_P(CorpusDelivery, FramesMatchTheReferenceInEveryBufferingMode) {
    REQUIRE_CORPUS_FILE(path, GetParam());
    const std::vector<uint8_t> file = testenv::read_file_or_empty(path);
    Player base(file, with_buffering(host::Buffering::Cache), true);
    base.play();
    for (int m = 1; m < 4; ++m) {
        SCOPED_TRACE(host::buffering_name(kBufferings[m]));
        Player other(file, with_buffering(kBufferings[m]));
        other.play();
        EXPECT_EQ(other.trace(), base.trace());
        other.expect_clean_close();
    }
    const json ref = load_ref(path);
    if (ref.is_null()) {
        EXPECT_TRUE(base.rc != HOVA_OK || base.last == HOVA_EndOfStream);
        return base.expect_clean_close();
    }
    ASSERT_EQ(base.rc, HOVA_OK);
    ASSERT_EQ(base.last, HOVA_EndOfStream);
    // End-of-stream notices close the run.
    std::vector<hova_stream_type_et> eos;
    for (const host::HostEvent& e : base.cb().events())
        if (e.kind == host::EventKind::Notify && e.event == HOVA_EVENT_EOS) eos.push_back(e.type);
    ASSERT_FALSE(eos.empty());
    EXPECT_EQ(base.cb().events().back().kind, host::EventKind::Notify);
    const bool ffmpeg = run("ffmpeg -version >/dev/null 2>&1");
    for (auto [type, kind] :
         {std::pair{HOVA_STREAM_AUDIO, "audio"}, std::pair{HOVA_STREAM_VIDEO, "video"}}) {
        SCOPED_TRACE(kind);
        int index = -1;
        const std::vector<Ref> pk = reference(ref, kind, false, &index);
        const auto frames = base.frames(type);
        if (std::find(eos.begin(), eos.end(), type) == eos.end()) {
            EXPECT_TRUE(frames.empty());
            continue;
        }
        ASSERT_GE(index, 0);
        EXPECT_EQ(match_frames(frames, pk, GetParam()) + 1, pk.size());
        if (!ffmpeg) continue;
        std::string copy;
        run("ffmpeg -v quiet -i '" + path + "' -map 0:" + std::to_string(index) +
                " -c copy -f data - 2>/dev/null",
            &copy);
        std::vector<uint8_t> mine;
        for (const host::HostEvent& f : frames)
            mine.insert(mine.end(), f.bytes.begin(), f.bytes.end());
        ASSERT_LE(mine.size(), copy.size());
        EXPECT_TRUE(
            std::equal(mine.begin(), mine.end(), reinterpret_cast<const uint8_t*>(copy.data())))
            << "committed bytes differ from the stream copy";
    }
    base.expect_clean_close();
}

uint64_t le(const std::vector<uint8_t>& b, size_t at, int n) {
    uint64_t v = 0;
    for (int i = n - 1; i >= 0; --i) v = v << 8 | b[at + static_cast<size_t>(i)];
    return v;
}
void add_le(std::vector<uint8_t>& b, size_t at, int n, uint64_t add) {
    const uint64_t v = le(b, at, n) + add;
    for (int i = 0; i < n; ++i) b[at + static_cast<size_t>(i)] = static_cast<uint8_t>(v >> (8 * i));
}

// Three more payload extension systems (GUID, data size 0xFFFF, no info)
// behind the first extended stream properties object's own, the way other
// encoders write them: the object, the header extension and the header grow
// by 66 bytes. Empty if there is none.
std::vector<uint8_t> with_longer_extension_tail(std::vector<uint8_t> f) {
    static const uint8_t kHeaderExt[4] = {0xB5, 0x03, 0xBF, 0x5F};
    static const uint8_t kExtStream[4] = {0xCB, 0xA5, 0xE6, 0x14};
    const uint64_t header_size = le(f, 16, 8);
    for (size_t at = 30; at + 24 <= header_size; at += le(f, at + 16, 8)) {
        if (!std::equal(kHeaderExt, kHeaderExt + 4, f.begin() + static_cast<long>(at))) continue;
        const size_t ext_end = at + le(f, at + 16, 8);
        for (size_t c = at + 46; c + 24 <= ext_end; c += le(f, c + 16, 8)) {
            if (!std::equal(kExtStream, kExtStream + 4, f.begin() + static_cast<long>(c))) continue;
            std::vector<uint8_t> systems;
            for (int i = 0; i < 3; ++i) {
                for (int k = 0; k < 16; ++k)
                    systems.push_back(static_cast<uint8_t>(0x40 + 16 * i + k));
                systems.insert(systems.end(), {0xFF, 0xFF, 0, 0, 0, 0});
            }
            f.insert(f.begin() + static_cast<long>(c + le(f, c + 16, 8)), systems.begin(),
                     systems.end());
            add_le(f, c + 16, 8, 66);
            add_le(f, c + 24 + 62, 2, 3);
            add_le(f, at + 16, 8, 66);
            add_le(f, at + 24 + 18, 4, 66);
            add_le(f, 16, 8, 66);
            return f;
        }
    }
    return {};
}

TEST(CorpusDelivery, FileChangedByOneFieldPlaysAsTheOriginal) {
    REQUIRE_CORPUS_FILE(path, "moon-timecode-short.wmv");
    const std::vector<uint8_t> file = testenv::read_file_or_empty(path);
    const std::vector<uint8_t> changed = with_longer_extension_tail(file);
    ASSERT_FALSE(changed.empty());
    Player base(file, with_buffering(host::Buffering::Cache));
    ASSERT_EQ(base.rc, HOVA_OK);
    base.play();
    for (host::Buffering b : kBufferings) {
        SCOPED_TRACE(host::buffering_name(b));
        Player other(changed, with_buffering(b));
        other.play();
        EXPECT_EQ(other.trace(), base.trace());
        other.expect_clean_close();
    }
}

std::vector<std::string> corpus_names() {
    std::vector<std::string> out;
    for (const std::string& p : testenv::corpus_files()) out.push_back(corpus::base_name(p));
    if (out.empty()) out.push_back("moon-miguel.wma");  // reported as skipped
    return out;
}

INSTANTIATE_TEST_SUITE_P(Corpus, CorpusDelivery, testing::ValuesIn(corpus_names()),
                         [](const testing::TestParamInfo<std::string>& i) {
                             std::string n = i.param;
                             for (char& c : n)
                                 if (!isalnum(static_cast<unsigned char>(c))) c = '_';
                             return n;
                         });

// ---- information ----

// The announced duration in microseconds: play duration less preroll, 0 for
// broadcast content; read straight from the file properties object.
int64_t announced_duration(const std::vector<uint8_t>& file) {
    static const uint8_t kFileProp[16] = {0xA1, 0xDC, 0xAB, 0x8C, 0x47, 0xA9, 0xCF, 0x11,
                                          0x8E, 0xE4, 0x00, 0xC0, 0x0C, 0x20, 0x53, 0x65};
    auto it = std::search(file.begin(), file.end(), std::begin(kFileProp), std::end(kFileProp));
    if (it == file.end()) return -1;
    const uint8_t* body = &*it + 24;
    if (plimo::load_le<uint32_t>(body + 64) & 1) return 0;
    return static_cast<int64_t>(plimo::load_le<uint64_t>(body + 40) / 10) -
           static_cast<int64_t>(plimo::load_le<uint64_t>(body + 56) * 1000);
}

std::string asfdump_info(const std::string& path, const char* redirect) {
    std::string out;
    const int rc = testenv::run_command("'" + testenv::asfdump_path() + "' info --plugin '" +
                                            testenv::plugin_path() + "' '" + path + "' " + redirect,
                                        &out);
    return std::to_string(rc) + "\n" + out;
}

TEST(CorpusInfo, AgreesWithFfprobe) {
    static const std::map<std::string, std::string> kCodecNames = {{"wmav1", "WMA1"},
                                                                   {"wmav2", "WMA2"},
                                                                   {"wmapro", "WMA3"},
                                                                   {"wmalossless", "WMA_LOSSLESS"},
                                                                   {"wmavoice", "WMA_VOICE"},
                                                                   {"mp3", "MP3"},
                                                                   {"aac", "AAC"},
                                                                   {"ac3", "AC3"},
                                                                   {"vc1", "WVC1"},
                                                                   {"wmv1", "WMV1"},
                                                                   {"wmv2", "WMV2"},
                                                                   {"wmv3", "WMV3"},
                                                                   {"msmpeg4v3", "DIV3"},
                                                                   {"msmpeg4v2", "MP42"},
                                                                   {"mpeg4", "M4V"}};
    int compared = 0;
    for (const std::string& path : testenv::corpus_files()) {
        const json ref = load_ref(path);
        if (ref.is_null()) continue;  // the damaged file
        SCOPED_TRACE(path);
        const std::string dump = asfdump_info(path, "2>/dev/null");
        ASSERT_EQ(dump.substr(0, 2), "0\n") << "asfdump info failed";
        const json info = json::parse(dump.substr(2));
        compared++;
        std::vector<json> ref_audio, ref_video;
        for (const json& s : ref["streams"]) {
            if (s["codec_type"] == "audio") ref_audio.push_back(s);
            // A cover picture appears as a video stream without a FourCC.
            if (s["codec_type"] == "video" && s.value("codec_tag_string", "") != "[0][0][0][0]")
                ref_video.push_back(s);
        }
        ASSERT_EQ(info["audio"].size(), ref_audio.size());
        ASSERT_EQ(info["video"].size(), ref_video.size());
        for (size_t i = 0; i < ref_audio.size(); ++i) {
            const json &ours = info["audio"][i], &theirs = ref_audio[i];
            EXPECT_EQ(ours["codec_name"], kCodecNames.at(theirs["codec_name"])) << "audio " << i;
            EXPECT_EQ(ours["sample_rate"], std::stoi(theirs["sample_rate"].get<std::string>()));
            EXPECT_EQ(ours["language"], theirs.value("language", "")) << "audio " << i;
        }
        for (size_t i = 0; i < ref_video.size(); ++i) {
            const json &ours = info["video"][i], &theirs = ref_video[i];
            EXPECT_EQ(ours["codec_name"], kCodecNames.at(theirs["codec_name"])) << "video " << i;
            EXPECT_EQ(ours["width"], theirs["width"]);
            EXPECT_EQ(ours["height"], theirs["height"]);
        }
        EXPECT_EQ(info["active_audio"].is_null(), ref_audio.empty());
        EXPECT_EQ(info["active_video"].is_null(), ref_video.empty());
        const int64_t duration = info["program"]["duration"];
        EXPECT_EQ(duration, announced_duration(testenv::read_file_or_empty(path)));
        const json& ff = ref["format"]["duration"];
        if (ff.is_null()) {
            EXPECT_EQ(duration, 0) << "ffprobe sees no duration only in broadcast content";
            continue;
        }
        const double ff_us = std::stod(ff.get<std::string>()) * 1e6;
        if (std::fabs(ff_us - static_cast<double>(duration)) <= 1000) continue;
        // ffprobe counts the announced duration from each audio or video
        // stream's first packet and reports the latest end; where one stream
        // starts late and the packets stop short of the announced play time the
        // two figures part. The plug-in reports the announced duration.
        std::map<int, double> first_ms;
        double last_ms = 0, latest_start = 0;
        for (const json& pk : ref["packets"]) {
            const json& t = pk["pts_ms"].is_null() ? pk["dts_ms"] : pk["pts_ms"];
            const int st = pk["stream"];
            const std::string type = ref["streams"][st]["codec_type"];
            if (t.is_null() || (type != "audio" && type != "video")) continue;
            const double ms = t.get<double>();
            first_ms[st] = first_ms.count(st) ? std::min(first_ms[st], ms) : ms;
            last_ms = std::max(last_ms, ms);
        }
        for (const auto& [st, ms] : first_ms) latest_start = std::max(latest_start, ms);
        EXPECT_LT(last_ms * 1000, static_cast<double>(duration)) << "ffprobe " << ff_us << " us";
        EXPECT_NEAR(ff_us, static_cast<double>(duration) + latest_start * 1000, 1000);
        std::printf("duration differs from ffprobe (packets end early): %s\n", path.c_str());
    }
    if (compared == 0) GTEST_SKIP() << "no corpus in " << testenv::corpus_dir();
}

TEST(CorpusInfo, DamagedFileFailsToOpenCleanly) {
    REQUIRE_CORPUS_FILE(path, "musicmeta-CWE-835.wma");
    const std::string out = asfdump_info(path, "2>&1");
    EXPECT_EQ(out.substr(0, 2), "1\n");
    EXPECT_NE(out.find("HOVA_OpenFailed"), std::string::npos) << out;
    EXPECT_EQ(out.find("blocks still held"), std::string::npos) << out;
    Player p(testenv::read_file_or_empty(path));
    EXPECT_EQ(p.rc, HOVA_OpenFailed);
    p.expect_clean_close();
}

TEST(CorpusInfo, SameAnswersInEveryBufferingMode) {
    for (const std::string& path : testenv::corpus_files()) {
        SCOPED_TRACE(path);
        const std::vector<uint8_t> bytes = testenv::read_file_or_empty(path);
        std::vector<std::string> answers;
        for (host::Buffering b :
             {host::Buffering::None, host::Buffering::Cache, host::Buffering::Thread}) {
            Player p(bytes, with_buffering(b));
            std::string a = std::to_string(p.rc);
            if (p.rc == HOVA_OK) {
                hova_audio_info_st au{};
                hova_video_info_st vi{};
                hova_program_info_st pr{};
                hova_asff_demuxer.get_info(p.ctx(), HOVA_STREAM_PROG, 0, &pr);
                const int ra = hova_asff_demuxer.get_info(p.ctx(), HOVA_STREAM_AUDIO, -1, &au);
                const int rv = hova_asff_demuxer.get_info(p.ctx(), HOVA_STREAM_VIDEO, -1, &vi);
                for (int64_t v : {pr.duration, int64_t{ra}, int64_t{au.codec}, int64_t{rv},
                                  int64_t{vi.codec}, int64_t{p.ctx()->index_count},
                                  int64_t{p.ctx()->first_packet}, int64_t{pr.cover.length}})
                    a += " " + std::to_string(v);
            }
            p.expect_clean_close();
            answers.push_back(a);
        }
        EXPECT_EQ(answers[1], answers[0]);
        EXPECT_EQ(answers[2], answers[0]);
    }
}

// ---- seeking ----

struct SweepFile {
    std::string name;
    std::vector<uint8_t> bytes;
    std::vector<Ref> own;  // the stream the plug-in seeks on: video, else audio
    bool video;
};

// WMV7 and WMV8 made by ffmpeg at test time with key frames only every 2 s,
// so that most targets lie far from a key frame.
void add_made_files(std::vector<SweepFile>* files) {
    char dir[] = "/tmp/plimo_seek_XXXXXX";
    if (!run("command -v ffmpeg >/dev/null && command -v ffprobe >/dev/null") || !::mkdtemp(dir))
        return;
    for (std::string codec : {"wmv1", "wmv2"}) {
        const std::string path = std::string(dir) + "/" + codec + ".wmv";
        std::string out;
        if (!run("ffmpeg -v error -f lavfi -i testsrc=size=160x120:rate=25:duration=7 -c:v " +
                 codec + " -g 50 -f asf " + path) ||
            !run("ffprobe -v quiet -print_format json -show_packets -show_data_hash CRC32 "
                 "-select_streams v " +
                     path,
                 &out))
            continue;
        SweepFile f{"ffmpeg-" + codec + ".wmv", testenv::read_file_or_empty(path), {}, true};
        const json probed = json::parse(out);
        for (const auto& pk : probed["packets"]) {
            const std::string hash = pk["data_hash"].get<std::string>();
            f.own.push_back(
                {std::llround(std::stod(pk["pts_time"].get<std::string>()) * 1000) * 1000,
                 static_cast<uint32_t>(std::stoul(pk["size"].get<std::string>())),
                 static_cast<uint32_t>(std::stoul(hash.substr(hash.find(':') + 1), nullptr, 16)),
                 pk["flags"].get<std::string>().find('K') != std::string::npos});
        }
        files->push_back(std::move(f));
        std::remove(path.c_str());
    }
    ::rmdir(dir);
}

// 20 targets spread over each file (a little off the frame grid), both
// directions, with the file's index and with the copy cut after the data
// object, in the file cache and unbuffered. A backward seek lands on the last
// key frame at or before the target (time 0 when there is none), a forward
// seek on a key frame at or after it whenever one exists, else it fails.
// Delivery then hands over that key frame byte for byte among its first
// frames. The sweep is printed as a table.
TEST(CorpusSeek, SweepLandsOnTheAskedSideAndDeliversTheKeyFrame) {
    std::vector<SweepFile> files;
    for (const std::string& path : testenv::corpus_files()) {
        const json ref = load_ref(path);
        if (ref.is_null()) continue;
        int index;
        SweepFile f{corpus::base_name(path), testenv::read_file_or_empty(path),
                    reference(ref, "video", true, &index), true};
        if (f.own.empty()) {
            f.own = reference(ref, "audio", true, &index);
            f.video = false;
            for (Ref& r : f.own) r.key = true;  // every object start
        }
        files.push_back(std::move(f));
    }
    if (files.empty()) GTEST_SKIP() << "no corpus in " << testenv::corpus_dir();
    add_made_files(&files);
    std::printf("%-40s %-6s %-6s %-8s %12s %3s %12s %7s\n", "file", "index", "buffer", "dir",
                "target_us", "rc", "found_us", "before");
    for (const SweepFile& f : files) {
        Player probe(f.bytes);
        ASSERT_EQ(probe.rc, HOVA_OK) << f.name;
        const uint32_t first_packet = probe.ctx()->first_packet;
        const bool had_index = probe.ctx()->index_packet != 0;
        probe.expect_clean_close();
        std::vector<int64_t> keys;
        for (const Ref& r : f.own)
            if (r.key) keys.push_back(r.pts_us);
        std::sort(keys.begin(), keys.end());
        ASSERT_FALSE(keys.empty()) << f.name;
        const hova_stream_type_et kind = f.video ? HOVA_STREAM_VIDEO : HOVA_STREAM_AUDIO;
        std::vector<std::pair<const char*, std::vector<uint8_t>>> variants = {
            {had_index ? "index" : "none", f.bytes}};
        if (had_index) {  // the copy cut after the data object: no index
            std::vector<uint8_t> cut = f.bytes;
            const uint64_t end =
                first_packet < 50
                    ? cut.size()
                    : first_packet - 50 +
                          plimo::load_le<uint64_t>(cut.data() + first_packet - 50 + 16);
            cut.resize(std::min<uint64_t>(end, cut.size()));
            variants.push_back({"cut", cut});
        }
        for (const auto& [variant, bytes] : variants)
            for (bool cache : {true, false})
                for (int k = 1; k <= 20; ++k)
                    for (int dir : {HOVA_SEEK_BACKWARD, HOVA_SEEK_FORWARD}) {
                        const int64_t target = f.own.back().pts_us * k / 21 + 7000;
                        SCOPED_TRACE(testing::Message()
                                     << f.name << " " << variant << " cache " << cache << " target "
                                     << target << " dir " << dir);
                        host::InputOptions in;
                        in.disable_cache = !cache;
                        Player p(bytes, in);
                        ASSERT_EQ(p.rc, HOVA_OK);
                        int64_t found = target;
                        const int rc = p.seek(dir, &found);
                        int before = -1;  // frames of the kind delivered before the one found
                        uint32_t crc = 0;
                        for (int calls = 0; rc == HOVA_OK && calls < 100000 && before < 0;
                             ++calls) {
                            const int r = p.step();
                            const auto frames = p.frames(kind);
                            for (size_t i = 0; i < frames.size() && before < 0; ++i)
                                if (frames[i].pts == found)
                                    before = static_cast<int>(i), crc = frames[i].crc32;
                            if ((r != HOVA_OK && r != HOVA_TryAgain) || frames.size() > 120) break;
                        }
                        p.expect_clean_close();
                        std::printf("%-40s %-6s %-6s %-8s %12" PRId64 " %3d %12" PRId64 " %7d\n",
                                    f.name.c_str(), variant, cache ? "cache" : "none",
                                    dir == HOVA_SEEK_BACKWARD ? "backward" : "forward", target, rc,
                                    rc == HOVA_OK ? found : -1, before);
                        if (dir == HOVA_SEEK_FORWARD && keys.back() < target) {
                            EXPECT_EQ(rc, HOVA_SeekFailed);
                            continue;
                        }
                        ASSERT_EQ(rc, HOVA_OK);
                        EXPECT_TRUE(dir == HOVA_SEEK_BACKWARD ? found <= target : found >= target)
                            << found;
                        if (dir == HOVA_SEEK_BACKWARD && keys.front() > target) {
                            EXPECT_EQ(found, 0);
                            continue;
                        }
                        const Ref* key = nullptr;
                        for (const Ref& r : f.own)
                            if (r.key && r.pts_us == found && !key) key = &r;
                        ASSERT_NE(key, nullptr) << found << " is no reference key frame";
                        if (key == &f.own.back()) continue;  // the last object stays pending
                        EXPECT_GE(before, 0) << "the frame at " << found << " was not delivered";
                        if (f.video) {
                            EXPECT_EQ(crc, key->crc);
                            EXPECT_LE(before, 8);
                        }
                    }
    }
}

// Files that interleave audio and video more than 2 s apart play with two
// cursors; a seek then places both. Every video frame after it carries a
// reference time, the key frame found comes first and byte for byte, and
// audio resumes too.
TEST(CorpusSeek, SeekDuringSeparateParsingRestartsBothStreams) {
    int seen = 0;
    for (const std::string& path : testenv::corpus_files()) {
        const json ref = load_ref(path);
        int index;
        if (ref.is_null() || reference(ref, "audio", true, &index).empty()) continue;
        const std::vector<Ref> video = reference(ref, "video", true, &index);
        if (video.empty()) continue;
        SCOPED_TRACE(path);
        Player p(testenv::read_file_or_empty(path));
        ASSERT_EQ(p.rc, HOVA_OK);
        for (int i = 0; i < 5000 && p.ctx()->parse_mode != PARSE_SEP; ++i)
            if (p.step() == HOVA_EndOfStream) break;
        seen += p.ctx()->parse_mode == PARSE_SEP;
        for (int dir : {HOVA_SEEK_BACKWARD, HOVA_SEEK_FORWARD}) {
            if (p.ctx()->parse_mode != PARSE_SEP) break;
            int64_t t = p.ctx()->s.duration / 3;
            ASSERT_EQ(p.seek(dir, &t), HOVA_OK);
            const size_t from = p.cb().events().size();
            for (int i = 0; i < 300; ++i)
                if (p.step() == HOVA_EndOfStream) break;
            std::vector<host::HostEvent> v, a;
            for (size_t i = from; i < p.cb().events().size(); ++i) {
                const host::HostEvent& e = p.cb().events()[i];
                if (e.kind == host::EventKind::Commit && e.packet_type == 0)
                    (e.type == HOVA_STREAM_VIDEO ? v : a).push_back(e);
            }
            ASSERT_FALSE(v.empty());
            EXPECT_FALSE(a.empty());
            size_t key_at = v.size();
            for (size_t i = 0; i < v.size(); ++i) {
                bool known = false;
                for (const Ref& r : video) known |= r.pts_us == v[i].pts;
                EXPECT_TRUE(known) << "video frame at " << v[i].pts;
                if (v[i].pts != t || key_at != v.size()) continue;
                key_at = i;
                const Ref* k = nullptr;
                for (const Ref& r : video)
                    if (r.key && r.pts_us == t) k = &r;
                ASSERT_NE(k, nullptr);
                EXPECT_EQ(k->crc, v[i].crc32);
            }
            EXPECT_LE(key_at, 8u) << "key frame at " << t;
        }
        p.expect_clean_close();
    }
    if (seen == 0) GTEST_SKIP() << "no badly interleaved file in " << testenv::corpus_dir();
}

}  // namespace
