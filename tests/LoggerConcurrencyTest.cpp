#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <cstdio>
#include <sstream>
#include <thread>

#include "LogSupport.h"

using LoggerConcurrencyTest = qntest::LoggedTest;

// A line that is neither urgent nor flushed reaches the file within a second, whatever the flusher
// thread is doing when it comes: waiting for a first line, gathering a batch, just done writing one,
// or finding that an urgent line has written the batch it was gathering.
TEST_F(LoggerConcurrencyTest, UnflushedLineReachesTheFileWithinASecondInEveryFlusherPhase) {
  for (int lIndex = 0; lIndex < 8; ++lIndex) {
    std::this_thread::sleep_for(std::chrono::milliseconds(60 * lIndex));  // 0 to 420 ms after the last
    if (lIndex % 3 == 1) QN_LOG_WARNING("urgent %d", lIndex);
    QN_LOG_TRACE("%d trickled", lIndex);
    EXPECT_TRUE(qntest::waitForText(mLogPath, std::to_string(lIndex) + " trickled", std::chrono::seconds(1)));
  }
}

// Threads that start together log numbered lines of their own length while the test thread
// flushes: a line copied outside the lock is lost, torn or doubled, which breaks a number or a body.
TEST_F(LoggerConcurrencyTest, LinesLoggedAtOnceByManyThreadsAreEachInTheFileOnceAndWhole) {
  constexpr int kThreads = 3, kLines = 50000;
  std::atomic<int> lWaiting{kThreads};
  std::thread lThreads[kThreads];
  for (int lThread = 0; lThread < kThreads; ++lThread)
    lThreads[lThread] = std::thread([&lWaiting, lThread] {
      const std::string lBody(8 + 9 * lThread, static_cast<char>('a' + lThread));
      for (--lWaiting; lWaiting.load() > 0;) std::this_thread::yield();
      for (int lLine = 0; lLine < kLines; ++lLine) QN_LOG_TRACE("<%d %d %s>", lThread, lLine, lBody.c_str());
    });
  for (int lFlush = 0; lFlush < 100; ++lFlush) flushLogger();
  for (std::thread& lrThread : lThreads) lrThread.join();
  std::istringstream lLog(log());
  int lNext[kThreads] = {};
  for (std::string lLine; std::getline(lLog, lLine);) {
    int lThread = -1, lNumber = 0, lEnd = 0;
    char lBody[64] = "";
    const std::string lMessage = lLine.substr(lLine.find(") <") + 2);  // junk, or a throw, without one
    ASSERT_EQ(3, sscanf(lMessage.c_str(), "<%d %d %63[a-z]>%n", &lThread, &lNumber, lBody, &lEnd)) << lLine;
    ASSERT_TRUE(lThread >= 0 && lThread < kThreads && lMessage.size() == static_cast<size_t>(lEnd)) << lLine;
    EXPECT_TRUE(lNext[lThread]++ == lNumber && std::string(8 + 9 * lThread, 'a' + lThread) == lBody) << lLine;
  }
  for (const int lCount : lNext) EXPECT_EQ(kLines, lCount);
}
