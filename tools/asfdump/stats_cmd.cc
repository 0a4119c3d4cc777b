#include "commands.h"
namespace asfdump {
int run_stats(const hova_dmx_func_st*, const Options&) { return kExitUsage; }
}
