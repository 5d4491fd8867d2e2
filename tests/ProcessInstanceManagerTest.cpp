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
#include <string>
#include <thread>
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

// A pid that certainly named no living process a moment ago.
int deadPid() {
  const pid_t lPid = qntest::spawn({"/bin/true"});
  qntest::waitExit(lPid);
  return static_cast<int>(lPid);
}

class InstanceManagerTest : public ::testing::Test {
 protected:
  qntest::TempDir mDir;
  std::string mPidFile = mDir.file("service.pid");
};

TEST_F(InstanceManagerTest, FirstQueryCreatesAnEmptyFileAndFindsNoInstance) {
  QNCProcessInstanceManager lManager(mPidFile.c_str());
  EXPECT_FALSE(lManager.isAnInstanceRunning());
  struct stat lStat;
  ASSERT_EQ(0, stat(mPidFile.c_str(), &lStat));
  EXPECT_EQ(0, lStat.st_size);
  lManager.killRunningInstance();  // "No instance running... cannot kill": returns quietly
  EXPECT_FALSE(lockedByOther(mPidFile));
}

TEST_F(InstanceManagerTest, SecondManagerSeesTheInstanceUntilItIsReleased) {
  QNCProcessInstanceManager lRunning(mPidFile.c_str());
  lRunning.markAsRunning();
  EXPECT_EQ(pidBytes(getpid()), qntest::readFile(mPidFile));

  QNCProcessInstanceManager lSecond(mPidFile.c_str());
  EXPECT_TRUE(lSecond.isAnInstanceRunning());
  EXPECT_EQ("Cannot mark running.. found another instance (code 10)",
            qntest::thrown<QNCExistsEx>([&] { lSecond.markAsRunning(); }, true));
  EXPECT_EQ(pidBytes(getpid()), qntest::readFile(mPidFile));
  EXPECT_TRUE(lockedByOther(mPidFile));

  lRunning.exitCleanup();
  EXPECT_FALSE(lockedByOther(mPidFile));
  QNCProcessInstanceManager lThird(mPidFile.c_str());
  EXPECT_FALSE(lThird.isAnInstanceRunning());
}

// The file names this very process (a second manager in the instance): kill(getpid(), SIGTERM)
// would end the instance that asked.
TEST_F(InstanceManagerTest, KillRefusesToSignalItsOwnProcess) {
  QNCProcessInstanceManager lRunning(mPidFile.c_str());
  lRunning.markAsRunning();
  QNCProcessInstanceManager lKiller(mPidFile.c_str());
  EXPECT_NE(
      std::string::npos,
      qntest::thrown<QNCTerminateFailedEx>([&] { lKiller.killRunningInstance(); }, true).find("(code 488)"));
  EXPECT_TRUE(lKiller.isAnInstanceRunning());
  EXPECT_TRUE(lockedByOther(mPidFile));
}

TEST_F(InstanceManagerTest, ProcStatusReadsTheIdAndAlwaysClosesItsDescriptor) {
  QNCProcessInstanceManager lManager(mPidFile.c_str());
  const int lDescriptors = openDescriptorCount();

  qntest::writeFile(mPidFile, pidBytes(getpid()) + "tail");
  EXPECT_NO_THROW(lManager.getProcStatusFromPidFile(mPidFile.c_str()));

  qntest::writeFile(mPidFile, pidBytes(deadPid()));
  EXPECT_THROW(lManager.getProcStatusFromPidFile(mPidFile.c_str()), QNCClibGetProcStatusFailedEx);

  // Two bytes of our own id would read as a small, possibly living pid: a short file names none.
  qntest::writeFile(mPidFile, pidBytes(getpid()).substr(0, 2));
  EXPECT_THROW(lManager.getProcStatusFromPidFile(mPidFile.c_str()), QNCClibGetProcStatusFailedEx);

  EXPECT_THROW(lManager.getProcStatusFromPidFile(mDir.file("missing.pid").c_str()), QNCOpenFailedEx);
  EXPECT_EQ(lDescriptors, openDescriptorCount());
}

