// The command line and configuration file of the real qnsensord, run as a process.

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstring>
#include <string>
#include <thread>
#include <vector>

#include "TestSupport.h"

namespace {

struct QnsensordRun {
  pid_t mPid = 0;
  int mStatus = -1;
  std::string mStdout;
  std::string mStderr;
  std::string mLog;
};

class QnsensordCommandLineTest : public ::testing::Test {
 protected:
  // Runs qnsensord with its log in this test's directory. A service that starts keeps running:
  // it is stopped with SIGTERM once its first sample is processed (a second after its signal
  // handlers are installed), or after 5 s when its log level hides that line.
  QnsensordRun run(const std::vector<std::string>& acrArguments, bool aFreshLog = true) {
    std::vector<std::string> lArgv{qntest::builtProgram("examples/qnsensord")};
    lArgv.insert(lArgv.end(), acrArguments.begin(), acrArguments.end());
    // The log is appended to: an earlier run's lines would be taken for this run's.
    if (aFreshLog) std::remove(logPath().c_str());
    const size_t lLogBefore = qntest::readFile(logPath()).size();
    QnsensordRun lRun;
    lRun.mPid = qntest::spawn(lArgv, {"QN_LOG_DIR=" + mDir.path()}, mDir.file("stdout"), mDir.file("stderr"));
    lRun.mStatus = endOfRun(lRun.mPid, lLogBefore);
    lRun.mStdout = qntest::readFile(mDir.file("stdout"));
    lRun.mStderr = qntest::readFile(mDir.file("stderr"));
    lRun.mLog = qntest::readFile(logPath());
    return lRun;
  }

  // Only log text past aLogBefore counts: a daemon started earlier may share the log.
  int endOfRun(pid_t aPid, size_t aLogBefore) const {
    const auto lDeadline = std::chrono::steady_clock::now() + std::chrono::seconds(5);
    while (std::chrono::steady_clock::now() < lDeadline) {
      int lStatus = 0;
      if (waitpid(aPid, &lStatus, WNOHANG) == aPid) {
        return WIFEXITED(lStatus) ? WEXITSTATUS(lStatus) : 128 + WTERMSIG(lStatus);
      }
      const std::string lLog = qntest::readFile(logPath());
      if (lLog.size() > aLogBefore && contains(lLog.substr(aLogBefore), "qnsensord running")) break;
      std::this_thread::sleep_for(std::chrono::milliseconds(20));
    }
    kill(aPid, SIGTERM);
    return qntest::waitExit(aPid);
  }

  std::string logPath() const { return mDir.file("qnsensord.log"); }

  // Waits until a process that is not our child (a daemon) is gone. A zombie counts as gone:
  // whoever adopted it reaps it.
  static bool isGone(pid_t aPid) {
    for (int lTry = 0; lTry < 500; ++lTry) {
      const std::string lStat = qntest::readFile("/proc/" + std::to_string(aPid) + "/stat");
      const size_t lState = lStat.rfind(')');
      if (lStat.empty() || (lState != std::string::npos && lStat.compare(lState, 3, ") Z") == 0)) return true;
      std::this_thread::sleep_for(std::chrono::milliseconds(20));
    }
    return false;
  }

  std::string writeConfig(const std::string& acrContents) {
    const std::string lPath = mDir.file("qnsensord.conf");
    qntest::writeFile(lPath, acrContents);
    return lPath;
  }

  static bool contains(const std::string& acrText, const std::string& acrPart) {
    return acrText.find(acrPart) != std::string::npos;
  }

  // Lines written after applySettings come from the process that was started: it stayed in front.
  static bool ranInFront(const QnsensordRun& acrRun) {
    return contains(acrRun.mLog, "[" + std::to_string(acrRun.mPid) + "] init");
  }

  bool hasPidFile() const { return access(mDir.file("qnsensord.pid").c_str(), F_OK) == 0; }

