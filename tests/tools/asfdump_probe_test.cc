// asfdump probe through the shared library, as other tools call it: real ASF
// files answer 1, and the exit status follows the contract.
#include <gtest/gtest.h>

#include "test_env.h"

using namespace std::string_literals;

int asfdump(const std::string& args, std::string* out) {
    return testenv::run_command(testenv::asfdump_path() + " " + args + " 2>/dev/null", out);
}

TEST(AsfdumpProbe, ExitStatusFollowsTheContract) {
    const std::pair<const char*, int> cases[] = {
        {"", 2}, {"probe", 2}, {"explode /dev/null", 2}, {"probe /dev/null --buffer fancy", 2},
        {"probe /dev/null --thread", 2},  // the streaming thread needs the ring
        {"probe /nonexistent/x.wmv", 3}, {"probe /tmp", 3}, {"probe /dev/null", 3},
        {"probe /dev/null --plugin /nonexistent.so", 1}, {"--help", 0}, {"-h", 0},
        {"info /nonexistent/x.wmv --help", 0}};  // help is no usage error: usage on stdout
    for (const auto& [args, status] : cases) {
        std::string out;
        EXPECT_EQ(asfdump(args, &out), status) << args;
        if (status == 0) { EXPECT_EQ(out.rfind("usage: asfdump probe FILE\n", 0), 0u) << args; }
    }
    std::string out;
    for (const std::string& f : testenv::corpus_files())  // a real file answers 1
        EXPECT_EQ(std::make_pair(asfdump("probe '" + f + "'", &out), out), std::make_pair(0, "1\n"s)) << f;
}
