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

// The session over the file with the input the options describe; null, said
// on stderr, when the file cannot be read.
std::unique_ptr<host::Session> make_session(const hova_dmx_func_st* dmx, const Options& opts);
// open_file; a failure is said on stderr.
bool open_session(host::Session& session);

}  // namespace asfdump
