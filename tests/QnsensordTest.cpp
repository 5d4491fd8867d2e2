// The example service qnsensord and its client qnsensor-feed as real processes: the command line,
// the configuration file, and serving readings end to end until -s stops the service.
// (A daemon start and its -s stop: DaemonStartTest.)

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <thread>

#include "LogSupport.h"

namespace {

using qntest::readFile;

class QnsensordTest : public ::testing::Test {
 protected:
  struct Run {
    pid_t mPid = 0;
    int mStatus = -1;
    std::string mStdout, mStderr, mLog;
  };

  pid_t start(const std::string& acrProgram, const std::vector<std::string>& acrArguments,
              const std::string& acrOut) {
    std::vector<std::string> lArgv{qntest::builtProgram("examples/" + acrProgram)};
    lArgv.insert(lArgv.end(), acrArguments.begin(), acrArguments.end());
    return qntest::spawn(lArgv, {"QN_LOG_DIR=" + mDir.path()}, mDir.file(acrOut + ".out"),
                         mDir.file(acrOut + ".err"));
  }

  // Runs qnsensord to its end. One that starts to serve is stopped with SIGTERM once its log
  // says it runs (its signal handlers exist from then on), or after 5 s.
  Run run(const std::vector<std::string>& acrArguments) {
    const size_t lLogBefore = readFile(mLog).size();  // a daemon started earlier shares the log
    Run lRun;
    lRun.mPid = start("qnsensord", acrArguments, "run");
    const auto lDeadline = std::chrono::steady_clock::now() + std::chrono::seconds(5);
    for (int lStatus = 0; lRun.mStatus == -1 && std::chrono::steady_clock::now() < lDeadline;) {
      if (waitpid(lRun.mPid, &lStatus, WNOHANG) == lRun.mPid) {
        lRun.mStatus = WIFEXITED(lStatus) ? WEXITSTATUS(lStatus) : 128 + WTERMSIG(lStatus);
      } else if (readFile(mLog).find("qnsensord running", lLogBefore) != std::string::npos) {
        break;
      }
      std::this_thread::sleep_for(std::chrono::milliseconds(20));
    }
    if (lRun.mStatus == -1) {
      kill(lRun.mPid, SIGTERM);
      lRun.mStatus = qntest::waitExit(lRun.mPid);
    }
    lRun.mStdout = readFile(mDir.file("run.out"));
    lRun.mStderr = readFile(mDir.file("run.err"));
    lRun.mLog = readFile(mLog).substr(lLogBefore);
    return lRun;
  }

  std::string writeConfig(const std::string& acrContents) {
    qntest::writeFile(mDir.file("qnsensord.conf"), acrContents);
    return mDir.file("qnsensord.conf");
  }
  bool hasPidFile() const { return access(mDir.file("qnsensord.pid").c_str(), F_OK) == 0; }
  // Lines written after applySettings come from the process that was started: it stayed in front.
  static bool ranInFront(const Run& acrRun) {
    return acrRun.mLog.find("[" + std::to_string(acrRun.mPid) + "] init") != std::string::npos;
  }

