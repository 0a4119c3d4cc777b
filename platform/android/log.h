/*
 * The platform log-print call. On the device this is the system log; this
 * build provides its own with the same shape (see log.cc).
 */
#ifndef PLIMO_ANDROID_LOG_H
#define PLIMO_ANDROID_LOG_H

#ifdef __cplusplus
extern "C" {
#endif

typedef enum android_LogPriority {
    ANDROID_LOG_UNKNOWN = 0,
    ANDROID_LOG_DEFAULT = 1,
    ANDROID_LOG_VERBOSE = 2,
    ANDROID_LOG_DEBUG = 3,
    ANDROID_LOG_INFO = 4,
    ANDROID_LOG_WARN = 5,
    ANDROID_LOG_ERROR = 6,
    ANDROID_LOG_FATAL = 7,
    ANDROID_LOG_SILENT = 8
} android_LogPriority;

int __android_log_print(int prio, const char* tag, const char* fmt, ...)
    __attribute__((format(printf, 3, 4)));

/*
 * Observer for tests: when set, every formatted message is handed to it
 * instead of being written to stderr. Not part of the device interface.
 */
typedef void (*plimo_log_hook_fn)(int prio, const char* tag, const char* text, void* user);
void plimo_log_set_hook(plimo_log_hook_fn hook, void* user);

#ifdef __cplusplus
}
#endif

#endif /* PLIMO_ANDROID_LOG_H */
