#include "DaemonStart.h"

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "OsService.h"
#include "OsStream.h"
#include "QNException.h"
#include "SystemGlobals.h"

namespace {
enum QNEDaemonStartRole {
  QNDSR_None,                // no channel in this process
  QNDSR_Daemon,              // the side that reports: the daemon, and its parents until they fork
  QNDSR_StartingParent,      // waits for the word
  QNDSR_IntermediateParent,  // leaves at once
};

constexpr unsigned int kDefaultWaitSeconds = 30;
constexpr unsigned int kMaxWaitSeconds = 3600;
// What the starting command keeps of the daemon's lines: the last ones explain the failure.
constexpr size_t kKeptReport = 64 * 1024;
// How long the daemon tries to deliver its word to a starting command that does not read.
constexpr unsigned int kWordWriteMs = 500;
constexpr char kReady[] = "ready";

bool gsArmed = false;
QNEDaemonStartRole gsRole = QNDSR_None;
int gsReadFd = -1;
int gsWriteFd = -1;
int gsSavedStderr = -1;  // where descriptor 2 pointed before it was moved aside

void moveStderrTo(int aFd) {
  gsSavedStderr = OsCopyDescriptor(2);
  if (gsSavedStderr < 0) return;  // no standard error to move: nothing to hide or to restore
  const bool lMoved = aFd < 0 ? OsNullDescriptor(2) : OsReplaceDescriptor(aFd, 2);
  if (!lMoved) {
    OsCloseDescriptor(gsSavedStderr);
    gsSavedStderr = -1;
  }
}

void restoreStderr() {
  if (gsSavedStderr < 0) return;
  OsReplaceDescriptor(gsSavedStderr, 2);
  OsCloseDescriptor(gsSavedStderr);
  gsSavedStderr = -1;
}

void closeChannel() {
  OsCloseDescriptor(gsReadFd);
  OsCloseDescriptor(gsWriteFd);
  gsReadFd = -1;
  gsWriteFd = -1;
  gsRole = QNDSR_None;
}

void sendWord(const char* apWord) {
  if (gsRole != QNDSR_Daemon || gsWriteFd < 0) return;
  restoreStderr();
  // NUL, word, NUL: log lines never hold a NUL, so the word cannot be mistaken for one of them.
  char lRecord[QNCException::kMaxMessage + 2];
  const size_t lLength = strnlen(apWord, QNCException::kMaxMessage - 1);
  lRecord[0] = '\0';
  memcpy(lRecord + 1, apWord, lLength);
  lRecord[lLength + 1] = '\0';
  const size_t lSize = lLength + 2;
  try {
    OsWriteAll(gsWriteFd, false, lRecord, lSize, kWordWriteMs);
  } catch (const QNCException&) {
    // The starting command has stopped reading (its wait ran out): nobody is left to tell.
  }
  closeChannel();
}

// QN_START_TIMEOUT in whole seconds, 1 to kMaxWaitSeconds; otherwise the default, said once.
unsigned int waitSeconds() {
  const char* lpText = getenv("QN_START_TIMEOUT");
  if (lpText == nullptr) return kDefaultWaitSeconds;
  char* lpEnd = nullptr;
  const unsigned long lValue = strtoul(lpText, &lpEnd, 10);
  if (lpText[0] >= '0' && lpText[0] <= '9' && *lpEnd == '\0' && lValue >= 1 && lValue <= kMaxWaitSeconds)
    return static_cast<unsigned int>(lValue);
  fprintf(stderr, "QN_START_TIMEOUT='%s' is not a number of seconds from 1 to %u: waiting %u s\n", lpText,
          kMaxWaitSeconds, kDefaultWaitSeconds);
  return kDefaultWaitSeconds;
}

// Prints what the daemon wrote before its word, ending in a newline, then the verdict.
int fail(const char* apLines, size_t aLength, const char* apVerdict) {
  fwrite(apLines, 1, aLength, stderr);
  if (aLength > 0 && apLines[aLength - 1] != '\n') fputc('\n', stderr);
  fprintf(stderr, "%s\n", apVerdict);
  return 1;
}
}  // namespace

void QNCDaemonStart::arm() { gsArmed = true; }