  qntest::TempDir mDir;
  std::string mLog = mDir.file("qnsensord.log");
};

// -v prints the version alone, even with -h; -h ends the process before -s looks for an instance
// (looking would create the PID file) and before the log is opened.
TEST_F(QnsensordTest, VersionAndHelpArePrintedAndNothingElseHappens) {
  for (const std::vector<std::string>& lrArguments :
       std::vector<std::vector<std::string>>{{"-v"}, {"-v", "-h"}}) {
    const Run lRun = run(lrArguments);
    EXPECT_EQ(0, lRun.mStatus);
    EXPECT_EQ("qnsensord v1.0.0", lRun.mStdout);
  }
  const Run lRun = run({"-h", "-s"});
  EXPECT_EQ(0, lRun.mStatus);
  EXPECT_EQ(0u, lRun.mStdout.find("usage: qnsensord [-v] [-h] [-s] [-c file] [-d mask]"));
  for (const char* lpOption :
       {"-v", "-h", "-s", "-c file", "-d mask", "-b seconds", "-D true|false", "-I minutes", "-n count"})
    EXPECT_NE(std::string::npos, lRun.mStdout.find(std::string("\n  ") + lpOption + " ")) << lpOption;
  EXPECT_FALSE(hasPidFile());
  EXPECT_EQ("", lRun.mLog);
}

// The whole line is checked before any option is acted on (-v would print and end the process,
// -s would look for an instance); the log is opened and the PID file locked only after that.
TEST_F(QnsensordTest, BadCommandLineIsAUsageErrorWithNothingStarted) {
  const std::vector<std::pair<std::vector<std::string>, std::string>> lCases = {
      {{"-s", "-x"}, "qnsensord: Unknown option '-x'\n"},
      {{"-v", "now"}, "qnsensord: Option '-v' takes no value, got 'now'\n"},
      {{"-D", "false", "-d"}, "qnsensord: Option '-d' needs a value\n"},
      {{"-c", "/nonexistent.conf", "-n", "3"}, "qnsensord: Option '-n' cannot be combined with -c"},
      {{"-n", "0"}, "Option '-n' expects a channel count from 1 to 64, got '0'"},
      {{"-n", "65"}, "Option '-n' expects a channel count from 1 to 64, got '65'"},
      {{"-n", "two"}, "Option '-n' expects a channel count from 1 to 64, got 'two'"},
  };
  for (const auto& lrCase : lCases) {
    const Run lRun = run(lrCase.first);
    EXPECT_EQ(2, lRun.mStatus) << lrCase.second;
    EXPECT_NE(std::string::npos, lRun.mStderr.find(lrCase.second)) << lRun.mStderr;
    EXPECT_EQ("", lRun.mLog);
    EXPECT_FALSE(hasPidFile());
  }
}

// A file that lacks a required key or holds a bad line ends start-up with a message naming the
// file (and the line); nothing starts. The shipped sample is a file qnsensord accepts, and its
// settings (not those of -d or -D) are the ones used.
TEST_F(QnsensordTest, ConfigFileSuppliesTheSettingsOrStopsStartUp) {
  const std::vector<std::pair<std::string, std::string>> lCases = {
      {"DebugLevel = 255\nDaemonize = 0\n", ": 'HbTimeout' is not set"},
      {"DebugLevel = 255\nHbTimeout = 30\nDaemonize\n", ":3:"},
      {"DebugLevel = 255\nHbTimeout = soon\nDaemonize = 0\n",
       ":2: HbTimeout: 'soon' is not an unsigned integer"},
      {"DebugLevel = 255\nHbTimeout = 30\nDaemonize = 0\nDebugLevl = 8\n", ":4: unknown key 'DebugLevl'"},
  };
  for (const auto& lrCase : lCases) {
    const std::string lPath = writeConfig(lrCase.first);
    const Run lRun = run({"-c", lPath});
    EXPECT_NE(0, lRun.mStatus) << lrCase.second;
    EXPECT_NE(std::string::npos, lRun.mStderr.find(lPath + lrCase.second)) << lRun.mStderr;
    EXPECT_EQ(std::string::npos, lRun.mLog.find("init")) << "nothing may start without a valid file";
  }
  const Run lRun =
      run({"-c", std::string(QN_SOURCE_DIR) + "/examples/qnsensord.conf", "-d", "255", "-D", "true"});
  EXPECT_EQ(0, lRun.mStatus) << lRun.mStderr;
  EXPECT_TRUE(ranInFront(lRun)) << lRun.mLog;
  EXPECT_NE(std::string::npos, lRun.mLog.find("Using 2 sensor channels"));
  EXPECT_EQ(std::string::npos, lRun.mLog.find(" -T- "))
      << "DebugLevel = 57 holds no trace; -d 255 is not read";
}

// Two clients over two channels, four malformed readings among them, and one more client that
// leaves in the middle of a message first: every reading is answered once and in order, the
// malformed ones refused, the broken message costs only itself. "-s" (a SIGTERM from another
// process) then ends the service: components in index order before the pool, every thread
// waited for, then the shut-down lines. The heartbeat (every -b seconds) sleeps with
// waitAndCheckExit and ends on its exit notice.
TEST_F(QnsensordTest, ServesReadingsAndStopsOnRequest) {
  const pid_t lService = start("qnsensord", {"-D", "false", "-d", "127", "-b", "1", "-n", "2"}, "service");
  ASSERT_TRUE(qntest::waitForText(mLog, "Heartbeat: 0 readings answered")) << readFile(mLog);
  const pid_t lFeed = start("qnsensor-feed", {"-n", "400", "-m", "2", "-e", "4", "-x"}, "feed");
  ASSERT_EQ(0, qntest::waitExit(lFeed, std::chrono::seconds(60)))
      << readFile(mDir.file("feed.out")) << readFile(mDir.file("feed.err"));
  const std::string lSummary = readFile(mDir.file("feed.out"));
  EXPECT_NE(std::string::npos, lSummary.find("396 accepted, 4 refused")) << lSummary;
  EXPECT_NE(std::string::npos, lSummary.find("errors: 0")) << lSummary;
  EXPECT_EQ(0, qntest::waitExit(start("qnsensord", {"-s"}, "stop")));
  EXPECT_EQ("qnsensord shutdown successfully.\n", readFile(mDir.file("stop.out")));
  EXPECT_EQ(0, qntest::waitExit(lService));

  const std::string lLog = readFile(mLog);
  EXPECT_EQ(1u, qntest::countOf(lLog, "message lost, connection dropped")) << lLog;
  EXPECT_EQ(4u, qntest::countOf(lLog, "refused: bad value")) << lLog;
  EXPECT_NE(std::string::npos, lLog.find("Statistics: 396 readings from 8 sensors")) << lLog;
  qntest::expectInOrder(
      lLog, {"Started Thread: ChannelWorker-0", "Started Thread: ChannelWorker-1",
             "Started Thread: ReadingConsumer", "Started Thread: Heartbeat",
             "Started Threads in Thread Pool: Reporters", "Waiting for 'ChannelWorker-0' thread to exit",
             "Waiting for 'ChannelWorker-1' thread to exit", "Waiting for 'ReadingConsumer' thread to exit",
             "Waiting for 'Heartbeat' thread to exit",
             "Waiting for threads in 'Reporters' ThreadPool to exit", "All threads have gracefully exited",
             "Destroying System", "Statistics:", "Destroying the Logger. You won't see any more logs!"});
  // The heartbeat leaves its sleep on the exit flag, before the main thread has joined it.
  qntest::expectInOrder(lLog, {"Started Threads in Thread Pool: Reporters", "Process is marked for exit.",
                               "Waiting for threads in 'Reporters' ThreadPool to exit"});
  // The only error lines: the driver's note that without -c no configuration file is read, and
  // the message the leaving client cut short. Starting and stopping add none.
  EXPECT_EQ(2u, qntest::countOf(lLog, " -E- ")) << lLog;
}

}  // namespace
