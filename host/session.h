// One opened file as the framework holds it: the raw input, the callback
// table with its accounted memory, the context buffer and the context that
// open_file returned. Shared by asfdump's commands and the tests.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "callbacks.h"
#include "hova_dmx.h"
#include "loader.h"
#include "raw_input.h"

namespace host {

struct SessionOptions {
    InputOptions input;
    int ring_size = 1048576;
    int context_size = 0;  // 0: the descriptor's min_context_size
    size_t misalign = 0;   // bytes past an 8-byte boundary for the buffer
};

class Session {
public:
    Session(const hova_dmx_func_st* dmx, std::unique_ptr<RawInput> input,
            const SessionOptions& opts = {});
    // Null when the file cannot be read.
    static std::unique_ptr<Session> from_file(const hova_dmx_func_st* dmx, const std::string& path,
                                              const SessionOptions& opts = {});
    static std::unique_ptr<Session> from_bytes(const hova_dmx_func_st* dmx,
                                               std::vector<uint8_t> bytes,
                                               const SessionOptions& opts = {});
    ~Session();
    Session(const Session&) = delete;
    Session& operator=(const Session&) = delete;

    // open_file's result; the session is open only when it is HOVA_OK.
    int open();
    bool is_open() const { return open_; }
    void* context() const { return ctx_; }
    // close_file when open (its result), else HOVA_OK.
    int close();

    const hova_dmx_func_st* dmx() const { return dmx_; }
    HostCallbacks& callbacks() { return callbacks_; }
    RawInput& input() { return *input_; }
    // Blocks of the plug-in the host still holds.
    size_t blocks_outstanding() const { return callbacks_.outstanding_blocks(); }

private:
    const hova_dmx_func_st* dmx_;
    std::unique_ptr<RawInput> input_;
    SessionOptions opts_;
    HostCallbacks callbacks_;
    ContextBuffer buffer_;
    void* ctx_ = nullptr;
    bool open_ = false;
};

// "HOVA_OK", "HOVA_OpenFailed", ... for a result code.
const char* errno_name(int code);

}  // namespace host
