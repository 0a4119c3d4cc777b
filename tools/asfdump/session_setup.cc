// What info and frames share: the session over the file with the input the
// options describe, and opening it with the failure said on stderr.
#include <cstdio>

#include "commands.h"

namespace asfdump {

std::unique_ptr<host::Session> make_session(const hova_dmx_func_st* dmx, const Options& opts) {
    host::SessionOptions so;
    so.input = opts.input;
    so.ring_size = opts.ring_size;
    auto session = host::Session::from_file(dmx, opts.file, so);
    if (!session) std::fprintf(stderr, "asfdump: cannot read %s\n", opts.file.c_str());
    return session;
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
