#include "ThreadComponent.h"

#include <chrono>
#include <cstdio>
#include <system_error>

#include "Logger.h"
#include "OsError.h"
#include "QNException.h"

namespace {
// The component whose body runs on this thread. Tested before any lock is taken: a body that
// waited for its own exit would otherwise block on the join lock its owner holds while joining.
thread_local const QNCThreadComponent* gspCurrentComponent = nullptr;

// Throws QNCInvalidEx "<apFormat with the component's name>".
[[noreturn]] void throwInvalid(const char* apFormat, const QNCString& acrName) {
  char lMessage[QNCException::kMaxMessage];
  snprintf(lMessage, sizeof lMessage, apFormat, acrName.get());
  throw QNCInvalidEx(lMessage, 6);
}
}  // namespace

QNCThreadComponent::QNCThreadComponent(const QNCString& acrName)
    : mName(acrName), mExitRequested(false), mStarted(false) {}

QNCThreadComponent::~QNCThreadComponent() {
  // Last resort only (see the header): a joinable std::thread destroyed would call terminate.
  if (mThread.joinable()) {
    {
      std::lock_guard<std::mutex> lGuard(mLock);
      mExitRequested = true;
    }
    mExitRequest.notify_all();
    mThread.join();
  }
}

void QNCThreadComponent::requestExit() {
  QN_ENTERED();
  {
    std::lock_guard<std::mutex> lGuard(mLock);
    if (!mStarted) throwInvalid("Thread '%s' was never started", mName);
    mExitRequested = true;
  }
  mExitRequest.notify_all();
  QN_LEFT();
}

void QNCThreadComponent::init() {
  QN_ENTERED();
  std::lock_guard<std::mutex> lJoinGuard(mJoinLock);
  {
    // Marked before the thread exists, so a body that asks itself to exit finds itself started.
    std::lock_guard<std::mutex> lGuard(mLock);
    if (mStarted) throwInvalid("Thread '%s' already started", mName);
    mStarted = true;
  }
  try {
    mThread = std::thread(&QNCThreadComponent::_body, this);
  } catch (const std::system_error& acrError) {
    {
      std::lock_guard<std::mutex> lGuard(mLock);
      mStarted = false;
    }
    OsThrowError<QNCOsException>(acrError.code().value(), "std::thread", mName.get());
  }
  QN_LEFT();
}

bool QNCThreadComponent::isInited() const {
  std::lock_guard<std::mutex> lGuard(mLock);
  return mStarted;
}

void QNCThreadComponent::waitForExit() {
  QN_ENTERED();
  if (gspCurrentComponent == this) throwInvalid("Thread '%s' cannot wait for its own exit", mName);
  std::lock_guard<std::mutex> lJoinGuard(mJoinLock);
  if (mThread.joinable()) mThread.join();
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
  return mExitRequest.wait_for(lGuard, std::chrono::milliseconds(aMilliseconds), [this] { return mExitRequested; });
}

void QNCThreadComponent::_body() {
  // Nothing may leave a thread function: an escaping exception would call std::terminate and
  // take the whole service down for the fault of one thread. (The library never cancels
  // threads, so no forced-unwind exception passes through the last clause.)
  gspCurrentComponent = this;
  try {
    run();
  } catch (...) {
    QN_LOG_ERROR("Thread '%s' ended by an exception: %s", mName.get(), QNCurrentExceptionText());
  }
}
