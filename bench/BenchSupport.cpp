#include "BenchSupport.h"

#include <condition_variable>
#include <mutex>
#include <thread>

#include "Logger.h"

namespace qnbench {

void startSecondThread() {
  static std::mutex sLock;
  static std::condition_variable sNever;
  std::thread([] {
    std::unique_lock<std::mutex> lGuard(sLock);
    sNever.wait(lGuard, [] { return false; });
  }).detach();
}

void setTraceLogging(bool aOn) { setLogCode(aOn ? 255u : 255u & ~static_cast<unsigned int>(QNLL_Trace)); }

}  // namespace qnbench
