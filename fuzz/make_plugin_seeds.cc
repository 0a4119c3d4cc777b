// Writes the seed corpora of the whole-plug-in and reader targets:
//   make_plugin_seeds OUT_DIR [CORPUS_DIR]
// creates OUT_DIR/<target>/<name> from files the ASF builder makes and, when
// given, from the real files of CORPUS_DIR (cut to 256 KiB so that one run
// stays fast), each behind the control bytes its target expects.
#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <string>
#include <utility>
#include <vector>

#include "asf_builder.h"
#include "asf_packets.h"

namespace {

namespace fs = std::filesystem;
using asfb::Bytes;

constexpr size_t kMaxSeedFile = 256 * 1024;

void write(const fs::path& dir, const std::string& name, const Bytes& prefix, const Bytes& file) {
    fs::create_directories(dir);
    std::ofstream f(dir / name, std::ios::binary);
    f.write(reinterpret_cast<const char*>(prefix.data()), static_cast<std::streamsize>(prefix.size()));
    f.write(reinterpret_cast<const char*>(file.data()), static_cast<std::streamsize>(file.size()));
}

// Built files: plain, audio only, video only, spread audio, compressed
// payloads, damaged and misaligned packets, ID3 prefix, broadcast.
std::vector<std::pair<std::string, Bytes>> built() {
    using namespace asfb;
    std::vector<std::pair<std::string, Bytes>> out;
    std::vector<Object> objs;
    for (uint32_t i = 0; i < 24; ++i) {
        objs.push_back({1, 100 * i, pattern(300 + 37 * i, i), true});
        objs.push_back({2, 100 * i + 50, pattern(1500 + 211 * i, 100 + i), i % 6 == 0});
    }
    PacketFile pf;
    pf.packet_size = 1024;
    pf.preroll_ms = 3000;
    pf.packets = mux(objs, pf.packet_size);
    const uint32_t n = static_cast<uint32_t>(pf.packets.size());
    std::vector<IndexEntry> idx;
    for (uint32_t i = 0; i < 6; ++i) idx.push_back({std::min(n - 1, i * n / 6), 1});
    pf.trailing = {simple_index(4000000, idx)};
    out.emplace_back("built_av_index", build_packet_file(pf));

    PacketFile noidx = pf;
    noidx.trailing.clear();
    out.emplace_back("built_av_noindex", build_packet_file(noidx));

    PacketFile small = pf;
    PacketLayout l;
    l.error_correction = false;
    l.packet_len_type = 2;
    l.padding_len_type = 1;
    l.offset_type = 2;
    small.packet_size = 300;
    small.packets = mux(objs, small.packet_size, l);
    small.trailing.clear();
    out.emplace_back("built_av_small_packets", build_packet_file(small));

    PacketFile audio;
    audio.video = false;
    std::vector<Object> aobjs;
    for (uint32_t i = 0; i < 30; ++i) aobjs.push_back({1, 64 * i, pattern(200, i), true});
    audio.packets = mux(aobjs, 1024);
    out.emplace_back("built_audio", build_packet_file(audio));

    PacketFile video;
    video.audio = false;
    std::vector<Object> vobjs;
    for (uint32_t i = 0; i < 20; ++i) vobjs.push_back({2, 40 * i, pattern(2500, i), i % 5 == 0});
    video.packets = mux(vobjs, 1024);
    out.emplace_back("built_video", build_packet_file(video));

    PacketFile spread;
    spread.video = false;
    spread.spread = {3, 64, 64};
    std::vector<Object> sobjs;
    for (uint32_t i = 0; i < 8; ++i)
        sobjs.push_back({1, 100 * i, spread_scramble(pattern(192, i), 3, 64, 64), true});
    spread.packets = mux(sobjs, 512);
    out.emplace_back("built_spread", build_packet_file(spread));

    PacketFile comp;
    comp.packets = {packet({compressed(1, 1, 0, 20, {pattern(40, 1), pattern(50, 2), pattern(60, 3)}, true)}, 512),
                    packet({media(2, 1, 0, 100, 10, pattern(100, 4), true)}, 512),
                    damaged_packet(Damage::PacketLenTooLong, {media(1, 2, 0, 80, 70, pattern(80, 5))}, 512),
                    damaged_packet(Damage::PayloadTooLong, {media(2, 2, 0, 80, 70, pattern(80, 6))}, 512),
                    misaligned_packet(pattern(13, 7), {media(1, 3, 0, 80, 90, pattern(80, 8))}, 512),
                    packet({media(2, 3, 0, 90, 120, pattern(90, 9), true)}, 512)};
    out.emplace_back("built_compressed_damaged", build_packet_file(comp));

    File id3 = standard_file(true, true, 4);
    id3.id3_payload = 100;
    out.emplace_back("built_id3_standard", build(id3));
    out.emplace_back("built_standard_audio", build(standard_file(true, false, 3)));

    PacketFile bc = pf;
    bc.broadcast = true;
    out.emplace_back("built_broadcast", build_packet_file(bc));

    // A recorded live stream: packet count 0, data object size 50, half a
    // packet at the end.
    PacketFile live = noidx;
    live.broadcast = true;
    live.packet_count = 0;
    live.data_object_size = 50;
    live.packets.push_back(Bytes(live.packets.back().begin(), live.packets.back().begin() + 500));
    out.emplace_back("built_broadcast_uncounted", build_packet_file(live));

    // Extended stream properties with a stream name, four payload extension
    // systems and an embedded stream properties object behind them.
    File ext;
    FileProps efp;
    efp.packet_count = pf.packets.size();
    efp.min_packet_size = efp.max_packet_size = pf.packet_size;
    ExtStreamProps es;
    es.stream_num = 2;
    es.names = {{0, "Video"}};
    const PayloadExtSystem sys{guid_from_text("399595EC-8667-4E2D-8FDB-98814CE76C1E"), 0xFFFF, {}};
    es.ext_systems = {sys, sys, sys, sys};
    es.embedded_stream = video_stream(2);
    ExtStreamProps ea;
    ea.stream_num = 1;
    ea.ext_systems = {sys, sys, sys};
    ext.header_children = {file_properties(efp),
                           header_extension({extended_stream_properties(ea),
                                             extended_stream_properties(es), language_list({"en"})}),
                           audio_stream(1)};
    ext.packets = pf.packets;
    out.emplace_back("built_long_ext_tail", build(ext));

    // Single-payload packets off their grid: bytes inserted before one
    // packet (every later one shifted), and bytes lost from another's end.
    PacketLayout one;
    one.multiple = false;
    PacketFile off = noidx;
    off.packet_size = 512;
    off.packets = mux(objs, off.packet_size, one, 1, 480);
    const Bytes junk = {0x90, 0x11, 0x22, 0x33, 0x44, 0x55, 0x66};
    off.packets[5].insert(off.packets[5].begin(), junk.begin(), junk.end());
    off.packets[12].resize(off.packets[12].size() - 9);
    out.emplace_back("built_single_payload_off_grid", build_packet_file(off));
    return out;
}

std::vector<std::pair<std::string, Bytes>> from_corpus(const fs::path& dir) {
    std::vector<std::pair<std::string, Bytes>> out;
    std::error_code ec;
    if (dir.empty() || !fs::is_directory(dir, ec)) return out;
    std::vector<fs::path> files;
    for (const auto& e : fs::directory_iterator(dir, ec)) {
        const std::string ext = e.path().extension().string();
        if (ext == ".asf" || ext == ".wmv" || ext == ".wma") files.push_back(e.path());
    }
    std::sort(files.begin(), files.end());
    for (const auto& p : files) {
        std::ifstream f(p, std::ios::binary);
        Bytes b(kMaxSeedFile);
        f.read(reinterpret_cast<char*>(b.data()), static_cast<std::streamsize>(b.size()));
        b.resize(static_cast<size_t>(f.gcount()));
        out.emplace_back("corpus_" + p.filename().string(), std::move(b));
    }
    return out;
}

// Host actions for the seek and modes targets (pairs: action, argument).
const std::vector<Bytes> kActions = {
    {0, 20, 2, 8, 0, 20, 0x0a, 4, 0, 20, 3, 12, 0, 30, 4, 1, 0, 40, 5, 5, 0, 10, 6, 0, 7, 0, 0, 255, 2, 0, 0, 255},
    {0, 3, 0x12, 20, 0x1a, 200, 2, 255, 0, 5, 0x0a, 0, 0, 5, 3, 0, 0, 5, 0x0b, 2, 0, 5, 4, 0, 0, 80, 2, 4, 0, 80, 0, 0},
};
// Modes: cache, none, ring, ring with thread; small blocks and ring; short
// reads; refused frame buffers; a failing allocation; no seeking; streaming.
const std::vector<Bytes> kModes = {
    {0, 0, 0, 0},    {1, 0, 0, 0},    {2, 0, 0, 0},  {3, 0, 0, 0},  {0xe2, 2, 0, 0},
    {0xa3, 0x0d, 0, 0}, {0, 0x08, 0, 1}, {0, 0, 5, 2}, {4, 0, 0, 4}, {0x0b, 0x14, 0, 0},
};

}  // namespace

