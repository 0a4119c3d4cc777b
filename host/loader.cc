#include "loader.h"

#include <dlfcn.h>

namespace host {

#ifndef PLIMO_BUILD_DIR
#define PLIMO_BUILD_DIR "."
#endif

PluginLoader::~PluginLoader() {
    if (handle_) dlclose(handle_);
}

bool PluginLoader::load(const std::string& path) {
    if (handle_) {
        dlclose(handle_);
        handle_ = nullptr;
        desc_ = nullptr;
    }
    handle_ = dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL);
    if (!handle_) {
        const char* e = dlerror();
        error_ = e ? e : "dlopen failed";
        return false;
    }
    desc_ = static_cast<const hova_dmx_func_st*>(dlsym(handle_, "hova_asff_demuxer"));
    get_log_ = reinterpret_cast<int (*)(void)>(dlsym(handle_, "get_kesto_disable_log"));
    if (!desc_) {
        error_ = "hova_asff_demuxer not found in " + path;
        return false;
    }
    if (desc_->min_context_size <= 0 || !desc_->probe || !desc_->open_file) {
        error_ = "descriptor of " + path + " is incomplete";
        desc_ = nullptr;
        return false;
    }
    return true;
}

std::vector<std::string> PluginLoader::default_paths(const std::string& exe_path) {
    std::vector<std::string> out;
    const auto slash = exe_path.rfind('/');
    const std::string dir = slash == std::string::npos ? "." : exe_path.substr(0, slash);
    out.push_back(dir + "/libplimo_asf.so");
    out.push_back(std::string(PLIMO_BUILD_DIR) + "/libplimo_asf.so");
    return out;
}

ContextBuffer::ContextBuffer(size_t size, size_t misalign)
    : storage_(size + misalign + 8), size_(size), misalign_(misalign) {
    // std::vector<uint8_t> from operator new is at least 16-byte aligned, so
    // `misalign` is the offset from an 8-byte boundary.
}

}  // namespace host
