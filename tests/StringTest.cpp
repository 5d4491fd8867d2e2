#include <gtest/gtest.h>

#include <string>

#include "DeathTestSupport.h"
#include "QNString.h"

namespace {

// Equality and order compare the whole text: a prefix is neither equal to the longer text nor
// after it, and the empty text (however made) equals only another empty one. In each pair below
// the left text comes first.
TEST(StringTest, EqualityAndOrderCompareTheWholeText) {
  const std::pair<const char*, const char*> lOrdered[] = {
      {"abc", "abd"}, {"ab", "abc"}, {"a", "ab"}, {"", "a"}, {"ab", "b"}};
  for (const auto& lrPair : lOrdered) {
    SCOPED_TRACE(std::string(lrPair.first) + " vs " + lrPair.second);
    const QNCString lLeft(lrPair.first);
    const QNCString lRight(lrPair.second);
    EXPECT_FALSE(lLeft == lRight);
    EXPECT_FALSE(lRight == lLeft);
    EXPECT_TRUE(lLeft < lRight);
    EXPECT_FALSE(lRight < lLeft);
  }
  for (const char* lpText : {"abc", ""}) {
    EXPECT_TRUE(QNCString(lpText) == QNCString(lpText)) << lpText;
    EXPECT_FALSE(QNCString(lpText) < QNCString(lpText)) << lpText;
  }
  const QNCString lDefault;
  EXPECT_TRUE(lDefault.isEmpty());
  EXPECT_TRUE(QNCString("") == lDefault);
  EXPECT_FALSE(QNCString("x").isEmpty());
}

TEST(StringTest, CopiesNeverShareStorage) {
  QNCString lSource("base");
  QNCString lCopy(lSource);
  QNCString lAssigned("other");
  lAssigned = lSource;
  EXPECT_NE(lSource.get(), lCopy.get());
  EXPECT_NE(lSource.get(), lAssigned.get());

  lCopy += QNCString("-copy");
  lAssigned += QNCString("-assigned");
  EXPECT_STREQ("base", lSource.get());
  EXPECT_STREQ("base-copy", lCopy.get());
  EXPECT_STREQ("base-assigned", lAssigned.get());
}

TEST(StringTest, AppendChangesInPlaceAndChains) {
  QNCString lText("ab");
  QNCString& lrResult = (lText += QNCString("c"));
  EXPECT_EQ(&lText, &lrResult);
  lText += QNCString("");
  EXPECT_STREQ("abc", lText.get());
  lText += lText;  // appending itself reads the text before it grows
  EXPECT_STREQ("abcabc", lText.get());
  EXPECT_EQ(6u, lText.length());
}

TEST(StringDeathTest, NullTextIsAnAssertion) {
  EXPECT_EXIT({ QNCString lText(static_cast<const char*>(nullptr)); }, ::testing::ExitedWithCode(1),
              qntest::assertionFailure("0 != apString"));
}

}  // namespace
