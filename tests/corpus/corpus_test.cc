// The real files of the corpus against ffprobe's view of them: every active
// stream's frames (sizes, times, CRCs) and the information answers in every
// buffering mode, a file changed by one field, the information records
// (asfdump info), and seek sweeps landing on a reference key frame on the
// asked side. Files are read in place; the tests
// skip when they are absent.
#include <zlib.h>

#include <fstream>
#include <map>
#include <nlohmann/json.hpp>
#include <set>

#include "byte_reader.h"
#include "corpus_play.h"

namespace {

using corpus::Player;
using host::HostEvent;
using host::kBufferings;
using host::with_buffering;
using nlohmann::json;
constexpr hova_stream_type_et kAudio = HOVA_STREAM_AUDIO, kVideo = HOVA_STREAM_VIDEO;

json load_ref(const std::string& path) {
    std::ifstream f(path + ".ffprobe.json");
    return f ? json::parse(f) : json();
}

struct Ref {
    int64_t pts_us;
    uint32_t size, crc;
    bool key;
};

// ffprobe's packets of the last stream of a kind (the one the plug-in makes
// active); an untimed packet has -1 ms, or is left out with `timed_only`.
std::vector<Ref> reference(const json& ref, const char* kind, bool timed_only) {
    int at = -1;
    for (const auto& s : ref["streams"])
        if (s["codec_type"] == kind) at = s["index"];
    std::vector<Ref> out;
    for (const auto& p : ref["packets"])
        if (p["stream"] == at && !(timed_only && p["pts_ms"].is_null()))
            out.push_back({p["pts_ms"].is_null() ? -1000 : p["pts_ms"].get<int64_t>() * 1000,
                           p["size"], uint32_t(std::stoul(p["crc32"].get<std::string>(), nullptr, 16)),
                           p.value("key", false)});
    return out;
}

// Each frame is one reference packet, or a run of them (the sub-payloads of
// one compressed payload) whose sizes add up to it, with the time of the
// first and the CRC of their concatenation. Returns the packets consumed.
size_t match_frames(const std::vector<HostEvent>& frames, const std::vector<Ref>& ref) {
    size_t i = 0;
    for (const HostEvent& f : frames) {
        const int64_t pts = i < ref.size() ? ref[i].pts_us : -2;  // -2: no reference packet left
        uint64_t size = 0;
        uLong crc = 0;
        for (; i < ref.size() && (size == 0 || size < uint64_t(f.size)); ++i) {
            crc = crc32_combine(crc, ref[i].crc, z_off_t(ref[i].size));
            size += ref[i].size;
        }
        if (size != uint64_t(f.size) || crc != f.crc32 || pts != f.pts) {
            ADD_FAILURE() << "frame at " << f.pts << " (size " << f.size << ") differs from the reference at " << pts;
            return i;
        }
    }
    return i;
}

// What get_info answers right after the open, then every event of the whole play.
std::vector<std::string> answers_and_play(Player& p) {
    std::string a = std::to_string(p.rc);
    if (p.rc == HOVA_OK) {
        hova_audio_info_st au{};
        hova_video_info_st vi{};
        hova_program_info_st pr{};
        hova_asff_demuxer.get_info(p.ctx(), HOVA_STREAM_PROG, 0, &pr);
        const int ra = hova_asff_demuxer.get_info(p.ctx(), kAudio, -1, &au);
        const int rv = hova_asff_demuxer.get_info(p.ctx(), kVideo, -1, &vi);
        for (int64_t v : {pr.duration, int64_t{ra}, int64_t{au.codec}, int64_t{rv}, int64_t{vi.codec},
                          int64_t{p.ctx()->index_count}, int64_t{p.ctx()->first_packet},
                          int64_t{pr.cover.length}})
            a.append(" ").append(std::to_string(v));
    }
    p.play();
    std::vector<std::string> t = p.trace();
    t.push_back(a);
    return t;
}

uint64_t le(const std::vector<uint8_t>& b, size_t at, int n) {
    uint64_t v = 0;
    for (int i = n - 1; i >= 0; --i) v = v << 8 | b[at + size_t(i)];
    return v;
}
void add_le(std::vector<uint8_t>& b, size_t at, int n, uint64_t add) {
    const uint64_t v = le(b, at, n) + add;
    for (int i = 0; i < n; ++i) b[at + size_t(i)] = uint8_t(v >> (8 * i));
}

// Three more payload extension systems (GUID, data size 0xFFFF, no info)
// behind the first extended stream properties object's own, the way other
// encoders write them: the object, the header extension and the header grow
// by 66 bytes. Empty if there is none.
std::vector<uint8_t> with_longer_extension_tail(std::vector<uint8_t> f) {
    static const uint8_t kHeaderExt[4] = {0xB5, 0x03, 0xBF, 0x5F}, kExtStream[4] = {0xCB, 0xA5, 0xE6, 0x14};
    auto is = [&](const uint8_t* guid, size_t at) { return std::equal(guid, guid + 4, &f[at]); };
    for (size_t at = 30; at + 24 <= le(f, 16, 8); at += le(f, at + 16, 8)) {
        if (!is(kHeaderExt, at)) continue;
        for (size_t c = at + 46; c + 24 <= at + le(f, at + 16, 8); c += le(f, c + 16, 8)) {
            if (!is(kExtStream, c)) continue;
            std::vector<uint8_t> systems;
            for (int i = 0; i < 48; ++i) {
                systems.push_back(uint8_t(0x40 + i));
                if (i % 16 == 15) systems.insert(systems.end(), {0xFF, 0xFF, 0, 0, 0, 0});
            }
            f.insert(f.begin() + long(c + le(f, c + 16, 8)), systems.begin(), systems.end());
            for (auto [pos, n, add] : {std::tuple{c + 16, 8, 66}, {c + 24 + 62, 2, 3}, {at + 16, 8, 66},
                                       {at + 24 + 18, 4, 66}, {size_t{16}, 8, 66}})
                add_le(f, pos, n, uint64_t(add));
            return f;
        }
    }
    return {};
}

class CorpusDelivery : public testing::TestWithParam<std::string> {};

// Every active stream's frames against ffprobe's packets (every object but the
// last, which stays pending), the same answers and events in every buffering
// mode (also for one file changed by one field). Damaged input (no reference)
// leaves nothing behind and plays to its end when it opens.
TEST_P(CorpusDelivery, FramesMatchTheReferenceInEveryBufferingMode) {
    REQUIRE_CORPUS_FILE(path, GetParam());
    const std::vector<uint8_t> file = testenv::read_file_or_empty(path);
    Player base(file, with_buffering(host::Buffering::Cache));
    const std::vector<std::string> played = answers_and_play(base);
    // One file also plays as the original with a longer extension tail.
    const bool change = GetParam() == "moon-timecode-short.wmv";
    const std::vector<uint8_t> changed = change ? with_longer_extension_tail(file) : file;
    EXPECT_FALSE(changed.empty());
    for (int m = 1; m < (change ? 8 : 4); ++m) {
        SCOPED_TRACE(testing::Message() << host::buffering_name(kBufferings[m % 4]) << (m > 3 ? " changed" : ""));
        Player other(m > 3 ? changed : file, with_buffering(kBufferings[m % 4]));
        std::vector<std::string> got = answers_and_play(other);
        if (m > 3) got.back() = played.back();  // its header is longer
        EXPECT_EQ(got, played);
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
    std::set<hova_stream_type_et> eos;
    for (const HostEvent& e : base.cb().events())
        if (e.kind == host::EventKind::Notify && e.event == HOVA_EVENT_EOS) eos.insert(e.type);
    ASSERT_FALSE(eos.empty());
    EXPECT_EQ(base.cb().events().back().kind, host::EventKind::Notify);
    for (auto [type, kind] : {std::pair{kAudio, "audio"}, std::pair{kVideo, "video"}}) {
        SCOPED_TRACE(kind);
        const std::vector<Ref> pk = reference(ref, kind, false);
        const auto frames = base.frames(type);
        if (!eos.count(type)) {
            EXPECT_TRUE(frames.empty());
            continue;
        }
        EXPECT_EQ(match_frames(frames, pk) + 1, pk.size());
    }
    base.expect_clean_close();
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
                             for (char& c : n) c = isalnum(static_cast<unsigned char>(c)) ? c : '_';
                             return n;
                         });

// The announced duration in microseconds: play duration less preroll, 0 for
// broadcast content; read straight from the file properties object.
int64_t announced_duration(const std::vector<uint8_t>& file) {
    static const uint8_t kFileProp[16] = {0xA1, 0xDC, 0xAB, 0x8C, 0x47, 0xA9, 0xCF, 0x11,
                                          0x8E, 0xE4, 0x00, 0xC0, 0x0C, 0x20, 0x53, 0x65};
    auto it = std::search(file.begin(), file.end(), std::begin(kFileProp), std::end(kFileProp));
    if (it == file.end()) return -1;
    const uint8_t* body = &*it + 24;
    if (plimo::load_le<uint32_t>(body + 64) & 1) return 0;
    return int64_t(plimo::load_le<uint64_t>(body + 40) / 10) -
           int64_t(plimo::load_le<uint64_t>(body + 56) * 1000);
}

// asfdump info on every file: streams, codecs, rates, sizes, languages and the
// duration as ffprobe sees them; the damaged file fails to open, cleanly.
TEST(CorpusInfo, AgreesWithFfprobe) {
    static const std::map<std::string, std::string> kCodecs = {
        {"wmav1", "WMA1"}, {"wmav2", "WMA2"}, {"wmapro", "WMA3"}, {"wmalossless", "WMA_LOSSLESS"},
        {"wmavoice", "WMA_VOICE"}, {"mp3", "MP3"}, {"aac", "AAC"}, {"ac3", "AC3"}, {"vc1", "WVC1"},
        {"wmv1", "WMV1"}, {"wmv2", "WMV2"}, {"wmv3", "WMV3"}, {"msmpeg4v3", "DIV3"},
        {"msmpeg4v2", "MP42"}, {"mpeg4", "M4V"}};
    int compared = 0;
    for (const std::string& path : testenv::corpus_files()) {
        SCOPED_TRACE(path);
        const json ref = load_ref(path);
        std::string dump;
        const std::string tool = testenv::asfdump_path(), plugin = testenv::plugin_path();
        const int rc = testenv::run_command("'" + tool + "' info --plugin '" + plugin + "' '" + path + "' 2>&1", &dump);
        if (ref.is_null()) {  // the damaged file
            EXPECT_EQ(rc, 1);
            EXPECT_NE(dump.find("HOVA_OpenFailed"), std::string::npos) << dump;
            EXPECT_EQ(dump.find("blocks still held"), std::string::npos) << dump;
            continue;
        }
        ASSERT_EQ(rc, 0) << "asfdump info failed";
        const json info = json::parse(dump);
        compared++;
        std::map<std::string, std::vector<json>> streams;
        for (const json& s : ref["streams"])  // a cover picture is a video stream without a FourCC
            if (s.value("codec_tag_string", "") != "[0][0][0][0]") streams[s["codec_type"]].push_back(s);
        for (const char* kind : {"audio", "video"}) {
            const std::vector<json>& theirs = streams[kind];
            ASSERT_EQ(info[kind].size(), theirs.size()) << kind;
            EXPECT_EQ(info[std::string("active_") + kind].is_null(), theirs.empty()) << kind;
            for (size_t i = 0; i < theirs.size(); ++i) {
                const json& ours = info[kind][i];
                SCOPED_TRACE(testing::Message() << kind << " " << i);
                EXPECT_EQ(ours["codec_name"], kCodecs.at(theirs[i]["codec_name"]));
                if (theirs[i].contains("sample_rate")) {
                    EXPECT_EQ(ours["sample_rate"], std::stoi(theirs[i]["sample_rate"].get<std::string>()));
                    EXPECT_EQ(ours["language"], theirs[i].value("language", ""));
                } else {
                    EXPECT_EQ(ours["width"], theirs[i]["width"]);
                    EXPECT_EQ(ours["height"], theirs[i]["height"]);
                }
            }
        }
        const int64_t duration = info["program"]["duration"];
        EXPECT_EQ(duration, announced_duration(testenv::read_file_or_empty(path)));
        const json& ff = ref["format"]["duration"];
        if (ff.is_null()) {
            EXPECT_EQ(duration, 0) << "ffprobe sees no duration only in broadcast content";
            continue;
        }
        // ffprobe counts from each stream's first packet: never less.
        EXPECT_GE(std::stod(ff.get<std::string>()) * 1e6 + 1000, double(duration));
    }
    if (compared == 0) GTEST_SKIP() << "no corpus in " << testenv::corpus_dir();
}

// 12 targets spread over each file (a little off the frame grid), both
// directions, with the file's index and with the copy cut after the data
// object, in the file cache and unbuffered, right after the open and once
// delivery has gone into separate parsing (the files that interleave audio and
// video far apart) or to the end of the stream. A backward seek lands on the
// last key frame at or before the target (the first key frame when there is
// none), a forward seek on a key frame at or after it whenever one exists (and
// no key frame a backward seek finds lies between the two), else it fails.
// Delivery then hands over that key frame byte for byte as its first video
// frame (audio: among its first frames), every frame of the kind has a
// reference time, and in separate parsing the other stream resumes too.
TEST(CorpusSeek, SweepLandsOnTheAskedSideAndDeliversTheKeyFrame) {
    int files = 0, separate = 0;
    for (const std::string& path : testenv::corpus_files()) {
        const json ref = load_ref(path);
        if (ref.is_null()) continue;
        ++files;
        const std::vector<uint8_t> bytes = testenv::read_file_or_empty(path);
        std::vector<Ref> own = reference(ref, "video", true);  // the stream the plug-in seeks on
        const bool video = !own.empty();
        if (!video) own = reference(ref, "audio", true);
        Player probe(bytes);
        ASSERT_EQ(probe.rc, HOVA_OK) << path;
        const uint32_t first_packet = probe.ctx()->first_packet;
        std::vector<std::vector<uint8_t>> variants = {bytes};
        if (probe.ctx()->index_packet != 0 && first_packet >= 50) {  // the copy cut after the data object
            const uint64_t end = first_packet - 50 + plimo::load_le<uint64_t>(&bytes[first_packet - 50 + 16]);
            variants.emplace_back(bytes.begin(), bytes.begin() + long(std::min<uint64_t>(end, bytes.size())));
        }
        probe.expect_clean_close();
        std::set<int64_t> keys, times;
        for (Ref& r : own) {
            r.key = r.key || !video;  // audio: every object start
            if (r.key) keys.insert(r.pts_us);
            times.insert(r.pts_us);
        }
        ASSERT_FALSE(keys.empty()) << path;
        const hova_stream_type_et kind = video ? kVideo : kAudio;
        for (size_t v = 0; v < variants.size(); ++v)
            for (int mode = 0; mode < 4; ++mode)
                for (int k = 1; k <= 12; ++k)
                    for (int dir : {HOVA_SEEK_BACKWARD, HOVA_SEEK_FORWARD}) {
                        const int64_t target = own.back().pts_us * k / 13 + 7000;
                        SCOPED_TRACE(testing::Message() << corpus::base_name(path) << (v ? " cut" : "") << " mode "
                                                        << mode << " target " << target << " dir " << dir);
                        host::InputOptions in;
                        in.disable_cache = mode & 1;
                        Player p(variants[v], in);
                        ASSERT_EQ(p.rc, HOVA_OK);
                        while (mode & 2 && p.ctx()->parse_mode != PARSE_SEP && p.step() != HOVA_EndOfStream) {}
                        const bool sep = p.ctx()->parse_mode == PARSE_SEP;
                        separate += sep;
                        const size_t from = p.cb().events().size();
                        int64_t found = target;
                        const int rc = p.seek(dir, &found);
                        if (rc == HOVA_OK && dir == HOVA_SEEK_FORWARD) {
                            // No key frame the seek can find lies between the target and the answer.
                            int64_t before = found - 1;
                            ASSERT_EQ(p.seek(HOVA_SEEK_BACKWARD, &before, 1), HOVA_OK);
                            EXPECT_TRUE(before <= target || before == *keys.begin()) << "forward answer " << found;
                        }
                        std::vector<HostEvent> got;
                        int at = -1;  // frames of the kind delivered before the one found
                        for (int calls = 0; rc == HOVA_OK && calls < 100000 && at < 0 && got.size() <= 120; ++calls) {
                            const int r = p.step();
                            got = p.frames(kind, from);
                            for (size_t i = 0; i < got.size() && at < 0; ++i)
                                if (got[i].pts == found) at = int(i);
                            if (r != HOVA_OK && r != HOVA_TryAgain) break;
                        }
                        for (const HostEvent& e : got) EXPECT_EQ(times.count(e.pts), 1u) << e.pts;
                        if (sep && k <= 8 && at >= 0) {
                            for (int i = 0; i < 300 && p.step() != HOVA_EndOfStream; ++i) {}
                            EXPECT_FALSE(p.frames(video ? kAudio : kVideo, from).empty());
                        }
                        p.expect_clean_close();
                        if (dir == HOVA_SEEK_FORWARD && *keys.rbegin() < target) {
                            EXPECT_EQ(rc, HOVA_SeekFailed);
                            continue;
                        }
                        ASSERT_EQ(rc, HOVA_OK);
                        // Backward with no key frame at or before the target: the first one.
                        EXPECT_TRUE(dir == HOVA_SEEK_BACKWARD ? found <= target || found == *keys.begin()
                                                              : found >= target) << found;
                        const auto key = std::find_if(own.begin(), own.end(),
                                                      [&](const Ref& r) { return r.key && r.pts_us == found; });
                        ASSERT_NE(key, own.end()) << found << " is no reference key frame";
                        if (key + 1 == own.end()) continue;  // the last object stays pending
                        ASSERT_GE(at, 0) << "the frame at " << found << " was not delivered";
                        if (video) {  // the first video frame
                            EXPECT_EQ(got[size_t(at)].crc32, key->crc);
                            EXPECT_EQ(at, 0);
                        }
                    }
    }
    if (files == 0) GTEST_SKIP() << "no corpus in " << testenv::corpus_dir();
    EXPECT_TRUE(files < 12 || separate > 0) << "no seek in separate parsing";
}

// Every video key frame's exact time as a target, both directions, local and
// network input, one session per file seeking again and again, with the host
// moving its input to another packet and resynchronising before every third
// seek. Each successful seek reports a reference key frame on the asked side
// (backward before the first key frame: that one), and the first video frame
// delivered after it is that key frame, byte for byte (after a seek to 0:
// the file's first key frame). A network input fails only where the index
// cannot answer: no index, or a forward target in its last entry's interval.
TEST(CorpusSeek, KeyFrameTargetsStartOnTheReportedKeyFrame) {
    int files = 0, checked = 0;
    for (const std::string& path : testenv::corpus_files()) {
        const json ref = load_ref(path);
        if (ref.is_null()) continue;
        const std::vector<Ref> video = reference(ref, "video", true);
        std::vector<Ref> keys;
        std::copy_if(video.begin(), video.end(), std::back_inserter(keys), [](const Ref& r) { return r.key; });
        if (keys.empty()) continue;
        ++files;
        const std::vector<uint8_t> bytes = testenv::read_file_or_empty(path);
        for (bool network : {false, true}) {
            host::InputOptions in;
            in.streaming = network;
            Player p(bytes, in);
            ASSERT_EQ(p.rc, HOVA_OK) << path;
            asf_demuxer_st* d = p.ctx();
            for (size_t k = 0; k < 2 * keys.size(); ++k) {
                const int dir = k % 2 ? HOVA_SEEK_FORWARD : HOVA_SEEK_BACKWARD;
                const int64_t target = keys[k / 2].pts_us;
                SCOPED_TRACE(testing::Message() << corpus::base_name(path) << (network ? " network" : "")
                                                << " target " << target << " dir " << dir);
                if (k % 3 == 2 && d->num_packets > 0) {  // the host moves to a packet of its choosing
                    const uint64_t to = d->first_packet + uint64_t(d->packet_size) * (k * 7 % d->num_packets);
                    p.s.input().time_to_position = [to](int) { return int64_t(to); };
                    ASSERT_EQ(hova_asff_demuxer.resync_time(d, target), HOVA_OK);
                    for (int i = 0; i < 3; ++i) p.step();
                }
                const size_t from = p.cb().events().size();
                int64_t found = target;
                const int rc = p.seek(dir, &found);
                if (rc != HOVA_OK) {
                    const bool index = d->index_packet != 0 && d->index_time_interval != 0;
                    const int64_t last = d->index_start_offset + int64_t(d->index_time_interval) * (d->index_count - 1);
                    EXPECT_TRUE(network && (!index || (dir == HOVA_SEEK_FORWARD && target >= last)));
                    continue;
                }
                EXPECT_TRUE(dir == HOVA_SEEK_BACKWARD ? found <= target || found == keys.front().pts_us
                                                      : found >= target) << found;
                const auto key = found == 0 && target == 0 ? keys.begin()
                                 : std::find_if(keys.begin(), keys.end(), [&](const Ref& r) { return r.pts_us == found; });
                ASSERT_NE(key, keys.end()) << found << " is no reference key frame";
                std::vector<HostEvent> got;
                for (int calls = 0; calls < 100000 && got.empty(); ++calls) {
                    const int r = p.step();
                    got = p.frames(kVideo, from);
                    if (r != HOVA_OK && r != HOVA_TryAgain) break;
                }
                if (got.empty()) {  // only the last object stays pending
                    EXPECT_EQ(key->pts_us, video.back().pts_us);
                    continue;
                }
                EXPECT_EQ(got.front().pts, key->pts_us);
                EXPECT_EQ(got.front().crc32, key->crc);
                ++checked;
            }
            p.expect_clean_close();
        }
    }
    if (files == 0) GTEST_SKIP() << "no corpus in " << testenv::corpus_dir();
    RecordProperty("first_frames_checked", checked);
}

}  // namespace
