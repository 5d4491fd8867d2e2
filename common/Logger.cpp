#include "Logger.h"

#include <fcntl.h>
#include <sys/syscall.h>
#include <sys/time.h>
#include <time.h>
#include <unistd.h>

#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <mutex>

#include "QNString.h"

std::atomic<unsigned int> gsQNLogCode{255};

namespace {
constexpr size_t kMaxLine = 2048;
std::mutex gsLogMutex;  // guards gsLogFd
int gsLogFd = -1;
std::atomic<unsigned int> gsHbTimeout{30};

bool isUrgent(unsigned int aLevel) { return (aLevel & (QNLL_Halt | QNLL_Error | QNLL_Warning)) != 0; }
}  // namespace

void PrintLogMessageWithTimeStamp(unsigned int aLevel, const char* apTag, unsigned int aLine,
                                  const char* apFunction, const char* apFile, const char* apFormat, ...) {
  if (!QNIsLogLevelOn(aLevel)) return;
  char lLine[kMaxLine];
  struct timeval lNow;
  gettimeofday(&lNow, nullptr);
  struct tm lTm;
  localtime_r(&lNow.tv_sec, &lTm);
  int lUsed = snprintf(lLine, sizeof lLine, "%04d-%02d-%02d %02d:%02d:%02d.%06ld %s [%ld] %s (%s:%u) ",
                       lTm.tm_year + 1900, lTm.tm_mon + 1, lTm.tm_mday, lTm.tm_hour, lTm.tm_min, lTm.tm_sec,
                       static_cast<long>(lNow.tv_usec), apTag, static_cast<long>(syscall(SYS_gettid)),
                       apFunction, apFile, aLine);
  va_list lArgs;
  va_start(lArgs, apFormat);
  if (lUsed > 0 && static_cast<size_t>(lUsed) < sizeof lLine)
    lUsed += vsnprintf(lLine + lUsed, sizeof lLine - lUsed, apFormat, lArgs);
  va_end(lArgs);
  size_t lLength = lUsed < 0 ? 0 : static_cast<size_t>(lUsed);
  if (lLength > sizeof lLine - 2) lLength = sizeof lLine - 2;
  while (lLength > 0 && lLine[lLength - 1] == '\n') --lLength;
  lLine[lLength++] = '\n';
  std::lock_guard<std::mutex> lGuard(gsLogMutex);
  if (gsLogFd >= 0) {
    (void)!write(gsLogFd, lLine, lLength);
  } else if (isUrgent(aLevel)) {
    (void)!write(STDERR_FILENO, lLine, lLength);
  }
}

void CreateLogger(const QNCString& acrPath) {
  std::lock_guard<std::mutex> lGuard(gsLogMutex);
  if (gsLogFd >= 0) close(gsLogFd);
  gsLogFd = open(acrPath.get(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0644);
  if (gsLogFd < 0) fprintf(stderr, "Cannot open log file '%s': %s\n", acrPath.get(), strerror(errno));
}

void destroyLogger() {
  std::lock_guard<std::mutex> lGuard(gsLogMutex);
  if (gsLogFd >= 0) close(gsLogFd);
  gsLogFd = -1;
}

void flushLogger() {}

void setLogCode(unsigned int aMask) { gsQNLogCode.store(aMask, std::memory_order_relaxed); }
void getLogCode(unsigned int& arMask) { arMask = gsQNLogCode.load(std::memory_order_relaxed); }
void setHbTimeout(unsigned int aValue) { gsHbTimeout.store(aValue); }
void getHbTimeout(unsigned int& arValue) { arValue = gsHbTimeout.load(); }
