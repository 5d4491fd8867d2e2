// The operating-system layer and the C library wrappers: error reports, calls interrupted by
// signals, and the primitives under the conditionals and mutexes.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <pthread.h>
#include <signal.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <functional>
#include <string>
#include <thread>

#include "Clib.h"
#include "Mutex.h"
#include "Os.h"
#include "QNException.h"
#include "TestSupport.h"

namespace {

using std::chrono::milliseconds;

std::atomic<int> gsHandled{0};
void countSignal(int) { ++gsHandled; }

// Installs a no-op SIGUSR1 handler without SA_RESTART, so that a blocked call it interrupts
// returns EINTR instead of being restarted by the kernel.
class InterruptingSignal {
 public:
  InterruptingSignal() {
    struct sigaction lAction = {};
    lAction.sa_handler = countSignal;
    sigemptyset(&lAction.sa_mask);
    lAction.sa_flags = 0;
    sigaction(SIGUSR1, &lAction, &mPrevious);
  }
  ~InterruptingSignal() { sigaction(SIGUSR1, &mPrevious, nullptr); }

  // Runs aCall on a thread and, whenever that thread is found asleep in the kernel, sends it
  // SIGUSR1 until the handler has run; then calls aRelease (which lets the call finish) and joins.
  // Returns whether the handler ran while the thread was blocked.
  bool interrupt(const std::function<void()>& acrCall, const std::function<void()>& acrRelease) {
    std::atomic<long> lTid{0};
    std::thread lThread([&] {
      lTid = syscall(SYS_gettid);
      acrCall();
    });
    const int lBefore = gsHandled;
    for (int lPoll = 0; lPoll < 1000 && gsHandled == lBefore; ++lPoll) {
      std::this_thread::sleep_for(milliseconds(10));
      if (lTid != 0 && isSleeping(lTid)) pthread_kill(lThread.native_handle(), SIGUSR1);
    }
    const bool lInterrupted = gsHandled != lBefore;
    acrRelease();
    lThread.join();
    return lInterrupted;
  }

 private:
  static bool isSleeping(long aTid) {
    const std::string lStat = qntest::readFile("/proc/self/task/" + std::to_string(aTid) + "/stat");
    const size_t lEnd = lStat.rfind(')');  // the state follows the command name in parentheses
    return lEnd != std::string::npos && lStat.compare(lEnd, 3, ") S") == 0;
  }

  struct sigaction mPrevious;
};

class ClibTest : public ::testing::Test {
 protected:
  void SetUp() override { ASSERT_EQ(0, pipe(mPipe)); }
  void TearDown() override {
    close(mPipe[0]);
    close(mPipe[1]);
  }

