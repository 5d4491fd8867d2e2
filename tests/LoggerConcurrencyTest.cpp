#include <gtest/gtest.h>

#include <chrono>
#include <string>
#include <thread>

#include "LogSupport.h"
#include "Logger.h"
#include "TestSupport.h"

namespace {

class LoggerConcurrencyTest : public qntest::LoggedTest {};

// A line that is neither urgent nor flushed reaches the file within a second, whatever the flusher
// thread is doing when it comes: waiting for a first line, gathering a batch, just done writing one,
// or finding that an urgent line has written the batch it was gathering.
TEST_F(LoggerConcurrencyTest, UnflushedLineReachesTheFileWithinASecondInEveryFlusherPhase) {
  const int kPausesMs[] = {0, 0, 50, 150, 190, 210, 400, 0};
  int lIndex = 0;
  for (const int lPause : kPausesMs) {
    std::this_thread::sleep_for(std::chrono::milliseconds(lPause));
    if (lIndex % 3 == 1) QN_LOG_WARNING("urgent %d", lIndex);
    const std::string lText = "trickle " + std::to_string(lIndex++) + ".";
    QN_LOG_TRACE("%s", lText.c_str());
    EXPECT_TRUE(qntest::waitForText(mLogPath, lText, std::chrono::seconds(1))) << lText;
  }
}

}  // namespace
