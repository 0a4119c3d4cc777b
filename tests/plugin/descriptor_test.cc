// The descriptor as the framework sees it: loaded by name from the shared
// library, with the slots and sizes the host was built against.
#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <cstring>
#include <sstream>
#include <string>
#include <vector>

#include "asf_api.h"
#include "loader.h"
#include "raw_input.h"
#include "test_env.h"

#pragma GCC diagnostic ignored "-Wmissing-field-initializers"

namespace {

const hova_dmx_func_st& dmx = hova_asff_demuxer;

TEST(Descriptor, LoadsByNameAndFillsTheSlotsTheHostCalls) {
    host::PluginLoader loader;
    ASSERT_TRUE(loader.load(testenv::plugin_path())) << loader.error();
    const hova_dmx_func_st* d = loader.descriptor();
    ASSERT_NE(d, nullptr);
    EXPECT_TRUE(d->probe && d->open_file && d->close_file && d->get_info && d->get_data &&
                d->seek_time && d->resync_time && d->set_track && d->set_drop &&
                d->set_multi_thumb && d->notify_event);
    // Slots the plug-in does not offer are left empty for the host to test.
    EXPECT_FALSE(d->set_edition || d->release_data || d->get_frame_info || d->get_frame_data ||
                 d->reset_avframe || d->discard_avframe || d->queue_avframe ||
                 d->deliver_avframe || d->peek_avframe || d->set_unset_temi_config ||
                 d->get_timeline_info || d->support_avframe_video ||
                 d->support_avframe_audio || d->support_fast_track_switch);
    ASSERT_NE(loader.disable_log_getter(), nullptr);
    EXPECT_EQ(loader.disable_log_getter()(), 0);
}

TEST(Descriptor, TrivialEntryPointsAnswerAsDocumented) {
    alignas(8) std::array<uint8_t, 4096> buf{};
    auto* ctx = reinterpret_cast<asf_demuxer_st*>(buf.data());
    ctx->s.thumbnail_interval = -1;
    const std::array<uint8_t, 4096> before = buf;

    for (int level = HOVA_DROP_NONE; level <= HOVA_DROP_FULL + 1; ++level)
        EXPECT_EQ(dmx.set_drop(ctx, static_cast<hova_drop_level_et>(level)), HOVA_InvalidParam);
    EXPECT_EQ(buf, before) << "set_drop changes nothing";

    for (int ev = HOVA_NOTIFY_NONE; ev <= HOVA_NOTIFY_SVP_VERSION; ++ev)
        EXPECT_EQ(dmx.notify_event(ctx, static_cast<hova_player_notify_et>(ev), nullptr), HOVA_OK);
    EXPECT_EQ(buf, before) << "notify_event changes nothing";
}

const uint8_t kHeaderGuid[16] = {0x30, 0x26, 0xB2, 0x75, 0x8E, 0x66, 0xCF, 0x11,
                                 0xA6, 0xD9, 0x00, 0xAA, 0x00, 0x62, 0xCE, 0x6C};

// The header GUID at the start, or behind an ID3v2 tag (syncsafe size 259:
// 269 bytes) on a seekable input that is put back at its start.
TEST(Probe, RecognisesTheHeaderGuidAtTheStartOrBehindAnId3Tag) {
    std::vector<uint8_t> at0(64, 0);
    std::memcpy(at0.data(), kHeaderGuid, 16);
    std::vector<uint8_t> tagged(269 + 64, 0);
    std::memcpy(tagged.data(), "ID3\x03\x00\x00\x80\x80\x82\x83", 10);
    std::memcpy(tagged.data() + 269, kHeaderGuid, 16);
    auto edit = [](std::vector<uint8_t> v, size_t at, uint8_t x) { return v[at] ^= x, v; };
    auto cut = [](std::vector<uint8_t> v, size_t n) { return v.resize(n), v; };
    const struct {
        std::vector<uint8_t> file;
        int len, expected;
        bool seekable = true, refuse_seek = false;
    } cases[] = {
        {at0, 64, 1},          {at0, 16, 1},           {at0, 15, 0},
        {at0, 0, 0},           {edit(at0, 15, 1), 64, 0}, {edit(at0, 0, 0x45), 64, 0},
        {tagged, 64, 1},       {tagged, 64, 0, false}, {tagged, 64, 0, true, true},
        {edit(tagged, 269, 0xFF), 64, 0}, {cut(tagged, 269 + 15), 64, 0},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(&c - cases);
        auto raw = host::RawInput::from_memory(c.file, {.seekable = c.seekable});
        raw->faults().refuse_seek = c.refuse_seek;
        EXPECT_EQ(asf_probe(c.file.data(), c.len, raw->io(), HOVA_PROBE_NORMAL), c.expected);
        EXPECT_EQ(raw->position(), 0u);
        EXPECT_TRUE(c.seekable || raw->counters().seeks == 0);
    }
    EXPECT_EQ(asf_probe(tagged.data(), 64, nullptr, HOVA_PROBE_NORMAL), 0) << "no raw input";
}

// The dynamic symbols nm lists with `flags`, without their version suffix.
std::vector<std::string> nm_symbols(const std::string& flags) {
    std::string out;
    testenv::run_command("nm -D " + flags + " " + testenv::plugin_path() + " 2>/dev/null", &out);
    std::istringstream lines(out);
    std::vector<std::string> names;
    for (std::string line; std::getline(lines, line);) {
        std::istringstream f(line);
        std::string a, b, c;
        f >> a >> b >> c;
        if (c.empty()) c = b, b = a;  // undefined symbols have no address
        if (b != "U" && b != "w" && b != "v") names.push_back(c.substr(0, c.find('@')));
        if (b == "U") names.push_back("U:" + c.substr(0, c.find('@')));
    }
    std::sort(names.begin(), names.end());
    return names;
}

TEST(SharedLibrary, ExportsExactlyTheDescriptorAndTheLogGetter) {
    std::vector<std::string> exported;
    for (const auto& n : nm_symbols("--defined-only"))
        if (n != "_init" && n != "_fini" && n != "_edata" && n != "_end" && n != "__bss_start")
            exported.push_back(n);
    EXPECT_EQ(exported, (std::vector<std::string>{"get_kesto_disable_log", "hova_asff_demuxer"}));
}

TEST(SharedLibrary, ImportsNoProcessHeapFunction) {
    const std::vector<std::string> undefined = nm_symbols("--undefined-only");
    ASSERT_FALSE(undefined.empty());
    for (const char* sym : {"malloc", "calloc", "realloc", "free", "strdup", "_Znwm", "_Znam",
                            "_Znwj", "_Znaj", "_ZdlPv", "_ZdaPv", "_ZdlPvm", "_ZdlPvj",
                            "posix_memalign", "aligned_alloc"})
        EXPECT_EQ(std::count(undefined.begin(), undefined.end(), std::string("U:") + sym), 0)
            << "imports " << sym;
}

}  // namespace
