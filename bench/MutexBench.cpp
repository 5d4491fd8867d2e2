// QNCMutex and QNCConditional beside std::mutex and std::condition_variable, the baseline: the
// wrappers add an out-of-line call and an error check per operation, which these figures bound.
#include <benchmark/benchmark.h>

#include <condition_variable>
#include <mutex>
#include <thread>

#include "BenchSupport.h"
#include "Conditional.h"
#include "Mutex.h"

namespace {

void BM_QNCMutexLockUnlock(benchmark::State& arState) {
  QNCMutex lMutex;
  for (auto _ : arState) {
    lMutex.lock();
    lMutex.unlock();
  }
}
BENCHMARK(BM_QNCMutexLockUnlock);

void BM_StdMutexLockUnlock(benchmark::State& arState) {
  std::mutex lMutex;
  for (auto _ : arState) {
    lMutex.lock();
    lMutex.unlock();
  }
}
BENCHMARK(BM_StdMutexLockUnlock);

// One iteration: the turn goes to a second thread and back, two waits and two signals.
void BM_QNCConditionalPingPong(benchmark::State& arState) {
  QNCConditional lConditional;
  long lTurn = 0;  // guarded by lConditional's mutex; odd: the partner's turn
  bool lStop = false;
  std::thread lPartner([&] {
    lConditional.lock();
    for (;;) {
      while (lTurn % 2 == 0 && !lStop) lConditional.wait();
      if (lStop) break;
      ++lTurn;
      lConditional.signal();
    }
    lConditional.unlock();
  });
  for (auto _ : arState) {
    lConditional.lock();
    ++lTurn;
    lConditional.signal();
    while (lTurn % 2 == 1) lConditional.wait();
    lConditional.unlock();
  }
  lConditional.lock();
  lStop = true;
  lConditional.signal();
  lConditional.unlock();
  lPartner.join();
}
BENCHMARK(BM_QNCConditionalPingPong)->UseRealTime();

void BM_StdConditionPingPong(benchmark::State& arState) {
  std::mutex lMutex;
  std::condition_variable lCondition;
  long lTurn = 0;  // guarded by lMutex; odd: the partner's turn
  bool lStop = false;
  std::thread lPartner([&] {
    std::unique_lock<std::mutex> lLock(lMutex);
    for (;;) {
      lCondition.wait(lLock, [&] { return lTurn % 2 == 1 || lStop; });
      if (lStop) break;
      ++lTurn;
      lCondition.notify_one();
    }
  });
  for (auto _ : arState) {
    std::unique_lock<std::mutex> lLock(lMutex);
    ++lTurn;
    lCondition.notify_one();
    lCondition.wait(lLock, [&] { return lTurn % 2 == 0; });
  }
  {
    std::lock_guard<std::mutex> lLock(lMutex);
    lStop = true;
  }
  lCondition.notify_one();
  lPartner.join();
}
BENCHMARK(BM_StdConditionPingPong)->UseRealTime();

}  // namespace

QN_BENCHMARK_MAIN();
