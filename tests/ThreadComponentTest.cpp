#include <gtest/gtest.h>

#include <atomic>
#include <functional>
#include <future>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include "LogSupport.h"
#include "QNException.h"
#include "TestSupport.h"
#include "ThreadComponent.h"

namespace {

constexpr unsigned int kHour = 3600u * 1000u;

// A component whose body is given by the test. Joins in its own destructor, before the body
// (a member of this class) is destroyed.
class ScriptedComponent : public QNCThreadComponent {
 public:
  using Body = std::function<void(ScriptedComponent&)>;
  ScriptedComponent(const char* apName, Body aBody) : QNCThreadComponent(apName), mBody(std::move(aBody)) {}
  ~ScriptedComponent() override {
    try {
      requestExit();
    } catch (const QNCInvalidEx&) {
      // never started: nothing to join
    }
    waitForExit();
  }
  using QNCThreadComponent::waitForExitRequest;

 protected:
  void run() override { mBody(*this); }

 private:
  Body mBody;
};

// Set by SleeperComponent's body as it returns. A global, not a member: the body finishes while
// the base destructor runs, when the derived part no longer exists.
std::atomic<bool> gsSleeperReturned{false};

// No join of its own: the base destructor alone has to bring its thread down.
class SleeperComponent : public QNCThreadComponent {
 public:
  explicit SleeperComponent(std::promise<void>* apAsleep)
      : QNCThreadComponent("sleeper"), mpAsleep(apAsleep) {}

 protected:
  void run() override {
    mpAsleep->set_value();
    while (!waitForExitRequest(kHour)) {
    }
    gsSleeperReturned = true;
  }

 private:
  std::promise<void>* mpAsleep;
};

// Fault pinned for the request made first: a wait that only listens for notifications would
// sleep the whole period instead of seeing the request already given.
TEST(ThreadComponentTest, RequestExitWakesABodyInALongWaitEvenWhenMadeBeforeIt) {
  for (const bool lRequestFirst : {false, true}) {
    std::promise<void> lStarted;
    std::promise<void> lGate;
    std::shared_future<void> lGateOpen = lGate.get_future().share();
    std::atomic<bool> lWoken{false};
    ScriptedComponent lComponent("waiter", [&](ScriptedComponent& arSelf) {
      lStarted.set_value();
      if (lRequestFirst) lGateOpen.wait();
      lWoken = arSelf.waitForExitRequest(kHour);
    });
    lComponent.init();
    lStarted.get_future().wait();
    lComponent.requestExit();
    lGate.set_value();
    lComponent.waitForExit();  // would block for an hour if the request did not end the wait
    EXPECT_TRUE(lWoken) << (lRequestFirst ? "request before the wait" : "request during the wait");
    EXPECT_TRUE(lComponent.isExitRequested());
  }
}

// A request before init() is refused and not remembered; a wait without a request reports none;
// init() runs once; joins and requests after the end are no-ops. Fault pinned: the owner joins
// (holding the join lock) while the body waits for its own exit; the body blocked on that lock
// and the join never finished.
TEST(ThreadComponentTest, LifecycleStatesAndRepeatedCalls) {
  std::atomic<int> lRequestedAtStart{-1};
  std::atomic<int> lWaitResult{-1};
  std::atomic<bool> lSelfWaitRefused{false};
  ScriptedComponent lComponent("once", [&](ScriptedComponent& arSelf) {
    lRequestedAtStart = arSelf.isExitRequested() ? 1 : 0;
    lWaitResult = arSelf.waitForExitRequest(1) ? 1 : 0;
    try {
      arSelf.waitForExit();
    } catch (const QNCInvalidEx&) {
      lSelfWaitRefused = true;
    }
  });
  EXPECT_EQ("Thread 'once' was never started",
            qntest::thrown<QNCInvalidEx>([&] { lComponent.requestExit(); }));
  EXPECT_FALSE(lComponent.isInited());
  lComponent.waitForExit();  // never started: returns at once
  lComponent.init();
  EXPECT_TRUE(lComponent.isInited());
  EXPECT_THROW(lComponent.init(), QNCInvalidEx);
  lComponent.waitForExit();
  EXPECT_EQ(0, lRequestedAtStart);
  EXPECT_EQ(0, lWaitResult);
  EXPECT_TRUE(lSelfWaitRefused);
  EXPECT_FALSE(lComponent.isExitRequested());
  lComponent.waitForExit();            // already joined: returns at once
  EXPECT_TRUE(lComponent.isInited());  // started once, stays so after the end
  lComponent.requestExit();            // the thread has ended: no effect, no failure
}

// An exception leaving a thread function would call std::terminate; here each kind is logged at
// error level with its message and the test process lives on to read the log.
class ThreadComponentLogTest : public qntest::LoggedTest {};

TEST_F(ThreadComponentLogTest, AnExceptionFromTheBodyIsLoggedAndTheProcessGoesOn) {
  const std::vector<std::pair<ScriptedComponent::Body, std::string>> lCases = {
      {[](ScriptedComponent&) { throw QNCInvalidEx("sensor lost", 6); }, "sensor lost"},
      {[](ScriptedComponent&) { throw std::runtime_error("bus error"); }, "bus error"},
      {[](ScriptedComponent&) { throw 42; }, "unknown exception"},
  };
  for (const auto& lrCase : lCases) {
    ScriptedComponent lComponent("thrower", lrCase.first);
    lComponent.init();
    lComponent.waitForExit();
  }
  const std::string lText = log();
  for (const auto& lrCase : lCases)
    EXPECT_EQ("-E-", qntest::levelOf(lText, "Thread 'thrower' ended by an exception: " + lrCase.second))
        << lText;
}

// Destroying a started, never-joined component must not reach std::terminate (a joinable
// std::thread destroyed) nor leave the thread behind.
TEST(ThreadComponentTest, DestructorEndsAndJoinsARunningThread) {
  std::promise<void> lAsleep;
  auto* lpComponent = new SleeperComponent(&lAsleep);
  lpComponent->init();
  lAsleep.get_future().wait();
  delete lpComponent;
  EXPECT_TRUE(gsSleeperReturned);  // woken and joined before the object was gone
}

}  // namespace
