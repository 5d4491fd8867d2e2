#pragma once
// QNCConditional: a mutex and a condition variable that waits against the monotonic clock.
// Waiting follows one pattern: lock(), then wait() or timedWait() (repeated while the awaited
// condition does not hold), then unlock(). signal() may be called with or without the mutex held;
// a signal given while nobody waits is lost. None of the inline operations logs.

#include "Mutex.h"
#include "Os.h"

class QNCConditional {
 public:
  QNCConditional() { OsInitConditional(mCondition); }
  QNCConditional(const QNCConditional&) = delete;
  QNCConditional& operator=(const QNCConditional&) = delete;
  virtual ~QNCConditional() { OsDestroyConditional(mCondition); }

  void lock() { mMutex.lock(); }
  void unlock() { mMutex.unlock(); }

  // The caller holds the mutex; it is released while waiting and held again on return.
  void wait() { OsWait(mCondition, mMutex.getMutex()); }

  // As wait(), at most aMilliseconds; a time-out throws QNCTimeOutEx with the mutex held.
  void timedWait(unsigned int aMilliseconds) { OsConditionalTimedWait(mCondition, mMutex.getMutex(), aMilliseconds); }

  // Wakes one waiting thread.
  void signal() { OsSignal(mCondition); }

  // Wakes every waiting thread.
  void broadcast() { OsBroadcast(mCondition); }

 private:
  QNCMutex mMutex;
  pthread_cond_t mCondition;
};
