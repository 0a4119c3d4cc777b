#include "dprintf.h"

#include <sys/syscall.h>
#include <unistd.h>

extern "C" {

int kesto_disable_log = 0;

int get_kesto_disable_log(void) { return kesto_disable_log; }

// The device's ARM EABI kernel numbers gettid 224; use the number of the
// architecture we are built for so that the same code runs on the build host.
int sys_gettid(void) { return static_cast<int>(syscall(SYS_gettid)); }

}  // extern "C"
