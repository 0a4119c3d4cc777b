// What info and frames share: the session over the file with the input the
// options describe, and opening it with the failure said on stderr.
#include <cinttypes>
#include <cstdio>

#include "asf_demuxer.h"
#include "commands.h"
#include "file_check.h"

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

int context_size_for(const hova_dmx_func_st* dmx, int records) {
    // min_context_size holds the fixed record and two stream records.
    return dmx->min_context_size + (records - 2) * static_cast<int>(sizeof(asf_stream_st));
}

std::unique_ptr<host::Session> make_session(const hova_dmx_func_st* dmx, const Options& opts,
                                            int default_records) {
    host::SessionOptions so;
    so.input = opts.input;
    so.ring_size = opts.ring_size;
    const int records = opts.streams >= 0 ? opts.streams : default_records;
    if (records >= 0) so.context_size = context_size_for(dmx, records);
    auto input = make_input(opts);
    if (!input) return nullptr;
    return std::make_unique<host::Session>(dmx, std::move(input), so);
}

bool open_session(host::Session& session, const Options& opts) {
    const int rc = session.open();
    if (rc == HOVA_OK) return true;
    std::string why = opts.is_url ? "" : explain_file(opts.file);
    if (why.empty() && rc == HOVA_NotEnoughMemory)
        why = "the context holds too few stream records for this file (try --streams 127)";
    if (why.empty()) why = "the ASF header could not be parsed (damaged or unsupported)";
    std::fprintf(stderr, "asfdump: open failed: %s: %s: %s\n", host::errno_name(rc), opts.file.c_str(),
                 why.c_str());
    if (session.blocks_outstanding() != 0)
        std::fprintf(stderr, "asfdump: %zu blocks still held after the failed open\n",
                     session.blocks_outstanding());
    return false;
}

}  // namespace asfdump
