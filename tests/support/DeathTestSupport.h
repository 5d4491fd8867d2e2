#pragma once
// Matching the standard error of a process that failed an assertion.

#include <gtest/gtest.h>

#include <string>

#include "TestSupport.h"

namespace qntest {

// Matches output that holds exactly one "-H-" line, and that line ends in
// "Assertion [ <condition> ] failed".
inline ::testing::Matcher<const std::string&> assertionFailure(const std::string& acrCondition) {
  const std::string lExpected = "Assertion [ " + acrCondition + " ] failed";
  return ::testing::Truly([lExpected](const std::string& acrOutput) {
    const size_t lAt = acrOutput.find("-H-");
    const std::string lLine = acrOutput.substr(lAt == std::string::npos ? 0 : lAt);
    const std::string lHaltLine = lLine.substr(0, lLine.find('\n'));
    return countOf(acrOutput, "-H-") == 1 && lHaltLine.size() >= lExpected.size() &&
           lHaltLine.compare(lHaltLine.size() - lExpected.size(), lExpected.size(), lExpected) == 0;
  });
}

}  // namespace qntest
