// Daemonizing (through the real qn_daemon_probe process) and the exit-aware sleep.

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <map>
#include <sstream>
#include <string>
#include <thread>

#include "QNException.h"
#include "TestSupport.h"
#include "programs/TestSystem.h"

namespace {
using std::chrono::seconds;

// "key=value" lines of the daemon's report.
std::map<std::string, std::string> parseReport(const std::string& acrText) {
  std::map<std::string, std::string> lValues;
  std::istringstream lIn(acrText);
  std::string lLine;
  while (std::getline(lIn, lLine)) {
    const size_t lEqual = lLine.find('=');
    if (lEqual != std::string::npos) lValues[lLine.substr(0, lEqual)] = lLine.substr(lEqual + 1);
  }
  return lValues;
}

TEST(SystemDaemonizeTest, CallerReturnsAtOnceAndTheDaemonIsDetached) {
  qntest::TempDir lDir;
  const std::string lReport = lDir.file("report");
  const std::string lGo = lDir.file("go");
  const pid_t lCaller = qntest::spawn({qntest::builtProgram("tests/qn_daemon_probe"), lReport, lGo}, {},
                                      lDir.file("out"), lDir.file("err"));
  // The daemon reports only after "go": the caller ending first shows it did not wait for it.
  ASSERT_EQ(0, qntest::waitExit(lCaller, seconds(10))) << qntest::readFile(lDir.file("err"));
  EXPECT_NE(std::string::npos, qntest::readFile(lDir.file("err")).find("Time for parent process to quit"));
  EXPECT_NE(0, access(lReport.c_str(), F_OK));

  qntest::writeFile(lGo, "");
  ASSERT_TRUE(qntest::waitForText(lReport, "done")) << "the daemon never reported";
  auto lValues = parseReport(qntest::readFile(lReport));
  const int lDaemon = std::stoi(lValues["pid"]);
  EXPECT_NE(lCaller, lDaemon);
  EXPECT_NE(std::to_string(lCaller), lValues["ppid"]);
  EXPECT_NE(std::to_string(getpid()), lValues["ppid"]);
  // In a session of its own, but not its leader: it can never regain a controlling terminal.
  EXPECT_NE(lValues["pid"], lValues["sid"]);
  EXPECT_NE(std::to_string(getsid(0)), lValues["sid"]);
  EXPECT_EQ("/", lValues["cwd"]);
  EXPECT_EQ("0", lValues["umask"]);
  EXPECT_EQ("ignored", lValues["sighup"]);
  EXPECT_EQ("/dev/null", lValues["fd0"]);
  EXPECT_EQ("/dev/null", lValues["fd1"]);
  EXPECT_EQ("/dev/null", lValues["fd2"]);
  // The probe left one descriptor open low and one at the top of the limit: both are gone.
  EXPECT_EQ("", lValues["others"]);
}

class WaitAndCheckExitTest : public ::testing::Test {
 protected:
  QNCTestSystem mSystem;
};

TEST_F(WaitAndCheckExitTest, ZeroSecondsChecksTheFlagWithoutSleeping) {
  EXPECT_NO_THROW(mSystem.waitAndCheckExit(0));
  mSystem.setForExit();
  EXPECT_EQ("Process is marked for exit. (code 1)",
            qntest::thrown<QNCHaltEx>([&] { mSystem.waitAndCheckExit(0); }, true));
}

// A wait of 12 seconds is checked after 5, 10 and 12: a flag set during the first step must end
// it at the first check, well before the 12 seconds are over.
TEST_F(WaitAndCheckExitTest, FlagSetDuringTheFirstStepEndsTheWaitAtTheFirstCheck) {
  std::thread lStopper([this] {
    std::this_thread::sleep_for(std::chrono::seconds(1));
    mSystem.setForExit();
  });
  const auto lStart = std::chrono::steady_clock::now();
  EXPECT_THROW(mSystem.waitAndCheckExit(12), QNCHaltEx);
  const auto lWaited = std::chrono::steady_clock::now() - lStart;
  lStopper.join();
  EXPECT_GE(lWaited, seconds(5));
  EXPECT_LT(lWaited, seconds(9));
}
}  // namespace
