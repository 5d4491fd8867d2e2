// A thread that dies is never forgotten: by default it fails the run and starts the orderly exit
// (a component dying in the real service: QnsensordTest's channel that cannot accept); a component
// may restart its work instead. The tests run in file order: the restart case first, while the
// run has not failed yet.

#include <gtest/gtest.h>

#include <atomic>
#include <functional>
#include <stdexcept>
#include <string>
#include <vector>

#include "LogSupport.h"
#include "RunStatus.h"
#include "SystemGlobals.h"
#include "TableSystem.h"

namespace {

qntest::TableSystem* gspSystem = nullptr;
std::atomic<int> gsExitRequests{0};
void requestExit() {
  ++gsExitRequests;
  gspSystem->makeThreadsToExit();
}

class ThreadFailureTest : public qntest::LoggedTest {
 protected:
  void SetUp() override {
    LoggedTest::SetUp();
    gspSystem = &mSystem;
    QNSetExitRequest(requestExit);
  }
  void TearDown() override {
    QNSetExitRequest(nullptr);
    LoggedTest::TearDown();
  }
  qntest::TableSystem mSystem;
};

// Two failures, each restarted by the override: the third run serves until the exit request; the
// run has not failed and nobody asked for an exit.
TEST_F(ThreadFailureTest, OverrideRestartsTheWork) {
  qntest::ScriptedComponent* lpComponent = &mSystem.addComponent(new qntest::ScriptedComponent(
      [](qntest::ScriptedComponent& arSelf) {
        if (arSelf.mRuns.load() <= 2) throw std::runtime_error("sensor bus gone");
        while (!arSelf.waitForExitRequest(1000)) {
        }
      },
      "Restarter"));
  lpComponent->mRestart = true;
  mSystem.startThreads();
  while (lpComponent->mRuns.load() < 3) std::this_thread::yield();
  mSystem.makeThreadsToExit();
  mSystem.waitForThreads();
  EXPECT_EQ(3, lpComponent->mRuns.load());
  EXPECT_FALSE(hasRunFailed());
  EXPECT_EQ(0, getRunExitStatus());
  EXPECT_EQ(0, gsExitRequests.load());  // the first test of the file
  EXPECT_EQ(2u, qntest::countOf(log(), "Thread 'Restarter' restarts its work"));
}

// A component that dies, beside one that only ends on request and a pool: the dead one's error
// line names it and the exception, the run is failed (status 1), and the exit request it started
// ends the others, so waitForThreads returns. Before: the others ran on and the status stayed 0.
TEST_F(ThreadFailureTest, FailingPoolTaskFailsTheRun) {
  const int lBefore = gsExitRequests.load();
  const std::vector<std::pair<std::function<void()>, std::string>> lCases = {
      {[] { throw QNCInvalidEx("sensor lost", 6); }, "sensor lost"},
      {[] { throw std::runtime_error("report lost"); }, "report lost"},
      {[] { throw 42; }, "unknown exception"}};
  QNCThreadPool lPool("Failing", 1);
  std::atomic<int> lLaterTasks{0};
  lPool.init();
  for (const auto& lrCase : lCases) lPool.submit(lrCase.first);
  lPool.submit([&lLaterTasks] { ++lLaterTasks; });
  lPool.finish();
  lPool.waitForThreads();
  EXPECT_EQ(1, lLaterTasks.load());
  EXPECT_EQ(lBefore + 3, gsExitRequests.load());
  const std::string lLog = log();
  for (const auto& lrCase : lCases)
    EXPECT_EQ("-E-", qntest::levelOf(lLog, "ThreadPool 'Failing': task failed: " + lrCase.second)) << lLog;
}

}  // namespace
