// Writes a small ASF file with the project's builder: two seconds of a WMV3
// stream and a WMA2 stream, muxed into fixed-size packets, with a title and
// album. scripts/run plays it when no file is given.
#include <cstdio>
#include <fstream>

#include "asf_builder.h"
#include "asf_packets.h"

int main(int argc, char** argv) {
    if (argc != 2) {
        std::fprintf(stderr, "usage: make_sample OUT.asf\n");
        return 2;
    }
    constexpr uint32_t kPacketSize = 2048;
    constexpr uint32_t kPrerollMs = 3000;
    constexpr uint32_t kSeconds = 2;

    std::vector<asfb::Object> objects;
    for (uint32_t ms = 0, n = 0; ms < kSeconds * 1000; ms += 40, ++n) {
        // Audio every 40 ms ahead of the video frame it goes with.
        objects.push_back({1, kPrerollMs + ms, asfb::pattern(743, 1000 + n), true});
        objects.push_back({2, kPrerollMs + ms, asfb::pattern(n % 25 == 0 ? 4000 : 900, n),
                           n % 25 == 0});
    }
    const std::vector<asfb::Bytes> packets = asfb::mux(objects, kPacketSize);

    asfb::File file;
    asfb::FileProps fp;
    fp.packet_count = packets.size();
    fp.min_packet_size = fp.max_packet_size = kPacketSize;
    fp.preroll = kPrerollMs;
    fp.play_duration = (kSeconds * 1000ull + kPrerollMs) * 10000;
    fp.send_duration = kSeconds * 10000000ull;
    file.header_children.push_back(asfb::file_properties(fp));
    file.header_children.push_back(asfb::audio_stream(1));
    file.header_children.push_back(asfb::video_stream(2));
    file.header_children.push_back(
        asfb::content_description({"plimo sample", "the ASF builder", "", "", ""}));
    file.header_children.push_back(asfb::extended_content_description({
        {"WM/AlbumTitle", 0, asfb::string_value("Test patterns")},
        {"WM/Year", 0, asfb::string_value("2026")},
    }));
    file.packets = packets;
    const asfb::Bytes bytes = asfb::build(file);

    std::ofstream out(argv[1], std::ios::binary);
    out.write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
    if (!out) {
        std::fprintf(stderr, "make_sample: cannot write %s\n", argv[1]);
        return 3;
    }
    return 0;
}
