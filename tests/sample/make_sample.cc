// Writes a small ASF file with the project's builder: two seconds of a WMV3
// stream and a WMA2 stream, muxed into fixed-size packets, with a title and
// album. scripts/run plays it when no file is given.
#include <cstdio>
#include <fstream>

#include "asf_builder.h"
#include "asf_packets.h"

int main(int argc, char** argv) {
    if (argc != 2) return std::fprintf(stderr, "usage: make_sample OUT.asf\n"), 2;
    std::vector<asfb::Object> objects;
    for (uint32_t ms = 0, n = 0; ms < 2000; ms += 40, ++n) {  // audio ahead of its video frame
        objects.push_back({1, 3000 + ms, asfb::pattern(743, 1000 + n), true});
        objects.push_back({2, 3000 + ms, asfb::pattern(n % 25 == 0 ? 4000 : 900, n), n % 25 == 0});
    }
    asfb::File file;
    file.packets = asfb::mux(objects, 2048);
    asfb::FileProps fp;
    fp.packet_count = file.packets.size();
    fp.min_packet_size = fp.max_packet_size = 2048, fp.preroll = 3000;  // ms
    fp.play_duration = 5000 * 10000ull, fp.send_duration = 2000 * 10000ull;
    file.header_children = {
        asfb::file_properties(fp), asfb::audio_stream(1), asfb::video_stream(2),
        asfb::content_description({"plimo sample", "the ASF builder", "", "", ""}),
        asfb::extended_content_description({{"WM/AlbumTitle", 0, asfb::string_value("Test patterns")},
                                            {"WM/Year", 0, asfb::string_value("2026")}})};
    const asfb::Bytes bytes = asfb::build(file);
    std::ofstream out(argv[1], std::ios::binary);
    out.write(reinterpret_cast<const char*>(bytes.data()), std::streamsize(bytes.size()));
    if (!out) return std::fprintf(stderr, "make_sample: cannot write %s\n", argv[1]), 3;
    return 0;
}