void QNCDaemonStart::openChannel() {
  if (!gsArmed || gsReadFd >= 0) return;
  OsOpenStartChannel(gsReadFd, gsWriteFd);
  gsRole = QNDSR_Daemon;
}

void QNCDaemonStart::enterParent(bool aStarting) {
  if (gsRole != QNDSR_Daemon) return;
  if (aStarting) {
    // Without its own write end the starting command sees end of file when the daemon dies.
    OsCloseDescriptor(gsWriteFd);
    gsWriteFd = -1;
    gsRole = QNDSR_StartingParent;
  } else {
    closeChannel();
    gsRole = QNDSR_IntermediateParent;
  }
  moveStderrTo(-1);
}

void QNCDaemonStart::getKeptDescriptors(int& arFirst, int& arSecond) {
  const bool lReporting = gsRole == QNDSR_Daemon;
  arFirst = lReporting ? gsReadFd : -1;
  arSecond = lReporting ? gsWriteFd : -1;
}

void QNCDaemonStart::enterDaemon() {
  if (gsRole == QNDSR_Daemon && gsWriteFd >= 0) moveStderrTo(gsWriteFd);
}

void QNCDaemonStart::reportReady() { sendWord(kReady); }

void QNCDaemonStart::reportFailure(const char* apText) { sendWord(apText); }

int QNCDaemonStart::waitForStart() {
  const bool lWaits = gsRole == QNDSR_StartingParent;
  restoreStderr();
  if (!lWaits) {
    if (gsRole != QNDSR_Daemon) gsRole = QNDSR_None;
    return 0;
  }
  const unsigned int lSeconds = waitSeconds();
  const auto lDeadline = std::chrono::steady_clock::now() + std::chrono::seconds(lSeconds);
  static char sReport[kKeptReport];
  size_t lUsed = 0;
  const char* lpVerdict = nullptr;
  char lVerdict[QNCException::kMaxMessage + 64];
  for (;;) {
    const char* lpWord = static_cast<const char*>(memchr(sReport, '\0', lUsed));
    const char* lpWordEnd =
        lpWord == nullptr ? nullptr
                          : static_cast<const char*>(memchr(lpWord + 1, '\0', sReport + lUsed - lpWord - 1));
    if (lpWordEnd != nullptr) {
      if (strcmp(lpWord + 1, kReady) == 0) {
        closeChannel();
        return 0;
      }
      snprintf(lVerdict, sizeof lVerdict, "Daemon start-up failed: %s", lpWord + 1);
      lUsed = static_cast<size_t>(lpWord - sReport);
      lpVerdict = lVerdict;
      break;
    }
    const auto lLeft =
        std::chrono::duration_cast<std::chrono::milliseconds>(lDeadline - std::chrono::steady_clock::now());
    long lRead = -1;
    try {
      if (lLeft.count() > 0 && OsWaitReadable(gsReadFd, static_cast<unsigned int>(lLeft.count()) + 1))
        lRead = OsReadSome(gsReadFd, sReport + lUsed, sizeof sReport - lUsed);
    } catch (const QNCException& acrException) {
      snprintf(lVerdict, sizeof lVerdict, "Daemon start-up unknown: %s", acrException.what());
      lpVerdict = lVerdict;
      break;
    }
    if (lRead == 0) {
      lpVerdict = "Daemon start-up failed: the daemon ended before it was ready";
      break;
    }
    if (lRead < 0) {
      if (std::chrono::steady_clock::now() < lDeadline) continue;  // EAGAIN: nothing after all
      snprintf(
          lVerdict, sizeof lVerdict,
          "Daemon start-up not confirmed: no word from the daemon within %u s (QN_START_TIMEOUT); it may "
          "still be starting",
          lSeconds);
      lpVerdict = lVerdict;
      break;
    }
    lUsed += static_cast<size_t>(lRead);
    if (lUsed == sizeof sReport) {
      // Keep the later half: the lines nearest the failure explain it.
      memmove(sReport, sReport + sizeof sReport / 2, sizeof sReport / 2);
      lUsed = sizeof sReport / 2;
    }
  }
  closeChannel();
  return fail(sReport, lUsed, lpVerdict);
}

int waitForDaemonStart() { return QNCDaemonStart::waitForStart(); }