  qntest::TempDir mDir;
};

TEST_F(QnsensordCommandLineTest, VersionIsPrintedAloneEvenWithHelp) {
  for (const std::vector<std::string>& lrArguments :
       std::vector<std::vector<std::string>>{{"-v"}, {"-v", "-h"}}) {
    const QnsensordRun lRun = run(lrArguments);
    EXPECT_EQ(0, lRun.mStatus);
    EXPECT_EQ("qnsensord v1.0.0", lRun.mStdout);
  }
}

// -h ends the process before -s looks for an instance: looking would create the PID file.
TEST_F(QnsensordCommandLineTest, HelpBeforeShutdownPrintsHelpAndStopsNothing) {
  const QnsensordRun lRun = run({"-h", "-s"});
  EXPECT_EQ(0, lRun.mStatus);
  EXPECT_EQ(0u, lRun.mStdout.find("usage: qnsensord [-v] [-h] [-s] [-c file] [-d mask]"));
  for (const char* lpOption :
       {"-v", "-h", "-s", "-c file", "-d mask", "-b seconds", "-D true|false", "-I minutes", "-n count"}) {
    EXPECT_TRUE(contains(lRun.mStdout, std::string("\n  ") + lpOption + " ")) << lpOption;
  }
  EXPECT_FALSE(contains(lRun.mStdout, "shutdown successfully"));
  EXPECT_FALSE(hasPidFile());
  EXPECT_EQ("", lRun.mLog) << "help ends the process before the log is opened";
}

// "-s" with nothing running ends quietly with status 0; without arguments the service becomes a
// daemon that holds the PID file, and "-s" from another process stops it.
TEST_F(QnsensordCommandLineTest, NoArgumentsStartADaemonThatShutdownStops) {
  const QnsensordRun lNothing = run({"-s"});
  EXPECT_EQ(0, lNothing.mStatus);
  EXPECT_EQ("", lNothing.mStdout);
  EXPECT_TRUE(hasPidFile()) << "looking for an instance creates the PID file";

  // The starting process ends by itself once the daemon has started (run() would stop it).
  const pid_t lStarter =
      qntest::spawn({qntest::builtProgram("examples/qnsensord")}, {"QN_LOG_DIR=" + mDir.path()},
                    mDir.file("stdout"), mDir.file("stderr"));
  EXPECT_EQ(0, qntest::waitExit(lStarter)) << "the starting process leaves once the daemon has started";
  ASSERT_TRUE(qntest::waitForText(logPath(), "qnsensord running")) << qntest::readFile(logPath());
  const std::string lLog = qntest::readFile(logPath());
  EXPECT_TRUE(contains(lLog, "Running the current process in the background as daemon"));
  const std::string lPidFile = qntest::readFile(mDir.file("qnsensord.pid"));
  ASSERT_EQ(sizeof(pid_t), lPidFile.size());
  pid_t lDaemon = 0;
  std::memcpy(&lDaemon, lPidFile.data(), sizeof lDaemon);
  EXPECT_NE(lStarter, lDaemon);
  EXPECT_TRUE(contains(lLog, "[" + std::to_string(lDaemon) + "] init")) << lLog;

  const QnsensordRun lStop = run({"-s"}, false);
  EXPECT_EQ(0, lStop.mStatus) << lStop.mStderr;
  EXPECT_EQ("qnsensord shutdown successfully.\n", lStop.mStdout);
  if (!isGone(lDaemon)) {
    kill(lDaemon, SIGKILL);
    ADD_FAILURE() << "the daemon survived -s";
  }
}

// -D false keeps the service in front; -n, the application's own option, is checked and used.
TEST_F(QnsensordCommandLineTest, DaemonizeFalseStaysInFrontAndChannelCountIsCheckedAndUsed) {
  QnsensordRun lRun = run({"-D", "false", "-n", "3"});
  EXPECT_EQ(0, lRun.mStatus) << lRun.mStderr;
  EXPECT_TRUE(ranInFront(lRun)) << lRun.mLog;
  EXPECT_FALSE(contains(lRun.mLog, "Running the current process in the background as daemon"));
  EXPECT_TRUE(contains(lRun.mLog, "Using 3 sensor channels"));
  for (const char* lpBad : {"0", "65", "two"}) {
    lRun = run({"-D", "false", "-n", lpBad});
    EXPECT_EQ(2, lRun.mStatus) << lpBad;
    EXPECT_TRUE(contains(
        lRun.mStderr, std::string("Option '-n' expects a channel count from 1 to 64, got '") + lpBad + "'"))
        << lRun.mStderr;
  }
}

// SysInit reports the missing configuration file at error level, so -E- lines remain.
TEST_F(QnsensordCommandLineTest, DebugLevelEightLeavesOnlyErrorLines) {
  const QnsensordRun lRun = run({"-D", "false", "-d", "8"});
  EXPECT_EQ(0, lRun.mStatus) << lRun.mStderr;
  EXPECT_TRUE(contains(lRun.mLog, " -E- "));
  for (const char* lpTag : {" -H- ", " -W- ", " -N- ", " -I- ", " -T- "})
    EXPECT_FALSE(contains(lRun.mLog, lpTag)) << lpTag;
}

TEST_F(QnsensordCommandLineTest, ConfigFileSuppliesTheStartUpSettings) {
  // 96 = notice + info: no trace lines; -d 8 and -D true on the command line are not read.
  const std::string lPath = writeConfig(
      "# test configuration\n"
      "DebugLevel = 96\n"
      "\n"
      "HbTimeout = 45\n"
      "Daemonize = 0\n"
      "ChannelCount = 5\n");
  const QnsensordRun lRun = run({"-c", lPath, "-d", "8", "-D", "true"});
  EXPECT_EQ(0, lRun.mStatus) << lRun.mStderr;
  EXPECT_TRUE(contains(lRun.mLog, "Applying 'DebugLevel' setting to 96"));
  EXPECT_TRUE(contains(lRun.mLog, "Applying 'HbTimeout' setting to 45"));
  EXPECT_TRUE(contains(lRun.mLog, "Using 5 sensor channels"));
  EXPECT_TRUE(ranInFront(lRun)) << "Daemonize = 0 keeps it in front";
  EXPECT_TRUE(contains(lRun.mLog, " -N- "));
  EXPECT_FALSE(contains(lRun.mLog, " -T- "));
}

// The commented sample shipped beside the example must stay a file qnsensord accepts.
TEST_F(QnsensordCommandLineTest, ShippedSampleConfigurationStartsTheService) {
  const QnsensordRun lRun = run({"-c", std::string(QN_SOURCE_DIR) + "/examples/qnsensord.conf"});
  EXPECT_EQ(0, lRun.mStatus) << lRun.mStderr;
  EXPECT_TRUE(ranInFront(lRun)) << lRun.mLog;
}

// A file that lacks a required key or holds a bad line ends start-up with a message naming the
// file (and the line); nothing starts.
TEST_F(QnsensordCommandLineTest, IncompleteOrMalformedConfigFileStopsStartUp) {
  const std::vector<std::pair<std::string, std::string>> lCases = {
      {"DebugLevel = 255\nDaemonize = 0\n", ": 'HbTimeout' is not set"},
      {"DebugLevel = 255\nHbTimeout = 30\nDaemonize\n", ":3:"},
      {"DebugLevel = 255\nHbTimeout = soon\nDaemonize = 0\n",
       ":2: HbTimeout: 'soon' is not an unsigned integer"},
      {"DebugLevel = 255\nHbTimeout = 30\nDaemonize = 0\nDebugLevl = 8\n", ":4: unknown key 'DebugLevl'"},
  };
  for (const auto& lrCase : lCases) {
    SCOPED_TRACE(lrCase.second);
    const std::string lPath = writeConfig(lrCase.first);
    const QnsensordRun lRun = run({"-c", lPath});
    EXPECT_NE(0, lRun.mStatus);
    EXPECT_TRUE(contains(lRun.mStderr, lPath + lrCase.second)) << lRun.mStderr;
    EXPECT_FALSE(contains(lRun.mLog, "init")) << "nothing may start without a valid file";
  }
}

// The whole line is checked before any option is acted on (-v would print and end the process,
// -s would look for an instance); the log is opened and the PID file locked only after that.
TEST_F(QnsensordCommandLineTest, BadCommandLineIsAUsageErrorWithNothingStarted) {
  const std::vector<std::pair<std::vector<std::string>, std::string>> lCases = {
      {{"-s", "-x"}, "qnsensord: Unknown option '-x'\n"},
      {{"-v", "now"}, "qnsensord: Option '-v' takes no value, got 'now'\n"},
      {{"-D", "false", "-d"}, "qnsensord: Option '-d' needs a value\n"},
      {{"-c", "/nonexistent.conf", "-n", "3"}, "qnsensord: Option '-n' cannot be combined with -c"},
  };
  for (const auto& lrCase : lCases) {
    const QnsensordRun lRun = run(lrCase.first);
    EXPECT_EQ(2, lRun.mStatus) << lrCase.second;
    EXPECT_EQ(0u, lRun.mStderr.find(lrCase.second)) << lRun.mStderr;
    EXPECT_TRUE(contains(lRun.mStderr, "\nusage: qnsensord [-v]")) << lRun.mStderr;
    EXPECT_EQ("", lRun.mLog);
    EXPECT_FALSE(hasPidFile());
  }
}

}  // namespace
