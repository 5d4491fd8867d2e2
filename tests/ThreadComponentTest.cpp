#include <gtest/gtest.h>

#include <atomic>
#include <functional>
#include <future>
#include <stdexcept>
#include <string>

#include "LogSupport.h"
#include "Logger.h"
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
  explicit SleeperComponent(std::promise<void>* apAsleep) : QNCThreadComponent("sleeper"), mpAsleep(apAsleep) {}

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

TEST(ThreadComponentTest, RequestExitWakesABodyInALongWait) {
  std::promise<void> lWaiting;
  std::atomic<bool> lWoken{false};
  ScriptedComponent lComponent("waiter", [&](ScriptedComponent& arSelf) {
    lWaiting.set_value();
    lWoken = arSelf.waitForExitRequest(kHour);
  });
  lComponent.init();
  lWaiting.get_future().wait();
  lComponent.requestExit();
  lComponent.waitForExit();  // would block for an hour if the request did not wake the wait
  EXPECT_TRUE(lWoken);
  EXPECT_TRUE(lComponent.isExitRequested());
}

// Fault pinned: a request given before the body starts waiting must not be lost (a wait that
// only listens for notifications would sleep the whole period).
TEST(ThreadComponentTest, ARequestMadeBeforeTheWaitIsNotLost) {
  std::promise<void> lGate;
  std::shared_future<void> lGateOpen = lGate.get_future().share();
  std::atomic<bool> lSeen{false};
  ScriptedComponent lComponent("late", [&](ScriptedComponent& arSelf) {
    lGateOpen.wait();
    lSeen = arSelf.waitForExitRequest(kHour);
  });
  lComponent.init();
  lComponent.requestExit();
  lGate.set_value();
  lComponent.waitForExit();
  EXPECT_TRUE(lSeen);
}

// A request before init() is refused and not remembered; a wait without a request reports none;
// init() runs once; joins and requests after the end are no-ops.
TEST(ThreadComponentTest, LifecycleStatesAndRepeatedCalls) {
  std::atomic<int> lRequestedAtStart{-1};
  std::atomic<int> lWaitResult{-1};
  ScriptedComponent lComponent("once", [&](ScriptedComponent& arSelf) {
    lRequestedAtStart = arSelf.isExitRequested() ? 1 : 0;
    lWaitResult = arSelf.waitForExitRequest(1) ? 1 : 0;
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
  EXPECT_FALSE(lComponent.isExitRequested());
  lComponent.waitForExit();            // already joined: returns at once
  EXPECT_TRUE(lComponent.isInited());  // started once, stays so after the end
  lComponent.requestExit();  // the thread has ended: no effect, no failure
  EXPECT_STREQ("once", lComponent.getName().get());
}

// Fault pinned: the owner joins (holding the join lock) while the body waits for its own exit;
// the body blocked on that lock and the join never finished.
TEST(ThreadComponentTest, WaitingForItsOwnExitIsRefused) {
  std::atomic<bool> lRefused{false};
  ScriptedComponent lComponent("self", [&](ScriptedComponent& arSelf) {
    try {
      arSelf.waitForExit();
    } catch (const QNCInvalidEx&) {
      lRefused = true;
    }
  });
  lComponent.init();
  lComponent.waitForExit();
  EXPECT_TRUE(lRefused);
}

// An exception leaving a thread function would call std::terminate; here each one is logged
// with its message and the test process lives on to read the log.
class ThreadComponentLogTest : public qntest::LoggedTest {};

TEST_F(ThreadComponentLogTest, AnExceptionFromTheBodyIsLoggedAndTheProcessGoesOn) {
  {
    ScriptedComponent lFamily("family", [](ScriptedComponent&) { throw QNCInvalidEx("sensor lost", 6); });
    ScriptedComponent lStandard("standard", [](ScriptedComponent&) { throw std::runtime_error("bus error"); });
    ScriptedComponent lOther("other", [](ScriptedComponent&) { throw 42; });
    lFamily.init();
    lStandard.init();
    lOther.init();
    lFamily.waitForExit();
    lStandard.waitForExit();
    lOther.waitForExit();
  }
  const std::string lText = log();
  EXPECT_NE(std::string::npos, lText.find("-E-")) << lText;
  EXPECT_NE(std::string::npos, lText.find("Thread 'family' ended by an exception: sensor lost")) << lText;
  EXPECT_NE(std::string::npos, lText.find("Thread 'standard' ended by an exception: bus error")) << lText;
  EXPECT_NE(std::string::npos, lText.find("Thread 'other' ended by an exception: unknown exception")) << lText;
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
