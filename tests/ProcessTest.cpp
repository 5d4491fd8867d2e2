// The process as a whole: the single running instance (the PID file, its lock, stopping the
// running instance), waiting with an eye on the exit flag, and the start-up and shut-down driver
// in a real process. In-process cases use several managers on one file (open-file-description
// locks make them conflict like separate processes); process cases start qn_test_helper as real
// instances and as a service. (Daemonizing: DaemonStartTest, with the real daemon.) Last, the
// signal dispatcher the driver's handlers run on.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <pthread.h>
#include <signal.h>
#include <string.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <condition_variable>
#include <functional>
#include <mutex>
#include <thread>

#include "LogSupport.h"
#include "Os.h"
#include "SignalHandler.h"
#include "TableSystem.h"
#include "TestSupport.h"

namespace {
using qntest::expectInOrder;
using qntest::lockedByOther;
using qntest::readFile;
using std::chrono::seconds;

// The 4 bytes a PID file holds for aPid: little-endian, whatever the host order.
std::string pidBytes(int aPid) {
  std::string lBytes;
  for (int lShift = 0; lShift < 32; lShift += 8) lBytes += static_cast<char>((aPid >> lShift) & 0xff);
  return lBytes;
}

class InstanceTest : public ::testing::Test {
 protected:
  struct Tool {
    qntest::Child mChild;
    std::string mOut, mErr, mLog;
  };

  // Starts the helper in an instance mode; given acrReady, waits until it has printed that word.
  Tool start(const std::string& acrMode, const std::string& acrReady = "", const std::string& acrGo = "") {
    const std::string lName = "tool" + std::to_string(mCount++);
    Tool lTool{qntest::Child(), mDir.file(lName + ".out"), mDir.file(lName + ".err"),
               mDir.file(lName + ".log")};
    std::vector<std::string> lArgs = {acrMode, mPidFile, lTool.mLog};
    if (!acrGo.empty()) lArgs.push_back(acrGo);
    lTool.mChild = qntest::Child(qntest::spawnHelper(lArgs, lTool.mOut, lTool.mErr));
    EXPECT_TRUE(acrReady.empty() || qntest::waitForText(lTool.mOut, acrReady)) << readFile(lTool.mErr);
    return lTool;
  }

