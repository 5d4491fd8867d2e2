#include <fcntl.h>
#include <gtest/gtest.h>
#include <pthread.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/utsname.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <functional>
#include <string>
#include <thread>

#include "Clib.h"
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
  struct stat lStat;
  EXPECT_EQ("stat '" + lMissing + "': No such file or directory",
            qntest::thrown<QNCClibStatFailedEx>([&] { ClibStat(lMissing.c_str(), &lStat); }));

  const std::string lFile = mDir.file("log");
  const int lWriteOnly = ClibOpen(lFile.c_str(), O_WRONLY | O_CREAT, 0600);
  char lByte;
  EXPECT_EQ("read fd " + std::to_string(lWriteOnly) + " '" + lFile + "': Bad file descriptor",
            qntest::thrown<QNCReadFailedEx>([&] { ClibRead(lWriteOnly, &lByte, 1); }));
  ClibClose(lWriteOnly);
  EXPECT_EQ("close fd " + std::to_string(lWriteOnly) + ": Bad file descriptor",
            qntest::thrown<QNCCloseFailedEx>([&] { ClibClose(lWriteOnly); }));
  EXPECT_THROW(ClibChdir(lMissing.c_str()), QNCOpenFailedEx);

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
// was cut short writes the rest from where it stopped, the sleep lasts its whole time.
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

  const auto lStart = std::chrono::steady_clock::now();
  ASSERT_TRUE(lSignal.interrupt([] { ClibSleepMS(400); }, [] {}));
  const auto lSlept = std::chrono::steady_clock::now() - lStart;
  EXPECT_GE(lSlept, milliseconds(400));
  EXPECT_LT(lSlept, milliseconds(400 + 5000));
}

TEST_F(ClibTest, ProcStatusTellsExistingFromGoneAndRefusesGroups) {
  EXPECT_EQ(0, ClibGetProcStatus(ClibGetpid()));
  EXPECT_EQ(0, ClibGetProcStatus(1));  // exists always; may belong to another user (EPERM)

  const pid_t lChild = fork();
  if (lChild == 0) _exit(0);
  ASSERT_EQ(0, qntest::waitExit(lChild));  // reaped: the pid names no process now
  EXPECT_EQ("kill(signal 0) pid " + std::to_string(lChild) + ": No such process (code " +
                std::to_string(ESRCH) + ")",
            qntest::thrown<QNCClibGetProcStatusFailedEx>([&] { ClibGetProcStatus(lChild); }, true));

  // kill(0, 0) and kill(-1, 0) would succeed (they probe process groups): refusal proves they
  // were never made.
  for (int lPid : {0, -1, -12345}) {
    const std::string lRefusal =
        qntest::thrown<QNCClibGetProcStatusFailedEx>([&] { ClibGetProcStatus(lPid); }, true);
    EXPECT_NE(std::string::npos, lRefusal.find("(code " + std::to_string(EINVAL) + ")"))
        << lPid << ": " << lRefusal;
  }
}

// Both copy into a caller's buffer: a text longer than the buffer is cut and still terminated,
// and strerror leaves errno as it found it. (The whole host name shows in the system's init.)
TEST_F(ClibTest, TextsAreCutToTheBufferAndTerminated) {
  char lShort[8];
  memset(lShort, 'x', sizeof lShort);
  errno = EACCES;
  ClibStrerror(lShort, sizeof lShort);
  EXPECT_STREQ("Permiss", lShort);
  EXPECT_EQ(EACCES, errno);

  struct utsname lName;
  ASSERT_EQ(0, uname(&lName));
  char lCut[3];
  memset(lCut, 'x', sizeof lCut);
  ClibGethostname(lCut, sizeof lCut);
  EXPECT_EQ(std::string(lName.nodename).substr(0, 2), std::string(lCut));
}

}  // namespace
