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

void recordingHandler(int aSignal) {
  std::lock_guard<std::mutex> lGuard(gsSeenLock);
  ++gsCalls;
  gsLastSignal = aSignal;
  gsHandlerThread = gettid();
  gsSeenChanged.notify_all();
}

bool waitForCalls(int aCalls) {
  std::unique_lock<std::mutex> lGuard(gsSeenLock);
  return gsSeenChanged.wait_for(lGuard, 10s, [aCalls] { return gsCalls >= aCalls; });
}

// The signal hits a thread of the application: the handler must run in a thread of its own, not
// in the hit thread's signal context (where it could not take a lock that thread holds).
TEST(SignalHandlerTest, SignalToAThreadOfTheApplicationRunsTheHandlerElsewhere) {
  RegisterSignalHandler(SIGUSR2, recordingHandler);
  std::atomic<pid_t> lTargetTid{0};
  std::atomic<bool> lHandled{false};
  std::thread lTarget([&] {
    lTargetTid.store(gettid());
    while (!lHandled.load()) std::this_thread::sleep_for(1ms);
  });
  while (lTargetTid.load() == 0) std::this_thread::sleep_for(1ms);
  ASSERT_EQ(0, pthread_kill(lTarget.native_handle(), SIGUSR2));
  const bool lCalled = waitForCalls(1);
  lHandled.store(true);
  lTarget.join();
  ASSERT_TRUE(lCalled);
  std::lock_guard<std::mutex> lGuard(gsSeenLock);
  EXPECT_EQ(SIGUSR2, gsLastSignal);
  EXPECT_NE(lTargetTid.load(), gsHandlerThread);
  EXPECT_NE(gettid(), gsHandlerThread);
}

std::atomic<int> gsThrows{0};
void throwingHandler(int) {
  ++gsThrows;
  throw QNCInvalidEx("handler failed on purpose", 6);
}

// A handler that throws leaves the dispatcher serving. Regression: a child forked after
// registration wrote its signal into the pipe it shares with the parent, so the parent's
// dispatcher ran the handler, in the parent, for the child's signal. The pipe is served in
// order: once the parent's SIGUSR2 has been handled, a byte the child had written and the
// parent's own SIGUSR1 have been served before it.
TEST(SignalHandlerTest, ThrowingHandlerOrAForkedChildsSignalLeavesTheDispatcherServing) {
  RegisterSignalHandler(SIGUSR1, throwingHandler);
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
  ASSERT_EQ(0, kill(getpid(), SIGUSR1));
  ASSERT_EQ(0, kill(getpid(), SIGUSR2));
  ASSERT_TRUE(waitForCalls(1));
  EXPECT_EQ(1, gsThrows.load()) << "the child's signal ran the handler in the parent, or ours did not run";
}

}  // namespace
