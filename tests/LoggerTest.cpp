// The logger: the shape and bound of its lines, its buffer across fork, exit and crashes (in
// processes of their own, qn_test_helper's log- modes), and where its lines go besides the file:
// the journal copy on standard error, reopening after the log was moved away (SIGUSR1), safe
// opening and the mode of a new log file.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <regex>
#include <sstream>
#include <string>
#include <thread>
#include <tuple>
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

// Urgent lines are in the file when the call returns, with what was buffered before them.
// Regression: a child forked while lines sat in the buffer wrote them again at its exit, so the
// parent's lines appeared twice in the log.
TEST_F(LoggerTest, UrgentLinesWriteThroughAndAForkedChildDoesNotRepeatTheParentsLines) {
  QN_LOG_TRACE("parent before fork");
  // Once the flusher has written the line (with no further call) it idles; a fork while it was
  // still starting up could copy a sanitizer's allocator lock held, and the child would hang in
  // its exit-time leak check.
  ASSERT_TRUE(qntest::waitForText(mLogPath, "parent before fork"));
  QN_LOG_TRACE("buffered before");
  for (const auto& [lLevel, lpTag] :
       {std::pair<QNELogLevel, const char*>{QNLL_Halt, "-H-"}, {QNLL_Error, "-E-"}, {QNLL_Warning, "-W-"}}) {
    PrintLogMessageWithTimeStamp(lLevel, lpTag, __LINE__, __func__, __FILE__, "urgent %s", lpTag);
    qntest::expectInOrder(qntest::readFile(mLogPath), {"buffered before", std::string("urgent ") + lpTag});
  }
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
  for (const char* lpLine :
       {"parent before fork", "buffered before", "parent buffered at the fork", "from the child"})
    EXPECT_EQ(1u, countOf(lLog, lpLine)) << lpLine << " in:\n" << lLog;
}

// Scenarios that need a process of their own (qn_test_helper's log- modes): exit and crashes.
// (Lines before CreateLogger: the driver's and qnsensord's start-up, the death tests.)
class LoggerProcessTest : public ::testing::Test {
 protected:
  // The helper's exit status for the log- mode and its arguments.
  int run(const std::vector<std::string>& acrArgs) {
    return qntest::waitExit(qntest::spawnHelper(acrArgs, mDir.file("stdout"), mDir.file("stderr")));
  }

  qntest::TempDir mDir;
  std::string mLog = mDir.file("probe.log");
};

// exit(1) right after 1000 lines while another thread keeps logging: the exit handler writes
// every buffered line and does not deadlock against the logging thread. (An assertion's exit
// writes its urgent "-H-" line, and the buffer with it, before that: the death tests.)
TEST_F(LoggerProcessTest, ExitWritesEveryBufferedLine) {
  ASSERT_EQ(1, run({"log-exit", mLog}));
  const std::string lLog = qntest::readFile(mLog);
  for (int lIndex = 0; lIndex < 1000; ++lIndex)
    ASSERT_EQ(1u, countOf(lLog, ") line " + std::to_string(lIndex) + "\n")) << "line " << lIndex;
  for (const std::string& lrLine : linesOf(lLog)) ASSERT_TRUE(std::regex_match(lrLine, kLine)) << lrLine;
}

TEST_F(LoggerProcessTest, CrashSignalWritesTheBufferAndStillKillsTheProcess) {
  for (const int lSignal : {SIGSEGV, SIGBUS, SIGABRT, SIGFPE}) {
    SCOPED_TRACE(strsignal(lSignal));
    const std::string lLog = mDir.file("crash" + std::to_string(lSignal) + ".log");
    EXPECT_EQ(128 + lSignal, run({"log-crash", lLog, std::to_string(lSignal)}));
    const std::string lText = qntest::readFile(lLog);
    EXPECT_EQ(101u, linesOf(lText).size());
    EXPECT_EQ(1u, countOf(lText, ") line 99\n"));
    EXPECT_EQ(1u, countOf(lText, "last line before the crash"));
  }
}

