// asfdump probe FILE: the first bytes of the file and the raw input, as the
// framework hands them to the probe.
#include <cstdio>
#include <vector>

#include "commands.h"

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
    return kExitOk;
}

}  // namespace asfdump
