#include "ThreadGroup.h"

#include <new>
#include <system_error>

#include "OsError.h"

namespace {
// The group whose body runs on this thread; set before the body runs.
thread_local const QNCThreadGroup* gspCurrentGroup = nullptr;
}  // namespace

void QNCThreadGroup::start(unsigned int aCount, const std::function<void()>& acrBody,
                           const std::function<void()>& acrAbandon, const QNCString& acrName) {
  std::lock_guard<std::mutex> lGuard(mJoinLock);
  int lErrno = 0;
  try {
    mThreads.reserve(aCount);
    for (unsigned int lIndex = 0; lIndex < aCount; ++lIndex) {
      mThreads.emplace_back([this, acrBody] {
        gspCurrentGroup = this;
        acrBody();
      });
    }
    return;
  } catch (const std::system_error& acrError) {
    lErrno = acrError.code().value();
  } catch (const std::bad_alloc&) {
    lErrno = 0;
  }
  // The threads made so far end before the failure is reported, so none outlives the call.
  acrAbandon();
  for (std::thread& lThread : mThreads) lThread.join();
  mThreads.clear();
  if (lErrno == 0) throw QNCNoMemoryEx("Out of Memory", 2);
  OsThrowError<QNCOsException>(lErrno, "std::thread", acrName.get());
}

void QNCThreadGroup::join() {
  std::lock_guard<std::mutex> lGuard(mJoinLock);
  for (std::thread& lThread : mThreads) {
    if (lThread.joinable()) lThread.join();
  }
}

bool QNCThreadGroup::isCurrent() const { return gspCurrentGroup == this; }
