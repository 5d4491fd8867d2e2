#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <regex>
#include <sstream>
#include <string>
#include <vector>

#include "LogSupport.h"
#include "Logger.h"
#include "QNString.h"
#include "TestSupport.h"

namespace {

std::vector<std::string> linesOf(const std::string& acrText) {
  std::vector<std::string> lLines;
  std::istringstream lIn(acrText);
  for (std::string lLine; std::getline(lIn, lLine);) lLines.push_back(lLine);
  return lLines;
}

using qntest::countOf;

// Time stamp, tag, thread id, function, file and line, then the message (group 1).
const std::regex kLine(
    R"(^\d{4}-\d\d-\d\d \d\d:\d\d:\d\d\.\d{6} -[HEWNIT]- \[\d+\] \S+ \([^ :]+:\d+\) (.*)$)");

// The message of a line of the log's shape; the marker and the line itself when the shape is wrong.
std::string messageOf(const std::string& acrLine) {
  std::smatch lMatch;
  return std::regex_match(acrLine, lMatch, kLine) ? lMatch[1].str() : "(malformed) " + acrLine;
}

// Each test writes to a log of its own in a fresh directory, closed again at the end.
class LoggerTest : public qntest::LoggedTest {};

// A line carries time stamp, tag, thread, call site and message, and logging keeps errno. An
// overlong message is cut to one line of the maximum length, on the "%s" fast path and the
// formatted one alike; the line breaks of a message become blanks, trailing ones are dropped.
TEST_F(LoggerTest, EveryMessageBecomesOneWellFormedBoundedLine) {
  const unsigned int lLine = __LINE__ + 1;
  QN_LOG_NOTICE("value %d of %s", 42, "forty-two");
  errno = EACCES;
  QN_ENTERED();
  EXPECT_EQ(EACCES, errno) << "logging changed errno";
  const std::string lLong(3 * kQNLogMaxLine, 'x');
  QN_LOG_INFO("%s", lLong.c_str());
  QN_LOG_INFO("%s%s", lLong.c_str(), "tail");
  QN_LOG_INFO("first\nsecond\n\n");
  const std::vector<std::string> lLines = linesOf(log());
  ASSERT_EQ(5u, lLines.size());
  EXPECT_EQ("value 42 of forty-two", messageOf(lLines[0]));
  const std::string lCallSite = std::string(" -N- [") + std::to_string(gettid()) +
                                "] TestBody (tests/LoggerTest.cpp:" + std::to_string(lLine) + ") ";
  EXPECT_NE(std::string::npos, lLines[0].find(lCallSite)) << lLines[0];
  EXPECT_EQ("Entered", messageOf(lLines[1]));
  for (int lIndex = 2; lIndex < 4; ++lIndex) {
    EXPECT_EQ(kQNLogMaxLine - 1, lLines[lIndex].size());
    EXPECT_NE(std::string::npos, lLines[lIndex].find(") xxxxxxxx"));
    EXPECT_EQ('x', lLines[lIndex].back());
  }
  EXPECT_EQ("first second", messageOf(lLines[4]));
}

// Urgent lines, and whatever flushLogger() finds buffered, are in the file when the call returns.
TEST_F(LoggerTest, UrgentOrFlushedLineIsInTheFileWhenTheCallReturns) {
  QN_LOG_TRACE("buffered before");
  const std::pair<QNELogLevel, const char*> lUrgent[] = {
      {QNLL_Halt, "-H-"}, {QNLL_Error, "-E-"}, {QNLL_Warning, "-W-"}};
  for (const auto& lrUrgent : lUrgent) {
    const std::string lText = std::string("urgent ") + lrUrgent.second;
    PrintLogMessageWithTimeStamp(lrUrgent.first, lrUrgent.second, __LINE__, __func__, __FILE__, "%s",
                                 lText.c_str());
    const std::string lLog = qntest::readFile(mLogPath);
    EXPECT_NE(std::string::npos, lLog.find(lText)) << lLog;
    // Order is kept: what was buffered before the urgent line is written with it.
    EXPECT_LT(lLog.find("buffered before"), lLog.find(lText));
  }
  for (int lIndex = 0; lIndex < 10; ++lIndex) QN_LOG_TRACE("line %d", lIndex);
  flushLogger();
  EXPECT_EQ(14u, linesOf(qntest::readFile(mLogPath)).size());
}

// Regression: a child forked while lines sat in the buffer wrote them again at its exit, so the
// parent's lines appeared twice in the log.
TEST_F(LoggerTest, ChildForkedAfterCreateLoggerDoesNotRepeatTheParentsLines) {
  QN_LOG_TRACE("parent before fork");
  // Once the flusher has written the line (with no further call) it idles; a fork while it was
  // still starting up could copy a sanitizer's allocator lock held, and the child would hang in
  // its exit-time leak check.
  ASSERT_TRUE(qntest::waitForText(mLogPath, "parent before fork"));
  QN_LOG_TRACE("parent buffered at the fork");
  const pid_t lChild = fork();
  ASSERT_GE(lChild, 0);
  if (lChild == 0) {
    QN_LOG_TRACE("from the child");
    exit(0);  // the exit handler writes the child's buffer
  }
  int lStatus = 0;
  ASSERT_EQ(lChild, waitpid(lChild, &lStatus, 0));
  EXPECT_TRUE(WIFEXITED(lStatus) && WEXITSTATUS(lStatus) == 0);
  const std::string lLog = log();
  EXPECT_EQ(1u, countOf(lLog, "parent before fork")) << lLog;
  EXPECT_EQ(1u, countOf(lLog, "parent buffered at the fork")) << lLog;
  EXPECT_EQ(1u, countOf(lLog, "from the child")) << lLog;
}

// Scenarios that need a process of their own (qn_test_helper's log- modes): the state before
// CreateLogger, exit and crashes.
class LoggerProcessTest : public ::testing::Test {
 protected:
  int run(const std::string& acrMode, const std::string& acrLog, const std::string& acrExtra = "") {
    std::vector<std::string> lArgs{"log-" + acrMode, acrLog};
    if (!acrExtra.empty()) lArgs.push_back(acrExtra);
    return qntest::waitExit(qntest::spawnHelper(lArgs, mDir.file("stdout"), mDir.file("stderr")));
  }
  std::string stdErr() const { return qntest::readFile(mDir.file("stderr")); }

