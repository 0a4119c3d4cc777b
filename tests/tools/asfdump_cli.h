// Running asfdump from the tests: its exit status, standard output and
// standard error, and files written for it.
#pragma once

#include <unistd.h>

#include <cstdio>
#include <fstream>
#include <string>
#include <vector>

#include "test_env.h"

namespace cli {

struct Result {
    int status;
    std::string out, err;
};

inline Result asfdump(const std::string& args) {
    const std::string err_path = testing::TempDir() + "asfdump_stderr_" + std::to_string(::getpid());
    Result r{};
    r.status = testenv::run_command(testenv::asfdump_path() + " " + args + " 2>'" + err_path + "'", &r.out);
    std::ifstream f(err_path);
    r.err.assign(std::istreambuf_iterator<char>(f), std::istreambuf_iterator<char>());
    std::remove(err_path.c_str());
    return r;
}

// Writes `bytes` to a file in the test's temporary folder and returns its path.
inline std::string write_temp(const std::string& name, const std::vector<uint8_t>& bytes) {
    const std::string path = testing::TempDir() + name;
    std::ofstream(path, std::ios::binary).write(reinterpret_cast<const char*>(bytes.data()),
                                                static_cast<std::streamsize>(bytes.size()));
    return path;
}

inline std::string quoted(const std::string& path) { return "'" + path + "'"; }

}  // namespace cli
