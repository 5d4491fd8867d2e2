// Where log lines go besides the file, and which files the log refuses: the journal copy on
// standard error, reopening after the log was moved away (SIGUSR1), safe opening and the mode of
// a new log file.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <csignal>
#include <cstdio>
#include <string>
#include <thread>
#include <tuple>
#include <vector>

#include "LogSupport.h"

namespace {

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
