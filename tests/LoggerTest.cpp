#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <regex>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

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

size_t countOf(const std::string& acrText, const std::string& acrPart) {
  size_t lCount = 0;
  for (size_t lAt = acrText.find(acrPart); lAt != std::string::npos; lAt = acrText.find(acrPart, lAt + 1)) ++lCount;
  return lCount;
}

// Time stamp, tag, thread id, function, file and line, then the message (group 1).
const std::regex kLine(R"(^\d{4}-\d\d-\d\d \d\d:\d\d:\d\d\.\d{6} -[HEWNIT]- \[\d+\] \S+ \([^ :]+:\d+\) (.*)$)");

// Each test writes to a log of its own in a fresh directory and closes it at the end, so the
// logger is back in its closed state between tests.
class LoggerTest : public ::testing::Test {
 protected:
  void SetUp() override {
    setLogCode(255);
    CreateLogger(mLog.c_str());
  }
  void TearDown() override {
    destroyLogger();
    setLogCode(255);
  }
  std::string closeAndRead() {
    destroyLogger();
    return qntest::readFile(mLog);
  }

  qntest::TempDir mDir;
  std::string mLog = mDir.file("test.log");
};

TEST_F(LoggerTest, MaskSelectsTheLevelsWritten) {
  auto lLogEveryLevel = [](const char* apRound) {
    QN_LOG_HALT("%s halt", apRound);
    QN_LOG_ERROR("%s error", apRound);
    QN_LOG_WARNING("%s warning", apRound);
    QN_LOG_NOTICE("%s notice", apRound);
    QN_LOG_INFO("%s info", apRound);
    QN_LOG_TRACE("%s trace", apRound);
  };
  lLogEveryLevel("all");
  setLogCode(8);
  lLogEveryLevel("errors");
  // A direct call is filtered too, not only the macros.
  PrintLogMessageWithTimeStamp(QNLL_Trace, "-T-", __LINE__, __func__, __FILE__, "direct trace");
  const std::string lLog = closeAndRead();
  EXPECT_EQ(7u, linesOf(lLog).size()) << lLog;
  for (const char* lpText : {"-H- ", "-E- ", "-W- ", "-N- ", "-I- ", "-T- "}) EXPECT_NE(0u, countOf(lLog, lpText));
  for (const char* lpText : {"all halt", "all error", "all warning", "all notice", "all info", "all trace"})
    EXPECT_EQ(1u, countOf(lLog, lpText)) << lpText;
  EXPECT_EQ(1u, countOf(lLog, "errors error"));
  EXPECT_EQ(0u, countOf(lLog, "direct trace"));
}

TEST_F(LoggerTest, LineCarriesTimeTagThreadCallSiteAndMessage) {
  const unsigned int lLine = __LINE__ + 1;
  QN_LOG_NOTICE("value %d of %s", 42, "forty-two");
  errno = EACCES;
  QN_ENTERED();
  EXPECT_EQ(EACCES, errno) << "logging changed errno";
  const std::vector<std::string> lLines = linesOf(closeAndRead());
  ASSERT_EQ(2u, lLines.size());
  std::smatch lMatch;
  ASSERT_TRUE(std::regex_match(lLines[0], lMatch, kLine)) << lLines[0];
  EXPECT_EQ("value 42 of forty-two", lMatch[1].str());
  const std::string lCallSite = std::string(" -N- [") + std::to_string(gettid()) + "] TestBody (tests/LoggerTest.cpp:" +
                                std::to_string(lLine) + ") ";
  EXPECT_NE(std::string::npos, lLines[0].find(lCallSite)) << lLines[0];
  ASSERT_TRUE(std::regex_match(lLines[1], lMatch, kLine)) << lLines[1];
  EXPECT_EQ("Entered", lMatch[1].str());
}

TEST_F(LoggerTest, OverlongOrMultiLineMessageStaysOneBoundedLine) {
  const std::string lLong(3 * kQNLogMaxLine, 'x');
  QN_LOG_INFO("%s", lLong.c_str());
  QN_LOG_INFO("%s%s", lLong.c_str(), "tail");  // the formatted path, not only the "%s" fast path
  QN_LOG_INFO("first\nsecond\n\n");
  QN_LOG_INFO("after");
  const std::vector<std::string> lLines = linesOf(closeAndRead());
  ASSERT_EQ(4u, lLines.size());
  for (int lIndex = 0; lIndex < 2; ++lIndex) {
    EXPECT_EQ(kQNLogMaxLine - 1, lLines[lIndex].size());
    EXPECT_NE(std::string::npos, lLines[lIndex].find(") xxxxxxxx"));
    EXPECT_EQ('x', lLines[lIndex].back());
  }
  std::smatch lMatch;
  ASSERT_TRUE(std::regex_match(lLines[2], lMatch, kLine)) << lLines[2];
  EXPECT_EQ("first second", lMatch[1].str());
  ASSERT_TRUE(std::regex_match(lLines[3], lMatch, kLine)) << lLines[3];
  EXPECT_EQ("after", lMatch[1].str());
}

