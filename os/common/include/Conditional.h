#pragma once
// QNCConditional: a mutex and a condition variable, for a thread to sleep until another makes a
// condition true. Waiting follows one pattern: lock(), then wait() or timedWait() repeated while
// the awaited condition does not hold (a wake-up can be spurious), then unlock(). The thread that
// makes the condition true changes it under the lock and calls signal().
//
// Any thread may use it. signal() may be called with or without the mutex held; a signal given
// while nobody waits is lost, not remembered for a later wait. Timed waits measure against the
// monotonic clock. None of the operations logs.
//
// Waiters are counted: every thread between its lock() and its unlock() is one (but for the
// uncounted test below), from before it holds the mutex (so from before its first test of the
// condition) until it has given the mutex up, whether it runs, waits for the mutex or sleeps in
// wait(). hasWaiters() lets a thread that has just made the condition true skip the wake-up when
// nobody can need it. That is safe when the change is ordered before hasWaiters() and after any
// test that a waiter made (Dekker's pattern): a waiter counts itself (sequentially consistent)
// before its test, and the changer reads the count (sequentially consistent) after its change. If
// the change and the test are made under one lock (this conditional's, or a list's), a test that
// missed the change came first in that lock's order, so its count is visible to the changer's read;
// the same holds for a condition kept in sequentially consistent atomics. If the read gives 0,
// every later waiter tests after the change and sees it.
//
// A waiter that has just been woken may stop counting itself for one test that ends its wait
// when it succeeds (uncount(), then recount() before unlock() or before any test that a further
// wait may follow): a changer that comes meanwhile then passes by without the lock, which the
// woken waiter holds. A thread that only passes the lock to order a wake-up (passLock()) is not
// counted.

#include <atomic>

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

  // Blocks until the calling thread holds the mutex (guards the awaited condition). The thread
  // counts as a waiter from the start of lock() to the end of unlock().
  void lock() {
    mWaiters.fetch_add(1, std::memory_order_seq_cst);
    try {
      mMutex.lock();
    } catch (...) {
      mWaiters.fetch_sub(1, std::memory_order_seq_cst);
      throw;
    }
  }
  void unlock() {
    mMutex.unlock();
    mWaiters.fetch_sub(1, std::memory_order_seq_cst);
  }

  // True while any thread is between lock() and unlock() and counted. Never blocks, never throws.
  bool hasWaiters() const noexcept { return mWaiters.load(std::memory_order_seq_cst) != 0; }
  // For the holder of the mutex, woken from wait(): stop counting it / count it again (above).
  void uncount() noexcept { mWaiters.fetch_sub(1, std::memory_order_seq_cst); }
  void recount() noexcept { mWaiters.fetch_add(1, std::memory_order_seq_cst); }
  // Takes and releases the mutex without counting the caller as a waiter: a thread that has
  // changed the condition waits so until no waiter is between its test and its wait. Blocks only
  // for the mutex.
  void passLock() {
    mMutex.lock();
    mMutex.unlock();
  }

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
  std::atomic<unsigned int> mWaiters{0};  // threads between lock() and unlock()
};