// Standard error goes to a file for the object's life.
struct StderrToFile {
  explicit StderrToFile(const std::string& acrPath) : mSaved(dup(2)) {
    const int lFd = open(acrPath.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
    dup2(lFd, 2);
    close(lFd);
  }
  ~StderrToFile() {
    dup2(mSaved, 2);
    close(mSaved);
  }
  const int mSaved;
};

class LogOutputTest : public qntest::LoggedTest {
 protected:
  std::string mErr = mDir.file("stderr");
};

// The copy is made for QN_LOG_STDERR=1 and for a JOURNAL_STREAM that names standard error itself,
// not for one naming another stream (standard error redirected after systemd started the process).
// It is each line of the log behind its priority, one per line. Each case's new log file is made
// 0640 under a different umask (a daemon's is 0).
TEST_F(LogOutputTest, JournalCopyCarriesEachLinesPriority) {
  const std::tuple<unsigned int, const char*, const char*> lLevels[] = {
      {QNLL_Halt, "-H-", "<2>"},   {QNLL_Error, "-E-", "<3>"}, {QNLL_Warning, "-W-", "<4>"},
      {QNLL_Notice, "-N-", "<5>"}, {QNLL_Info, "-I-", "<6>"},  {QNLL_Trace, "-T-", "<7>"}};
  const std::tuple<std::string, const char*, bool, bool, mode_t> lCases[] = {
      {"forced", "1", false, true, 0},
      {"journal", nullptr, true, true, 022},
      {"other", "0", false, false, 077}};
  for (const auto& [lCase, lpForced, lStreamIsStderr, lCopied, lUmask] : lCases) {
    const std::string lLogPath = mDir.file(lCase + ".log");
    const mode_t lPrevious = umask(lUmask);
    struct stat lStat;
    {
      StderrToFile lRedirect(mErr);
      ASSERT_EQ(0, fstat(2, &lStat));
      const std::string lOwn = std::to_string(lStat.st_dev) + ":" + std::to_string(lStat.st_ino);
      setenv("JOURNAL_STREAM", lStreamIsStderr ? lOwn.c_str() : "1:1", 1);
      lpForced != nullptr ? setenv("QN_LOG_STDERR", lpForced, 1) : unsetenv("QN_LOG_STDERR");
      CreateLogger(QNCString(lLogPath.c_str()));
      for (const auto& [lLevel, lpTag, lpPrefix] : lLevels)
        PrintLogMessageWithTimeStamp(lLevel, lpTag, 1, "f", "x.cpp", "%s", lpPrefix);
      destroyLogger();
    }
    umask(lPrevious);
    unsetenv("JOURNAL_STREAM");
    unsetenv("QN_LOG_STDERR");
    ASSERT_EQ(0, stat(lLogPath.c_str(), &lStat));
    EXPECT_EQ(0640u, lStat.st_mode & 07777) << "a new log's mode under umask " << lUmask;
    const std::string lLog = qntest::readFile(lLogPath);
    std::string lExpected;
    size_t lAt = 0;
    for (const auto& [lLevel, lpTag, lpPrefix] : lLevels) {
      const size_t lEnd = lLog.find('\n', lAt) + 1;
      EXPECT_EQ(lpTag, qntest::levelOf(lLog, lpPrefix)) << lLog;
      lExpected += lpPrefix + lLog.substr(lAt, lEnd - lAt);
      lAt = lEnd;
    }
    EXPECT_EQ(lCopied ? lExpected : "", qntest::readFile(mErr)) << lCase;
  }
}

// logrotate moves the log away and sends SIGUSR1 while four threads log: every line is found
// exactly once in the two files together, whole, and lines logged after the reopen are in the
// new file. Urgent lines among them write through during the switch.
TEST_F(LogOutputTest, Sigusr1ReopensTheMovedLogLosingAndTearingNothing) {
  constexpr int kThreads = 4;
  std::atomic<bool> lStop{false};
  std::atomic<int> lCounts[kThreads] = {};
  std::vector<std::thread> lWriters;
  for (int lThread = 0; lThread < kThreads; ++lThread)
    lWriters.emplace_back([&, lThread] {
      for (int lLine = 0; !lStop.load() || lLine < 2000; ++lLine, lCounts[lThread].store(lLine)) {
        const bool lUrgent = lLine % 97 == 0;
        PrintLogMessageWithTimeStamp(lUrgent ? QNLL_Warning : QNLL_Info, lUrgent ? "-W-" : "-I-", 1, "f",
                                     "x.cpp", "line %d.%d", lThread, lLine);
        if (lLine % 50 == 0) std::this_thread::sleep_for(std::chrono::milliseconds(1));  // bounds the files
      }
    });
  while (lCounts[0].load() < 500) std::this_thread::yield();
  const std::string lMoved = mDir.file("test.log.1");
  ASSERT_EQ(0, rename(mLogPath.c_str(), lMoved.c_str()));
  ASSERT_EQ(0, kill(getpid(), SIGUSR1));
  EXPECT_TRUE(qntest::waitForText(mLogPath, "line ", std::chrono::seconds(10)));
  lStop.store(true);
  for (std::thread& lrWriter : lWriters) lrWriter.join();
  const std::string lAll = qntest::readFile(lMoved) + log();
  std::vector<int> lSeen[kThreads];
  for (int lThread = 0; lThread < kThreads; ++lThread) lSeen[lThread].assign(lCounts[lThread].load(), 0);
  for (size_t lAt = 0, lEnd; (lEnd = lAll.find('\n', lAt)) != std::string::npos; lAt = lEnd + 1) {
    const std::string lText = lAll.substr(lAt, lEnd - lAt);
    int lThread = -1, lLine = -1, lTail = 0;
    const size_t lMessage = lText.find(" (x.cpp:1) line ");
    ASSERT_TRUE(lText.rfind("20", 0) == 0 && lMessage != std::string::npos &&
                sscanf(lText.c_str() + lMessage, " (x.cpp:1) line %d.%d%n", &lThread, &lLine, &lTail) == 2 &&
                lText.size() == lMessage + lTail)
        << "torn: " << lText;
    ++lSeen[lThread].at(lLine);
  }
  for (const std::vector<int>& lrSeen : lSeen) EXPECT_EQ(lrSeen, std::vector<int>(lrSeen.size(), 1));
}

// A link planted at the log's path, a FIFO, a file of another user: none is opened (the FIFO
// without waiting for a reader), each is named with its reason on standard error, the target
// keeps its contents, and the log already open goes on.
TEST_F(LogOutputTest, UnsafeLogPathsAreRefusedAndTheOpenLogGoesOn) {
  const std::string lTarget = mDir.file("precious"), lForeign = mDir.file("foreign"),
                    lFifo = mDir.file("fifo");
  for (const std::string& lrFile : {lTarget, lForeign}) qntest::writeFile(lrFile, "keep\n");
  ASSERT_EQ(0, symlink(lTarget.c_str(), mDir.file("link").c_str()));
  ASSERT_EQ(0, mkfifo(lFifo.c_str(), 0600));
  const bool lRoot = geteuid() == 0 && chown(lForeign.c_str(), 1, 1) == 0;
  const std::pair<std::string, std::string> lCases[] = {
      {mDir.file("link"), "is a symbolic link (not followed)"},
      {lFifo, "is not a regular file"},
      {lForeign, "is owned by another user (uid 1)"}};
  for (const auto& lrCase : lCases) {
    if (lrCase.first == lForeign && !lRoot) continue;  // only root can give a file away
    {
      StderrToFile lRedirect(mErr);
      CreateLogger(QNCString(lrCase.first.c_str()));
      QN_LOG_ERROR("after %s", lrCase.second.c_str());
    }
    EXPECT_EQ("Cannot open log file '" + lrCase.first + "': " + lrCase.second + "\n", qntest::readFile(mErr));
    EXPECT_NE(std::string::npos, log().find("after " + lrCase.second));
  }
  for (const std::string& lrFile : {lTarget, lForeign}) EXPECT_EQ("keep\n", qntest::readFile(lrFile));
}

}  // namespace
