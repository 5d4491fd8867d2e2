#include "Assert.h"

#include <cstdlib>

#include "Logger.h"

void QNAssertionFailed(const char* apCondition, unsigned int aLine, const char* apFunction,
                       const char* apFile) {
  if (QNIsLogLevelOn(QNLL_Halt)) {
    PrintLogMessageWithTimeStamp(QNLL_Halt, "-H-", aLine, apFunction, apFile, "Assertion [ %s ] failed\n",
                                 apCondition);
  }
  exit(1);
}