TEST_F(InstanceManagerTest, UnopenableFileFailsAndLeavesNothingOpen) {
  const int lDescriptors = openDescriptorCount();
  {
    QNCProcessInstanceManager lManager(mDir.file("no/such/dir.pid").c_str());
    EXPECT_THROW(lManager.markAsRunning(), QNCOpenFailedEx);
    EXPECT_THROW(lManager.isAnInstanceRunning(), QNCOpenFailedEx);
    lManager.exitCleanup();  // nothing held: no effect
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

  Tool start(const std::string& acrAction, std::vector<std::string> aExtra = {}) {
    const std::string lName = "tool" + std::to_string(mCount++);
    Tool lTool{0, mDir.file(lName + ".out"), mDir.file(lName + ".err"), mDir.file(lName + ".log")};
    std::vector<std::string> lArgv = {qntest::builtProgram("tests/qn_instance_tool"), acrAction, mPidFile,
                                      lTool.mLog};
    lArgv.insert(lArgv.end(), aExtra.begin(), aExtra.end());
    lTool.mPid = qntest::spawn(lArgv, {}, lTool.mOut, lTool.mErr);
    return lTool;
  }

  Tool startRunning(const std::string& acrAction = "hold") {
    Tool lTool = start(acrAction);
    EXPECT_TRUE(qntest::waitForText(lTool.mOut, "running")) << qntest::readFile(lTool.mErr);
    return lTool;
  }

  // Ends a holding tool with SIGTERM; it must leave cleanly.
  static void stop(const Tool& acrTool) {
    kill(acrTool.mPid, SIGTERM);
    EXPECT_EQ(0, qntest::waitExit(acrTool.mPid));
  }

  int mCount = 0;
};

TEST_F(InstanceProcessTest, FirstStartCreatesTheFileWithItsModeAndPid) {
  // The manager asks for 0640; with the usual umask 022 the file would show the same bits, so
  // the child runs under umask 0 (as a daemon does) and the mode is exactly what was asked for.
  const mode_t lOldMask = umask(0);
  Tool lInstance = start("hold");
  umask(lOldMask);
  ASSERT_TRUE(qntest::waitForText(lInstance.mOut, "running")) << qntest::readFile(lInstance.mErr);

  struct stat lStat;
  ASSERT_EQ(0, stat(mPidFile.c_str(), &lStat));
  EXPECT_EQ(0640u, lStat.st_mode & 07777);
  EXPECT_EQ(pidBytes(lInstance.mPid), qntest::readFile(mPidFile));
  EXPECT_TRUE(lockedByOther(mPidFile));

  stop(lInstance);
  EXPECT_FALSE(lockedByOther(mPidFile));
  EXPECT_EQ(pidBytes(lInstance.mPid), qntest::readFile(mPidFile));  // never deleted or cleared
}

TEST_F(InstanceProcessTest, SecondStartFailsAndLeavesTheFirstUntouched) {
  Tool lFirst = startRunning();
  Tool lSecond = start("hold");
  EXPECT_EQ(1, qntest::waitExit(lSecond.mPid));
  EXPECT_NE(std::string::npos,
            qntest::readFile(lSecond.mErr).find("error: Cannot mark running.. found another instance (code 10)"));
  EXPECT_NE(std::string::npos, qntest::readFile(lSecond.mLog).find("Another instance is already running"));

  EXPECT_EQ(pidBytes(lFirst.mPid), qntest::readFile(mPidFile));
  EXPECT_TRUE(lockedByOther(mPidFile));
  stop(lFirst);
}

// getProcStatus() opens and closes the instance's own PID file. Were the lock a classic fcntl
// lock, owned by the process, that close would release it and a second start would succeed.
TEST_F(InstanceProcessTest, ProbingItsOwnPidFileKeepsTheLock) {
  Tool lFirst = start("hold", {"--probe-own"});
  ASSERT_TRUE(qntest::waitForText(lFirst.mOut, "running")) << qntest::readFile(lFirst.mErr);
  Tool lSecond = start("hold");
  EXPECT_EQ(1, qntest::waitExit(lSecond.mPid));
  EXPECT_TRUE(lockedByOther(mPidFile));
  stop(lFirst);
}

// Also pins a lost id: A and B find no file; A creates it, locks, writes its id and runs on; B's
// creating open then truncated the file to nothing before B found the lock held and gave up.
TEST_F(InstanceProcessTest, TwentySimultaneousStartsLeaveExactlyOneRunning) {
  const std::string lGo = mDir.file("go");
  std::vector<Tool> lTools;
  for (int lIndex = 0; lIndex < 20; ++lIndex) lTools.push_back(start("hold", {"--go", lGo}));
  qntest::writeFile(lGo, "");

  // The losers end by themselves; the winner waits for SIGTERM.
  std::vector<int> lStatus(lTools.size(), -1);
  size_t lEnded = 0;
  const auto lDeadline = std::chrono::steady_clock::now() + seconds(30);
  while (lEnded < lTools.size() - 1 && std::chrono::steady_clock::now() < lDeadline) {
    for (size_t lIndex = 0; lIndex < lTools.size(); ++lIndex) {
      int lRaw = 0;
      if (lStatus[lIndex] == -1 && waitpid(lTools[lIndex].mPid, &lRaw, WNOHANG) == lTools[lIndex].mPid) {
        lStatus[lIndex] = WIFEXITED(lRaw) ? WEXITSTATUS(lRaw) : 128 + WTERMSIG(lRaw);
        ++lEnded;
      }
    }
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
  }

  std::vector<size_t> lRunning;
  for (size_t lIndex = 0; lIndex < lTools.size(); ++lIndex) {
    if (lStatus[lIndex] == -1) {
      lRunning.push_back(lIndex);
    } else {
      // Failing cleanly: an exception of the family reported, not a crash.
      EXPECT_EQ(1, lStatus[lIndex]);
      EXPECT_EQ(0u, qntest::readFile(lTools[lIndex].mErr).find("error: ")) << qntest::readFile(lTools[lIndex].mErr);
    }
  }
  ASSERT_EQ(1u, lRunning.size());
  const Tool& lWinner = lTools[lRunning[0]];
  EXPECT_TRUE(qntest::waitForText(lWinner.mOut, "running"));
  EXPECT_TRUE(lockedByOther(mPidFile));
  EXPECT_EQ(pidBytes(lWinner.mPid), qntest::readFile(mPidFile));
  stop(lWinner);
}

TEST_F(InstanceProcessTest, StartAfterSigkillTakesOverAndKeepsLaterBytes) {
  Tool lCrashed = startRunning();
  {
    const int lFd = open(mPidFile.c_str(), O_WRONLY | O_APPEND);
    ASSERT_GE(lFd, 0);
    ASSERT_EQ(5, write(lFd, "extra", 5));
    close(lFd);
  }
  kill(lCrashed.mPid, SIGKILL);
  EXPECT_EQ(128 + SIGKILL, qntest::waitExit(lCrashed.mPid));

  Tool lNext = startRunning();
  EXPECT_EQ(pidBytes(lNext.mPid) + "extra", qntest::readFile(mPidFile));
  stop(lNext);
}

TEST_F(InstanceProcessTest, KillStopsAnInstanceThatEndsOnSigterm) {
  Tool lInstance = startRunning();
  Tool lKiller = start("kill");
  EXPECT_EQ(0, qntest::waitExit(lKiller.mPid)) << qntest::readFile(lKiller.mErr);
  EXPECT_EQ(0, qntest::waitExit(lInstance.mPid));
  EXPECT_NE(std::string::npos, qntest::readFile(lInstance.mOut).find("stopped"));
  const std::string lLog = qntest::readFile(lKiller.mLog);
  EXPECT_NE(std::string::npos,
            lLog.find("Instance with pid : " + std::to_string(lInstance.mPid) + " is terminated successfully"))
      << lLog;
  EXPECT_FALSE(lockedByOther(mPidFile));
}

// Takes about ten seconds: ten lock attempts one second apart.
TEST_F(InstanceProcessTest, KillGivesUpOnAnInstanceIgnoringSigterm) {
  Tool lStubborn = startRunning("hold-stubborn");
  Tool lKiller = start("kill");
  EXPECT_EQ(0, qntest::waitExit(lKiller.mPid, seconds(30))) << qntest::readFile(lKiller.mErr);
  const std::string lLog = qntest::readFile(lKiller.mLog);
  EXPECT_NE(std::string::npos, lLog.find("Failed in terminating Instance with pid " + std::to_string(lStubborn.mPid)))
      << lLog;
  EXPECT_EQ(10u, qntest::countOf(lLog, "Sleep for 1 second..."));
  EXPECT_TRUE(lockedByOther(mPidFile));  // still running, still the instance
  kill(lStubborn.mPid, SIGKILL);
  EXPECT_EQ(128 + SIGKILL, qntest::waitExit(lStubborn.mPid));
}

// An instance that holds the lock but whose file names no process: 2 bytes, or id 0 (kill(0, ...)
// would signal this test's own process group, which the holder and the test belong to).
TEST_F(InstanceProcessTest, KillSignalsNobodyForAShortOrZeroId) {
  for (const std::string& acrContents : {pidBytes(getpid()).substr(0, 2), pidBytes(0)}) {
    SCOPED_TRACE(acrContents.size());
    qntest::writeFile(mPidFile, acrContents);
    Tool lHolder = start("lock-only");
    ASSERT_TRUE(qntest::waitForText(lHolder.mOut, "locked")) << qntest::readFile(lHolder.mErr);
    Tool lKiller = start("kill");
    EXPECT_EQ(1, qntest::waitExit(lKiller.mPid));
    EXPECT_NE(std::string::npos,
              qntest::readFile(lKiller.mErr).find("error: Failed to terminate running instance (code 488)"));
    EXPECT_NE(std::string::npos, qntest::readFile(lKiller.mLog).find("cannot kill"));
    EXPECT_EQ(std::string::npos, qntest::readFile(lKiller.mLog).find("Attempting to kill"));
    EXPECT_EQ(acrContents, qntest::readFile(mPidFile));
    // The holder got no SIGTERM: it still holds the lock, and ends only when we signal it.
    EXPECT_TRUE(lockedByOther(mPidFile));
    stop(lHolder);
  }
}
}  // namespace
