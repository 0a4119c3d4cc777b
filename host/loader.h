// Loads the plug-in as the framework does: dlopen, the descriptor by name,
// a check of min_context_size, and the context buffer open_file receives.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "hova_dmx.h"

namespace host {

class PluginLoader {
public:
    PluginLoader() = default;
    ~PluginLoader();
    PluginLoader(const PluginLoader&) = delete;
    PluginLoader& operator=(const PluginLoader&) = delete;

    // Loads `path`; on failure returns false and leaves the reason in error().
    bool load(const std::string& path);
    const hova_dmx_func_st* descriptor() const { return desc_; }
    int (*disable_log_getter() const)(void) { return get_log_; }
    const std::string& error() const { return error_; }

    // Where the plug-in is looked for when no path is given: beside the
    // executable, then the build tree this host was built in.
    static std::vector<std::string> default_paths(const std::string& exe_path);

private:
    void* handle_ = nullptr;
    const hova_dmx_func_st* desc_ = nullptr;
    int (*get_log_)(void) = nullptr;
    std::string error_;
};

// The host's context buffer: `size` usable bytes starting `misalign` bytes past
// an 8-byte boundary, so that open's alignment step is exercised.
class ContextBuffer {
public:
    explicit ContextBuffer(size_t size, size_t misalign = 0);
    void* data() { return storage_.data() + misalign_; }
    int size() const { return static_cast<int>(size_); }

private:
    std::vector<uint8_t> storage_;
    size_t size_;
    size_t misalign_;
};

}  // namespace host