  qntest::TempDir mDir;
  std::string mPidFile = mDir.file("service.pid");
  int mCount = 0;
};

// Several managers in one process stand for several processes. The second one finds the file
// naming this very process, where kill(getpid(), SIGTERM) would end the instance that asked.
TEST_F(InstanceTest, SecondManagerNeverSignalsItsOwnProcess) {
  QNCProcessInstanceManager lRunning(mPidFile.c_str());
  lRunning.markAsRunning();
  QNCProcessInstanceManager lSecond(mPidFile.c_str());
  EXPECT_TRUE(lSecond.isAnInstanceRunning());
  EXPECT_EQ("Failed to terminate running instance (code 488)",
            qntest::thrown<QNCTerminateFailedEx>([&] { lSecond.killRunningInstance(); }, true));
  lRunning.exitCleanup();
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

TEST_F(InstanceTest, StartInTheReopeningGapNeverLeavesTheFileNamingTheWrongProcess) {
  const std::string lIntruderId = pidBytes(0x01020304);
  GapManager lWinner(mPidFile, [&] { qntest::writeFile(mPidFile, lIntruderId); });
  lWinner.markAsRunning();
  EXPECT_EQ(pidBytes(getpid()), readFile(mPidFile));
  lWinner.exitCleanup();
  int lIntruderFd = -1;
  GapManager lLoser(mPidFile, [&] {
    lIntruderFd = open(mPidFile.c_str(), O_RDWR);
    OsLockFile(lIntruderFd);
    ASSERT_EQ(4, pwrite(lIntruderFd, lIntruderId.data(), 4, 0));
  });
  // The refusal names the descriptor and the file.
  const std::string lRefusal = qntest::thrown<QNCFileLockFailedEx>([&] { lLoser.markAsRunning(); }, true);
  EXPECT_EQ(0u, lRefusal.find("fcntl(F_OFD_SETLK) fd ")) << lRefusal;
  EXPECT_NE(std::string::npos, lRefusal.find(" '" + mPidFile + "' (locked by another process): "))
      << lRefusal;
  EXPECT_EQ(lIntruderId, readFile(mPidFile));
  close(lIntruderFd);
}

// Also pins a lost id: A and B find no file; A creates it, locks, writes its id and runs on; B's
// creating open then truncated the file to nothing before B found the lock held and gave up.
TEST_F(InstanceTest, TwentySimultaneousStartsLeaveExactlyOneRunning) {
  const std::string lGo = mDir.file("go");
  std::vector<Tool> lTools;
  for (int lIndex = 0; lIndex < 20; ++lIndex) lTools.push_back(start("hold", "", lGo));
  qntest::writeFile(lGo, "");
  // The winner says so and runs until stopped; the losers end by themselves with an error of
  // the family (a second winner would run on and be killed at the time-out). The file may name
  // a loser for a moment, so it is read once they have all ended.
  const Tool* lpWinner = nullptr;
  for (int lTry = 0; lTry < 3000 && lpWinner == nullptr; ++lTry, usleep(20 * 1000))
    for (const Tool& lrTool : lTools)
      if (readFile(lrTool.mOut).find("running") != std::string::npos) lpWinner = &lrTool;
  ASSERT_NE(nullptr, lpWinner) << "no start is running";
  const auto lDeadline = std::chrono::steady_clock::now() + seconds(10);  // for all of them
  for (Tool& lrTool : lTools) {
    if (&lrTool == lpWinner) continue;
    const auto lLeft =
        std::chrono::duration_cast<std::chrono::milliseconds>(lDeadline - std::chrono::steady_clock::now());
    EXPECT_EQ(1, lrTool.mChild.exit(std::max(lLeft, std::chrono::milliseconds(0))));
    EXPECT_EQ(0u, readFile(lrTool.mErr).find("error: ")) << readFile(lrTool.mErr);
  }
  EXPECT_EQ(pidBytes(lpWinner->mChild.pid()), readFile(mPidFile));
}

// Takes about ten seconds: ten lock attempts one second apart. The instance that would not stop
// is then killed outright, which frees the file for the next start without a word from it.
TEST_F(InstanceTest, KillGivesUpOnAnInstanceIgnoringSigtermAndSigkillFreesTheFile) {
  Tool lStubborn = start("hold-stubborn", "running");
  qntest::writeFile(mPidFile, readFile(mPidFile) + "extra");
  Tool lKiller = start("kill");
  EXPECT_EQ(0, lKiller.mChild.exit(seconds(30))) << readFile(lKiller.mErr);
  const std::string lLog = readFile(lKiller.mLog);
  EXPECT_NE(std::string::npos,
            lLog.find("Failed in terminating Instance with pid " + std::to_string(lStubborn.mChild.pid())));
  EXPECT_EQ(10u, qntest::countOf(lLog, "Sleep for 1 second..."));
  EXPECT_TRUE(lockedByOther(mPidFile));  // still running, still the instance
  kill(lStubborn.mChild.pid(), SIGKILL);
  EXPECT_EQ(128 + SIGKILL, lStubborn.mChild.exit());
  Tool lNext = start("hold", "running");
  const pid_t lNextPid = lNext.mChild.pid();
  kill(lNextPid, SIGTERM);
  EXPECT_EQ(0, lNext.mChild.exit());
  EXPECT_NE(std::string::npos, readFile(lNext.mOut).find("stopped"));
  // Written over without truncating, and neither deleted nor cleared at the exit.
  EXPECT_EQ(pidBytes(lNextPid) + "extra", readFile(mPidFile));
}

// The lock is held (here by this test itself) but the file names no process: 2 bytes, or id 0.
// Read on as an int, the 2 bytes name this test when its id is below 65536; kill(0, ...) would
// signal the killer's process group, which this test belongs to. Either mistake ends the test.
TEST_F(InstanceTest, KillSignalsNobodyForAShortOrZeroId) {
  for (const std::string& acrContents : {pidBytes(getpid()).substr(0, 2), pidBytes(0)}) {
    qntest::writeFile(mPidFile, acrContents);
    const int lHolder = open(mPidFile.c_str(), O_RDWR);
    OsLockFile(lHolder);
    Tool lKiller = start("kill");
    EXPECT_EQ(1, lKiller.mChild.exit());
    EXPECT_EQ("error: Failed to terminate running instance (code 488)\n", readFile(lKiller.mErr));
    EXPECT_EQ(std::string::npos, readFile(lKiller.mLog).find("Attempting to kill"));
    close(lHolder);
  }
}

// A wait of 12 seconds is checked after 5, 10 and 12: a flag set during the first step must end
// it at the first check, well before the 12 seconds are over. A wait of 0 only checks the flag.
TEST(WaitAndCheckExitTest, ExitFlagEndsTheWaitAtTheNextCheck) {
  qntest::TableSystem lSystem;
  EXPECT_NO_THROW(lSystem.waitAndCheckExit(0));
  std::thread lStopper([&] {
    std::this_thread::sleep_for(seconds(1));
    lSystem.setForExit();
  });
  const auto lStart = std::chrono::steady_clock::now();
  EXPECT_EQ("Process is marked for exit. (code 1)",
            qntest::thrown<QNCHaltEx>([&] { lSystem.waitAndCheckExit(12); }, true));
  const auto lWaited = std::chrono::steady_clock::now() - lStart;
  lStopper.join();
  EXPECT_GE(lWaited, seconds(5));
  EXPECT_LT(lWaited, seconds(9));
  EXPECT_THROW(lSystem.waitAndCheckExit(0), QNCHaltEx);
}

// The driver's whole run in a real process (qn_test_helper as a service): start-up order,
// shut-down on each signal, repeated signals and signals after the run.
const std::vector<std::string> kStartUpSteps = {
    "preInit", "processCommandLine", "parseConfigFile", "applySettings",   "markAsRunning",
    "init",    "createThreads",      "startThreads",    "postThreadsInit", "createStartUpEvent",
};

class DriverProcessTest : public ::testing::Test {
 protected:
  // The service (mService), once it has said it runs.
  pid_t startRunning(const std::vector<std::string>& acrArguments) {
    mService = qntest::Child(
        qntest::spawnHelper(acrArguments, stdoutPath(), mDir.file("stderr"), {"QN_LOG_DIR=" + mDir.path()}));
    EXPECT_TRUE(qntest::waitForText(stdoutPath(), "running\n")) << "never running; output:\n" << output();
    return mService.pid();
  }

  std::string stdoutPath() const { return mDir.file("stdout"); }
  std::string output() const { return qntest::readFile(stdoutPath()); }
  std::string log() const { return qntest::readFile(mDir.file("driver_app.log")); }

  qntest::TempDir mDir;
  qntest::Child mService;
};

// The whole run, the driver's own lines between the application's steps. The service's
// parseConfigFile is not implemented: that is logged once, as an error, and start-up goes on.
class DriverSignalTest : public DriverProcessTest, public ::testing::WithParamInterface<int> {};

TEST_P(DriverSignalTest, SignalShutsDownInOrder) {
  const pid_t lPid = startRunning({"run"});
  ASSERT_EQ(0, kill(lPid, GetParam()));
  ASSERT_EQ(0, mService.exit()) << output();
  const std::string lLog = log();
  std::vector<std::string> lExpected;
  for (const auto& lStep : kStartUpSteps) lExpected.push_back("step " + lStep);
  lExpected.insert(lExpected.end(),
                   {"step waitForThreads", "step makeThreadsToExit", "All threads have gracefully exited",
                    "step exitInstanceManagement", "Destroying System", "step destroy", "step postDestroy",
                    "step destructor", "Destroying the Logger. You won't see any more logs!"});
  expectInOrder(lLog, lExpected);
  // The driver's own lines between the steps.
  expectInOrder(lLog,
                {"step parseConfigFile", "Config file parsing not implemented.", "step applySettings",
                 "Creating the logger", "step markAsRunning", "Initializing the system data", "step init",
                 "Creating the threads", "step createThreads", "Waiting for threads to exit...",
                 "step waitForThreads", "All threads have gracefully exited",
                 "Going to unmark itself as singleton running process", "step exitInstanceManagement"});
  EXPECT_EQ(1u, qntest::countOf(lLog, "Config file parsing not implemented."));
  EXPECT_EQ("-E-", qntest::levelOf(lLog, "Config file parsing not implemented."));
  EXPECT_NE(std::string::npos, output().find("exit request 1 self\n"))
      << "the handler must reach the registered object, which must still be registered";
  EXPECT_NE(std::string::npos, output().find("SystemMain returned\n"));
  // After the log is closed an urgent line still reaches standard error, the only line there
  // (a trace is dropped).
  const std::string lErr = readFile(mDir.file("stderr"));
  EXPECT_EQ(1u, qntest::countOf(lErr, "\n")) << lErr;
  EXPECT_NE(std::string::npos, lErr.find(") urgent after the log was closed\n")) << lErr;
}

INSTANTIATE_TEST_SUITE_P(EachShutDownSignal, DriverSignalTest, ::testing::Values(SIGTERM, SIGINT, SIGHUP),
                         [](const ::testing::TestParamInfo<int>& acrInfo) {
                           return "SIG" + std::string(sigabbrev_np(acrInfo.param));
                         });

// Each SIGINT repeats the exit request; the service here ends only after the second one, so a
// lost or ignored second request hangs it and the wait below fails. Signals that come after
// SystemMain has returned must neither end the process nor reach the destroyed object. This
// service's parseConfigFile succeeds: then the driver has nothing to report about it.
TEST_F(DriverProcessTest, TwoInterruptsShutDownOnceAndLaterSignalsAreIgnored) {
  const pid_t lPid = startRunning({"linger", "2"});
  ASSERT_EQ(0, kill(lPid, SIGINT));
  // Signals of one kind do not queue: the second is sent once the first has been handled.
  ASSERT_TRUE(qntest::waitForText(stdoutPath(), "exit request 1 self\n")) << output();
  ASSERT_EQ(0, kill(lPid, SIGINT));
  ASSERT_TRUE(qntest::waitForText(stdoutPath(), "SystemMain returned\n")) << output();
  for (const int lSignal : {SIGINT, SIGTERM, SIGHUP}) ASSERT_EQ(0, kill(lPid, lSignal));
  EXPECT_EQ(0, mService.exit()) << output();

  EXPECT_NE(std::string::npos, output().find("exit request 2 self\n"));
  EXPECT_NE(std::string::npos, output().find("lingered\n"));
  EXPECT_EQ(2u, qntest::countOf(output(), "exit request")) << "a handler reached the destroyed object";
  EXPECT_EQ(1u, qntest::countOf(output(), "destructor\n"));
  const std::string lLog = log();
  EXPECT_EQ(1u, qntest::countOf(lLog, "Destroying System"));
  EXPECT_EQ(1u, qntest::countOf(lLog, "Destroying the Logger. You won't see any more logs!"));
  EXPECT_EQ(std::string::npos, lLog.find("Config file parsing not implemented."));
}

// --- The signal dispatcher.
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
