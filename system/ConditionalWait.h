#pragma once
// The one scaffold of the system object's waits on a numbered conditional (SystemChannels.cpp,
// SystemQueues.cpp): lock, test, wait (the lock is released while blocked), unlock on every way
// out, exceptions included, so the conditional stays usable.
//
// The tests run under the conditional's lock, and signal() and makeThreadsToExit() pass through
// that lock before they wake waiters, so a change made before either cannot fall between a test
// and the wait and be lost. signal() skips the lock and the wake-up only when no thread is
// between the conditional's lock() and unlock(): the waiter counts itself in lock(), before its
// first test, so none can then be between a test that missed the change and its wait
// (Conditional.h). Lock order: the conditional's lock, then inside it whatever the tests take (a
// list's or queue's lock, mExitLock); never the reverse.

#include <chrono>

#include "Conditional.h"
#include "Logger.h"
#include "QNException.h"
#include "System.h"

// Waits on arConditional until acrReady() (QNWS_Ready) or acrExit() (QNWS_Exit) holds, testing
// them in that order before every wait, or until aLimitMs milliseconds have passed (QNWS_TimedOut;
// negative: no limit). With aOnce it waits once whatever the tests say and returns QNWS_Ready after the
// wake-up; a time-out then throws QNCTimeOutEx (wait, timedWait). Traces the conditional's steps,
// and apWaitTrace before each wait, under the caller's function name apFunction.
template <class Ready, class Exit>
QNEWaitStatus QNWaitOnConditional(QNCConditional& arConditional, const Ready& acrReady, const Exit& acrExit,
                                  long long aLimitMs, bool aOnce, const char* apWaitTrace,
                                  const char* apFunction) {
  const auto lTrace = [apFunction](const char* apText) {
    if (QNIsLogLevelOn(QNLL_Trace))
      PrintLogMessageWithTimeStamp(QNLL_Trace, "-T-", __LINE__, apFunction, __FILE__, "%s", apText);
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
