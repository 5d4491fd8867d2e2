#include "Logger.h"

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstring>

#include "LoggerLine.h"
#include "LoggerSink.h"
#include "QNString.h"

std::atomic<unsigned int> gsQNLogCode{255};

namespace {
std::atomic<unsigned int> gsHbTimeout{30};
}  // namespace

void PrintLogMessageWithTimeStamp(unsigned int aLevel, const char* apTag, unsigned int aLine,
                                  const char* apFunction, const char* apFile, const char* apFormat, ...) {
  if (!QNIsLogLevelOn(aLevel)) return;
  // Callers log and then report errno (OsThrowError); a line must not change what they report.
  const int lSavedErrno = errno;
  char lLine[kQNLogMaxLine];
  va_list lArgs;
  va_start(lArgs, apFormat);
  const size_t lLength = QNFormatLogLine(lLine, sizeof lLine, apTag, aLine, apFunction, apFile, apFormat, lArgs);
  va_end(lArgs);
  QNCLogSink::instance().write(aLevel, lLine, lLength);
  errno = lSavedErrno;
}

void CreateLogger(const QNCString& acrPath) {
  const int lSavedErrno = errno;
  if (!QNCLogSink::instance().open(acrPath.get(), gsQNLogCode.load(std::memory_order_relaxed))) {
    // The log is optional to the process: a service without one still runs.
    fprintf(stderr, "Cannot open log file '%s': %s\n", acrPath.get(), strerror(errno));
  }
  errno = lSavedErrno;
}

void destroyLogger() { QNCLogSink::instance().close(); }

void flushLogger() { QNCLogSink::instance().flush(); }

void setLogCode(unsigned int aMask) { gsQNLogCode.store(aMask, std::memory_order_relaxed); }
void getLogCode(unsigned int& arMask) { arMask = gsQNLogCode.load(std::memory_order_relaxed); }
void setHbTimeout(unsigned int aValue) { gsHbTimeout.store(aValue, std::memory_order_relaxed); }
void getHbTimeout(unsigned int& arValue) { arValue = gsHbTimeout.load(std::memory_order_relaxed); }
