// The single running instance: the PID file, its lock, and stopping the running instance.
// In-process cases use several managers on one file (open-file-description locks make them
// conflict like separate processes); process cases start qn_instance_tool as real instances.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <functional>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "DeathTestSupport.h"
#include "Os.h"
#include "ProcessInstanceManager.h"
#include "QNException.h"
#include "TestSupport.h"

namespace {
using std::chrono::seconds;

// The 4 bytes a PID file holds for aPid: little-endian, whatever the host order.
std::string pidBytes(int aPid) {
  std::string lBytes;
  for (int lShift = 0; lShift < 32; lShift += 8) lBytes += static_cast<char>((aPid >> lShift) & 0xff);
  return lBytes;
}

int openDescriptorCount() {
  int lCount = 0;
  for (int lFd = 0; lFd < 1024; ++lFd) lCount += fcntl(lFd, F_GETFD) != -1 ? 1 : 0;
  return lCount;
}

// Whether some open of the file other than a fresh one of ours holds its lock.
bool lockedByOther(const std::string& acrPath) {
  const int lFd = open(acrPath.c_str(), O_RDONLY);
  if (lFd < 0) return false;
  QNEFileLockStatus lStatus = QNFLS_None;
  OsFileLockStatus(lFd, lStatus);
  close(lFd);
  return lStatus == QNFLS_LockedByOther;
}

class InstanceManagerTest : public ::testing::Test {
 protected:
  qntest::TempDir mDir;
  std::string mPidFile = mDir.file("service.pid");
};

// Several managers in one process stand for several processes. The second one finds the file
// naming this very process, where kill(getpid(), SIGTERM) would end the instance that asked.
TEST_F(InstanceManagerTest, SecondManagerSeesTheInstanceUntilItIsReleasedAndNeverSignalsItself) {
  QNCProcessInstanceManager lRunning(mPidFile.c_str());
  lRunning.markAsRunning();
  EXPECT_EQ(pidBytes(getpid()), qntest::readFile(mPidFile));

  QNCProcessInstanceManager lSecond(mPidFile.c_str());
  EXPECT_TRUE(lSecond.isAnInstanceRunning());
  EXPECT_NE(
      std::string::npos,
      qntest::thrown<QNCTerminateFailedEx>([&] { lSecond.killRunningInstance(); }, true).find("(code 488)"));
  EXPECT_TRUE(lockedByOther(mPidFile));

  lRunning.exitCleanup();
  EXPECT_FALSE(lockedByOther(mPidFile));
  QNCProcessInstanceManager lThird(mPidFile.c_str());
  EXPECT_FALSE(lThird.isAnInstanceRunning());
  lThird.killRunningInstance();  // "No instance running... cannot kill": returns quietly
  EXPECT_FALSE(lockedByOther(mPidFile));
}

// The lock is free for a moment while the file is reopened. A start that slips into that gap
// either writes its id and then loses the lock to us, or keeps the lock; either way the file must
// end up naming the holder. (Regression: twenty simultaneous starts once left the id of a start
// that had failed.)
class GapManager : public QNCProcessInstanceManager {
 public:
  GapManager(const std::string& acrPath, std::function<void()> aInGap)
      : QNCProcessInstanceManager(acrPath.c_str()), mInGap(std::move(aInGap)) {}
  void reopenPidFile() override {
    QNCProcessInstanceManager::reopenPidFile();
    mInGap();
  }

 private:
  std::function<void()> mInGap;
};

TEST_F(InstanceManagerTest, StartInTheReopeningGapNeverLeavesTheFileNamingTheWrongProcess) {
  const std::string lIntruderId = pidBytes(0x01020304);
  GapManager lWinner(mPidFile, [&] { qntest::writeFile(mPidFile, lIntruderId); });
  lWinner.markAsRunning();
  EXPECT_EQ(pidBytes(getpid()), qntest::readFile(mPidFile));
  lWinner.exitCleanup();

  int lIntruderFd = -1;
  GapManager lLoser(mPidFile, [&] {
    lIntruderFd = open(mPidFile.c_str(), O_RDWR);
    OsLockFile(lIntruderFd);
    ASSERT_EQ(4, pwrite(lIntruderFd, lIntruderId.data(), 4, 0));
  });
  EXPECT_THROW(lLoser.markAsRunning(), QNCFileLockFailedEx);
  EXPECT_EQ(lIntruderId, qntest::readFile(mPidFile));
  close(lIntruderFd);
}

TEST_F(InstanceManagerTest, ProcStatusReadsTheIdAndNoFailureLeavesADescriptorOpen) {
  const int lDescriptors = openDescriptorCount();
  {
    QNCProcessInstanceManager lManager(mDir.file("no/such/dir.pid").c_str());
    EXPECT_THROW(lManager.markAsRunning(), QNCOpenFailedEx);
    EXPECT_THROW(lManager.isAnInstanceRunning(), QNCOpenFailedEx);
    lManager.exitCleanup();  // nothing held: no effect

    qntest::writeFile(mPidFile, pidBytes(getpid()) + "tail");
    EXPECT_NO_THROW(lManager.getProcStatusFromPidFile(mPidFile.c_str()));
    // Two bytes of our own id would read as a small, possibly living pid: a short file names none,
    // and the failure to find it reaches the caller.
    qntest::writeFile(mPidFile, pidBytes(getpid()).substr(0, 2));
    EXPECT_THROW(lManager.getProcStatusFromPidFile(mPidFile.c_str()), QNCClibGetProcStatusFailedEx);
    EXPECT_THROW(lManager.getProcStatusFromPidFile(mDir.file("missing.pid").c_str()), QNCOpenFailedEx);
  }
  EXPECT_EQ(lDescriptors, openDescriptorCount());
}

// --- Real instances.

class InstanceProcessTest : public InstanceManagerTest {
 protected:
  struct Tool {
    pid_t mPid;
    std::string mOut, mErr, mLog;
  };

