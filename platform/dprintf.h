/*
 * Diagnostics: every message goes to the platform log at debug priority under
 * the tag "[PLIMO]", and only while the log switch is off (zero).
 */
#ifndef PLIMO_DPRINTF_H
#define PLIMO_DPRINTF_H

#include "android/log.h"

#ifdef __cplusplus
extern "C" {
#endif

#define PLIMO_LOG_TAG "[PLIMO]"

/* Non-zero suppresses every message. Starts at 0; the plug-in never changes it. */
extern int kesto_disable_log;

__attribute__((visibility("default"))) int get_kesto_disable_log(void);

/* Kernel thread id of the caller. */
int sys_gettid(void);

#ifdef __cplusplus
}
#endif

#define DPRINTF(...)                                                        \
    do {                                                                    \
        if (get_kesto_disable_log() == 0)                                   \
            __android_log_print(ANDROID_LOG_DEBUG, PLIMO_LOG_TAG, __VA_ARGS__); \
    } while (0)

#define ASF_LOG(fmt, ...) DPRINTF("[ASF] " fmt, ##__VA_ARGS__)
#define SYS_LOG(fmt, ...) DPRINTF("[SYS] " fmt, ##__VA_ARGS__)

#endif /* PLIMO_DPRINTF_H */
