// What info and frames share: the session over the file with the input the
// options describe, and opening it with the failure said on stderr.
#include <cinttypes>
#include <cstdio>

#include "commands.h"

namespace asfdump {

std::unique_ptr<host::RawInput> make_input(const Options& opts) {
    if (!opts.is_url) {
        auto input = host::RawInput::from_file(opts.file, opts.input);
        if (!input) std::fprintf(stderr, "asfdump: cannot read %s\n", opts.file.c_str());
        return input;
    }
    std::string why;
    auto input = host::RawInput::from_url(opts.file, opts.input, &why);
    if (!input) {
        std::fprintf(stderr, "asfdump: cannot read %s: %s\n", opts.file.c_str(), why.c_str());
        return nullptr;
    }
    if (!input->http()->ranges())
        std::fprintf(stderr, "asfdump: %s: the server ignores range requests; reading it in one pass, "
                             "seeks are refused\n", opts.file.c_str());
    return input;
}

bool report_network(const host::RawInput& input, const Options& opts) {
    const host::HttpSource* http = input.http();
    if (!http) return true;
    const host::HttpStats s = http->stats();
    std::fprintf(stderr, "asfdump: http: %" PRIu64 " requests, %" PRIu64 " bytes received, %.1f ms waiting\n",
                 s.requests, s.bytes_received, static_cast<double>(s.wait_us) / 1000.0);
    if (http->failure().empty()) return true;
    std::fprintf(stderr, "asfdump: %s: %s\n", opts.file.c_str(), http->failure().c_str());
    return false;
}

std::unique_ptr<host::Session> make_session(const hova_dmx_func_st* dmx, const Options& opts) {
    host::SessionOptions so;
    so.input = opts.input;
    so.ring_size = opts.ring_size;
    auto input = make_input(opts);
    if (!input) return nullptr;
    return std::make_unique<host::Session>(dmx, std::move(input), so);
}

bool open_session(host::Session& session) {
    const int rc = session.open();
    if (rc == HOVA_OK) return true;
    std::fprintf(stderr, "asfdump: open failed: %s\n", host::errno_name(rc));
    if (session.blocks_outstanding() != 0)
        std::fprintf(stderr, "asfdump: %zu blocks still held after the failed open\n",
                     session.blocks_outstanding());
    return false;
}

}  // namespace asfdump
