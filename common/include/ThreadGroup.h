#pragma once
// QNCThreadGroup: the threads behind one thread component (one thread) or thread pool (n
// threads): starting them with the system's failures mapped to the exception family, joining
// them, and telling whether the calling thread is one of them. Both owners keep their own state
// and policy; this class keeps only the std::threads.
//
// Threads: start() and join() are for the owner; isCurrent() for any thread. mJoinLock guards
// mThreads (one starter or joiner at a time) and is never taken on one of the group's threads:
// the owners refuse a join from their own thread by isCurrent() before it is taken.

#include <cstdio>
#include <functional>
#include <mutex>
#include <thread>
#include <vector>

#include "QNException.h"
#include "QNString.h"

class QNCThreadGroup {
 public:
  QNCThreadGroup() = default;
  QNCThreadGroup(const QNCThreadGroup&) = delete;
  QNCThreadGroup& operator=(const QNCThreadGroup&) = delete;
  // The owner has joined; a thread still running here is joined (never std::terminate).
  ~QNCThreadGroup() { join(); }

  // Starts aCount threads, each running acrBody. When one cannot be created, acrAbandon is called
  // (it must make the bodies already running return), those threads are joined, and the call
  // throws QNCOsException naming acrName (the system refused) or QNCNoMemoryEx.
  void start(unsigned int aCount, const std::function<void()>& acrBody,
             const std::function<void()>& acrAbandon, const QNCString& acrName);

  // Blocks until every started thread has ended; returns at once when none is left to join.
  void join();

  // True when called on one of this group's threads.
  bool isCurrent() const;

 private:
  std::mutex mJoinLock;  // guards mThreads
  std::vector<std::thread> mThreads;
};

// Throws E with apFormat filled with acrName (one "%s") and aCode: the owners' error messages all
// name the component or pool.
template <class E>
[[noreturn]] void QNThrowNamed(const char* apFormat, const QNCString& acrName, unsigned int aCode) {
  char lMessage[QNCException::kMaxMessage];
  snprintf(lMessage, sizeof lMessage, apFormat, acrName.get());
  throw E(lMessage, aCode);
}
