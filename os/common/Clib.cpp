#include "Clib.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstring>

#include "OsError.h"

namespace {
// "fd 7", for messages about a descriptor.
struct QNSFdText {
  explicit QNSFdText(int aFd) { snprintf(mText, sizeof mText, "fd %d", aFd); }
  char mText[24];
};

void sleepFor(struct timespec aRequest) {
  // nanosleep reports the time left when a signal interrupts it; sleep on for the rest.
  while (nanosleep(&aRequest, &aRequest) != 0 && errno == EINTR) {
  }
}
}  // namespace

int ClibOpen(const char* apPath, int aFlags, int aMode) {
  for (;;) {
    const int lFd = open(apPath, aFlags, aMode);
    if (lFd >= 0) return lFd;
    if (errno == EINTR) continue;  // open of a FIFO or slow device can be interrupted
    char lQuoted[QNCException::kMaxMessage / 2];
    snprintf(lQuoted, sizeof lQuoted, "'%s'", apPath);
    OsThrowError<QNCOpenFailedEx>(errno, "open", lQuoted);
  }
}

unsigned int ClibRead(int aFd, void* apBuffer, unsigned int aCount) {
  for (;;) {
    const ssize_t lRead = read(aFd, apBuffer, aCount);
    if (lRead >= 0) return static_cast<unsigned int>(lRead);
    if (errno == EINTR) continue;  // nothing was read; the call can be made again
    OsThrowError<QNCReadFailedEx>(errno, "read", QNSFdText(aFd).mText);
  }
}

unsigned int ClibWrite(int aFd, const void* apBuffer, unsigned int aCount) {
  const char* lpBytes = static_cast<const char*>(apBuffer);
  unsigned int lWritten = 0;
  while (lWritten < aCount) {
    const ssize_t lResult = write(aFd, lpBytes + lWritten, aCount - lWritten);
    if (lResult > 0) {
      lWritten += static_cast<unsigned int>(lResult);
    } else if (lResult < 0 && errno == EINTR) {
      continue;  // interrupted before anything was written
    } else {
      OsThrowError<QNCWriteFailedEx>(lResult == 0 ? EIO : errno, "write", QNSFdText(aFd).mText);
    }
  }
  return lWritten;
}

void ClibClose(int aFd) {
  // Never retried: Linux releases the descriptor even when close reports EINTR, and a retry could
  // close a descriptor another thread has just been given.
  if (close(aFd) != 0 && errno != EINTR) OsThrowError<QNCCloseFailedEx>(errno, "close", QNSFdText(aFd).mText);
}

void ClibStat(const char* apPath, struct stat* apOut) {
  if (stat(apPath, apOut) != 0) {
    char lQuoted[QNCException::kMaxMessage / 2];
    snprintf(lQuoted, sizeof lQuoted, "'%s'", apPath);
    OsThrowError<QNCClibStatFailedEx>(errno, "stat", lQuoted);
  }
}

int ClibGetpid() { return static_cast<int>(getpid()); }

int ClibGetProcStatus(int aPid) {
  char lText[24];
  snprintf(lText, sizeof lText, "pid %d", aPid);
  // kill(0, ...) and kill(-n, ...) address process groups, not one process.
  if (aPid <= 0) OsThrowError<QNCClibGetProcStatusFailedEx>(ESRCH, "kill(0)", lText);
  if (kill(aPid, 0) == 0) return 0;
  // EPERM: the process exists but belongs to another user.
  if (errno == EPERM) return 0;
  OsThrowError<QNCClibGetProcStatusFailedEx>(errno, "kill(0)", lText);
}

void ClibSleep(unsigned int aSeconds) { sleepFor({static_cast<time_t>(aSeconds), 0}); }

void ClibSleepMS(unsigned long aMilliseconds) {
  sleepFor({static_cast<time_t>(aMilliseconds / 1000), static_cast<long>(aMilliseconds % 1000) * 1000000L});
}

void ClibChdir(const char* apDir) {
  if (chdir(apDir) != 0) {
    char lQuoted[QNCException::kMaxMessage / 2];
    snprintf(lQuoted, sizeof lQuoted, "'%s'", apDir);
    OsThrowError<QNCOpenFailedEx>(errno, "chdir", lQuoted);
  }
}

void ClibStrerror(char* apBuffer, unsigned long aSize) {
  if (aSize == 0) return;
  const int lErrno = errno;
  const char* lpText = strerror_r(lErrno, apBuffer, aSize);
  if (lpText != apBuffer) snprintf(apBuffer, aSize, "%s", lpText);
}

void ClibGethostname(char* apBuffer, unsigned int aSize) {
  if (aSize == 0) return;
  if (gethostname(apBuffer, aSize) != 0) snprintf(apBuffer, aSize, "%s", "localhost");
  apBuffer[aSize - 1] = '\0';  // gethostname does not terminate a cut name
}

void ClibMemcpy(void* apDestination, const void* apSource, unsigned long aCount) {
  if (aCount != 0) memcpy(apDestination, apSource, aCount);
}

int ClibStrcmp(const char* apFirst, const char* apSecond) { return strcmp(apFirst, apSecond); }

int ClibSnprintf(char* apBuffer, unsigned long aSize, const char* apFormat, ...) {
  va_list lArgs;
  va_start(lArgs, apFormat);
  const int lResult = vsnprintf(apBuffer, aSize, apFormat, lArgs);
  va_end(lArgs);
  return lResult;
}
