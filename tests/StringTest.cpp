#include <gtest/gtest.h>

#include <string>

#include "DeathTestSupport.h"
#include "QNString.h"

namespace {

// Equality and order compare the whole text: a prefix is neither equal to the longer text nor
// after it, and the empty text (however made) equals only another empty one.
TEST(StringTest, EqualityAndOrderCompareTheWholeText) {
  struct Row {
    const char* mLeft;
    const char* mRight;
    bool mEqual, mLeftFirst, mRightFirst;
  };
  const Row lRows[] = {
      {"abc", "abc", true, false, false}, {"abc", "abd", false, true, false},
      {"ab", "abc", false, true, false},  {"a", "ab", false, true, false},
      {"", "a", false, true, false},      {"ab", "b", false, true, false},
      {"", "", true, false, false},
  };
  for (const Row& lrRow : lRows) {
    SCOPED_TRACE(std::string(lrRow.mLeft) + " vs " + lrRow.mRight);
    const QNCString lLeft(lrRow.mLeft);
    const QNCString lRight(lrRow.mRight);
    EXPECT_EQ(lrRow.mEqual, lLeft == lRight);
    EXPECT_EQ(lrRow.mEqual, lRight == lLeft);
    EXPECT_EQ(lrRow.mLeftFirst, lLeft < lRight);
    EXPECT_EQ(lrRow.mRightFirst, lRight < lLeft);
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

  lSource += QNCString("-source");
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
