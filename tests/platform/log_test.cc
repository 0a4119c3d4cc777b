// The log switch, the call shape and the stand-in platform log on stderr.
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <string>

#include "dprintf.h"
#include "test_env.h"

namespace {

TEST(Log, MessagesGoOutAtDebugUnderTheTagWhileTheSwitchIsZero) {
    testenv::LogCapture log;
    ASSERT_EQ(get_kesto_disable_log(), 0) << "logging starts on";
    ASF_LOG("open %d\n", 7);
    SYS_LOG("tool\n");
    ASSERT_EQ(log.lines().size(), 2u);
    EXPECT_EQ(log.lines()[0].text, "[ASF] open 7\n");
    EXPECT_EQ(log.lines()[1].text, "[SYS] tool\n");
    EXPECT_EQ(log.lines()[0].priority, ANDROID_LOG_DEBUG);
    EXPECT_EQ(log.lines()[0].tag, "[PLIMO]");

    kesto_disable_log = 5;
    EXPECT_EQ(get_kesto_disable_log(), 5);
    DPRINTF("suppressed\n");
    kesto_disable_log = 0;
    EXPECT_EQ(log.lines().size(), 2u) << "nothing is written while the switch is set";
}

// What two messages look like on stderr in a child whose PLIMO_LOG is `env`.
std::string stderr_of_child(const char* env) {
    int fds[2];
    if (::pipe(fds) != 0) return "pipe failed";
    const pid_t pid = ::fork();
    if (pid == 0) {
        ::dup2(fds[1], 2);
        ::close(fds[0]);
        if (env) ::setenv("PLIMO_LOG", env, 1); else ::unsetenv("PLIMO_LOG");
        __android_log_print(ANDROID_LOG_DEBUG, "[PLIMO]", "hello %s\n", "there");
        __android_log_print(ANDROID_LOG_DEBUG, "[PLIMO]", "no newline");
        ::_exit(0);
    }
    ::close(fds[1]);
    std::string out;
    char buf[256];
    ssize_t n;
    while ((n = ::read(fds[0], buf, sizeof buf)) > 0) out.append(buf, static_cast<size_t>(n));
    ::close(fds[0]);
    int status = 0;
    ::waitpid(pid, &status, 0);
    return out;
}

TEST(Log, StandInWritesOneLinePerMessageToStderrUnlessPlimoLogIsOff) {
    EXPECT_EQ(stderr_of_child(nullptr), "D/[PLIMO]: hello there\nD/[PLIMO]: no newline\n");
    EXPECT_EQ(stderr_of_child("on"), "D/[PLIMO]: hello there\nD/[PLIMO]: no newline\n");
    EXPECT_EQ(stderr_of_child("off"), "");
}

TEST(Log, ThreadIdIsTheCallersKernelId) {
    EXPECT_EQ(sys_gettid(), static_cast<int>(::getpid())) << "main thread id equals the pid";
}

}  // namespace
