#include "Logger.h"

#include <cerrno>
#include <csignal>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "LoggerLine.h"
#include "LoggerSink.h"
#include "OsLogFile.h"
#include "QNException.h"
#include "QNString.h"
#include "SignalHandler.h"

std::atomic<unsigned int> gsQNLogCode{255};

namespace {
std::atomic<unsigned int> gsHbTimeout{30};

constexpr int kStandardError = 2;

bool journalWanted() {
  const char* const lpForced = getenv("QN_LOG_STDERR");
  return (lpForced != nullptr && strcmp(lpForced, "1") == 0) ||
         OsIsJournalStream(kStandardError, getenv("JOURNAL_STREAM"));
}

// Runs on the signal dispatcher's thread, never in signal context (see SignalHandler.h).
void reopenOnSignal(int) {
  char lReason[256];
  if (!QNCLogSink::instance().reopen(lReason, sizeof lReason))
    QN_LOG_ERROR("Cannot reopen the log file: %s; writing on to the file opened before", lReason);
}
}  // namespace

void PrintLogMessageWithTimeStamp(unsigned int aLevel, const char* apTag, unsigned int aLine,
                                  const char* apFunction, const char* apFile, const char* apFormat, ...) {
  if (!QNIsLogLevelOn(aLevel)) return;
  // Callers log and then report errno (OsThrowError); a line must not change what they report.
  const int lSavedErrno = errno;
  char lLine[kQNLogMaxLine];
  va_list lArgs;
  va_start(lArgs, apFormat);
  const size_t lLength =
      QNFormatLogLine(lLine, sizeof lLine, apTag, aLine, apFunction, apFile, apFormat, lArgs);
  va_end(lArgs);
  QNCLogSink::instance().write(aLevel, lLine, lLength);
  errno = lSavedErrno;
}

void CreateLogger(const QNCString& acrPath) {
  const int lSavedErrno = errno;
  QNCLogSink& lrSink = QNCLogSink::instance();
  lrSink.setJournal(journalWanted());
  char lReason[256];
  if (!lrSink.open(acrPath.get(), gsQNLogCode.load(std::memory_order_relaxed), lReason, sizeof lReason)) {
    // The log is optional to the process: a service without one still runs.
    fprintf(stderr, "Cannot open log file '%s': %s\n", acrPath.get(), lReason);
  } else {
    try {
      RegisterSignalHandler(SIGUSR1, reopenOnSignal);
    } catch (const QNCException& acrError) {
      // The log works; only rotation by signal is lost, which the message says.
      fprintf(stderr, "Cannot take SIGUSR1 to reopen log file '%s': %s\n", acrPath.get(), acrError.what());
    }
  }
  errno = lSavedErrno;
}

void destroyLogger() {
  QNCLogSink& lrSink = QNCLogSink::instance();
  lrSink.close();
  lrSink.setJournal(false);
}

void flushLogger() { QNCLogSink::instance().flush(); }

void setLogCode(unsigned int aMask) { gsQNLogCode.store(aMask, std::memory_order_relaxed); }
void getLogCode(unsigned int& arMask) { arMask = gsQNLogCode.load(std::memory_order_relaxed); }
void setHbTimeout(unsigned int aValue) { gsHbTimeout.store(aValue, std::memory_order_relaxed); }
void getHbTimeout(unsigned int& arValue) { arValue = gsHbTimeout.load(std::memory_order_relaxed); }
