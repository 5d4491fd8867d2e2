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
  EXPECT_NE(std::to_string(lCaller), lValues["ppid"]);
  EXPECT_NE(std::to_string(getpid()), lValues["ppid"]);
  // In a session of its own, but not its leader: it can never regain a controlling terminal.
  EXPECT_NE(lValues["pid"], lValues["sid"]);
  EXPECT_NE(std::to_string(getsid(0)), lValues["sid"]);
  // "others": the probe left one descriptor open low and one at the top of the limit.
  const std::map<std::string, std::string> lExpected = {
      {"cwd", "/"},         {"umask", "0"},       {"sighup", "ignored"}, {"fd0", "/dev/null"},
      {"fd1", "/dev/null"}, {"fd2", "/dev/null"}, {"others", ""}};
  for (const auto& acrEntry : lExpected)
    EXPECT_EQ(acrEntry.second, lValues[acrEntry.first]) << acrEntry.first;
}

// A wait of 12 seconds is checked after 5, 10 and 12: a flag set during the first step must end
// it at the first check, well before the 12 seconds are over. A wait of 0 only checks the flag.
TEST(WaitAndCheckExitTest, ExitFlagEndsTheWaitAtTheNextCheck) {
  QNCTestSystem lSystem;
  EXPECT_NO_THROW(lSystem.waitAndCheckExit(0));
  std::thread lStopper([&] {
    std::this_thread::sleep_for(std::chrono::seconds(1));
    lSystem.setForExit();
  });
  const auto lStart = std::chrono::steady_clock::now();
  const std::string lHalt = qntest::thrown<QNCHaltEx>([&] { lSystem.waitAndCheckExit(12); }, true);
  const auto lWaited = std::chrono::steady_clock::now() - lStart;
  lStopper.join();
  EXPECT_EQ("Process is marked for exit. (code 1)", lHalt);
  EXPECT_GE(lWaited, seconds(5));
  EXPECT_LT(lWaited, seconds(9));
  EXPECT_THROW(lSystem.waitAndCheckExit(0), QNCHaltEx);
}
}  // namespace
