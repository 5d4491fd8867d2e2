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

TEST(ExceptionTest, NoMemoryIsCaughtThroughEveryBase) {
  try {
    throw QNCNoMemoryEx("Out of Memory", 2);
  } catch (QNCGenericException& arException) {
    EXPECT_STREQ("Out of Memory", arException.what());
  }
  try {
    throw QNCNoMemoryEx("Out of Memory", 2);
  } catch (QNCHaltEx& arException) {
    EXPECT_STREQ("Out of Memory", arException.what());
  }
  try {
    throw QNCNoMemoryEx("Out of Memory", 2);
  } catch (QNCException& arException) {
    EXPECT_STREQ("Out of Memory", arException.what());
    EXPECT_EQ(2u, arException.getCode());
  }
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

TEST(ExceptionTest, CategoryDoesNotCatchAnotherCategory) {
  bool lCaughtAsOs = false;
  try {
    try {
      throw QNCExistsEx("Element already exists in map.. can't insert", 10);
    } catch (QNCOsException&) {
      lCaughtAsOs = true;
    }
  } catch (QNCGenericException& arException) {
    EXPECT_EQ(10u, arException.getCode());
  }
  EXPECT_FALSE(lCaughtAsOs);
}

}  // namespace
