#pragma once
// Reading what the library logged: a fixture that gives each test a log file of its own, and
// checks on the order and level of the lines in it.

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "Logger.h"
#include "QNString.h"
#include "TestSupport.h"

namespace qntest {

// Fails unless every text occurs in acrLog, each after the one before it.
inline void expectInOrder(const std::string& acrLog, const std::vector<std::string>& acrTexts) {
  size_t lFrom = 0;
  for (const std::string& acrText : acrTexts) {
    const size_t lAt = acrLog.find(acrText, lFrom);
    ASSERT_NE(std::string::npos, lAt) << "'" << acrText << "' missing or out of order in:\n" << acrLog;
    lFrom = lAt + acrText.size();
  }
}

// The level tag ("-N-", "-E-", ...) of the first line that contains the text; "" when there is none.
inline std::string levelOf(const std::string& acrLog, const std::string& acrText) {
  const size_t lAt = acrLog.find(acrText);
  if (lAt == std::string::npos) return "";
  const size_t lLineStart = acrLog.rfind('\n', lAt) == std::string::npos ? 0 : acrLog.rfind('\n', lAt) + 1;
  const size_t lTag = acrLog.find(" -", lLineStart);
  return lTag == std::string::npos || lTag > lAt ? "" : acrLog.substr(lTag + 1, 3);
}

// Every level logged into a file of the test's own directory; log() flushes and reads it.
class LoggedTest : public ::testing::Test {
 protected:
  void SetUp() override {
    setLogCode(255);
    CreateLogger(QNCString(mLogPath.c_str()));
  }
  void TearDown() override { destroyLogger(); }

  std::string log() {
    flushLogger();
    return readFile(mLogPath);
  }

  TempDir mDir;
  std::string mLogPath = mDir.file("test.log");
};

}  // namespace qntest
