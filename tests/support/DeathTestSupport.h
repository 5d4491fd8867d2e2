#pragma once
// Matching the standard error of a process that failed an assertion.

#include <gtest/gtest.h>

#include <ostream>
#include <string>

#include "TestSupport.h"

namespace qntest {

// Matches output that holds exactly one "-H-" line, and that line reads
// "Assertion [ <condition> ] failed".
class AssertionOutputMatcher : public ::testing::MatcherInterface<const std::string&> {
 public:
  explicit AssertionOutputMatcher(std::string aCondition)
      : mExpected("Assertion [ " + aCondition + " ] failed") {}

  bool MatchAndExplain(const std::string& acrOutput,
                       ::testing::MatchResultListener* apListener) const override {
    const size_t lHaltLines = countOf(acrOutput, "-H-");
    const size_t lAt = acrOutput.find("-H-");
    // Up to the line's end (to the output's end when no line break follows).
    const std::string lHaltLine =
        lAt == std::string::npos ? "" : acrOutput.substr(lAt, acrOutput.find('\n', lAt) - lAt);
    *apListener << "which holds " << lHaltLines << " \"-H-\" lines";
    return lHaltLines == 1 && lHaltLine.size() >= mExpected.size() &&
           lHaltLine.compare(lHaltLine.size() - mExpected.size(), mExpected.size(), mExpected) == 0;
  }
  void DescribeTo(std::ostream* apStream) const override {
    *apStream << "holds exactly one \"-H-\" line, ending in \"" << mExpected << "\"";
  }

 private:
  std::string mExpected;
};

inline ::testing::Matcher<const std::string&> assertionFailure(const std::string& acrCondition) {
  return ::testing::MakeMatcher(new AssertionOutputMatcher(acrCondition));
}

}  // namespace qntest
