#include <gtest/gtest.h>

#include <cstdio>
#include <cstring>
#include <string>

#include "QNException.h"

namespace {

// Whether acrException, thrown, is caught by a handler for Base.
template <class Base, class E>
bool caughtAs(const E& acrException) {
  try {
    throw acrException;
  } catch (const Base&) {
    return true;
  } catch (...) {
    return false;
  }
}

// Each class is caught through every base of its category and never through another category;
// with two categories (generic and halt) and a shared virtual root, a non-virtual path would make
// the root ambiguous and the root handler would miss it.
TEST(ExceptionTest, ClassesAreCaughtThroughTheirCategoryOnly) {
  const QNCNoMemoryEx lNoMemory("Out of Memory", 2);
  EXPECT_TRUE(caughtAs<QNCHaltEx>(lNoMemory));
  EXPECT_TRUE(caughtAs<QNCGenericException>(lNoMemory));
  EXPECT_TRUE(caughtAs<QNCException>(lNoMemory));
  EXPECT_FALSE(caughtAs<QNCOsException>(lNoMemory));

  const QNCExistsEx lExists("Element already exists in map.. can't insert", 10);
  EXPECT_TRUE(caughtAs<QNCGenericException>(lExists));
  EXPECT_FALSE(caughtAs<QNCOsException>(lExists));
  EXPECT_FALSE(caughtAs<QNCHaltEx>(lExists));
}

// A message built in a local buffer must survive the buffer (the exception owns a copy), and one
// longer than the exception can hold is cut, not written past its end.
TEST(ExceptionTest, MessageIsACopyCutToItsMaximum) {
  char lBuffer[64];
  snprintf(lBuffer, sizeof lBuffer, "bad frame at %d", 42);
  const QNCReadFailedEx lException(lBuffer, 328);
  memset(lBuffer, 'x', sizeof lBuffer - 1);
  EXPECT_STREQ("bad frame at 42", lException.what());
  EXPECT_EQ(328u, lException.getCode());

  const std::string lLong(5000, 'm');
  const QNCInvalidEx lLongException(lLong.c_str(), 6);
  EXPECT_EQ(QNCException::kMaxMessage - 1, strlen(lLongException.what()));
}

}  // namespace
