#pragma once
// QNCWarningLimiter: bounds how fast one kind of log line can grow the log when something outside
// the process decides how often the line is written -- a peer that sends malformed messages,
// announces oversized ones, or keeps dropping its connection. Without it a flood of bad input
// writes one line per message and can fill the disk.
//
// Time is cut into intervals of the steady clock. In each interval the first aLinesPerInterval
// calls of admit() return true and the caller writes its line; the later ones return false and
// are only counted. The first admit() of a later interval first writes the count, as one warning:
//   "<kind>: <n> similar lines suppressed"
// So one kind adds at most aLinesPerInterval + 1 lines to the log per interval, whatever the rate
// of its cause: with the defaults, 11 lines per second. Nothing is lost from sight: every
// suppressed line is in some count. flush() writes a count still pending at once (call it before
// the logger is destroyed); the destructor does the same.
//
// Threads: any thread may call admit() and flush(). mLock guards the interval and the counts; the
// count's line is written after the lock is released.

#include <chrono>

#include "Mutex.h"
#include "QNString.h"

class QNCWarningLimiter {
 public:
  static constexpr unsigned int kDefaultLinesPerInterval = 10;
  static constexpr unsigned int kDefaultIntervalMilliseconds = 1000;

  // apKind names the kind in the count's line ("refused readings"); it is copied.
  // aLinesPerInterval and aIntervalMilliseconds must be positive (asserted).
  explicit QNCWarningLimiter(const char* apKind, unsigned int aLinesPerInterval = kDefaultLinesPerInterval,
                             unsigned int aIntervalMilliseconds = kDefaultIntervalMilliseconds);
  // Writes a pending count (flush()). Never throws.
  ~QNCWarningLimiter();
  QNCWarningLimiter(const QNCWarningLimiter&) = delete;
  QNCWarningLimiter& operator=(const QNCWarningLimiter&) = delete;

  // True when the caller may write its line now; false when the line is to be left out (it is
  // counted). Never blocks beyond mLock; never throws.
  bool admit();

  // Writes the count of lines suppressed since the last count, if there are any.
  void flush();

 private:
  void _report(unsigned long aSuppressed);

  QNCString mKind;
  const unsigned int mLinesPerInterval;
  const std::chrono::milliseconds mInterval;
  QNCMutex mLock;  // guards the three members below
  std::chrono::steady_clock::time_point mIntervalStart;
  unsigned int mAdmitted;
  unsigned long mSuppressed;
};
