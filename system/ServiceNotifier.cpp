#include "ServiceNotifier.h"

#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <cstring>

#include "Logger.h"
#include "OsService.h"
#include "RunStatus.h"
#include "System.h"

namespace {
// Sends one state; logs a failure unless aQuiet. Returns false when it could not be sent.
bool sendState(const char* apState, bool aQuiet) {
  const char* lpAddress = getenv("NOTIFY_SOCKET");
  if (lpAddress == nullptr || lpAddress[0] == '\0') return true;
  const int lError = OsSendDatagram(lpAddress, apState, strlen(apState));
  if (lError != 0 && !aQuiet)
    QN_LOG_WARNING("Cannot notify the service manager at NOTIFY_SOCKET=%s: %s", lpAddress, strerror(lError));
  return lError == 0;
}

// WATCHDOG_USEC as microseconds; 0 when it is unset, meant for another process, or invalid.
long long watchdogMicroseconds() {
  const char* lpText = getenv("WATCHDOG_USEC");
  if (lpText == nullptr) return 0;
  const char* lpPid = getenv("WATCHDOG_PID");
  if (lpPid != nullptr && atoi(lpPid) != OsGetPid()) return 0;  // the pings are another process's
  char* lpEnd = nullptr;
  errno = 0;
  const long long lValue = strtoll(lpText, &lpEnd, 10);
  if (lpText[0] < '0' || lpText[0] > '9' || *lpEnd != '\0' || errno != 0 || lValue <= 0) {
    QN_LOG_WARNING("WATCHDOG_USEC='%s' is not a positive number of microseconds: no watchdog pings", lpText);
    return 0;
  }
  return lValue;
}
}  // namespace

QNCServiceNotifier& QNCServiceNotifier::instance() {
  static QNCServiceNotifier sNotifier;
  return sNotifier;
}

void QNCServiceNotifier::send(const char* apState) { sendState(apState, false); }

void QNCServiceNotifier::notifyStopping() {
  {
    std::lock_guard<std::mutex> lGuard(mLock);
    if (mStoppingSent) return;
    mStoppingSent = true;
  }
  send("STOPPING=1\nSTATUS=Stopping");
}

bool QNCServiceNotifier::isHealthy(const QNCSystem& acrSystem) {
  return !QNHasRunFailed() && !acrSystem.isSetForExit();
}

void QNCServiceNotifier::startWatchdog(QNCSystem* apSystem) {
  const char* lpAddress = getenv("NOTIFY_SOCKET");
  if (lpAddress == nullptr || lpAddress[0] == '\0' || mWatchdog.joinable()) return;
  const long long lIntervalUs = watchdogMicroseconds() / 2;
  if (lIntervalUs <= 0) return;
  {
    std::lock_guard<std::mutex> lGuard(mLock);
    mStop = false;
  }
  QN_LOG_INFO("Watchdog pings every %lld ms", lIntervalUs / 1000);
  mWatchdog = std::thread(&QNCServiceNotifier::_runWatchdog, this, apSystem, lIntervalUs);
}

void QNCServiceNotifier::stopWatchdog() {
  if (!mWatchdog.joinable()) return;
  {
    std::lock_guard<std::mutex> lGuard(mLock);
    mStop = true;
  }
  mWake.notify_all();
  mWatchdog.join();
}

void QNCServiceNotifier::_runWatchdog(QNCSystem* apSystem, long long aIntervalUs) {
  bool lWarned = false;
  auto lNext = std::chrono::steady_clock::now();
  std::unique_lock<std::mutex> lGuard(mLock);
  while (!mStop) {
    lGuard.unlock();
    if (!isHealthy(*apSystem)) return;  // silence: the service manager acts at its time-out
    if (!sendState("WATCHDOG=1", lWarned)) lWarned = true;
    lGuard.lock();
    // Paced from the planned times, not from the end of each send, so the pace does not drift.
    lNext += std::chrono::microseconds(aIntervalUs);
    mWake.wait_until(lGuard, lNext, [this] { return mStop; });
  }
}
