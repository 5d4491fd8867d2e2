#include "OsThread.h"

#include <pthread.h>
#include <sys/syscall.h>
#include <unistd.h>

long OsThreadId() noexcept { return syscall(SYS_gettid); }

int OsAtFork(void (*apPrepare)(), void (*apParent)(), void (*apChild)()) noexcept {
  return pthread_atfork(apPrepare, apParent, apChild);
}
