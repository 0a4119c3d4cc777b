#pragma once

#include <memory>

#include "hova_dmx.h"
#include "options.h"
#include "session.h"

namespace asfdump {

// Each returns the process exit status.
int run_probe(const hova_dmx_func_st* dmx, const Options& opts);
int run_info(const hova_dmx_func_st* dmx, const Options& opts);
int run_frames(const hova_dmx_func_st* dmx, const Options& opts);
int run_thumb(const hova_dmx_func_st* dmx, const Options& opts);

// The session over the file with the input the options describe; null, said
// on stderr, when the file cannot be read.
std::unique_ptr<host::Session> make_session(const hova_dmx_func_st* dmx, const Options& opts);
// open_file; a failure is said on stderr.
bool open_session(host::Session& session);

// The raw input over the file or URL; null, said on stderr, when it cannot
// be read.
std::unique_ptr<host::RawInput> make_input(const Options& opts);
// For a URL: what the network saw, and a transfer that failed, on stderr.
// False when the transfer failed (the file could not be read to its end).
bool report_network(const host::RawInput& input, const Options& opts);

}  // namespace asfdump
