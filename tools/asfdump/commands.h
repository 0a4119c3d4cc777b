#pragma once

#include "hova_dmx.h"
#include "options.h"

namespace asfdump {

// Each returns the process exit status.
int run_probe(const hova_dmx_func_st* dmx, const Options& opts);
int run_info(const hova_dmx_func_st* dmx, const Options& opts);
int run_frames(const hova_dmx_func_st* dmx, const Options& opts);

}  // namespace asfdump
