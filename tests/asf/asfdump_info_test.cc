// asfdump info on built files: the JSON contract end to end, through the
// shared library loaded as the framework loads it.
#include <gtest/gtest.h>

#include <unistd.h>

#include <cstdio>
#include <algorithm>
#include <fstream>
#include <nlohmann/json.hpp>
#include <string>

#include "asf_builder.h"
#include "hova_dmx.h"
#include "test_env.h"

namespace {

using asfb::Bytes;
using nlohmann::json;

class TempFile {
public:
    explicit TempFile(const Bytes& bytes) {
        char name[] = "/tmp/asfdump_info_XXXXXX";
        const int fd = mkstemp(name);
        path_ = name;
        if (fd >= 0) {
            (void)!write(fd, bytes.data(), bytes.size());
            close(fd);
        }
    }
    ~TempFile() { std::remove(path_.c_str()); }
    const std::string& path() const { return path_; }

private:
    std::string path_;
};

int run_info(const std::string& file, const std::string& options, std::string* out) {
    return testenv::run_command("'" + testenv::asfdump_path() + "' info " + options +
                                    " --plugin '" + testenv::plugin_path() + "' '" + file +
                                    "' 2>&1",
                                out);
}

TEST(AsfdumpInfo, PrintsEveryRecordAsUtf8Json) {
    asfb::File f = asfb::standard_file();
    asfb::ExtStreamProps ev;
    ev.stream_num = 2;
    ev.avg_time_per_frame = 400000;
    ev.bitrate = 250000;
    f.header_children.push_back(asfb::header_extension(
        {asfb::language_list({"fr-FR"}), asfb::extended_stream_properties(ev)}));
    f.header_children.push_back(asfb::content_description({"Caf\xC3\xA9", "Band \xE2\x82\xAC", "", "", ""}));
    const Bytes pic(1234, 0x5C);
    f.header_children.push_back(asfb::extended_content_description(
        {{"WM/AlbumTitle", 0, asfb::string_value("Album")},
         {"WM/Year", 0, asfb::string_value("2004")},
         {"WM/Genre", 0, asfb::string_value("Chanson")},
         {"WM/Picture", 1, asfb::picture_value(3, "image/jpeg", "", pic)}}));
    const Bytes bytes = asfb::build(f);
    TempFile file(bytes);
    std::string out;
    ASSERT_EQ(run_info(file.path(), "", &out), 0) << out;
    const json j = json::parse(out);

    EXPECT_EQ(j["clip"]["seekable"], 1);
    EXPECT_EQ(j["clip"]["ts_type"], HOVA_TS_DTS);
    const json& p = j["program"];
    EXPECT_EQ(p["title"], "Caf\xC3\xA9");
    EXPECT_EQ(p["artist"], "Band \xE2\x82\xAC");
    EXPECT_EQ(p["album"], "Album");
    EXPECT_EQ(p["year"], 2004);
    EXPECT_EQ(p["genre"], "Chanson");
    EXPECT_EQ(p["cover"]["length"], 1234);
    const auto at = std::search(bytes.begin(), bytes.end(), pic.begin(), pic.end()) - bytes.begin();
    EXPECT_EQ(p["pic_offset"], at);
    EXPECT_EQ(p["duration"], 2000000);
    EXPECT_EQ(p["num_audio_streams"], 1);
    EXPECT_EQ(p["num_video_streams"], 1);

    ASSERT_TRUE(j["active_audio"].is_object());
    EXPECT_EQ(j["active_audio"]["codec_name"], "WMA2");
    EXPECT_EQ(j["active_audio"]["language"], "fre");
    ASSERT_TRUE(j["active_video"].is_object());
    EXPECT_EQ(j["active_video"]["codec_name"], "WMV3");
    EXPECT_EQ(j["active_video"]["frame_rate_den"], 40000);
    EXPECT_EQ(j["active_video"]["bit_rate"], 250000);
    ASSERT_EQ(j["audio"].size(), 1u);
    ASSERT_EQ(j["video"].size(), 1u);
    EXPECT_EQ(j["audio"][0]["index"], 0);
    EXPECT_EQ(j["video"][0]["width"], 320);
}

TEST(AsfdumpInfo, ExitStatusAndInputOptions) {
    const Bytes audio_only = asfb::build(asfb::standard_file(true, false));
    TempFile good(audio_only);
    TempFile not_asf(Bytes(4096, 0x47));
    const struct {
        const char* what;
        std::string file;
        std::string options;
        int status;
        const char* expect;  // text in the output
    } cases[] = {
        {"no video: active_video is null", good.path(), "", 0, "\"active_video\": null"},
        {"not seekable", good.path(), "--not-seekable", 0, "\"seekable\": 0"},
        {"no buffering", good.path(), "--buffer none", 0, "\"WMA2\""},
        {"ring with thread", good.path(), "--buffer ring --thread --block-size 4096", 0, "\"WMA2\""},
        {"not ASF", not_asf.path(), "", 1, "HOVA_OpenFailed"},
        {"missing file", "/nonexistent/file.wma", "", 3, "cannot read"},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        std::string out;
        EXPECT_EQ(run_info(c.file, c.options, &out), c.status) << out;
        EXPECT_NE(out.find(c.expect), std::string::npos) << out;
    }
}

}  // namespace
