// asfdump: the reference host's command line. Loads libplimo_asf.so as the
// framework does and drives its descriptor.
#include <dlfcn.h>
#include <unistd.h>

#include <climits>
#include <cstdio>
#include <cstdlib>
#include <string>

#include "commands.h"
#include "file_check.h"
#include "loader.h"
#include "options.h"
#include "plugin_version.h"

namespace {

std::string self_path(const char* argv0) {
    char buf[PATH_MAX];
    ssize_t n = readlink("/proc/self/exe", buf, sizeof buf - 1);
    if (n > 0) return std::string(buf, static_cast<size_t>(n));
    return argv0;
}

bool load_plugin(host::PluginLoader& loader, const asfdump::Options& opts, const char* argv0) {
    if (!opts.plugin.empty()) {
        if (loader.load(opts.plugin)) return true;
        std::fprintf(stderr, "asfdump: %s\n", loader.error().c_str());
        return false;
    }
    std::string last;
    for (const std::string& path : host::PluginLoader::default_paths(self_path(argv0))) {
        if (access(path.c_str(), R_OK) != 0) continue;
        if (loader.load(path)) return true;
        last = loader.error();
    }
    std::fprintf(stderr, "asfdump: cannot load libplimo_asf.so%s%s\n", last.empty() ? "" : ": ",
                 last.c_str());
    return false;
}

// asfdump's own version, then the version note of the plug-in it loaded.
int print_version(const hova_dmx_func_st* dmx) {
    Dl_info where{};
    const bool found = dladdr(dmx, &where) != 0 && where.dli_fname;
    const std::string v = host::plugin_version(dmx);
    std::printf("asfdump %s\nlibplimo_asf %s (%s)\n", PLIMO_VERSION, v.empty() ? "unknown" : v.c_str(),
                found ? where.dli_fname : "?");
    return asfdump::kExitOk;
}

// The command words and what runs them; no word: the summary.
struct Command {
    const char* name;
    int (*run)(const hova_dmx_func_st*, const asfdump::Options&);
};
constexpr Command kCommands[] = {
    {"", asfdump::run_summary},
    {"probe", asfdump::run_probe},
    {"info", asfdump::run_info},
    {"frames", asfdump::run_frames},
    {"stats", asfdump::run_stats},
    {"thumb", asfdump::run_thumb},
};

const Command* find_command(const std::string& name) {
    for (const Command& c : kCommands)
        if (name == c.name) return &c;
    return nullptr;
}

int usage_error(const std::string& error) {
    std::fprintf(stderr, "asfdump: %s\n", error.c_str());
    std::fputs(asfdump::usage_text(), stderr);
    return asfdump::kExitUsage;
}

}  // namespace

int main(int argc, char** argv) {
    asfdump::Options opts;
    std::string error;
    if (!asfdump::parse_options(argc, argv, &opts, &error)) return usage_error(error);
    if (opts.help) {
        std::fputs(asfdump::usage_text(), stdout);
        return asfdump::kExitOk;
    }
    if (opts.version) {
        host::PluginLoader loader;
        if (!load_plugin(loader, opts, argv[0])) return asfdump::kExitOpenFailed;
        return print_version(loader.descriptor());
    }
    const Command* command = find_command(opts.command);
    if (!command) return usage_error("unknown command " + opts.command);
    // "asfdump probe" alone is a command without its file, not a file named probe.
    if (opts.command.empty() && find_command(opts.file) && access(opts.file.c_str(), F_OK) != 0)
        return usage_error("missing file after " + opts.file);
    if (!opts.is_url) {
        const int status = asfdump::check_file(opts.file);
        if (status != asfdump::kExitOk) return status;
    }
    host::PluginLoader loader;
    if (!load_plugin(loader, opts, argv[0])) return asfdump::kExitOpenFailed;

    // The plug-in's log goes to stderr only when asked for.
    if (!opts.log) setenv("PLIMO_LOG", "off", 1);
    return command->run(loader.descriptor(), opts);
}
