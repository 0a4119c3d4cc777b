// Real files: asfdump info against ffprobe's view of each corpus file, the
// damaged file, and the same answers in every buffering mode. Files are read
// in place and the tests skip when they are absent. (Header truncation and
// refused allocations are swept in tests/asf over a header with more kinds
// of object than any corpus file.)
#include <gtest/gtest.h>

#include <cmath>
#include <cstdio>
#include <fstream>
#include <map>
#include <nlohmann/json.hpp>
#include <string>

#include "asf_open.h"
#include "byte_reader.h"
#include "test_env.h"

namespace {

using nlohmann::json;

// ffprobe's codec names and ours.
const std::map<std::string, std::string> kCodecNames = {
    {"wmav1", "WMA1"},      {"wmav2", "WMA2"},        {"wmapro", "WMA3"},
    {"wmalossless", "WMA_LOSSLESS"}, {"wmavoice", "WMA_VOICE"}, {"mp3", "MP3"},
    {"aac", "AAC"},         {"ac3", "AC3"},           {"vc1", "WVC1"},
    {"wmv1", "WMV1"},       {"wmv2", "WMV2"},         {"wmv3", "WMV3"},
    {"msmpeg4v3", "DIV3"},  {"msmpeg4v2", "MP42"},    {"mpeg4", "M4V"},
};

json load_json(const std::string& path) {
    std::ifstream f(path);
    return json::parse(f);
}

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

bool is_attached_picture(const json& s) {
    // A cover picture appears as a video stream without a FourCC.
    return s.value("codec_tag_string", "") == "[0][0][0][0]";
}

struct Dump {
    int status = -1;
    json info;
};

Dump asfdump_info(const std::string& path) {
    Dump d;
    std::string out;
    d.status = testenv::run_command("'" + testenv::asfdump_path() + "' info --plugin '" +
                                        testenv::plugin_path() + "' '" + path + "' 2>/dev/null",
                                    &out);
    if (d.status == 0) d.info = json::parse(out);
    return d;
}

TEST(CorpusInfo, AgreesWithFfprobe) {
    std::vector<std::string> files = testenv::corpus_files();
    if (files.empty()) GTEST_SKIP() << "no corpus in " << testenv::corpus_dir();
    int compared = 0;
    std::vector<std::string> duration_exceptions;
    for (const std::string& path : files) {
        std::ifstream probe(path + ".ffprobe.json");
        if (!probe) continue;  // no reference: the damaged file
        SCOPED_TRACE(path);
        const json ref = load_json(path + ".ffprobe.json");
        const Dump dump = asfdump_info(path);
        ASSERT_EQ(dump.status, 0) << "asfdump info failed";
        const json& info = dump.info;
        compared++;

        std::vector<json> ref_audio, ref_video;
        for (const json& s : ref["streams"]) {
            if (s["codec_type"] == "audio") ref_audio.push_back(s);
            if (s["codec_type"] == "video" && !is_attached_picture(s)) ref_video.push_back(s);
        }
        ASSERT_EQ(info["audio"].size(), ref_audio.size());
        ASSERT_EQ(info["video"].size(), ref_video.size());
        for (size_t i = 0; i < ref_audio.size(); ++i) {
            const json& ours = info["audio"][i];
            const json& theirs = ref_audio[i];
            EXPECT_EQ(ours["codec_name"], kCodecNames.at(theirs["codec_name"])) << "audio " << i;
            EXPECT_EQ(ours["sample_rate"], std::stoi(theirs["sample_rate"].get<std::string>()));
            EXPECT_EQ(ours["language"], theirs.value("language", "")) << "audio " << i;
        }
        for (size_t i = 0; i < ref_video.size(); ++i) {
            const json& ours = info["video"][i];
            const json& theirs = ref_video[i];
            EXPECT_EQ(ours["codec_name"], kCodecNames.at(theirs["codec_name"])) << "video " << i;
            EXPECT_EQ(ours["width"], theirs["width"]);
            EXPECT_EQ(ours["height"], theirs["height"]);
        }
        EXPECT_EQ(info["active_audio"].is_null(), ref_audio.empty());
        EXPECT_EQ(info["active_video"].is_null(), ref_video.empty());

        const std::vector<uint8_t> bytes = testenv::read_file_or_empty(path);
        const int64_t duration = info["program"]["duration"];
        EXPECT_EQ(duration, announced_duration(bytes));
        const json& ff = ref["format"]["duration"];
        if (ff.is_null()) {
            EXPECT_EQ(duration, 0) << "ffprobe sees no duration only in broadcast content";
            continue;
        }
        const double ff_us = std::stod(ff.get<std::string>()) * 1e6;
        if (std::fabs(ff_us - static_cast<double>(duration)) > 1000) {
            // ffprobe counts the announced duration from each audio or video
            // stream's first packet and reports the latest end; where one
            // stream starts late and the packets stop short of the announced
            // play time the two figures part. The plug-in reports the
            // announced duration.
            std::map<int, double> first_ms;
            double last_ms = 0;
            for (const json& pk : ref["packets"]) {
                const json& t = pk["pts_ms"].is_null() ? pk["dts_ms"] : pk["pts_ms"];
                if (t.is_null()) continue;
                const int st = pk["stream"];
                const std::string type = ref["streams"][st]["codec_type"];
                if (type != "audio" && type != "video") continue;
                const double ms = t.get<double>();
                first_ms[st] = first_ms.count(st) ? std::min(first_ms[st], ms) : ms;
                last_ms = std::max(last_ms, ms);
            }
            double latest_start = 0;
            for (const auto& [st, ms] : first_ms) latest_start = std::max(latest_start, ms);
            EXPECT_LT(last_ms * 1000, static_cast<double>(duration))
                << "ffprobe " << ff_us << " us against " << duration << " us";
            EXPECT_NEAR(ff_us, static_cast<double>(duration) + latest_start * 1000, 1000);
            duration_exceptions.push_back(path);
        }
    }
    EXPECT_GT(compared, 0);
    for (const std::string& e : duration_exceptions)
        std::printf("duration differs from ffprobe (packets end early): %s\n", e.c_str());
}

TEST(CorpusInfo, DamagedFileFailsToOpenCleanly) {
    REQUIRE_CORPUS_FILE(path, "musicmeta-CWE-835.wma");
    std::string out;
    const int status = testenv::run_command("'" + testenv::asfdump_path() + "' info --plugin '" +
                                                testenv::plugin_path() + "' '" + path + "' 2>&1",
                                            &out);
    EXPECT_EQ(status, 1);
    EXPECT_NE(out.find("HOVA_OpenFailed"), std::string::npos) << out;
    EXPECT_EQ(out.find("blocks still held"), std::string::npos) << out;

    testsupport::Opened o = testsupport::open_bytes(testenv::read_file_or_empty(path));
    EXPECT_EQ(o.rc, HOVA_OpenFailed);
    EXPECT_TRUE(o.close_clean());
}

TEST(CorpusInfo, SameAnswersInEveryBufferingMode) {
    std::vector<std::string> files = testenv::corpus_files();
    if (files.empty()) GTEST_SKIP() << "no corpus in " << testenv::corpus_dir();
    for (const std::string& path : files) {
        SCOPED_TRACE(path);
        const std::vector<uint8_t> bytes = testenv::read_file_or_empty(path);
        std::vector<std::string> answers;
        for (int mode = 0; mode < 3; ++mode) {
            host::SessionOptions so;
            so.input.disable_cache = mode == 0;
            so.input.rbuf_mode = mode == 2 ? CBIO_APPLY_RBUF : CBIO_NO_RBUF;
            so.input.use_thread = mode == 2;
            testsupport::Opened o = testsupport::open_bytes(bytes, so);
            std::string a = std::to_string(o.rc);
            if (o.rc == HOVA_OK) {
                hova_audio_info_st au{};
                hova_video_info_st vi{};
                hova_program_info_st pr{};
                hova_asff_demuxer.get_info(o.ctx(), HOVA_STREAM_PROG, 0, &pr);
                const int ra = hova_asff_demuxer.get_info(o.ctx(), HOVA_STREAM_AUDIO, -1, &au);
                const int rv = hova_asff_demuxer.get_info(o.ctx(), HOVA_STREAM_VIDEO, -1, &vi);
                a += " " + std::to_string(pr.duration) + " " + std::to_string(ra) + " " +
                     std::to_string(au.codec) + " " + std::to_string(rv) + " " +
                     std::to_string(vi.codec) + " " + std::to_string(o.ctx()->index_count) + " " +
                     std::to_string(o.ctx()->first_packet) + " " + std::to_string(pr.cover.length);
            }
            EXPECT_TRUE(o.close_clean());
            answers.push_back(a);
        }
        EXPECT_EQ(answers[0], answers[1]);
        EXPECT_EQ(answers[0], answers[2]);
    }
}

}  // namespace
