#pragma once
// QNCMutex: the lock every part of the system uses. An ordinary, non-recursive mutex: a thread
// that locks it twice without unlocking blocks itself, and only the holder may unlock it.
// Any thread may lock and unlock it; the object itself must outlive every thread that uses it.

#include <pthread.h>

#include "Os.h"

class QNCMutex {
 public:
  // Throws QNCOsException when the system cannot create the mutex.
  QNCMutex();
  QNCMutex(const QNCMutex&) = delete;
  QNCMutex& operator=(const QNCMutex&) = delete;
  // Traces "Entered" and "Left". Never throws: when the system refuses to destroy the mutex (it is
  // still locked, EBUSY) the failure is traced "Ignoring exception in Mutex destruction ..." and
  // the destructor ends normally.
  virtual ~QNCMutex();

  // Blocks, as long as necessary, until the calling thread holds the mutex. Inline: an
  // uncontended lock and unlock cost what the system's mutex costs, with no call of ours between.
  void lock() { OsLockMutex(mMutex); }
  // The calling thread must hold the mutex.
  void unlock() { OsUnlockMutex(mMutex); }

  // The system mutex, for QNCConditional to wait with.
  pthread_mutex_t& getMutex() { return mMutex; }

 private:
  pthread_mutex_t mMutex;
};

// Holds a QNCMutex for one scope; the lock is released on every way out, exceptions included.
class QNCMutexLocker {
 public:
  explicit QNCMutexLocker(QNCMutex& arMutex) : mMutex(arMutex) { mMutex.lock(); }
  QNCMutexLocker(const QNCMutexLocker&) = delete;
  QNCMutexLocker& operator=(const QNCMutexLocker&) = delete;
  ~QNCMutexLocker() { mMutex.unlock(); }

 private:
  QNCMutex& mMutex;
};
