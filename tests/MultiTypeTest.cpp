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
  EXPECT_EQ("Setting value holds an unsigned integer, not text",
            invalidMessage([&] { (void)lNumber.getText(); }));

  EXPECT_STREQ("/etc/qn.conf", lText.getText().get());
}

// aTarget after decoding what acrSource encodes.
QNCMultiType roundTrip(const QNCMultiType& acrSource, QNCMultiType aTarget) {
  QNCString lText;
  acrSource.encode(lText);
  aTarget.decode(lText);
  return aTarget;
}

TEST(MultiTypeTest, EncodeThenDecodeRestoresEveryKindAtItsLimits) {
  for (unsigned int lNumber : {0u, 1u, 4294967295u})
    EXPECT_EQ(lNumber, static_cast<unsigned int>(roundTrip(QNCMultiType(lNumber), QNCMultiType(12345u))));
  for (int lByte : {-128, -1, 0, 127}) {
    const QNCMultiType lByteValue(static_cast<signed char>(lByte));
    EXPECT_EQ(lByte,
              static_cast<signed char>(roundTrip(lByteValue, QNCMultiType(static_cast<signed char>(5)))));
  }
  EXPECT_STREQ("a = b", roundTrip(QNCMultiType("a = b"), QNCMultiType("old")).getText().get());
}

// decode() must never store a value that the text does not say: wrapped, truncated or partly
// parsed numbers would become silently wrong settings.
TEST(MultiTypeTest, DecodeRefusesWhatIsNotExactlyANumberAndKeepsTheOldValue) {
  QNCMultiType lNumber(42u);
  for (const char* lpBad :
       {"", "abc", "12abc", " 12", "12 ", "+12", "-1", "4294967296", "99999999999999999999"}) {
    EXPECT_EQ(std::string("'") + lpBad + "' is not an unsigned integer",
              invalidMessage([&] { lNumber.decode(lpBad); }));
    EXPECT_EQ(42u, static_cast<unsigned int>(lNumber));
  }
  QNCMultiType lByte(static_cast<signed char>(3));
  for (const char* lpBad : {"128", "-129", "-", "1.0", "true"}) {
    EXPECT_EQ(std::string("'") + lpBad + "' is not a signed byte",
              invalidMessage([&] { lByte.decode(lpBad); }));
    EXPECT_EQ(3, static_cast<signed char>(lByte));
  }
}

}  // namespace
