// The shared library as the framework sees it: the probe, and the symbols it
// exports and imports.
#include <gtest/gtest.h>

#include <cstring>

#include "asf_api.h"
#include "asffdec/asf_guid.h"
#include "raw_input.h"
#include "test_env.h"

#pragma GCC diagnostic ignored "-Wmissing-field-initializers"

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
        EXPECT_EQ(std::make_pair(asf_probe(c.file.data(), c.len, raw->io(), HOVA_PROBE_NORMAL), raw->position()),
                  std::make_pair(c.expected, uint64_t{0})) << (&c - cases);
    }
    EXPECT_EQ(asf_probe(tagged.data(), 64, nullptr, HOVA_PROBE_NORMAL) +
              asf_probe(nullptr, 64, nullptr, HOVA_PROBE_NORMAL), 0);
}

// Exactly the descriptor and the log getter go out; no process heap function
// comes in: the plug-in allocates through the host only.
TEST(SharedLibrary, ExportsTheDescriptorAndTheLogGetterAndImportsNoHeapFunction) {
    std::string exported, heap;
    const std::string nm = "nm -D --format=posix " + testenv::plugin_path() + " 2>/dev/null | ";
    testenv::run_command(nm + "awk '$2 ~ /^[A-Z]$/ && $2 != \"U\" && $2 != \"W\" && $2 != \"V\" && "
                         "$1 !~ /^(_init|_fini|_edata|_end|__bss_start)$/ {print $1}' | sort", &exported);
    EXPECT_EQ(exported, "get_kesto_disable_log\nhova_asff_demuxer\n");
    testenv::run_command(nm + "awk '$2 == \"U\" {sub(/@.*/, \"\", $1); print $1}' | grep -xE "
                         "'malloc|calloc|realloc|free|strdup|_Znwm|_Znam|_ZdlPv|_ZdaPv|_ZdlPvm|posix_memalign|"
                         "aligned_alloc|memcpy'", &heap);
    EXPECT_EQ(heap, "memcpy\n") << "imports a heap function (memcpy: the listing is read)";
}
