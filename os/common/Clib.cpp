#include "Clib.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstring>

#include "Os.h"
#include "OsError.h"
#include "OsStream.h"

namespace {
// Sleeps for the given time, to a deadline on the monotonic clock. An absolute deadline makes every signal
// cost nothing: a relative sleep restarted with the time left loses its rounding each time.
void sleepFor(time_t aSeconds, long aNanoseconds) {
  struct timespec lDeadline;
  clock_gettime(CLOCK_MONOTONIC, &lDeadline);  // cannot fail: the clock exists
  lDeadline.tv_sec += aSeconds + (lDeadline.tv_nsec + aNanoseconds) / 1000000000L;
  lDeadline.tv_nsec = (lDeadline.tv_nsec + aNanoseconds) % 1000000000L;
  // clock_nanosleep returns the error number; EINTR means a handler ran: sleep on.
  while (clock_nanosleep(CLOCK_MONOTONIC, TIMER_ABSTIME, &lDeadline, nullptr) == EINTR) {
  }
}
}  // namespace

int ClibOpen(const char* apPath, int aFlags, int aMode) {
  for (;;) {
    const int lFd = open(apPath, aFlags, static_cast<mode_t>(aMode));
    if (lFd >= 0) return lFd;
    const int lErrno = errno;
    if (lErrno == EINTR) continue;  // open of a FIFO or slow device can be interrupted; nothing was opened
    OsThrowPathError<QNCOpenFailedEx>(lErrno, "open", apPath);
  }
}

unsigned int ClibRead(int aFd, void* apBuffer, unsigned int aCount) {
  for (;;) {
    const ssize_t lRead = read(aFd, apBuffer, aCount);
    if (lRead >= 0) return static_cast<unsigned int>(lRead);
    const int lErrno = errno;
    if (lErrno == EINTR) continue;  // interrupted before anything was read: the call can be made again
    OsThrowFdError<QNCReadFailedEx>(lErrno, "read", aFd);
  }
}

unsigned int ClibWrite(int aFd, const void* apBuffer, unsigned int aCount) {
  unsigned long lWritten = 0;
  const int lErrno = OsWriteFully(aFd, apBuffer, aCount, QNPS_Raise, lWritten);
  if (lErrno != 0) OsThrowFdError<QNCWriteFailedEx>(lErrno, "write", aFd);
  return aCount;
}

void ClibClose(int aFd) {
  // Never retried: Linux releases the descriptor even when close reports EINTR, and a retry could
  // close a descriptor another thread has just been given.
  if (close(aFd) == 0) return;
  const int lErrno = errno;
  if (lErrno != EINTR) OsThrowFdError<QNCCloseFailedEx>(lErrno, "close", aFd);
}

void ClibCloseQuietly(int aFd) noexcept {
  // The result is not looked at: the descriptor is released whatever close reports, and the
  // caller's outcome is already decided. Never retried, for the reason given in ClibClose.
  (void)close(aFd);
}

void ClibStat(const char* apPath, struct stat* apOut) {
  for (;;) {
    if (stat(apPath, apOut) == 0) return;
    const int lErrno = errno;
    if (lErrno == EINTR) continue;  // possible on network file systems; stat has no effect to repeat
    OsThrowPathError<QNCClibStatFailedEx>(lErrno, "stat", apPath);
  }
}

int ClibGetpid() { return static_cast<int>(getpid()); }

int ClibGetProcStatus(int aPid) {
  if (OsKill(aPid, 0) == 0) return 0;  // OsKill refuses a pid that names a group (EINVAL)
  const int lErrno = errno;
  if (lErrno == EPERM) return 0;  // the process exists but belongs to another user
  char lPid[24];
  snprintf(lPid, sizeof lPid, "pid %d", aPid);
  OsThrowError<QNCClibGetProcStatusFailedEx>(lErrno, "kill(signal 0)", lPid);
}

void ClibSleep(unsigned int aSeconds) { sleepFor(static_cast<time_t>(aSeconds), 0); }

void ClibSleepMS(unsigned long aMilliseconds) {
  sleepFor(static_cast<time_t>(aMilliseconds / 1000), static_cast<long>(aMilliseconds % 1000) * 1000000L);
}

void ClibChdir(const char* apDir) {
  for (;;) {
    if (chdir(apDir) == 0) return;
    const int lErrno = errno;
    if (lErrno == EINTR) continue;  // possible on network file systems; nothing changed yet
    OsThrowPathError<QNCOpenFailedEx>(lErrno, "chdir", apDir);
  }
}

void ClibStrerror(char* apBuffer, unsigned long aSize) {
  if (aSize == 0) return;
  const int lErrno = errno;
  // The GNU strerror_r returns the text, which may or may not be apBuffer.
  const char* lpText = strerror_r(lErrno, apBuffer, aSize);
  if (lpText != apBuffer) snprintf(apBuffer, aSize, "%s", lpText);
  errno = lErrno;  // the caller may still want the number it asked about
}

void ClibGethostname(char* apBuffer, unsigned int aSize) {
  if (aSize == 0) return;
  if (gethostname(apBuffer, aSize) != 0) {
    // ENAMETOOLONG: glibc has already copied what fits, unterminated; any other failure leaves
    // nothing usable.
    if (errno != ENAMETOOLONG) snprintf(apBuffer, aSize, "%s", "localhost");
  }
  apBuffer[aSize - 1] = '\0';  // gethostname does not terminate a cut name
}

void ClibMemcpy(void* apDestination, const void* apSource, unsigned long aCount) {
  if (aCount != 0) memcpy(apDestination, apSource, aCount);  // a count of 0 may come with null pointers
}

int ClibStrcmp(const char* apFirst, const char* apSecond) { return strcmp(apFirst, apSecond); }

int ClibSnprintf(char* apBuffer, unsigned long aSize, const char* apFormat, ...) {
  va_list lArgs;
  va_start(lArgs, apFormat);
  const int lResult = vsnprintf(apBuffer, aSize, apFormat, lArgs);
  va_end(lArgs);
  return lResult;
}
