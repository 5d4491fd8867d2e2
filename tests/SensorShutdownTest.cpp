// qnsensord as a real process: real threads, real signals, the log it leaves behind.

#include <gtest/gtest.h>

#include <signal.h>

#include <string>

#include "TestSupport.h"

namespace {

class SensorShutdownTest : public ::testing::Test {
 protected:
  pid_t start() {
    return qntest::spawn({qntest::builtProgram("examples/qnsensord")}, {"QN_LOG_DIR=" + mDir.path()},
                         mDir.file("stdout"), mDir.file("stderr"));
  }

  static size_t count(const std::string& acrText, const std::string& acrWhat) {
    size_t lCount = 0;
    for (size_t lAt = acrText.find(acrWhat); lAt != std::string::npos; lAt = acrText.find(acrWhat, lAt + 1)) ++lCount;
    return lCount;
  }

  // Fails unless every text occurs in the log, each after the one before it.
  static void expectInOrder(const std::string& acrLog, std::initializer_list<std::string> aTexts) {
    size_t lFrom = 0;
    for (const std::string& acrText : aTexts) {
      const size_t lAt = acrLog.find(acrText, lFrom);
      ASSERT_NE(std::string::npos, lAt) << "'" << acrText << "' missing or out of order in:\n" << acrLog;
      lFrom = lAt + acrText.size();
    }
  }

  qntest::TempDir mDir;
  std::string mLog = mDir.file("qnsensord.log");
};

// SIGTERM while the sampler and the pool are busy: every component is waited for before the
// pool, then the three shut-down lines follow, and the process leaves with status 0.
TEST_F(SensorShutdownTest, SigtermWhileThreadsWorkShutsDownInOrder) {
  const pid_t lPid = start();
  // A processed sample proves both the component and the pool run.
  ASSERT_TRUE(qntest::waitForText(mLog, "Sample 1 processed")) << qntest::readFile(mLog);
  ASSERT_EQ(0, kill(lPid, SIGTERM));
  EXPECT_EQ(0, qntest::waitExit(lPid));
  const std::string lLog = qntest::readFile(mLog);
  expectInOrder(lLog, {"Started Thread: SensorSampler", "Started Threads in Thread Pool: SampleProcessors",
                       "Waiting for 'SensorSampler' thread to exit",
                       "Waiting for threads in 'SampleProcessors' ThreadPool to exit",
                       "All threads have gracefully exited", "Destroying System",
                       "Destroying the Logger. You won't see any more logs!"});
  EXPECT_EQ(0u, count(lLog, " -E- ")) << lLog;
}

// The second SIGINT repeats the exit request; the shut-down itself happens once.
TEST_F(SensorShutdownTest, TwoSigintsShutDownOnce) {
  const pid_t lPid = start();
  // Not the start lines: the handlers are installed only after them, and a signal before that has
  // its default effect. A processed sample comes a second after start-up has finished.
  ASSERT_TRUE(qntest::waitForText(mLog, "Sample 1 processed")) << qntest::readFile(mLog);
  ASSERT_EQ(0, kill(lPid, SIGINT));
  ASSERT_EQ(0, kill(lPid, SIGINT));
  EXPECT_EQ(0, qntest::waitExit(lPid));
  const std::string lLog = qntest::readFile(mLog);
  EXPECT_EQ(1u, count(lLog, "All threads have gracefully exited")) << lLog;
  EXPECT_EQ(1u, count(lLog, "Destroying System")) << lLog;
  EXPECT_EQ(1u, count(lLog, "Destroying the Logger. You won't see any more logs!")) << lLog;
}

}  // namespace