  // Starts a tool; given acrReady, waits until it has printed that word (it does once it holds
  // the instance or the lock).
  Tool start(const std::string& acrAction, const std::string& acrReady = "",
             std::vector<std::string> aExtra = {}) {
    const std::string lName = "tool" + std::to_string(mCount++);
    Tool lTool{0, mDir.file(lName + ".out"), mDir.file(lName + ".err"), mDir.file(lName + ".log")};
    std::vector<std::string> lArgv = {qntest::builtProgram("tests/qn_instance_tool"), acrAction, mPidFile,
                                      lTool.mLog};
    lArgv.insert(lArgv.end(), aExtra.begin(), aExtra.end());
    lTool.mPid = qntest::spawn(lArgv, {}, lTool.mOut, lTool.mErr);
    if (!acrReady.empty()) {
      EXPECT_TRUE(qntest::waitForText(lTool.mOut, acrReady)) << qntest::readFile(lTool.mErr);
    }
    return lTool;
  }

  // Ends a holding tool with SIGTERM; it must leave cleanly.
  static void stop(const Tool& acrTool) {
    kill(acrTool.mPid, SIGTERM);
    EXPECT_EQ(0, qntest::waitExit(acrTool.mPid));
  }

  int mCount = 0;
};

// The first instance asks getProcStatus() about its own PID file, which opens and closes it.
// Were the lock a classic fcntl lock, owned by the process, that close would release it and the
// second start would succeed.
TEST_F(InstanceProcessTest, FirstStartHoldsTheFileSecondFailsAndKillEndsTheFirst) {
  // The manager asks for 0640; with the usual umask 022 the file would show the same bits, so
  // the child runs under umask 0 (as a daemon does) and the mode is exactly what was asked for.
  const mode_t lOldMask = umask(0);
  Tool lFirst = start("hold", "running", {"--probe-own"});
  umask(lOldMask);
  struct stat lStat;
  ASSERT_EQ(0, stat(mPidFile.c_str(), &lStat));
  EXPECT_EQ(0640u, lStat.st_mode & 07777);
  EXPECT_EQ(pidBytes(lFirst.mPid), qntest::readFile(mPidFile));

  Tool lSecond = start("hold");
  EXPECT_EQ(1, qntest::waitExit(lSecond.mPid));
  EXPECT_NE(
      std::string::npos,
      qntest::readFile(lSecond.mErr).find("error: Cannot mark running.. found another instance (code 10)"));
  EXPECT_NE(std::string::npos, qntest::readFile(lSecond.mLog).find("Another instance is already running"));
  EXPECT_EQ(pidBytes(lFirst.mPid), qntest::readFile(mPidFile));
  EXPECT_TRUE(lockedByOther(mPidFile));

  Tool lKiller = start("kill");
  EXPECT_EQ(0, qntest::waitExit(lKiller.mPid)) << qntest::readFile(lKiller.mErr);
  EXPECT_EQ(0, qntest::waitExit(lFirst.mPid)) << "the instance did not end on SIGTERM by itself";
  const std::string lLog = qntest::readFile(lKiller.mLog);
  EXPECT_NE(std::string::npos,
            lLog.find("Instance with pid : " + std::to_string(lFirst.mPid) + " is terminated successfully"))
      << lLog;
  EXPECT_FALSE(lockedByOther(mPidFile));
  EXPECT_EQ(pidBytes(lFirst.mPid), qntest::readFile(mPidFile));  // never deleted or cleared
}

// Also pins a lost id: A and B find no file; A creates it, locks, writes its id and runs on; B's
// creating open then truncated the file to nothing before B found the lock held and gave up.
TEST_F(InstanceProcessTest, TwentySimultaneousStartsLeaveExactlyOneRunning) {
  const std::string lGo = mDir.file("go");
  std::vector<Tool> lTools;
  for (int lIndex = 0; lIndex < 20; ++lIndex) lTools.push_back(start("hold", "", {"--go", lGo}));
  qntest::writeFile(lGo, "");

  // The losers end by themselves, cleanly (an exception of the family reported, not a crash); the
  // winner runs until stopped. The file may name a loser for a moment (one that wrote its id in
  // the winner's reopening gap), so the winner is found by who keeps running, not by the file.
  std::vector<int> lStatus(lTools.size(), -1);
  size_t lEnded = 0;
  const auto lDeadline = std::chrono::steady_clock::now() + seconds(60);
  while (lEnded + 1 < lTools.size() && std::chrono::steady_clock::now() < lDeadline) {
    for (size_t lIndex = 0; lIndex < lTools.size(); ++lIndex) {
      int lRaw = 0;
      if (lStatus[lIndex] == -1 && waitpid(lTools[lIndex].mPid, &lRaw, WNOHANG) == lTools[lIndex].mPid) {
        lStatus[lIndex] = WIFEXITED(lRaw) ? WEXITSTATUS(lRaw) : 128 + WTERMSIG(lRaw);
        ++lEnded;
      }
    }
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
  }
  const Tool* lpWinner = nullptr;
  for (size_t lIndex = 0; lIndex < lTools.size(); ++lIndex) {
    if (lStatus[lIndex] == -1) {
      EXPECT_EQ(nullptr, lpWinner) << "two starts are running";
      lpWinner = &lTools[lIndex];
    } else {
      EXPECT_EQ(1, lStatus[lIndex]);
      EXPECT_EQ(0u, qntest::readFile(lTools[lIndex].mErr).find("error: ")) << qntest::readFile(lTools[lIndex].mErr);
    }
  }
  ASSERT_NE(nullptr, lpWinner) << "no start is running";
  EXPECT_TRUE(qntest::waitForText(lpWinner->mOut, "running"));
  EXPECT_TRUE(lockedByOther(mPidFile));
  EXPECT_EQ(pidBytes(lpWinner->mPid), qntest::readFile(mPidFile));
  stop(*lpWinner);
}

// Takes about ten seconds: ten lock attempts one second apart. The instance that would not stop
// is then killed outright, which frees the file for the next start without a word from it.
TEST_F(InstanceProcessTest, KillGivesUpOnAnInstanceIgnoringSigtermAndSigkillFreesTheFile) {
  Tool lStubborn = start("hold-stubborn", "running");
  qntest::writeFile(mPidFile, qntest::readFile(mPidFile) + "extra");
  Tool lKiller = start("kill");
  EXPECT_EQ(0, qntest::waitExit(lKiller.mPid, seconds(30))) << qntest::readFile(lKiller.mErr);
  const std::string lLog = qntest::readFile(lKiller.mLog);
  EXPECT_NE(std::string::npos,
            lLog.find("Failed in terminating Instance with pid " + std::to_string(lStubborn.mPid)))
      << lLog;
  EXPECT_EQ(10u, qntest::countOf(lLog, "Sleep for 1 second..."));
  EXPECT_TRUE(lockedByOther(mPidFile));  // still running, still the instance

  kill(lStubborn.mPid, SIGKILL);
  EXPECT_EQ(128 + SIGKILL, qntest::waitExit(lStubborn.mPid));
  Tool lNext = start("hold", "running");
  EXPECT_EQ(pidBytes(lNext.mPid) + "extra", qntest::readFile(mPidFile));
  stop(lNext);
}

// The lock is held (here by this test itself) but the file names no process: 2 bytes, or id 0.
// Read on as an int, the 2 bytes name this test when its id is below 65536; kill(0, ...) would
// signal the killer's process group, which this test belongs to. Either mistake ends the test.
TEST_F(InstanceProcessTest, KillSignalsNobodyForAShortOrZeroId) {
  for (const std::string& acrContents : {pidBytes(getpid()).substr(0, 2), pidBytes(0)}) {
    SCOPED_TRACE(acrContents.size());
    qntest::writeFile(mPidFile, acrContents);
    const int lHolder = open(mPidFile.c_str(), O_RDWR);
    OsLockFile(lHolder);
    Tool lKiller = start("kill");
    EXPECT_EQ(1, qntest::waitExit(lKiller.mPid));
    EXPECT_NE(std::string::npos,
              qntest::readFile(lKiller.mErr).find("error: Failed to terminate running instance (code 488)"));
    EXPECT_EQ(std::string::npos, qntest::readFile(lKiller.mLog).find("Attempting to kill"));
    close(lHolder);
  }
}
}  // namespace
