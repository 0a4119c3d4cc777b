// The descriptor as the framework sees it: loaded by name from the shared
// library, with the slots and sizes the host was built against.
#include <gtest/gtest.h>

#include <array>
#include <cstring>
#include <sstream>
#include <string>

#include "asf_api.h"
#include "loader.h"
#include "test_env.h"

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
                 d->get_timeline_info);
    EXPECT_FALSE(d->support_avframe_video || d->support_avframe_audio ||
                 d->support_fast_track_switch);
    ASSERT_NE(loader.disable_log_getter(), nullptr);
    EXPECT_EQ(loader.disable_log_getter()(), 0);
}

TEST(Descriptor, ContextSizeHoldsTheFixedRecordAndExactlyTwoStreams) {
    const int size = hova_asff_demuxer.min_context_size;
    EXPECT_EQ(size, static_cast<int>(sizeof(asf_demuxer_st) + 2 * sizeof(asf_stream_st)));
    EXPECT_LT(size, static_cast<int>(sizeof(asf_demuxer_st) + 3 * sizeof(asf_stream_st)));
    // The stream records follow the fixed record with nothing between.
    EXPECT_EQ(offsetof(asf_demuxer_st, stream_info), sizeof(asf_demuxer_st));
    EXPECT_EQ(sizeof(asf_demuxer_st) % alignof(asf_stream_st), 0u);
}

TEST(Descriptor, TrivialEntryPointsAnswerAsDocumented) {
    alignas(8) std::array<uint8_t, 4096> buf{};
    auto* ctx = reinterpret_cast<asf_demuxer_st*>(buf.data());
    ctx->s.thumbnail_interval = -1;
    const std::array<uint8_t, 4096> before = buf;

    for (int level = HOVA_DROP_NONE; level <= HOVA_DROP_FULL + 1; ++level)
        EXPECT_EQ(hova_asff_demuxer.set_drop(ctx, static_cast<hova_drop_level_et>(level)),
                  HOVA_InvalidParam);
    EXPECT_EQ(buf, before) << "set_drop changes nothing";

    for (int ev = HOVA_NOTIFY_NONE; ev <= HOVA_NOTIFY_SVP_VERSION; ++ev)
        EXPECT_EQ(hova_asff_demuxer.notify_event(ctx, static_cast<hova_player_notify_et>(ev),
                                                 nullptr),
                  HOVA_OK);
    EXPECT_EQ(buf, before) << "notify_event changes nothing";

    for (int64_t interval : {int64_t{0}, int64_t{2000000}, int64_t{-1}, INT64_MAX}) {
        EXPECT_EQ(hova_asff_demuxer.set_multi_thumb(ctx, interval), HOVA_OK);
        EXPECT_EQ(ctx->s.thumbnail_interval, interval);
    }
}

std::string nm_symbols(const std::string& flags) {
    std::string out;
    testenv::run_command("nm -D " + flags + " " + testenv::plugin_path() + " 2>/dev/null", &out);
    return out;
}

TEST(SharedLibrary, ExportsExactlyTheDescriptorAndTheLogGetter) {
    const std::string defined = nm_symbols("--defined-only");
    ASSERT_FALSE(defined.empty()) << "nm could not read " << testenv::plugin_path();
    std::istringstream lines(defined);
    std::string line;
    std::vector<std::string> exported;
    while (std::getline(lines, line)) {
        std::istringstream f(line);
        std::string addr, type, name;
        f >> addr >> type >> name;
        if (name.empty() || type == "U" || type == "w" || type == "v") continue;
        if (name == "_init" || name == "_fini" || name == "_edata" || name == "_end" ||
            name == "__bss_start")
            continue;
        exported.push_back(name);
    }
    std::sort(exported.begin(), exported.end());
    EXPECT_EQ(exported, (std::vector<std::string>{"get_kesto_disable_log", "hova_asff_demuxer"}));
}

TEST(SharedLibrary, ImportsNoProcessHeapFunction) {
    const std::string undefined = nm_symbols("--undefined-only");
    ASSERT_FALSE(undefined.empty());
    for (const char* sym : {"malloc", "calloc", "realloc", "free", "strdup", "_Znwm", "_Znam",
                            "_Znwj", "_Znaj", "_ZdlPv", "_ZdaPv", "_ZdlPvm", "_ZdlPvj",
                            "posix_memalign", "aligned_alloc"}) {
        std::istringstream lines(undefined);
        std::string line;
        while (std::getline(lines, line)) {
            std::istringstream f(line);
            std::string type, name;
            f >> type >> name;
            EXPECT_NE(name.substr(0, name.find('@')), sym) << "imports " << name;
        }
    }
}

}  // namespace
