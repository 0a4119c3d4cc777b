// asfdump probe FILE: the first bytes of the file and the raw input, as the
// framework hands them to the probe. Exits 0 for ASF, 1 otherwise (with the
// reason on stderr).
#include <cstdio>
#include <vector>

#include "commands.h"
#include "file_check.h"

namespace asfdump {

namespace {
constexpr size_t kProbeBytes = 4096;
}

int run_probe(const hova_dmx_func_st* dmx, const Options& opts) {
    auto input = make_input(opts);
    if (!input) return kExitUnreadable;
    std::vector<uint8_t> head(kProbeBytes);
    const size_t got = input->io()->read(input->io(), head.data(), head.size());
    input->io()->seek(input->io(), 0, CB_SEEK_SET);
    const int answer = dmx->probe(head.data(), static_cast<int>(got), input->io(), HOVA_PROBE_NORMAL);
    std::printf("%d\n", answer);
    if (answer == 1) return kExitOk;
    if (!opts.is_url) {
        const std::string why = explain_file(opts.file);
        std::fprintf(stderr, "asfdump: %s: %s\n", opts.file.c_str(),
                     why.empty() ? "the probe does not take it for ASF" : why.c_str());
    }
    return kExitOpenFailed;
}

}  // namespace asfdump
