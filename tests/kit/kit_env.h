// What the integrator's kit tests need beside the test environment: the
// example host, the sample maker, the build's compiler and flags, and a
// scratch folder that goes away with the process.
#pragma once

#include <cstdlib>
#include <filesystem>
#include <string>

namespace kitenv {

inline std::string example_path() { return PLIMO_BINARY_DIR "/plimo_play"; }
inline std::string make_sample_path() { return PLIMO_BINARY_DIR "/make_sample"; }

// A folder of this process's own under the system's temporary folder.
inline const std::string& temp_dir() {
    struct Dir {
        std::string path;
        Dir() {
            std::string tmpl = (std::filesystem::temp_directory_path() / "plimo_kit_XXXXXX").string();
            path = mkdtemp(tmpl.data()) ? tmpl : std::string();
        }
        ~Dir() {
            std::error_code ec;
            if (!path.empty()) std::filesystem::remove_all(path, ec);
        }
    };
    static const Dir dir;
    return dir.path;
}

}  // namespace kitenv