int main(int argc, char** argv) {
    if (argc < 2) {
        std::fprintf(stderr, "usage: make_plugin_seeds OUT_DIR [CORPUS_DIR]\n");
        return 2;
    }
    const fs::path out = argv[1];
    auto files = built();
    for (auto& f : from_corpus(argc > 2 ? argv[2] : "")) files.push_back(std::move(f));

    for (const auto& [name, bytes] : files) {
        write(out / "plugin_play", name, {}, bytes);
        for (size_t a = 0; a < kActions.size(); ++a)
            write(out / "plugin_seek", name + "_" + std::to_string(a), kActions[a], bytes);
        for (size_t m = 0; m < kModes.size(); ++m) {
            Bytes prefix = kModes[m];
            const Bytes& act = kActions[m % kActions.size()];
            prefix.insert(prefix.end(), act.begin(), act.end());
            write(out / "plugin_modes", name + "_" + std::to_string(m), prefix, bytes);
        }
        // Reader: a mix of reads, peeks and seeks over the first 64 KiB.
        const Bytes head(bytes.begin(), bytes.begin() + static_cast<long>(std::min<size_t>(bytes.size(), 65536)));
        for (uint8_t mode : {0x00, 0x01, 0x22, 0x33, 0x4b, 0x86}) {
            Bytes prefix = {mode, 9, 0, 16, 0, 1, 32, 0, 2, 100, 0, 0, 200, 1,
                            3, 0, 1, 0x13, 0, 0x7f, 0, 50, 0, 5, 0, 0, 6, 0, 0};
            write(out / "reader_ops", name + "_" + std::to_string(mode), prefix, head);
        }
    }
    return 0;
}
