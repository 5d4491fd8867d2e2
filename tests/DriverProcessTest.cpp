// The driver's whole run in a real process (qn_test_helper as a service): start-up order,
// shut-down on each signal, repeated signals, signals after the run, and failing steps.

#include <gtest/gtest.h>
#include <signal.h>
#include <string.h>

#include <string>
#include <vector>

#include "LogSupport.h"
#include "TestSupport.h"

namespace {
using qntest::expectInOrder;

const std::vector<std::string> kStartUpSteps = {
    "preInit", "processCommandLine", "parseConfigFile", "applySettings",   "markAsRunning",
    "init",    "createThreads",      "startThreads",    "postThreadsInit", "createStartUpEvent",
};

class DriverProcessTest : public ::testing::Test {
 protected:
  pid_t start(const std::vector<std::string>& acrArguments) {
    return qntest::spawnHelper(acrArguments, stdoutPath(), mDir.file("stderr"),
                               {"QN_LOG_DIR=" + mDir.path()});
  }
  pid_t startRunning(const std::vector<std::string>& acrArguments) {
    const pid_t lPid = start(acrArguments);
    if (!qntest::waitForText(stdoutPath(), "running\n")) {
      ADD_FAILURE() << "the service never reached the running state; output:\n" << output();
    }
    return lPid;
  }

  std::string stdoutPath() const { return mDir.file("stdout"); }
  std::string output() const { return qntest::readFile(stdoutPath()); }
  std::string log() const { return qntest::readFile(mDir.file("driver_app.log")); }

  qntest::TempDir mDir;
};

// The whole run, the driver's own lines between the application's steps. The service's
// parseConfigFile is not implemented: that is logged once, as an error, and start-up goes on.
class DriverSignalTest : public DriverProcessTest, public ::testing::WithParamInterface<int> {};

TEST_P(DriverSignalTest, SignalShutsDownInOrder) {
  const pid_t lPid = startRunning({"run"});
  ASSERT_EQ(0, kill(lPid, GetParam()));
  ASSERT_EQ(0, qntest::waitExit(lPid)) << output();
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
  EXPECT_EQ(0, qntest::waitExit(lPid)) << output();

  EXPECT_NE(std::string::npos, output().find("exit request 2 self\n"));
  EXPECT_NE(std::string::npos, output().find("lingered\n"));
  EXPECT_EQ(2u, qntest::countOf(output(), "exit request")) << "a handler reached the destroyed object";
  EXPECT_EQ(1u, qntest::countOf(output(), "destructor\n"));
  const std::string lLog = log();
  EXPECT_EQ(1u, qntest::countOf(lLog, "Destroying System"));
  EXPECT_EQ(1u, qntest::countOf(lLog, "Destroying the Logger. You won't see any more logs!"));
  EXPECT_EQ(std::string::npos, lLog.find("Config file parsing not implemented."));
}

}  // namespace
