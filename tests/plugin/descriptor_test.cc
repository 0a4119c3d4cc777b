// The descriptor as the framework sees it: loaded by name from the shared
// library, with the slots the host calls, the symbols it exports and imports,
// and the probe.
#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <sstream>

#include "asf_api.h"
#include "asffdec/asf_guid.h"
#include "loader.h"
#include "raw_input.h"
#include "test_env.h"

#pragma GCC diagnostic ignored "-Wmissing-field-initializers"

namespace {

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

// The header GUID at the start, or behind an ID3v2 tag (syncsafe size 259:
// 269 bytes) on a seekable input that is put back at its start.
TEST(Descriptor, ProbeFindsTheHeaderGuidAtTheStartOrBehindAnId3Tag) {
    std::vector<uint8_t> at0(64, 0), tagged(269 + 64, 0);
    std::memcpy(at0.data(), &asf_header_object, 16);
    std::memcpy(tagged.data(), "ID3\x03\x00\x00\x80\x80\x82\x83", 10);
    std::memcpy(tagged.data() + 269, &asf_header_object, 16);
    auto edit = [](std::vector<uint8_t> v, size_t at, uint8_t x) { return v[at] ^= x, v; };
    const struct { std::vector<uint8_t> file; int len, expected; bool seekable = true, refuse_seek = false; }
        cases[] = {{at0, 16, 1}, {at0, 15, 0}, {edit(at0, 15, 1), 64, 0}, {tagged, 64, 1}, {tagged, 9, 0},
                   {tagged, 64, 0, false}, {tagged, 64, 0, true, true}, {edit(tagged, 284, 0xFF), 64, 0},
                   {std::vector<uint8_t>(tagged.begin(), tagged.begin() + 284), 64, 0}};
    for (const auto& c : cases) {
        auto raw = host::RawInput::from_memory(c.file, {.seekable = c.seekable});
        raw->faults().refuse_seek = c.refuse_seek;
        EXPECT_EQ(asf_probe(c.file.data(), c.len, raw->io(), HOVA_PROBE_NORMAL), c.expected) << (&c - cases);
        EXPECT_EQ(raw->position(), 0u);
    }
    EXPECT_EQ(asf_probe(tagged.data(), 64, nullptr, HOVA_PROBE_NORMAL) +
              asf_probe(nullptr, 64, nullptr, HOVA_PROBE_NORMAL), 0);
}

// Exactly the descriptor and the log getter go out; no process heap function
// comes in: the plug-in allocates through the host only.
TEST(SharedLibrary, ExportsTheDescriptorAndTheLogGetterAndImportsNoHeapFunction) {
    std::string out;
    testenv::run_command("nm -D " + testenv::plugin_path() + " 2>/dev/null", &out);
    std::istringstream lines(out);
    std::vector<std::string> exported, imported;
    for (std::string line, a, b, c; std::getline(lines, line);) {
        std::istringstream f(line);
        c.clear();
        f >> a >> b >> c;
        if (c.empty()) c = b, b = a;  // undefined symbols have no address
        c = c.substr(0, c.find('@'));
        if (b == "U") imported.push_back(c);
        else if (b != "w" && b != "v" && c != "_init" && c != "_fini" && c != "_edata" &&
                 c != "_end" && c != "__bss_start") exported.push_back(c);
    }
    std::sort(exported.begin(), exported.end());
    EXPECT_EQ(exported, (std::vector<std::string>{"get_kesto_disable_log", "hova_asff_demuxer"}));
    ASSERT_FALSE(imported.empty());
    for (const char* sym : {"malloc", "calloc", "realloc", "free", "strdup", "_Znwm", "_Znam",
                            "_ZdlPv", "_ZdaPv", "_ZdlPvm", "posix_memalign", "aligned_alloc"})
        EXPECT_EQ(std::count(imported.begin(), imported.end(), sym), 0) << "imports " << sym;
}

}  // namespace
