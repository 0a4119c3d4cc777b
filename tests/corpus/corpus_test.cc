// The real files of the corpus against ffprobe's view of them: every active
// stream's frames (sizes, times, CRCs) and the information answers in every
// buffering mode, a file changed by one field, and seek sweeps landing on a
// reference key frame on the asked side. Files are read in place; the tests
// skip when they are absent.
#include <zlib.h>

#include <set>

#include "asfdump_cli.h"
#include "byte_reader.h"
#include "corpus_play.h"

namespace {

using corpus::Player;
using host::HostEvent;
using host::kBufferings;
using host::with_buffering;
using cli::json;
constexpr hova_stream_type_et kAudio = HOVA_STREAM_AUDIO, kVideo = HOVA_STREAM_VIDEO;

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
    const json ref = cli::ffprobe(path);
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

// 12 targets spread over each file (a little off the frame grid) and 12 video
// key frames' exact times, both directions, with the file's index and with
// the copy cut after the data object, in the file cache, unbuffered and (key
// frame targets) from a network input, right after the open and once delivery has gone into
// separate parsing (the files that interleave audio and video far apart) or
// to the end of the stream. A backward seek lands on the last key frame at or
// before the target (the first key frame when there is none), a forward seek
// on a key frame at or after it whenever one exists (and no key frame a
// backward seek finds lies between the two), else it fails; a network input
// fails only where the index cannot answer (no index, or a forward target in
// its last entry's interval). Delivery then hands over that key frame byte
// for byte as its first video frame (audio: among its first frames), also when
// the host moved its input and resynchronised before every third seek; every
// frame of the kind has a reference time, and in separate parsing the other
// stream resumes too.
TEST(CorpusSeek, SweepLandsOnTheAskedSideAndDeliversTheKeyFrame) {
    int files = 0, separate = 0;
    for (const std::string& path : testenv::corpus_files()) {
        const json ref = cli::ffprobe(path);
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
        std::vector<int64_t> targets;
        for (int k = 1; k <= 12; ++k) targets.push_back(own.back().pts_us * k / 13 + 7000);
        for (size_t k = 0; video && k < 12 && k < keys.size(); ++k)
            targets.push_back(*std::next(keys.begin(), long(k * keys.size() / std::min<size_t>(12, keys.size()))));
        for (size_t v = 0; v < variants.size(); ++v)
            for (int mode = 0; mode < 5; ++mode)  // bit 0: unbuffered, bit 1: separate parsing or end; 4: network
                for (size_t k = 0; k < targets.size(); ++k)
                    for (int dir : {HOVA_SEEK_BACKWARD, HOVA_SEEK_FORWARD}) {
                        const int64_t target = targets[k];
                        if (mode == 4 && k < 12) continue;  // network: the key frame targets only
                        SCOPED_TRACE(testing::Message() << corpus::base_name(path) << (v ? " cut" : "") << " mode "
                                                        << mode << " target " << target << " dir " << dir);
                        host::InputOptions in;
                        in.disable_cache = mode & 1;
                        in.streaming = mode == 4;
                        Player p(variants[v], in);
                        ASSERT_EQ(p.rc, HOVA_OK);
                        while (mode & 2 && p.ctx()->parse_mode != PARSE_SEP && p.step() != HOVA_EndOfStream) {}
                        const bool sep = p.ctx()->parse_mode == PARSE_SEP;
                        separate += sep;
                        if (k % 3 == 2 && p.ctx()->num_packets > 0) {  // the host first moves to a packet of its own
                            const asf_demuxer_st* c = p.ctx();
                            const uint64_t to = c->first_packet + uint64_t(c->packet_size) * (k * 7 % c->num_packets);
                            p.s.input().time_to_position = [to](int) { return int64_t(to); };
                            ASSERT_EQ(hova_asff_demuxer.resync_time(p.ctx(), target), HOVA_OK);
                            for (int i = 0; i < 3; ++i) p.step();
                        }
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
                        if (sep && k < 8 && at >= 0) {
                            for (int i = 0; i < 300 && p.step() != HOVA_EndOfStream; ++i) {}
                            EXPECT_FALSE(p.frames(video ? kAudio : kVideo, from).empty());
                        }
                        const asf_demuxer_st* d = p.ctx();
                        const bool index = d->index_packet != 0 && d->index_time_interval != 0;
                        const int64_t last = d->index_start_offset + int64_t(d->index_time_interval) * (d->index_count - 1);
                        p.expect_clean_close();
                        if (mode == 4 && rc != HOVA_OK) {
                            EXPECT_TRUE(!index || (dir == HOVA_SEEK_FORWARD && target >= last)) << "network seek failed";
                            continue;
                        }
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

}  // namespace
