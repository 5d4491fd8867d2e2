// qnsensord and qnsensor-feed as real processes: real sockets, threads and signals, and the log
// the service leaves behind.

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "DeathTestSupport.h"
#include "LogSupport.h"
#include "TestSupport.h"

namespace {

class SensorServiceTest : public ::testing::Test {
 protected:
  // Starts the service in the foreground with every level but trace, and waits until it runs
  // (its signal handlers exist only from then on).
  pid_t startService(const std::vector<std::string>& acrExtra = {}) {
    std::vector<std::string> lArgv = {qntest::builtProgram("examples/qnsensord"), "-D", "false", "-d", "127"};
    lArgv.insert(lArgv.end(), acrExtra.begin(), acrExtra.end());
    const pid_t lPid = qntest::spawn(lArgv, environment(), mDir.file("stdout"), mDir.file("stderr"));
    EXPECT_TRUE(qntest::waitForText(mLog, "qnsensord running")) << qntest::readFile(mLog);
    return lPid;
  }

  int runFeed(const std::vector<std::string>& acrArguments) {
    std::vector<std::string> lArgv = {qntest::builtProgram("examples/qnsensor-feed")};
    lArgv.insert(lArgv.end(), acrArguments.begin(), acrArguments.end());
    return qntest::waitExit(qntest::spawn(lArgv, environment(), mDir.file("feed.out"), mDir.file("feed.err")),
                            std::chrono::seconds(60));
  }

  std::vector<std::string> environment() const { return {"QN_LOG_DIR=" + mDir.path()}; }

  qntest::TempDir mDir;
  std::string mLog = mDir.file("qnsensord.log");
};

// Two clients over two channels, four malformed readings among them, and one more client that
// leaves in the middle of a message first: every reading is answered once and in order, the
// malformed ones refused, the broken message costs only itself. "-s" (a SIGTERM from another
// process) then ends the service: components in index order before the pool, every thread
// waited for, then the shut-down lines. The heartbeat (every -b seconds) sleeps with
// waitAndCheckExit and ends on its exit notice.
TEST_F(SensorServiceTest, ServesReadingsAndStopsOnRequest) {
  const pid_t lService = startService({"-b", "1"});
  ASSERT_TRUE(qntest::waitForText(mLog, "Heartbeat: 0 readings answered")) << qntest::readFile(mLog);
  ASSERT_EQ(0, runFeed({"-n", "400", "-m", "2", "-e", "4", "-x"}))
      << qntest::readFile(mDir.file("feed.out")) << qntest::readFile(mDir.file("feed.err"));
  const std::string lSummary = qntest::readFile(mDir.file("feed.out"));
  EXPECT_NE(std::string::npos, lSummary.find("396 accepted, 4 refused")) << lSummary;
  EXPECT_NE(std::string::npos, lSummary.find("errors: 0")) << lSummary;

  const pid_t lStopper = qntest::spawn({qntest::builtProgram("examples/qnsensord"), "-s"}, environment(),
                                       mDir.file("stop.out"), mDir.file("stop.err"));
  EXPECT_EQ(0, qntest::waitExit(lStopper));
  EXPECT_EQ("qnsensord shutdown successfully.\n", qntest::readFile(mDir.file("stop.out")));
  EXPECT_EQ(0, qntest::waitExit(lService));

  const std::string lLog = qntest::readFile(mLog);
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
