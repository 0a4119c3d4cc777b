// asfdump thumb beside ffmpeg: the picture at a time is the one ffmpeg gives
// for `-ss TIME`, and a contact sheet holds one tile per key frame of the
// thumbnail mode, each the picture thumb --at gives for its time. Pictures
// are compared as RGB through ffmpeg; skipped without ffmpeg or where asfdump
// was built without libavcodec.
#include <gtest/gtest.h>

#include <cmath>

#include "asfdump_cli.h"

namespace {

using cli::json;
using cli::quoted;

// asfdump's exit status, with what it said on stdout and stderr in `out`.
int asfdump(const std::string& args, std::string* out) {
    const cli::Result r = cli::asfdump(args);
    *out = r.out + r.err;
    return r.status;
}

// Skips the test unless ffmpeg is installed and asfdump can decode pictures.
#define REQUIRE_PICTURES()                                                                          \
    do {                                                                                            \
        if (testenv::run_command("ffmpeg -version >/dev/null 2>&1", nullptr) != 0)                 \
            GTEST_SKIP() << "ffmpeg is not installed";                                              \
        std::string said;                                                                           \
        asfdump("thumb /dev/null --at 0 -o /dev/null", &said);                                      \
        if (said.find("not available") != std::string::npos) GTEST_SKIP() << said;                  \
    } while (0)

// A picture as packed RGB, decoded by ffmpeg from `input` (its input options and file).
std::string rgb(const std::string& input) {
    std::string out;
    testenv::run_command("ffmpeg -v error " + input + " -frames:v 1 -f rawvideo -pix_fmt rgb24 - 2>/dev/null", &out);
    return out;
}

double psnr(const std::string& a, const std::string& b) {
    if (a.empty() || a.size() != b.size()) return 0;
    double sum = 0;
    for (size_t i = 0; i < a.size(); ++i) {
        const double d = static_cast<unsigned char>(a[i]) - static_cast<unsigned char>(b[i]);
        sum += d * d;
    }
    return sum == 0 ? INFINITY : 10 * std::log10(255.0 * 255.0 * a.size() / sum);
}

// Width and height from a PNG's header.
std::pair<int, int> png_size(const std::string& path) {
    const std::vector<uint8_t> b = testenv::read_file_or_empty(path);
    if (b.size() < 24 || b[1] != 'P' || b[2] != 'N' || b[3] != 'G') return {0, 0};
    auto be32 = [&](size_t i) { return int(b[i] << 24 | b[i + 1] << 16 | b[i + 2] << 8 | b[i + 3]); };
    return {be32(16), be32(20)};
}

// Times of the video frames `asfdump frames FILE ARGS` delivers.
std::vector<int64_t> video_times(const std::string& file, const std::string& args) {
    return cli::frame_times(cli::json_lines("frames " + quoted(file) + " --no-audio " + args));
}

std::string temp_png(const std::string& name) {
    return testing::TempDir() + "thumb-" + std::to_string(getpid()) + "-" + name + ".png";
}

// True when the plug-in delivered fewer frames between the key frame before
// `t` and `t` than the file holds there: a compressed payload's small objects
// come as one frame, whose later pictures no decoder sees, so the pictures
// after it cannot be ffmpeg's.
bool merged_before(const json& ffprobe, const std::vector<int64_t>& delivered, int64_t t) {
    int vstream = -1;
    for (const json& s : ffprobe["streams"])
        if (s["codec_type"] == "video") vstream = s["index"];
    int64_t key = 0;
    long in_file = 0;
    for (const json& p : ffprobe["packets"])
        if (p["stream"] == vstream && p["pts_ms"].is_number() && p["key"] == 1 && p["pts_ms"].get<int64_t>() * 1000 <= t)
            key = p["pts_ms"].get<int64_t>() * 1000;
    for (const json& p : ffprobe["packets"])
        if (p["stream"] == vstream && p["pts_ms"].is_number()) {
            const int64_t pts = p["pts_ms"].get<int64_t>() * 1000;
            in_file += pts >= key && pts <= t;
        }
    const long got = std::count_if(delivered.begin(), delivered.end(), [&](int64_t d) { return d >= key && d <= t; });
    return got < in_file;
}

TEST(AsfdumpThumb, PicturesAreFfmpegsFromStartToEndOfEveryVideoFile) {
    REQUIRE_PICTURES();
    int checked = 0;
    for (const std::string& file : testenv::corpus_files()) {
        std::string out;
        if (asfdump("info " + quoted(file), &out) != 0) continue;  // a damaged file that does not open
        const json info = json::parse(out);
        const std::string png = temp_png("at");
        if (info["active_video"].is_null()) {
            EXPECT_EQ(asfdump("thumb " + quoted(file) + " --at 1s -o " + png, &out), 2) << file;
            EXPECT_NE(out.find("has no video stream (audio only)"), std::string::npos) << out;
            continue;
        }
        const std::vector<int64_t> times = video_times(file, "");
        if (times.empty()) {
            // The single frame of a one-frame stream stays pending at the end of the data.
            EXPECT_EQ(asfdump("thumb " + quoted(file) + " --at 0 -o " + png, &out), 1) << file;
            EXPECT_NE(out.find("no picture at or after 0:00:00.000"), std::string::npos) << out;
            continue;
        }
        const json ffprobe = cli::ffprobe(file);
        // Half a frame past the last delivered frame: the VC-1 decoder holds
        // its last picture back until the end, then it still has one; other
        // decoders have none left (the file's last frame stays pending).
        const int64_t past = times.size() < 2 ? times.back() + 1 : times.back() + (times.back() - times.end()[-2]) / 2;
        const std::string codec = info["active_video"]["codec_name"];
        const bool held_back = codec == "WVC1" || codec == "WMVA";
        for (const int64_t t : {times.front(), times[times.size() / 2], times.back(), past}) {
            const std::string where = file + " at " + std::to_string(t) + " us";
            const int rc = asfdump("thumb " + quoted(file) + " --at " + std::to_string(t) + " -o " + png, &out);
            if (t == past && !held_back) {
                EXPECT_EQ(rc, 1) << where << ": " << out;
                continue;
            }
            ASSERT_EQ(rc, 0) << where << ": " << out;
            EXPECT_EQ(png_size(png), std::make_pair(info["active_video"]["width"].get<int>(),
                                                    info["active_video"]["height"].get<int>())) << where;
            // -seek_timestamp: ffmpeg's -ss in the stream's own times (not past its start time).
            char ss[32];
            std::snprintf(ss, sizeof ss, "%.6f", static_cast<double>(t) / 1e6);
            const double db = psnr(rgb("-i " + png), rgb("-seek_timestamp 1 -ss " + std::string(ss) + " -i " +
                                                        quoted(file) + " -map 0:v:0"));
            if (merged_before(ffprobe, times, t))
                std::printf("%s: frames merged by compressed payloads before it: PSNR %.1f dB, not compared\n",
                            where.c_str(), db);
            else
                EXPECT_GE(db, 40.0) << where;
            ++checked;
        }
        std::remove(png.c_str());
    }
    if (checked == 0) GTEST_SKIP() << "no corpus file with video in " << testenv::corpus_dir();
}

TEST(AsfdumpThumb, SheetHasATilePerThumbnailKeyFrameEachThePictureAtItsTime) {
    REQUIRE_PICTURES();
    REQUIRE_CORPUS_FILE(file, "moon-elephants-dream-first-minute.wmv");
    const std::string sheet = temp_png("sheet"), one = temp_png("one");
    std::string out;
    ASSERT_EQ(asfdump("thumb " + quoted(file) + " --every 5s --sheet " + sheet + " --width 160 --columns 3", &out), 0)
        << out;
    const std::vector<int64_t> keys = video_times(file, "--thumbnail 5000000");
    const std::string sheet_rgb = rgb("-i " + sheet);
    const int sheet_width = png_size(sheet).first;
    std::istringstream lines(out);
    size_t n = 0;
    for (std::string line; std::getline(lines, line);) {
        int index, h, m, s, ms, x, y, w, ht;
        ASSERT_EQ(std::sscanf(line.c_str(), "tile %d: %d:%d:%d.%d at %d,%d, %dx%d", &index, &h, &m, &s, &ms, &x, &y, &w,
                              &ht), 9) << line;
        const int64_t t = ((h * 60 + m) * 60 + s) * 1000000LL + ms * 1000LL;
        ASSERT_LT(n, keys.size()) << line;
        EXPECT_EQ(t, keys[n]) << line;
        ASSERT_EQ(asfdump("thumb " + quoted(file) + " --at " + std::to_string(t) + " --width 160 -o " + one, &out), 0)
            << out;
        const std::string want = rgb("-i " + one);
        std::string tile;
        for (int r = 0; r < ht; ++r) tile += sheet_rgb.substr((size_t(y + r) * sheet_width + x) * 3, size_t(w) * 3);
        EXPECT_EQ(png_size(one), std::make_pair(w, ht)) << line;
        EXPECT_TRUE(tile == want) << line << ": the tile differs from thumb --at, PSNR " << psnr(tile, want);
        ++n;
    }
    EXPECT_EQ(n, keys.size()) << "one tile per key frame of the thumbnail mode";
    std::remove(sheet.c_str());
    std::remove(one.c_str());
}

TEST(AsfdumpThumb, RefusesWhatItCannotDo) {
    REQUIRE_PICTURES();
    REQUIRE_CORPUS_FILE(file, "moon-timecode-short.wmv");
    const std::string png = temp_png("bad");
    const std::pair<std::string, const char*> cases[] = {
        {"", "thumb takes either"},
        {"--at 1s --every 5s --sheet " + png, "thumb takes either"},
        {"--at soon -o " + png, "bad --at soon"},
        {"--at 1s", "give -o OUT.png"},
        {"--at 1s -o " + png + " --columns 3", "go with --every"},
        {"--every 0 --sheet " + png, "bad --every 0"},
        {"--every 1s -o " + png, "give --sheet OUT.png"},
        {"--every 1s --sheet " + png + " --columns 0", "--columns takes 1 to 64"},
        {"--at 1s -o " + png + " --width 8", "--width takes 16 to 8192"},
    };
    for (const auto& [args, said] : cases) {
        std::string out;
        EXPECT_EQ(asfdump("thumb " + quoted(file) + " " + args, &out), 2) << args;
        EXPECT_NE(out.find(said), std::string::npos) << args << ": " << out;
    }
    std::string out;
    EXPECT_EQ(asfdump("thumb " + quoted(file) + " --at 1:00 -o " + png, &out), 1);
    EXPECT_NE(out.find("no picture at or after 0:01:00.000"), std::string::npos) << out;
    EXPECT_NE(access(png.c_str(), F_OK), 0) << "nothing written";
}

}  // namespace
