#pragma once
// Matching the standard error of a process that failed an assertion.

#include <gmock/gmock.h>

#include <string>

#include "TestSupport.h"

namespace qntest {

// Matches output that holds exactly one "-H-" line, and that line ends in
// "Assertion [ <condition> ] failed".
MATCHER_P(assertionFailure, apCondition,
          "holds exactly one \"-H-\" line, ending in \"Assertion [ " + std::string(apCondition) +
              " ] failed\"") {
  const std::string lExpected = "Assertion [ " + std::string(apCondition) + " ] failed";
  const size_t lHaltLines = countOf(arg, "-H-");
  const size_t lAt = arg.find("-H-");
  // Up to the line's end (to the output's end when no line break follows).
  const std::string lHaltLine = lAt == std::string::npos ? "" : arg.substr(lAt, arg.find('\n', lAt) - lAt);
  *result_listener << "which holds " << lHaltLines << " \"-H-\" lines";
  return lHaltLines == 1 && lHaltLine.size() >= lExpected.size() &&
         lHaltLine.compare(lHaltLine.size() - lExpected.size(), lExpected.size(), lExpected) == 0;
}

}  // namespace qntest
