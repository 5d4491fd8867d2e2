#include "BenchSupport.h"

#include <condition_variable>
#include <mutex>
#include <thread>

#include "Logger.h"

namespace qnbench {

void startSecondThread() {
  // Never destroyed: a condition variable destroyed at exit while the idle thread still waits on
  // it blocks the exit.
  auto* lpLock = new std::mutex;
  auto* lpNever = new std::condition_variable;
  std::thread([lpLock, lpNever] {
    std::unique_lock<std::mutex> lGuard(*lpLock);
    lpNever->wait(lGuard, [] { return false; });
  }).detach();
}

void setTraceLogging(bool aOn) { setLogCode(aOn ? 255u : 255u & ~static_cast<unsigned int>(QNLL_Trace)); }

}  // namespace qnbench
