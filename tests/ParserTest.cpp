// The readers of outside text: the configuration file parser, the command-line parser and the
// decoding of setting values. The fuzz targets (fuzz/) hold them to their properties over stored
// inputs in every build; these cases pin the exact results and messages.

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>

#include "CommandLineParser.h"
#include "KeyValueFormatParser.h"
#include "MultiType.h"
#include "TestSupport.h"

namespace {

using qntest::thrown;

class KeyValueFormatParserTest : public ::testing::Test {
 protected:
  std::string write(const std::string& acrText) {
    const std::string lPath = mDir.file("f" + std::to_string(mFiles++) + ".conf");
    qntest::writeFile(lPath, acrText);
    return lPath;
  }
  qntest::TempDir mDir;
  int mFiles = 0;
};

TEST_F(KeyValueFormatParserTest, ReadsKeysValuesAndLinesSkippingCommentsAndBlanks) {
  const std::string lPath = write(
      "# the sensor service\n\n   ; another comment\n  Port   =   4711  \n"
      "\tName\t=\tfront door\t\r\nQuery = a=b=c\nEmpty =\nlast=1");
  QNCKeyValueFormatParser lParser(QNCString(lPath.c_str()), QNCString(""), false, false);
  lParser.parse();
  QNCVector<QNCString> lKeys;
  lParser.getKeys(lKeys);
  std::string lJoined;
  for (unsigned int lIndex = 0; lIndex < lKeys.numberOfElements(); ++lIndex)
    lJoined += std::string(lKeys[lIndex].get()) + "=" + lParser.getValue(lKeys[lIndex]).get() + ":" +
               std::to_string(lParser.getLine(lKeys[lIndex])) + ";";
  EXPECT_EQ("Port=4711:4;Name=front door:5;Query=a=b=c:6;Empty=:7;last=1:8;", lJoined);
  EXPECT_FALSE(lParser.hasKey("name"));  // exact comparison by default
  EXPECT_NE(std::string::npos, thrown<QNCNotFoundEx>([&] { lParser.getValue("colour"); }).find("'colour'"));
  // Other comment markers, keys without regard to case, a later duplicate replacing the value.
  QNCKeyValueFormatParser lOther(
      QNCString(write("// note\n# not a comment = yes\nHOST = x\nhost = y\n").c_str()), QNCString("/"), true,
      true);
  lOther.parse();
  EXPECT_STREQ("yes", lOther.getValue("# not a comment").get());
  EXPECT_STREQ("y", lOther.getValue("Host").get());
  EXPECT_EQ(4u, lOther.getLine("host"));
}

TEST_F(KeyValueFormatParserTest, BadFilesAreRefusedNamingFileAndLine) {
  const struct {
    std::string mText;
    bool mFold;
    std::string mMessage;
  } lCases[] = {
      {"a = 1\n\njust words\n", false, ":3: expected 'key = value'"},
      {"  = 5\n", false, ":1: expected 'key = value'"},
      {std::string("a = 1\nb = x\0y\n", 14), false, ":2: expected 'key = value'"},
      {"a = 1\nb = 2\nA = 3\na = 4\n", false, ":4: key 'a' already set on line 1"},
      {"a = 1\nb = 2\nA = 3\na = 4\n", true, ":3: key 'A' already set on line 1"},
  };
  for (const auto& lrCase : lCases) {
    const std::string lPath = write(lrCase.mText);
    QNCKeyValueFormatParser lParser(QNCString(""), QNCString(""), lrCase.mFold, false);
    EXPECT_EQ(lPath + lrCase.mMessage,
              thrown<QNCException>([&] { lParser.parse(QNCString(lPath.c_str())); }));
  }
  // getUnsigned is held to an independent decimal reading by the KeyValueFormatParser fuzz target.
}

// A file that cannot be opened, read or parsed leaves what was read before; a good one replaces it.
TEST_F(KeyValueFormatParserTest, OnlyASuccessfulParseReplacesThePreviousContents) {
  const std::string lGood = write("a = 1\n");
  QNCKeyValueFormatParser lParser(QNCString(lGood.c_str()), QNCString(""), false, false);
  lParser.parse();
  const std::string lMissing = mDir.file("missing.conf");
  EXPECT_NE(std::string::npos, thrown<QNCOpenFailedEx>([&] {
                                 lParser.parse(QNCString(lMissing.c_str()));
                               }).find("'" + lMissing + "'"));
  EXPECT_NE(std::string::npos, thrown<QNCReadFailedEx>([&] {
                                 lParser.parse(QNCString(mDir.path().c_str()));  // opens, cannot be read
                               }).find("'" + mDir.path() + "'"));
  EXPECT_THROW(lParser.parse(QNCString(write("b = 2\nbroken\n").c_str())), QNCInvalidEx);
  EXPECT_STREQ("1", lParser.getValue("a").get());
  EXPECT_FALSE(lParser.hasKey("b"));
  EXPECT_EQ(lGood, lParser.getFilePath().get());
  const std::string lSecond = write("b = 2\n");
  lParser.parse(QNCString(lSecond.c_str()));
  EXPECT_FALSE(lParser.hasKey("a"));
  EXPECT_EQ(lSecond, lParser.getFilePath().get());
}

// The eight common options plus one of the application's own ("-n", with a value), and one whose
// descriptor fills its whole array (no NUL: matching must stay inside the array).
class CommandLineParserTest : public ::testing::Test {
 protected:
  CommandLineParserTest() {
    for (const char* lpOption : {"-v", "-h", "-s", "-abcdefghijklmno"}) add(lpOption, 0);
    for (const char* lpOption : {"-c", "-d", "-b", "-D", "-I", "-n"}) add(lpOption, 1);
  }
  void add(const char* apOption, unsigned int aTakesValue) {
    QNSCommandLineArgumentDesc lDesc = {};
    memcpy(lDesc.mOption, apOption, std::min(strlen(apOption), sizeof lDesc.mOption));
    lDesc.mTakesValue = aTakesValue;
    mDesc.append(lDesc);
  }
  // "" when run() accepts the line, else the message of its QNCInvalidEx.
  std::string parse(const char* apLine) {
    mParser.setCommandLine(apLine);
    mParser.setArgumentDesc(mDesc);
    const std::string lMessage = thrown<QNCInvalidEx>([&] { mParser.run(); });
    return lMessage == "(nothing thrown)" ? "" : lMessage;
  }
  QNCVector<QNSCommandLineArgumentDesc> mDesc;
  QNCCommandLineParser mParser;
};

// QnsensordTest pins the usage errors for an unknown option, a missing value and a flag given one;
// the command-line fuzz target holds every value found to the word after its option.
TEST_F(CommandLineParserTest, ValuesFlagsAndRefusalsNamingTheOffendingWord) {
  ASSERT_EQ("", parse("  -d 16\t-v   -I -5 -c /etc/qn.conf -abcdefghijklmno"));
  const std::pair<const char*, const char*> lRefusals[] = {
      {"-d16", "Unknown option '-d16'"},
      {"-abcdefghijklmnop", "Unknown option '-abcdefghijklmnop'"},
      {"start -v", "Unexpected argument 'start'"},
      {"-d 16 17", "Unexpected argument '17'"},
      {"-s -s", "Option '-s' given more than once"},
  };
  for (const auto& lrRefusal : lRefusals) {
    EXPECT_EQ(lrRefusal.second, parse(lrRefusal.first));
    EXPECT_EQ(QNCLPS_Failed, mParser.getState());
  }
  // A failed run keeps nothing of an earlier successful one: a handler would act on options that
  // are not on the current line.
  QNCPointer<QNCCommandLineArgument> lArgument;
  EXPECT_EQ("Option '-d' is not on the command line",
            thrown<QNCNotFoundEx>([&] { mParser.getArgument("-d", lArgument); }));
  EXPECT_TRUE(lArgument.isNull());
}

// Conversions and decoding never produce a value the setting does not hold or the text does not
// say; the old value stays.
TEST(MultiTypeTest, WrongKindsAndBadTextsAreRefusedWithClearMessages) {
  const QNCMultiType lText("/etc/qn.conf"), lFlag(static_cast<signed char>(1)), lNumber(16u);
  EXPECT_EQ("Setting value holds text, not an unsigned integer",
            thrown<QNCInvalidEx>([&] { (void)static_cast<unsigned int>(lText); }));
  EXPECT_EQ("Setting value holds a signed byte, not an unsigned integer",
            thrown<QNCInvalidEx>([&] { (void)static_cast<unsigned int>(lFlag); }));
  EXPECT_EQ("Setting value holds an unsigned integer, not a signed byte",
            thrown<QNCInvalidEx>([&] { (void)static_cast<signed char>(lNumber); }));
  EXPECT_EQ("Setting value holds an unsigned integer, not text",
            thrown<QNCInvalidEx>([&] { (void)lNumber.getText(); }));
  QNCMultiType lValue(42u), lByte(static_cast<signed char>(3));
  EXPECT_EQ("' 12' is not an unsigned integer", thrown<QNCInvalidEx>([&] { lValue.decode(" 12"); }));
  EXPECT_EQ("'128' is not a signed byte", thrown<QNCInvalidEx>([&] { lByte.decode("128"); }));
  EXPECT_EQ(42u, static_cast<unsigned int>(lValue));
  EXPECT_EQ(3, static_cast<signed char>(lByte));
}

}  // namespace
