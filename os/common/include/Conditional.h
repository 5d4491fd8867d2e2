#pragma once
// QNCConditional: a mutex and a condition variable, for a thread to sleep until another makes a
// condition true. Waiting follows one pattern: lock(), then wait() or timedWait() repeated while
// the awaited condition does not hold (a wake-up can be spurious), then unlock(). The thread that
// makes the condition true changes it under the lock and calls signal().
//
// Any thread may use it. signal() may be called with or without the mutex held; a signal given
// while nobody waits is lost, not remembered for a later wait. Timed waits measure against the
// monotonic clock. None of the operations logs.

#include "Mutex.h"
#include "Os.h"

class QNCConditional {
 public:
  // Throws QNCOsException when the system cannot create the mutex or the condition variable.
  QNCConditional() { OsInitConditional(mCondition); }
  QNCConditional(const QNCConditional&) = delete;
  QNCConditional& operator=(const QNCConditional&) = delete;
  // Nobody may be waiting any more.
  virtual ~QNCConditional() { OsDestroyConditional(mCondition); }

  // Blocks until the calling thread holds the mutex (guards the awaited condition).
  void lock() { mMutex.lock(); }
  void unlock() { mMutex.unlock(); }

  // The caller holds the mutex; it is released while the thread waits and held again on return.
  // Blocks until signalled (or woken spuriously).
  void wait() { OsWait(mCondition, mMutex.getMutex()); }

  // As wait(), but at most aMilliseconds milliseconds. A time-out throws QNCTimeOutEx with the
  // mutex held again: the caller unlocks it.
  void timedWait(unsigned int aMilliseconds) {
    OsConditionalTimedWait(mCondition, mMutex.getMutex(), aMilliseconds);
  }

  // Wakes one waiting thread, none if none waits. Never throws.
  void signal() { OsSignal(mCondition); }
  // Wakes every waiting thread. Never throws.
  void broadcast() { OsBroadcast(mCondition); }

 private:
  QNCMutex mMutex;  // guards the condition the waiting threads test
  pthread_cond_t mCondition;
};
