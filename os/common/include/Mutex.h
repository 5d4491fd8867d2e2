#pragma once
// QNCMutex: an ordinary, non-recursive mutex. A thread that locks it twice without unlocking
// blocks itself. The destructor never throws: a failure to destroy the mutex is traced
// "Ignoring exception in Mutex destruction ..." and ignored.

#include <pthread.h>

class QNCMutex {
 public:
  QNCMutex();
  QNCMutex(const QNCMutex&) = delete;
  QNCMutex& operator=(const QNCMutex&) = delete;
  virtual ~QNCMutex();

  // Blocks until the calling thread holds the mutex.
  void lock();
  void unlock();

  // The system mutex, for QNCConditional.
  pthread_mutex_t& getMutex() { return mMutex; }

 private:
  pthread_mutex_t mMutex;
};

// Holds a QNCMutex for one scope; the lock is released on every way out.
class QNCMutexLocker {
 public:
  explicit QNCMutexLocker(QNCMutex& arMutex) : mMutex(arMutex) { mMutex.lock(); }
  QNCMutexLocker(const QNCMutexLocker&) = delete;
  QNCMutexLocker& operator=(const QNCMutexLocker&) = delete;
  ~QNCMutexLocker() { mMutex.unlock(); }

 private:
  QNCMutex& mMutex;
};
