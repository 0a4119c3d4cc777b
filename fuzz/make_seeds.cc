// Writes the seed corpus of every fuzz target: make_seeds OUT_DIR creates
// OUT_DIR/<target>/<n> files from the toolkit tests' builders.
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "toolkit_builders.h"

namespace {

using tkb::Bytes;
namespace fs = std::filesystem;

void write_all(const fs::path& dir, const std::vector<Bytes>& seeds) {
    fs::create_directories(dir);
    for (size_t i = 0; i < seeds.size(); ++i) {
        std::ofstream f(dir / ("seed_" + std::to_string(i)), std::ios::binary);
        f.write(reinterpret_cast<const char*>(seeds[i].data()), static_cast<std::streamsize>(seeds[i].size()));
    }
}

std::vector<Bytes> adts() {
    return {tkb::adts_frame(4, 2, 16),
            tkb::adts_frame(3, 6, 16),
            tkb::adts_frame(4, 7, 4),
            tkb::cat({tkb::adts_frame(12, 5, 2), tkb::adts_frame(7, 1, 2)}),
            tkb::cat({Bytes{0xFF, 0x00, 0xFF}, tkb::adts_frame(11, 1, 8)})};
}

std::vector<Bytes> latm() {
    tkb::LoasConfig v0;
    tkb::LoasConfig v1;
    v1.mux_version = 1;
    v1.programs = {{tkb::LoasLayer{false, {2, 3, 6}, 16}}};
    tkb::LoasConfig layers;
    layers.mux_version = 1;
    layers.programs = {{tkb::LoasLayer{false, {3, 4, 2}, 19}, tkb::LoasLayer{false, {2, 4, 1}, 0}},
                       {tkb::LoasLayer{false, {5, 6, 7}, 0}, tkb::LoasLayer{true, {}, 0}}};
    tkb::LoasConfig same;
    same.use_same_stream_mux = true;
    return {tkb::loas_frame(v0), tkb::loas_frame(v1), tkb::loas_frame(layers),
            tkb::cat({tkb::loas_frame(same), tkb::loas_frame(v1)})};
}

std::vector<Bytes> ac3() {
    std::vector<Bytes> out;
    for (int acmod = 0; acmod < 8; ++acmod) out.push_back(tkb::ac3_frame(acmod, acmod & 1));
    out.push_back(tkb::cat({tkb::ac3_frame(7, 1, 40, 0), tkb::ac3_frame(2, 0)}));
    return out;
}

std::vector<Bytes> eac3() {
    std::vector<Bytes> out;
    for (int acmod = 0; acmod < 8; acmod += 3) out.push_back(tkb::eac3_frame(acmod, 1));
    return out;
}

std::vector<Bytes> asc() {
    return {tkb::asc_bytes({2, 4, 2}), tkb::asc_bytes({5, 6, 7}), tkb::asc_bytes({29, 12, 1}),
            tkb::asc_bytes({3, 4, 2}), Bytes{0x13, 0x90, 0x56, 0xE5, 0xA0}};
}

std::vector<Bytes> avcc() {
    auto with_mode = [](uint8_t mode, const Bytes& record) { return tkb::cat({Bytes{mode}, record}); };
    return {with_mode(0, tkb::avcc({tkb::pattern(10, 1)}, {tkb::pattern(4, 2)})),
            with_mode(0, tkb::avcc({tkb::pattern(20, 1), tkb::pattern(9, 3)}, {tkb::pattern(4, 2)}, 2)),
            with_mode(1, tkb::avcc({tkb::pattern(10, 1)}, {tkb::pattern(4, 2)})),
            with_mode(2, tkb::avcc({}, {}))};
}

// The ID3 harness reads one options byte (see id3_fuzzer.cc), then the input.
std::vector<Bytes> id3() {
    using tkb::text;
    using tkb::text_frame;
    const Bytes audio = tkb::pattern(300, 9);
    const Bytes jpeg = tkb::pattern(64, 0xD8);
    Bytes apic = {0};
    for (char c : std::string("image/jpeg")) apic.push_back(static_cast<uint8_t>(c));
    apic.insert(apic.end(), {0, 3, 'c', 'o', 'v', 0});
    apic.insert(apic.end(), jpeg.begin(), jpeg.end());
    const std::vector<tkb::Id3Frame> frames = {
        text_frame("TIT2", 0, text("Title")), text_frame("TPE1", 3, text("Artist")),
        text_frame("TALB", 1, {0xFF, 0xFE, 'A', 0, 'l', 0}), text_frame("TRCK", 0, text("7/10")),
        text_frame("TYER", 0, text("1999")), text_frame("TCON", 0, text("(17)")),
        text_frame("COMM", 0, text("engdesc\0body")), {"APIC", apic}};
    const std::vector<tkb::Id3Frame> frames_v2 = {
        text_frame("TT2", 0, text("Old")), text_frame("TP1", 0, text("Tagger")),
        {"PIC", tkb::cat({Bytes{0, 'J', 'P', 'G', 3, 0}, jpeg})}};
    const Bytes v1 = tkb::id3v1("Song", "Band", "Record", "2001", "nice", 17);
    std::vector<Bytes> out;
    out.push_back(tkb::cat({Bytes{1}, tkb::id3_tag(3, tkb::id3_frames(3, frames), 32), audio}));
    out.push_back(tkb::cat({Bytes{1}, tkb::id3_tag(4, tkb::id3_frames(4, frames), 8), audio}));
    out.push_back(tkb::cat({Bytes{0}, tkb::id3_tag(2, tkb::id3_frames(2, frames_v2)), audio}));
    out.push_back(tkb::cat({Bytes{1}, tkb::id3_tag(3, Bytes{'T', 'I', 'T', '2', 0, 0, 0, 4, 0, 0, 0, 0xFF, 0x00, 0x41}, 0, 0x80), audio}));
    out.push_back(tkb::cat({Bytes{1}, audio, v1}));
    out.push_back(tkb::cat({Bytes{3}, Bytes(256, 0), tkb::id3_tag(3, tkb::id3_frames(3, frames)), v1}));
    out.push_back(tkb::cat({Bytes{5}, tkb::id3_tag(3, tkb::id3_frames(3, frames), 40000), audio}));
    return out;
}

}  // namespace

int main(int argc, char** argv) {
    if (argc != 2) {
        std::fprintf(stderr, "usage: %s OUT_DIR\n", argv[0]);
        return 2;
    }
    const fs::path root = argv[1];
    write_all(root / "adts", adts());
    write_all(root / "latm", latm());
    write_all(root / "ac3", ac3());
    write_all(root / "eac3", eac3());
    write_all(root / "asc", asc());
    write_all(root / "avcc", avcc());
    write_all(root / "id3", id3());
    return 0;
}
