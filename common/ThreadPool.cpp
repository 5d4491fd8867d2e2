#include "ThreadPool.h"

#include <cstdio>
#include <new>
#include <system_error>
#include <utility>

#include "Logger.h"
#include "OsError.h"
#include "QNException.h"

namespace {
// The pool this thread works for. Tested before any lock is taken: a worker that waited for its
// own pool would otherwise block on the join lock its owner holds while joining.
thread_local const QNCThreadPool* gspCurrentPool = nullptr;

// Formats apFormat with the pool's name into a message for an exception of class E.
template <class E>
[[noreturn]] void throwNamed(const char* apFormat, const QNCString& acrName, unsigned int aCode) {
  char lMessage[QNCException::kMaxMessage];
  snprintf(lMessage, sizeof lMessage, apFormat, acrName.get());
  throw E(lMessage, aCode);
}
}  // namespace

QNCThreadPool::QNCThreadPool(const QNCString& acrName, unsigned int aThreadCount)
    : mName(acrName), mThreadCount(aThreadCount), mFinished(false), mStarted(false) {
  if (aThreadCount == 0) throwNamed<QNCInvalidEx>("ThreadPool '%s' needs at least one thread", mName, 6);
}

QNCThreadPool::~QNCThreadPool() {
  // Last resort only (see the header): joinable std::threads destroyed would call terminate.
  finish();
  std::lock_guard<std::mutex> lJoinGuard(mJoinLock);
  for (std::thread& lWorker : mWorkers) {
    if (lWorker.joinable()) lWorker.join();
  }
}

void QNCThreadPool::init() {
  QN_ENTERED();
  std::lock_guard<std::mutex> lJoinGuard(mJoinLock);
  {
    std::lock_guard<std::mutex> lGuard(mLock);
    if (mStarted) throwNamed<QNCInvalidEx>("ThreadPool '%s' already started", mName, 6);
    mStarted = true;
  }
  try {
    mWorkers.reserve(mThreadCount);
    for (unsigned int lIndex = 0; lIndex < mThreadCount; ++lIndex) {
      mWorkers.emplace_back(&QNCThreadPool::_work, this);
    }
  } catch (const std::system_error& acrError) {
    _abandonStart();
    OsThrowError<QNCOsException>(acrError.code().value(), "std::thread", mName.get());
  } catch (const std::bad_alloc&) {
    _abandonStart();
    throw QNCNoMemoryEx("Out of Memory", 2);
  }
  QN_LEFT();
}

void QNCThreadPool::finish() {
  QN_ENTERED();
  {
    std::lock_guard<std::mutex> lGuard(mLock);
    mFinished = true;
  }
  mWork.notify_all();
  QN_LEFT();
}

void QNCThreadPool::waitForThreads() {
  QN_ENTERED();
  if (gspCurrentPool == this) throwNamed<QNCInvalidEx>("ThreadPool '%s': a worker cannot wait for its own pool", mName, 6);
  std::lock_guard<std::mutex> lJoinGuard(mJoinLock);
  for (std::thread& lWorker : mWorkers) {
    if (lWorker.joinable()) lWorker.join();
  }
  QN_LEFT();
}

void QNCThreadPool::submit(QNTTask aTask) {
  if (!aTask) throwNamed<QNCInvalidEx>("ThreadPool '%s': empty task", mName, 6);
  {
    std::lock_guard<std::mutex> lGuard(mLock);
    if (mFinished) throwNamed<QNCExitConditionEx>("ThreadPool '%s' is finished: task refused", mName, 0);
    try {
      mTasks.push_back(std::move(aTask));
    } catch (const std::bad_alloc&) {
      throw QNCNoMemoryEx("Out of Memory", 2);
    }
  }
  mWork.notify_one();
}

void QNCThreadPool::_abandonStart() {
  // mJoinLock is held by init(). The workers made so far end at once: the queue may still hold
  // tasks, and they run first, as after any finish().
  finish();
  for (std::thread& lWorker : mWorkers) lWorker.join();
  mWorkers.clear();
}

void QNCThreadPool::_work() {
  gspCurrentPool = this;
  for (;;) {
    QNTTask lTask;
    {
      std::unique_lock<std::mutex> lGuard(mLock);
      mWork.wait(lGuard, [this] { return mFinished || !mTasks.empty(); });
      if (mTasks.empty()) return;  // finished and drained
      lTask = std::move(mTasks.front());
      mTasks.pop_front();
    }
    _run(lTask);
  }
}

void QNCThreadPool::_run(QNTTask& arTask) {
  // A failing task must not end its worker (the pool would shrink silently) nor, by leaving the
  // thread function, the process.
  try {
    arTask();
  } catch (...) {
    QN_LOG_ERROR("ThreadPool '%s': task failed: %s", mName.get(), QNCurrentExceptionText());
  }
}
