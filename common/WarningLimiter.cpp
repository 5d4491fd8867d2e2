#include "WarningLimiter.h"

#include "Assert.h"
#include "Logger.h"

QNCWarningLimiter::QNCWarningLimiter(const char* apKind, unsigned int aLinesPerInterval,
                                     unsigned int aIntervalMilliseconds)
    : mKind(apKind),
      mLinesPerInterval(aLinesPerInterval),
      mInterval(aIntervalMilliseconds),
      mIntervalStart(),
      mAdmitted(0),
      mSuppressed(0) {
  QN_ASSERT(aLinesPerInterval > 0 && aIntervalMilliseconds > 0);
}

QNCWarningLimiter::~QNCWarningLimiter() { flush(); }

bool QNCWarningLimiter::admit() {
  const std::chrono::steady_clock::time_point lNow = std::chrono::steady_clock::now();
  unsigned long lSuppressed = 0;
  bool lAdmitted = false;
  {
    QNCMutexLocker lGuard(mLock);
    if (lNow - mIntervalStart >= mInterval) {
      mIntervalStart = lNow;
      mAdmitted = 0;
      lSuppressed = mSuppressed;
      mSuppressed = 0;
    }
    lAdmitted = mAdmitted < mLinesPerInterval;
    if (lAdmitted) {
      ++mAdmitted;
    } else {
      ++mSuppressed;
    }
  }
  if (lSuppressed != 0) _report(lSuppressed);
  return lAdmitted;
}

void QNCWarningLimiter::flush() {
  unsigned long lSuppressed = 0;
  {
    QNCMutexLocker lGuard(mLock);
    lSuppressed = mSuppressed;
    mSuppressed = 0;
  }
  if (lSuppressed != 0) _report(lSuppressed);
}

void QNCWarningLimiter::_report(unsigned long aSuppressed) {
  QN_LOG_WARNING("%s: %lu similar lines suppressed", mKind.get(), aSuppressed);
}
