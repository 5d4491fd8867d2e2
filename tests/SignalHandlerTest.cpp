#include <gtest/gtest.h>
#include <pthread.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <mutex>
#include <thread>

#include "QNException.h"
#include "SignalHandler.h"

namespace {

using namespace std::chrono_literals;

// What a handler saw; written by the handler, read by the test under gsSeenLock.
std::mutex gsSeenLock;
std::condition_variable gsSeenChanged;
int gsCalls = 0;
int gsLastSignal = 0;
pid_t gsHandlerThread = 0;
bool gsTookTheLock = false;

// Held by the thread the signal is sent to. A handler running in that thread's signal context
// could never take it; one running in ordinary thread context gets it once the thread lets go.
// (Polled with try_lock rather than a timed_mutex: ThreadSanitizer does not follow timed locks.)
std::mutex gsTargetLock;

bool takeTargetLockWithin5s() {
  const auto lDeadline = std::chrono::steady_clock::now() + 5s;
  while (!gsTargetLock.try_lock()) {
    if (std::chrono::steady_clock::now() > lDeadline) return false;
    std::this_thread::sleep_for(1ms);
  }
  gsTargetLock.unlock();
  return true;
}

void recordingHandler(int aSignal) {
  const bool lTook = takeTargetLockWithin5s();
  std::lock_guard<std::mutex> lGuard(gsSeenLock);
  ++gsCalls;
  gsLastSignal = aSignal;
  gsHandlerThread = gettid();
  gsTookTheLock = lTook;
  gsSeenChanged.notify_all();
}

bool waitForCalls(int aCalls) {
  std::unique_lock<std::mutex> lGuard(gsSeenLock);
  return gsSeenChanged.wait_for(lGuard, 10s, [aCalls] { return gsCalls >= aCalls; });
}

class SignalHandlerTest : public ::testing::Test {
 protected:
  void SetUp() override {
    std::lock_guard<std::mutex> lGuard(gsSeenLock);
    gsCalls = 0;
    gsLastSignal = 0;
    gsHandlerThread = 0;
    gsTookTheLock = false;
  }
};

// The signal hits a thread of the application that holds the lock the handler takes: the handler
// must run in a thread of its own, not in the hit thread's signal context.
TEST_F(SignalHandlerTest, SignalToAThreadOfTheApplicationRunsTheHandlerElsewhere) {
  RegisterSignalHandler(SIGUSR2, recordingHandler);
  std::atomic<pid_t> lTargetTid{0};
  std::atomic<bool> lSent{false};
  std::thread lTarget([&] {
    std::lock_guard<std::mutex> lHeld(gsTargetLock);
    lTargetTid.store(gettid());
    while (!lSent.load()) std::this_thread::sleep_for(1ms);
    std::this_thread::sleep_for(50ms);  // time for a handler in this thread's signal context to fail
  });
  while (lTargetTid.load() == 0) std::this_thread::sleep_for(1ms);
  ASSERT_EQ(0, pthread_kill(lTarget.native_handle(), SIGUSR2));
  lSent.store(true);
  lTarget.join();
  ASSERT_TRUE(waitForCalls(1));
  std::lock_guard<std::mutex> lGuard(gsSeenLock);
  EXPECT_EQ(SIGUSR2, gsLastSignal);
  EXPECT_TRUE(gsTookTheLock);
  EXPECT_NE(lTargetTid.load(), gsHandlerThread);
  EXPECT_NE(gettid(), gsHandlerThread);
}

std::atomic<int> gsThrows{0};
void throwingHandler(int) {
  ++gsThrows;
  throw QNCInvalidEx("handler failed on purpose", 6);
}

// The pipe is served in order: once the later SIGUSR2 has been handled, the throwing handler of
// SIGUSR1 has run before it. Registering SIGUSR1 again then replaces the throwing function.
TEST_F(SignalHandlerTest, ThrowingHandlerLeavesTheDispatcherServingAndRegisteringAgainReplacesIt) {
  RegisterSignalHandler(SIGUSR1, throwingHandler);
  RegisterSignalHandler(SIGUSR2, recordingHandler);
  ASSERT_EQ(0, kill(getpid(), SIGUSR1));
  ASSERT_EQ(0, kill(getpid(), SIGUSR2));
  ASSERT_TRUE(waitForCalls(1));
  EXPECT_EQ(1, gsThrows.load());

  RegisterSignalHandler(SIGUSR1, recordingHandler);
  ASSERT_EQ(0, kill(getpid(), SIGUSR1));
  ASSERT_TRUE(waitForCalls(2));
  EXPECT_EQ(1, gsThrows.load());
  std::lock_guard<std::mutex> lGuard(gsSeenLock);
  EXPECT_EQ(SIGUSR1, gsLastSignal);
}

std::atomic<int> gsChildSignalRuns{0};
void countingHandler(int) { ++gsChildSignalRuns; }

// Regression: a child forked after registration wrote its signal into the pipe it shares with the
// parent, so the parent's dispatcher ran the handler, in the parent, for the child's signal.
TEST_F(SignalHandlerTest, SignalOfAForkedChildNeverRunsTheHandlerInTheParent) {
  RegisterSignalHandler(SIGUSR1, countingHandler);
  RegisterSignalHandler(SIGUSR2, recordingHandler);
  const pid_t lChild = fork();
  ASSERT_GE(lChild, 0);
  if (lChild == 0) {
    raise(SIGUSR1);
    _exit(0);
  }
  int lStatus = 0;
  ASSERT_EQ(lChild, waitpid(lChild, &lStatus, 0));
  // Without a dispatcher of its own the child takes the default action of the signal.
  // (ThreadSanitizer delivers signals itself and drops one re-raised with the default action.)
#if !defined(__SANITIZE_THREAD__)
  EXPECT_TRUE(WIFSIGNALED(lStatus) && WTERMSIG(lStatus) == SIGUSR1) << "status " << lStatus;
#endif
  // The pipe is read in order: once the parent's later signal has been served, a byte the child
  // had written would have been served before it.
  ASSERT_EQ(0, kill(getpid(), SIGUSR2));
  ASSERT_TRUE(waitForCalls(1));
  EXPECT_EQ(0, gsChildSignalRuns.load());
}

}  // namespace
