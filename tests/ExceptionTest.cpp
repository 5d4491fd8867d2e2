#include <gtest/gtest.h>

#include <cstdio>
#include <cstring>

#include "QNException.h"

namespace {

// A message built in a local buffer must survive the buffer: the exception owns a copy.
[[noreturn]] void throwFromLocalBuffer() {
  char lBuffer[64];
  snprintf(lBuffer, sizeof lBuffer, "bad frame at %d", 42);
  QNCReadFailedEx lException(lBuffer, 328);
  memset(lBuffer, 'x', sizeof lBuffer - 1);
  throw lException;
}

// Each class is caught through the bases of its category and never through another category.
TEST(ExceptionTest, ClassesAreCaughtThroughTheirCategoryOnly) {
  const QNCNoMemoryEx lNoMemory("Out of Memory", 2);
  const QNCException& lrNoMemory = lNoMemory;
  EXPECT_NE(nullptr, dynamic_cast<const QNCHaltEx*>(&lrNoMemory));
  EXPECT_NE(nullptr, dynamic_cast<const QNCGenericException*>(&lrNoMemory));
  EXPECT_EQ(nullptr, dynamic_cast<const QNCOsException*>(&lrNoMemory));
  EXPECT_STREQ("Out of Memory", lrNoMemory.what());
  EXPECT_EQ(2u, lrNoMemory.getCode());

  const QNCExistsEx lExists("Element already exists in map.. can't insert", 10);
  const QNCException& lrExists = lExists;
  EXPECT_NE(nullptr, dynamic_cast<const QNCGenericException*>(&lrExists));
  EXPECT_EQ(nullptr, dynamic_cast<const QNCOsException*>(&lrExists));
  EXPECT_EQ(nullptr, dynamic_cast<const QNCHaltEx*>(&lrExists));
}

TEST(ExceptionTest, MessageSurvivesTheBufferItCameFrom) {
  try {
    throwFromLocalBuffer();
  } catch (const QNCOsException& acrException) {
    EXPECT_STREQ("bad frame at 42", acrException.what());
    EXPECT_EQ(328u, acrException.getCode());
  }
}

TEST(ExceptionTest, OverlongMessageIsCutNotOverflowed) {
  const std::string lLong(5000, 'm');
  const QNCInvalidEx lException(lLong.c_str(), 6);
  EXPECT_EQ(QNCException::kMaxMessage - 1, strlen(lException.what()));
}

}  // namespace
