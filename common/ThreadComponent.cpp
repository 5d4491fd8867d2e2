#include "ThreadComponent.h"

#include <chrono>

#include "Logger.h"
#include "QNException.h"
#include "RunStatus.h"

QNCThreadComponent::QNCThreadComponent(const QNCString& acrName)
    : mName(acrName), mExitRequested(false), mStarted(false) {}

QNCThreadComponent::~QNCThreadComponent() {
  // Last resort only (see the header): a thread still running is asked to end and joined (by
  // mThreads' destructor) rather than left to std::terminate.
  {
    std::lock_guard<std::mutex> lGuard(mLock);
    mExitRequested = true;
  }
  mExitRequest.notify_all();
}

void QNCThreadComponent::requestExit() {
  QN_ENTERED();
  {
    std::lock_guard<std::mutex> lGuard(mLock);
    if (!mStarted) QNThrowNamed<QNCInvalidEx>("Thread '%s' was never started", mName, 6);
    mExitRequested = true;
  }
  mExitRequest.notify_all();
  QN_LEFT();
}

void QNCThreadComponent::init() {
  QN_ENTERED();
  {
    // Marked before the thread exists, so a body that asks itself to exit finds itself started.
    std::lock_guard<std::mutex> lGuard(mLock);
    if (mStarted) QNThrowNamed<QNCInvalidEx>("Thread '%s' already started", mName, 6);
    mStarted = true;
  }
  try {
    mThreads.start(
        1, [this] { _body(); }, [] {}, mName);
  } catch (const QNCException&) {
    std::lock_guard<std::mutex> lGuard(mLock);
    mStarted = false;
    throw;
  }
  QN_LEFT();
}

bool QNCThreadComponent::isInited() const {
  std::lock_guard<std::mutex> lGuard(mLock);
  return mStarted;
}

void QNCThreadComponent::waitForExit() {
  QN_ENTERED();
  if (mThreads.isCurrent()) QNThrowNamed<QNCInvalidEx>("Thread '%s' cannot wait for its own exit", mName, 6);
  mThreads.join();
  QN_LEFT();
}

bool QNCThreadComponent::isExitRequested() const {
  std::lock_guard<std::mutex> lGuard(mLock);
  return mExitRequested;
}

bool QNCThreadComponent::waitForExitRequest(unsigned int aMilliseconds) {
  std::unique_lock<std::mutex> lGuard(mLock);
  // The predicate form re-tests the flag after every wake-up, spurious ones included, and
  // before the first wait, so a request made before the call is never missed.
  return mExitRequest.wait_for(lGuard, std::chrono::milliseconds(aMilliseconds),
                               [this] { return mExitRequested; });
}

bool QNCThreadComponent::restartAfterFailure(const char*) {
  QNFailRun();
  return false;
}

void QNCThreadComponent::_body() {
  // Nothing may leave a thread function: an escaping exception would call std::terminate and
  // take the whole service down without its orderly exit. (The library never cancels threads,
  // so no forced-unwind exception passes through the last clause.)
  for (;;) {
    try {
      run();
      return;
    } catch (...) {
      const char* const lpWhat = QNCurrentExceptionText();
      QN_LOG_ERROR("Thread '%s' ended by an exception: %s", mName.get(), lpWhat);
      try {
        if (!restartAfterFailure(lpWhat) || isExitRequested()) return;
      } catch (...) {
        QN_LOG_ERROR("Thread '%s': its failure handling failed: %s", mName.get(), QNCurrentExceptionText());
        return;
      }
    }
    QN_LOG_NOTICE("Thread '%s' restarts its work", mName.get());
  }
}
