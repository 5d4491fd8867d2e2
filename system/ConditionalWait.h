#pragma once
// The one scaffold of the system object's waits on a numbered conditional (SystemChannels.cpp,
// SystemQueues.cpp): lock, test, wait (the lock is released while blocked), unlock on every way
// out, exceptions included, so the conditional stays usable.
//
// The tests run under the conditional's lock, and signal() and makeThreadsToExit() pass through
// that lock before they wake waiters, so a change made before either cannot fall between a test
// and the wait and be lost. signal() skips the lock and the wake-up only when no waiter is
// counted: the waiter counts itself in lock(), before its first test, and stops counting only
// for the first test after a wake-up, which ends the wait when it succeeds; so none can then be
// between a test that missed the change and its wait (Conditional.h). Lock order: the conditional's lock,
// then inside it whatever the tests take (a list's or queue's lock, mExitLock); never the reverse.

#include <chrono>

#include "Assert.h"
#include "Conditional.h"
#include "Logger.h"
#include "QNException.h"
#include "System.h"

// The numbered services read the trace level once per call and pass it on.
#define QN_TRACE_IF(aOn, apText)                                                                          \
  do {                                                                                                    \
    if (aOn) PrintLogMessageWithTimeStamp(QNLL_Trace, "-T-", __LINE__, __func__, __FILE__, "%s", apText); \
  } while (0)
#define QN_LEFT_IF(aOn) QN_TRACE_IF(aOn, "Left")

// Entry aNo of a numbered table, its number asserted first with the text apCondition (which names
// the caller's argument and table). An entry that was never set still meets the pointer's own
// assertion ("0 != mPointer"); a set one costs a single test. Always inline: it is on every
// hand-off's path, and the compiler would otherwise call it for its six arguments.
template <class T>
__attribute__((always_inline)) inline T& QNNumbered(const QNCVector<QNCPointer<T>>& acrTable,
                                                    unsigned int aNo, const char* apCondition, int aLine,
                                                    const char* apFunction, const char* apFile) {
  if (__builtin_expect(aNo >= acrTable.numberOfElements(), 0))
    QNAssertionFailed(apCondition, aLine, apFunction, apFile);
  const QNCPointer<T>& lrEntry = acrTable[aNo];
  T* const lpEntry = lrEntry.get();
  return __builtin_expect(lpEntry != nullptr, 1) ? *lpEntry : *lrEntry;
}

// Waits on arConditional until acrReady() (QNWS_Ready) or acrExit() (QNWS_Exit) holds, testing
// them in that order before every wait, or until aLimitMs milliseconds have passed (QNWS_TimedOut;
// negative: no limit). With aOnce it waits once whatever the tests say and returns QNWS_Ready after the
// wake-up; a time-out then throws QNCTimeOutEx (wait, timedWait). With aTrace (the caller reads
// the trace level once per call) it traces the conditional's steps, and apWaitTrace before each
// wait, under the caller's function name apFunction.
template <class Ready, class Exit>
QNEWaitStatus QNWaitOnConditional(QNCConditional& arConditional, const Ready& acrReady, const Exit& acrExit,
                                  long long aLimitMs, bool aOnce, const char* apWaitTrace,
                                  const char* apFunction, bool aTrace) {
  const auto lTrace = [apFunction, aTrace](const char* apText) {
    if (aTrace) PrintLogMessageWithTimeStamp(QNLL_Trace, "-T-", __LINE__, apFunction, __FILE__, "%s", apText);
  };
  // Without a limit the clock is not read at all.
  const auto lDeadline = aLimitMs < 0
                             ? std::chrono::steady_clock::time_point()
                             : std::chrono::steady_clock::now() + std::chrono::milliseconds(aLimitMs);
  QNEWaitStatus lStatus = QNWS_Ready;
  lTrace("Locking the wait conditional");
  arConditional.lock();
  try {
    for (;;) {
      if (!aOnce && acrReady()) break;
      if (!aOnce && acrExit()) {
        lStatus = QNWS_Exit;
        break;
      }
      lTrace(apWaitTrace);
      if (aLimitMs < 0) {
        arConditional.wait();
      } else if (aOnce) {
        arConditional.timedWait(static_cast<unsigned int>(aLimitMs));
      } else {
        // Rounded up: a wait never ends before its limit.
        const auto lLeft =
            std::chrono::ceil<std::chrono::milliseconds>(lDeadline - std::chrono::steady_clock::now())
                .count();
        if (lLeft <= 0) {
          lStatus = QNWS_TimedOut;
          break;
        }
        try {
          arConditional.timedWait(static_cast<unsigned int>(lLeft));
        } catch (const QNCTimeOutEx&) {
          // The tests run once more: what became true at the last moment still counts.
        }
      }
      if (aOnce) break;
      // Woken, most often by a hand-over: the first test runs uncounted (Conditional.h), so a
      // producer that hands over meanwhile does not queue on the lock held here. The count is
      // back before any test that a further wait may follow, and before an exception leaves.
      arConditional.uncount();
      bool lReady = false;
      try {
        lReady = acrReady();
      } catch (...) {
        arConditional.recount();
        throw;
      }
      arConditional.recount();
      if (lReady) break;
    }
  } catch (...) {
    lTrace("Unlocking the wait conditional");
    arConditional.unlock();
    throw;
  }
  lTrace("Unlocking the wait conditional");
  arConditional.unlock();
  return lStatus;
}