// Every thread writes numbered lines of its own letter, long enough to span many batches; a torn
// or interleaved line breaks its shape, a lost one leaves a gap in the numbers.
TEST_F(LoggerTest, LinesOfConcurrentThreadsAreWholeAndNoneIsLost) {
  constexpr int kThreads = 6;
  constexpr int kLinesEach = 3000;
  std::vector<std::thread> lThreads;
  for (int lThread = 0; lThread < kThreads; ++lThread) {
    lThreads.emplace_back([lThread] {
      const std::string lPayload(40 + 30 * lThread, static_cast<char>('a' + lThread));
      for (int lIndex = 0; lIndex < kLinesEach; ++lIndex) {
        if (lIndex % 500 == 0) {
          QN_LOG_WARNING("t%d n%d %s", lThread, lIndex, lPayload.c_str());  // interleaves batch writes
        } else {
          QN_LOG_TRACE("t%d n%d %s", lThread, lIndex, lPayload.c_str());
        }
      }
    });
  }
  for (auto& lrThread : lThreads) lrThread.join();
  const std::vector<std::string> lLines = linesOf(closeAndRead());
  ASSERT_EQ(static_cast<size_t>(kThreads * kLinesEach), lLines.size());
  std::vector<int> lNext(kThreads, 0);
  const std::regex lMessage(R"(t(\d) n(\d+) ([a-z]+))");
  for (const std::string& lrLine : lLines) {
    std::smatch lMatch;
    ASSERT_TRUE(std::regex_match(lrLine, lMatch, kLine)) << lrLine;
    const std::string lText = lMatch[1].str();
    std::smatch lParts;
    ASSERT_TRUE(std::regex_match(lText, lParts, lMessage)) << lrLine;
    const int lThread = std::stoi(lParts[1].str());
    ASSERT_LT(lThread, kThreads);
    EXPECT_EQ(lNext[lThread]++, std::stoi(lParts[2].str())) << "out of order or lost: " << lrLine;
    EXPECT_EQ(std::string(40 + 30 * lThread, static_cast<char>('a' + lThread)), lParts[3].str());
  }
}

TEST_F(LoggerTest, UrgentLineIsInTheFileWhenTheCallReturns) {
  QN_LOG_TRACE("buffered before");
  for (const char* lpTag : {"-H-", "-E-", "-W-"}) {
    const std::string lText = std::string("urgent ") + lpTag;
    PrintLogMessageWithTimeStamp(lpTag[1] == 'H' ? QNLL_Halt : lpTag[1] == 'E' ? QNLL_Error : QNLL_Warning, lpTag,
                                 __LINE__, __func__, __FILE__, "%s", lText.c_str());
    const std::string lLog = qntest::readFile(mLog);
    EXPECT_NE(std::string::npos, lLog.find(lText)) << lLog;
    // Order is kept: what was buffered before the urgent line is written with it.
    EXPECT_LT(lLog.find("buffered before"), lLog.find(lText));
  }
}

TEST_F(LoggerTest, OrdinaryLineReachesTheFileWithoutAnyFurtherCall) {
  QN_LOG_INFO("left in the buffer");
  EXPECT_TRUE(qntest::waitForText(mLog, "left in the buffer", std::chrono::seconds(3)));
}

TEST_F(LoggerTest, FlushLoggerWritesEverythingBuffered) {
  for (int lIndex = 0; lIndex < 10; ++lIndex) QN_LOG_TRACE("line %d", lIndex);
  flushLogger();
  EXPECT_EQ(10u, linesOf(qntest::readFile(mLog)).size());
}

TEST_F(LoggerTest, SecondCreateLoggerMovesTheLogAndAppendsToAnExistingFile) {
  QN_LOG_TRACE("into the first");
  const std::string lSecond = mDir.file("second.log");
  qntest::writeFile(lSecond, "existing line\n");
  CreateLogger(lSecond.c_str());
  QN_LOG_TRACE("into the second");
  destroyLogger();
  EXPECT_EQ(1u, countOf(qntest::readFile(mLog), "into the first"));
  EXPECT_EQ(0u, countOf(qntest::readFile(mLog), "into the second"));
  const std::string lSecondText = qntest::readFile(lSecond);
  EXPECT_EQ(0u, lSecondText.find("existing line\n"));
  EXPECT_EQ(1u, countOf(lSecondText, "into the second"));
}

TEST_F(LoggerTest, AfterDestroyOnlyUrgentLinesReachStandardError) {
  QN_LOG_TRACE("while open");
  destroyLogger();
  testing::internal::CaptureStderr();
  QN_LOG_TRACE("closed trace");
  QN_LOG_INFO("closed info");
  QN_LOG_ERROR("closed error");
  const std::string lStderr = testing::internal::GetCapturedStderr();
  EXPECT_EQ(1u, countOf(lStderr, "closed error"));
  EXPECT_EQ(0u, countOf(lStderr, "closed trace"));
  EXPECT_EQ(0u, countOf(lStderr, "closed info"));
  const std::string lLog = qntest::readFile(mLog);
  EXPECT_EQ(1u, countOf(lLog, "while open"));
  EXPECT_EQ(0u, countOf(lLog, "closed"));
}

