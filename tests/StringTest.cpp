#include <gtest/gtest.h>

#include "DeathTestSupport.h"
#include "QNString.h"

namespace {

TEST(StringTest, EmptyTextIsAValidStringEqualToAnyOtherEmptyOne) {
  const QNCString lEmpty("");
  const QNCString lDefault;
  EXPECT_TRUE(lEmpty.isEmpty());
  EXPECT_TRUE(lDefault.isEmpty());
  EXPECT_STREQ("", lEmpty.get());
  EXPECT_TRUE(lEmpty == lDefault);
  EXPECT_FALSE(lEmpty < lDefault);
  EXPECT_FALSE(QNCString("x").isEmpty());
}

TEST(StringTest, EqualityComparesTheWholeText) {
  EXPECT_TRUE(QNCString("abc") == QNCString("abc"));
  EXPECT_FALSE(QNCString("abc") == QNCString("abd"));
  EXPECT_FALSE(QNCString("ab") == QNCString("abc"));
  EXPECT_FALSE(QNCString("abc") == QNCString("ab"));
  EXPECT_FALSE(QNCString("") == QNCString("a"));
}

TEST(StringTest, ShorterPrefixOrdersFirstAndNeverTheReverse) {
  const QNCString lShort("a");
  const QNCString lLong("ab");
  EXPECT_TRUE(lShort < lLong);
  EXPECT_FALSE(lLong < lShort);
  EXPECT_FALSE(lShort < lShort);
  EXPECT_TRUE(QNCString("") < lShort);
  EXPECT_TRUE(QNCString("ab") < QNCString("b"));
  EXPECT_FALSE(QNCString("b") < QNCString("ab"));
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