  qntest::TempDir mDir;
  int mPipe[2];
};

TEST_F(ClibTest, FailuresNameTheCallTheObjectAndTheSystemText) {
  const std::string lMissing = mDir.file("missing/x.pid");
  EXPECT_EQ("open '" + lMissing + "': No such file or directory (code " + std::to_string(ENOENT) + ")",
            qntest::thrown<QNCOpenFailedEx>([&] { ClibOpen(lMissing.c_str(), O_RDONLY, 0); }, true));

  const std::string lFile = mDir.file("log");
  const int lWriteOnly = ClibOpen(lFile.c_str(), O_WRONLY | O_CREAT, 0600);
  char lByte;
  EXPECT_EQ("read fd " + std::to_string(lWriteOnly) + " '" + lFile + "': Bad file descriptor",
            qntest::thrown<QNCReadFailedEx>([&] { ClibRead(lWriteOnly, &lByte, 1); }));
  ClibClose(lWriteOnly);

  // A pipe nobody reads, with SIGPIPE ignored as a service does: the write fails with EPIPE
  // instead of looping or reporting success.
  close(mPipe[0]);
  mPipe[0] = -1;
  const sighandler_t lPrevious = signal(SIGPIPE, SIG_IGN);
  const std::string lBroken = qntest::thrown<QNCWriteFailedEx>([&] { ClibWrite(mPipe[1], "x", 1); }, true);
  signal(SIGPIPE, lPrevious);
  EXPECT_NE(std::string::npos, lBroken.find(": Broken pipe (code " + std::to_string(EPIPE) + ")")) << lBroken;
}

// A handler without SA_RESTART makes a blocked call return EINTR; the raw read shows that the
// set-up does interrupt it. The wrappers must go on: the read returns the data, the write that
// was cut short writes the rest from where it stopped.
TEST_F(ClibTest, SignalsDuringBlockedCallsNeverSurface) {
  InterruptingSignal lSignal;
  char lByte = 0;
  int lRawErrno = 0;
  ASSERT_TRUE(lSignal.interrupt([&] { lRawErrno = read(mPipe[0], &lByte, 1) < 0 ? errno : 0; }, [] {}));
  ASSERT_EQ(EINTR, lRawErrno);

  unsigned int lRead = 0;
  ASSERT_TRUE(lSignal.interrupt([&] { EXPECT_NO_THROW(lRead = ClibRead(mPipe[0], &lByte, 1)); },
                                [&] { ClibWrite(mPipe[1], "r", 1); }));
  EXPECT_EQ(1u, lRead);
  EXPECT_EQ('r', lByte);

  // Many times the pipe's capacity, and no byte equal to its neighbours: a write that restarted
  // from the beginning, or skipped or repeated a piece, shows in what arrives.
  std::string lSent(1 << 20, '\0');
  for (size_t lIndex = 0; lIndex < lSent.size(); ++lIndex)
    lSent[lIndex] = static_cast<char>(lIndex * 7 + lIndex / 251);
  unsigned int lWritten = 0;
  std::string lReceived;
  ASSERT_TRUE(lSignal.interrupt(
      [&] { lWritten = ClibWrite(mPipe[1], lSent.data(), static_cast<unsigned int>(lSent.size())); },
      [&] {
        char lChunk[65536];
        while (lReceived.size() < lSent.size())
          lReceived.append(lChunk, ClibRead(mPipe[0], lChunk, sizeof lChunk));
      }));
  EXPECT_EQ(lSent.size(), lWritten);
  EXPECT_TRUE(lSent == lReceived) << "received " << lReceived.size() << " bytes, not the ones sent";
}

// The deadline is computed on the monotonic clock; a condition variable left on the wall clock
// would see it as long past and time out at once. Signals given before the wait found nobody
// waiting and must not end it early; the time-out returns with the mutex held (an ordinary mutex
// refuses a second lock even to its holder).
TEST(ConditionalTest, TimedWaitNobodySignalsThrowsAfterTheTimeWithTheMutexHeld) {
  pthread_mutex_t lMutex;
  pthread_cond_t lCondition;
  OsInitMutex(lMutex);
  OsInitConditional(lCondition);
  OsSignal(lCondition);
  OsLockMutex(lMutex);
  OsSignal(lCondition);
  const auto lStart = std::chrono::steady_clock::now();
  const std::string lThrown =
      qntest::thrown<QNCTimeOutEx>([&] { OsConditionalTimedWait(lCondition, lMutex, 200); }, true);
  const auto lElapsed = std::chrono::steady_clock::now() - lStart;
  EXPECT_NE(std::string::npos, lThrown.find(" (code " + std::to_string(ETIMEDOUT) + ")")) << lThrown;
  EXPECT_GE(lElapsed, milliseconds(200));
  EXPECT_LT(lElapsed, milliseconds(200 + 5000));
  EXPECT_EQ(EBUSY, pthread_mutex_trylock(&lMutex)) << "the time-out arrived without the mutex";
  OsUnlockMutex(lMutex);
  OsDestroyConditional(lCondition);
  OsDestroyMutex(lMutex);
}

// Destroying a mutex that is still locked makes pthread_mutex_destroy fail with EBUSY; the
// destructor swallows that and leaves the system mutex as it was: still valid and locked.
TEST(MutexTest, DestroyingALockedMutexIsSwallowed) {
#if !defined(__SANITIZE_THREAD__)  // ThreadSanitizer reports exactly what this provokes
  alignas(QNCMutex) unsigned char lStorage[sizeof(QNCMutex)];
  QNCMutex* lpMutex = new (lStorage) QNCMutex();
  pthread_mutex_t* lpSystemMutex = &lpMutex->getMutex();
  lpMutex->lock();
  EXPECT_NO_THROW(lpMutex->~QNCMutex());
  EXPECT_EQ(0, pthread_mutex_unlock(lpSystemMutex));
  EXPECT_EQ(0, pthread_mutex_destroy(lpSystemMutex));
#endif
}

}  // namespace
