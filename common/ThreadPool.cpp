#include "ThreadPool.h"

#include <new>
#include <utility>

#include "Logger.h"
#include "QNException.h"
#include "RunStatus.h"

QNCThreadPool::QNCThreadPool(const QNCString& acrName, unsigned int aThreadCount)
    : mName(acrName), mThreadCount(aThreadCount), mFinished(false), mStarted(false) {
  if (aThreadCount == 0) QNThrowNamed<QNCInvalidEx>("ThreadPool '%s' needs at least one thread", mName, 6);
}

QNCThreadPool::~QNCThreadPool() {
  // Last resort only (see the header): the workers are told to end here and joined by mThreads'
  // destructor rather than left to std::terminate.
  finish();
}

void QNCThreadPool::init() {
  QN_ENTERED();
  {
    std::lock_guard<std::mutex> lGuard(mLock);
    if (mStarted) QNThrowNamed<QNCInvalidEx>("ThreadPool '%s' already started", mName, 6);
    mStarted = true;
  }
  // On failure the workers made so far end at once: the queue may still hold tasks, and they run
  // first, as after any finish().
  mThreads.start(
      mThreadCount, [this] { _work(); }, [this] { finish(); }, mName);
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
  if (mThreads.isCurrent()) {
    QNThrowNamed<QNCInvalidEx>("ThreadPool '%s': a worker cannot wait for its own pool", mName, 6);
  }
  mThreads.join();
  QN_LEFT();
}

void QNCThreadPool::submit(QNTTask aTask) {
  if (!aTask) QNThrowNamed<QNCInvalidEx>("ThreadPool '%s': empty task", mName, 6);
  {
    std::lock_guard<std::mutex> lGuard(mLock);
    if (mFinished) QNThrowNamed<QNCExitConditionEx>("ThreadPool '%s' is finished: task refused", mName, 0);
    try {
      mTasks.push_back(std::move(aTask));
    } catch (const std::bad_alloc&) {
      throw QNCNoMemoryEx("Out of Memory", 2);
    }
  }
  mWork.notify_one();
}

void QNCThreadPool::_work() {
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
    const char* const lpWhat = QNCurrentExceptionText();
    QN_LOG_ERROR("ThreadPool '%s': task failed: %s", mName.get(), lpWhat);
    try {
      onTaskFailure(lpWhat);
    } catch (...) {
      QN_LOG_ERROR("ThreadPool '%s': its failure handling failed: %s", mName.get(), QNCurrentExceptionText());
    }
  }
}

void QNCThreadPool::onTaskFailure(const char*) { QNFailRun(); }
