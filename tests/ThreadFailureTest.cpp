// A thread that dies is never forgotten: by default it fails the run and starts the orderly exit;
// a component may restart its work instead. The tests run in file order: the restart case
// first, while the run has not failed yet.

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

// Throws from its body aFailures times, then waits for its exit request.
qntest::ScriptedComponent* failing(const char* apName, int aFailures, bool aRestart) {
  auto* lpComponent = new qntest::ScriptedComponent(
      [aFailures](qntest::ScriptedComponent& arSelf) {
        if (arSelf.mRuns.load() <= aFailures) throw std::runtime_error("sensor bus gone");
        while (!arSelf.waitForExitRequest(1000)) {
        }
      },
      apName);
  lpComponent->mRestart = aRestart;
  return lpComponent;
}

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
  qntest::ScriptedComponent* lpComponent = &mSystem.addComponent(failing("Restarter", 2, true));
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
TEST_F(ThreadFailureTest, DyingThreadFailsTheRunAndEndsTheOthers) {
  const int lBefore = gsExitRequests.load();
  mSystem.addComponent(failing("Bystander", 0, false));  // started first: it can take the request
  mSystem.addComponent(failing("Dying", 1, false));
  mSystem.addPool("Pool", 1);
  mSystem.startThreads();
  EXPECT_TRUE(qntest::returnsWithin([this] { mSystem.waitForThreads(); }, std::chrono::seconds(5),
                                    [this] { mSystem.makeThreadsToExit(); }));
  EXPECT_TRUE(hasRunFailed());
  EXPECT_EQ(1, getRunExitStatus());
  EXPECT_EQ(lBefore + 1, gsExitRequests.load());
  EXPECT_EQ("-E-", qntest::levelOf(log(), "Thread 'Dying' ended by an exception: sensor bus gone"));
}

// A pool task that throws fails the run the same way, whatever it throws (an exception leaving
// the thread function would call std::terminate); the worker goes on with the next task. The
// text of the error line is shared with the components' own.
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