// Regression: a child forked while lines sat in the buffer wrote them again at its exit, so the
// parent's lines appeared twice in the log.
TEST_F(LoggerTest, ChildForkedAfterCreateLoggerDoesNotRepeatTheParentsLines) {
  QN_LOG_TRACE("parent before fork");
  // Once the flusher has written the line it idles; a fork while it was still starting up could
  // copy a sanitizer's allocator lock held, and the child would hang in its exit-time leak check.
  ASSERT_TRUE(qntest::waitForText(mLog, "parent before fork"));
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
  const std::string lLog = closeAndRead();
  EXPECT_EQ(1u, countOf(lLog, "parent before fork")) << lLog;
  EXPECT_EQ(1u, countOf(lLog, "parent buffered at the fork")) << lLog;
  EXPECT_EQ(1u, countOf(lLog, "from the child")) << lLog;
}

// Scenarios that need a process of their own: the state before CreateLogger, exit and crashes.
class LoggerProcessTest : public ::testing::Test {
 protected:
  int run(const std::vector<std::string>& acrArgs) {
    std::vector<std::string> lArgv{qntest::builtProgram("tests/LoggerProbe")};
    lArgv.insert(lArgv.end(), acrArgs.begin(), acrArgs.end());
    return qntest::waitExit(qntest::spawn(lArgv, {}, mDir.file("stdout"), mDir.file("stderr")));
  }
  std::string stdErr() const { return qntest::readFile(mDir.file("stderr")); }

  qntest::TempDir mDir;
  std::string mLog = mDir.file("probe.log");
};

TEST_F(LoggerProcessTest, StartUpLinesOpenTheLogFilteredByTheMaskThenInForce) {
  ASSERT_EQ(0, run({"startup", mLog}));
  const std::vector<std::string> lLines = linesOf(qntest::readFile(mLog));
  ASSERT_EQ(4u, lLines.size());
  EXPECT_NE(std::string::npos, lLines[0].find("-T- ")) << lLines[0];
  EXPECT_NE(std::string::npos, lLines[0].find(") early trace 1"));
  EXPECT_NE(std::string::npos, lLines[1].find(") early error 3"));
  EXPECT_NE(std::string::npos, lLines[2].find(") early warning 4"));
  EXPECT_NE(std::string::npos, lLines[3].find(") after open 5"));
  // Urgent lines went to standard error at once, before and after the log; nothing else did.
  const std::string lStderr = stdErr();
  EXPECT_EQ(1u, countOf(lStderr, "early error 3"));
  EXPECT_EQ(1u, countOf(lStderr, "early warning 4"));
  EXPECT_EQ(1u, countOf(lStderr, "after destroy 7"));
  EXPECT_EQ(3u, linesOf(lStderr).size()) << lStderr;
  EXPECT_EQ(0u, countOf(lStderr, "-T-"));
}

TEST_F(LoggerProcessTest, DaemonChildInheritsTheLinesKeptBeforeItsFork) {
  ASSERT_EQ(0, run({"daemon", mLog}));
  const std::vector<std::string> lLines = linesOf(qntest::readFile(mLog));
  ASSERT_EQ(2u, lLines.size());
  EXPECT_NE(std::string::npos, lLines[0].find(") before fork in "));
  EXPECT_NE(std::string::npos, lLines[1].find(") child opened the log"));
  EXPECT_EQ("", stdErr());
}

// exit(1) from a failed assertion while another thread keeps logging: nothing buffered is lost
// and the exit does not deadlock against the logging thread.
TEST_F(LoggerProcessTest, ExitWritesEveryBufferedLine) {
  ASSERT_EQ(1, run({"exit", mLog}));
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
    EXPECT_EQ(128 + lSignal, run({"crash", lLog, std::to_string(lSignal)}));
    const std::string lText = qntest::readFile(lLog);
    EXPECT_EQ(101u, linesOf(lText).size());
    EXPECT_EQ(1u, countOf(lText, ") line 99\n"));
    EXPECT_EQ(1u, countOf(lText, "last line before the crash"));
  }
}

TEST_F(LoggerProcessTest, UnopenablePathIsReportedAndTheProcessGoesOn) {
  const std::string lBad = mDir.file("no/such/dir/x.log");
  ASSERT_EQ(0, run({"badpath", lBad}));
  EXPECT_NE(std::string::npos, stdErr().find("Cannot open log file '" + lBad + "'")) << stdErr();
  EXPECT_EQ("went on\n", qntest::readFile(mDir.file("stdout")));
  EXPECT_EQ(0u, countOf(stdErr(), "still here"));  // an info line never reaches the terminal
}

}  // namespace
