#include <gtest/gtest.h>

#include <string>

#include "MultiType.h"
#include "QNException.h"
#include "TestSupport.h"

namespace {

template <class Call>
std::string invalidMessage(const Call& acrCall) {
  return qntest::thrown<QNCInvalidEx>(acrCall);
}

TEST(MultiTypeTest, ConversionToAKindNotHeldIsRefusedWithBothKindsNamed) {
  const QNCMultiType lText("/etc/qn.conf");
  const QNCMultiType lFlag(static_cast<signed char>(1));
  const QNCMultiType lNumber(16u);

  EXPECT_EQ("Setting value holds text, not an unsigned integer",
            invalidMessage([&] { (void)static_cast<unsigned int>(lText); }));
  EXPECT_EQ("Setting value holds text, not a signed byte",
            invalidMessage([&] { (void)static_cast<signed char>(lText); }));
  EXPECT_EQ("Setting value holds a signed byte, not an unsigned integer",
            invalidMessage([&] { (void)static_cast<unsigned int>(lFlag); }));
  EXPECT_EQ("Setting value holds an unsigned integer, not a signed byte",
            invalidMessage([&] { (void)static_cast<signed char>(lNumber); }));
  EXPECT_EQ("Setting value holds an unsigned integer, not text", invalidMessage([&] { (void)lNumber.getText(); }));

  EXPECT_STREQ("/etc/qn.conf", lText.getText().get());
  EXPECT_EQ(1, static_cast<signed char>(lFlag));
  EXPECT_EQ(16u, static_cast<unsigned int>(lNumber));
}

TEST(MultiTypeTest, EncodeThenDecodeRestoresEveryKindAtItsLimits) {
  for (unsigned int lNumber : {0u, 1u, 4294967295u}) {
    QNCMultiType lSource(lNumber);
    QNCString lText;
    lSource.encode(lText);
    QNCMultiType lTarget(12345u);
    lTarget.decode(lText);
    EXPECT_EQ(lNumber, static_cast<unsigned int>(lTarget)) << lText.get();
  }
  for (int lByte : {-128, -1, 0, 127}) {
    QNCMultiType lSource(static_cast<signed char>(lByte));
    QNCString lText;
    lSource.encode(lText);
    QNCMultiType lTarget(static_cast<signed char>(5));
    lTarget.decode(lText);
    EXPECT_EQ(lByte, static_cast<signed char>(lTarget)) << lText.get();
  }
  QNCMultiType lText("a = b");
  QNCString lEncoded;
  lText.encode(lEncoded);
  EXPECT_STREQ("a = b", lEncoded.get());
}

// decode() must never store a value that the text does not say: wrapped, truncated or partly
// parsed numbers would become silently wrong settings.
TEST(MultiTypeTest, DecodeRefusesWhatIsNotExactlyANumberAndKeepsTheOldValue) {
  QNCMultiType lNumber(42u);
  for (const char* lpBad : {"", "abc", "12abc", " 12", "12 ", "+12", "-1", "4294967296", "99999999999999999999"}) {
    EXPECT_EQ(std::string("'") + lpBad + "' is not an unsigned integer",
              invalidMessage([&] { lNumber.decode(lpBad); }));
    EXPECT_EQ(42u, static_cast<unsigned int>(lNumber));
  }
  QNCMultiType lByte(static_cast<signed char>(3));
  for (const char* lpBad : {"128", "-129", "-", "1.0", "true"}) {
    EXPECT_EQ(std::string("'") + lpBad + "' is not a signed byte", invalidMessage([&] { lByte.decode(lpBad); }));
    EXPECT_EQ(3, static_cast<signed char>(lByte));
  }
}

}  // namespace
