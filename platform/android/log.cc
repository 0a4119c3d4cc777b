// Stand-in for the system log: one line per message on stderr, in the
// "D/[PLIMO]: text" form of logcat's brief format. PLIMO_LOG=off silences it.
#include "android/log.h"

#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace {

plimo_log_hook_fn g_hook = nullptr;
void* g_hook_user = nullptr;

char priority_letter(int prio) {
    static constexpr char kLetters[] = "??VDIWEFS";
    return (prio >= 0 && prio <= ANDROID_LOG_SILENT) ? kLetters[prio] : '?';
}

// Read on every message so that a host can silence the log at any time.
bool stderr_enabled() {
    const char* v = std::getenv("PLIMO_LOG");
    return !(v && std::strcmp(v, "off") == 0);
}

}  // namespace

extern "C" void plimo_log_set_hook(plimo_log_hook_fn hook, void* user) {
    g_hook = hook;
    g_hook_user = user;
}

extern "C" int __android_log_print(int prio, const char* tag, const char* fmt, ...) {
    char text[1024];
    va_list ap;
    va_start(ap, fmt);
    int n = std::vsnprintf(text, sizeof text, fmt, ap);
    va_end(ap);
    if (n < 0) return n;
    if (g_hook) {
        g_hook(prio, tag, text, g_hook_user);
        return n;
    }
    if (!stderr_enabled()) return n;
    size_t len = std::strlen(text);
    const char* nl = (len > 0 && text[len - 1] == '\n') ? "" : "\n";
    std::fprintf(stderr, "%c/%s: %s%s", priority_letter(prio), tag, text, nl);
    return n;
}