  qntest::TempDir mDir;
  std::string mLog = mDir.file("probe.log");
};

TEST_F(LoggerProcessTest, StartUpLinesOpenTheLogFilteredByTheMaskThenInForce) {
  ASSERT_EQ(0, run("startup", mLog));
  const std::string lLog = qntest::readFile(mLog);
  EXPECT_EQ(4u, linesOf(lLog).size()) << lLog;
  EXPECT_EQ("-T-", qntest::levelOf(lLog, ") early trace 1"));
  qntest::expectInOrder(
      lLog, {") early trace 1\n", ") early error 3\n", ") early warning 4\n", ") after open 5\n"});
  // Urgent lines went to standard error at once, before and after the log; nothing else did.
  const std::string lStderr = stdErr();
  EXPECT_EQ(1u, countOf(lStderr, "early error 3"));
  EXPECT_EQ(1u, countOf(lStderr, "early warning 4"));
  EXPECT_EQ(1u, countOf(lStderr, "after destroy 7"));
  EXPECT_EQ(3u, linesOf(lStderr).size()) << lStderr;
  EXPECT_EQ(0u, countOf(lStderr, "-T-"));
}

// exit(1) from a failed assertion while another thread keeps logging: nothing buffered is lost
// and the exit does not deadlock against the logging thread.
TEST_F(LoggerProcessTest, ExitWritesEveryBufferedLine) {
  ASSERT_EQ(1, run("exit", mLog));
  const std::string lLog = qntest::readFile(mLog);
  for (int lIndex = 0; lIndex < 1000; ++lIndex)
    ASSERT_EQ(1u, countOf(lLog, ") line " + std::to_string(lIndex) + "\n")) << "line " << lIndex;
  EXPECT_EQ(1u, countOf(lLog, "Assertion [ lStarted.load() == false ] failed\n"));
  for (const std::string& lrLine : linesOf(lLog)) ASSERT_TRUE(std::regex_match(lrLine, kLine)) << lrLine;
}

TEST_F(LoggerProcessTest, CrashSignalWritesTheBufferAndStillKillsTheProcess) {
  for (const int lSignal : {SIGSEGV, SIGBUS, SIGABRT, SIGFPE}) {
    SCOPED_TRACE(strsignal(lSignal));
    const std::string lLog = mDir.file("crash" + std::to_string(lSignal) + ".log");
    EXPECT_EQ(128 + lSignal, run("crash", lLog, std::to_string(lSignal)));
    const std::string lText = qntest::readFile(lLog);
    EXPECT_EQ(101u, linesOf(lText).size());
    EXPECT_EQ(1u, countOf(lText, ") line 99\n"));
    EXPECT_EQ(1u, countOf(lText, "last line before the crash"));
  }
}

}  // namespace
