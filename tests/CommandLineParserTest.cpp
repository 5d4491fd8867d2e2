#include <gtest/gtest.h>

#include <string>

#include "CommandLineParser.h"
#include "QNException.h"
#include "TestSupport.h"

namespace {

// The eight common options plus one of the application's own ("-n", with a value).
class CommandLineParserTest : public ::testing::Test {
 protected:
  void SetUp() override {
    const QNSCommandLineArgumentDesc lTable[] = {
        {"-v", 0, "", ""},     {"-h", 0, "", ""},        {"-s", 0, "", ""},
        {"-c", 1, "file", ""}, {"-d", 1, "mask", ""},    {"-b", 1, "seconds", ""},
        {"-D", 1, "bool", ""}, {"-I", 1, "minutes", ""}, {"-n", 1, "count", ""},
    };
    for (const QNSCommandLineArgumentDesc& lrDesc : lTable) mDesc.append(lrDesc);
  }

  void parse(const char* apLine) {
    mParser.setCommandLine(apLine);
    mParser.setArgumentDesc(mDesc);
    mParser.run();
  }

  // The message of the QNCInvalidEx that run() throws on apLine, or "" when it succeeds.
  std::string refusal(const char* apLine) {
    try {
      parse(apLine);
    } catch (const QNCInvalidEx& acrException) {
      EXPECT_EQ(QNCLPS_Failed, mParser.getState());
      return acrException.what();
    }
    return "";
  }

  std::string valueOf(const char* apOption) {
    QNCPointer<QNCCommandLineArgument> lArgument;
    mParser.getArgument(apOption, lArgument);
    QNCOptionValueArgument* lpValue = dynamic_cast<QNCOptionValueArgument*>(lArgument.get());
    if (lpValue == nullptr) return "<no value argument>";
    return lpValue->getValue().get();
  }

  bool isFlag(const char* apOption) {
    QNCPointer<QNCCommandLineArgument> lArgument;
    mParser.getArgument(apOption, lArgument);
    return dynamic_cast<QNCOptionValueArgument*>(lArgument.get()) == nullptr &&
           lArgument->getOption() == QNCString(apOption);
  }

  QNCVector<QNSCommandLineArgumentDesc> mDesc;
  QNCCommandLineParser mParser;
};

// A missing option is an exception naming it, and leaves the caller's pointer alone.
TEST_F(CommandLineParserTest, EmptyLineWithoutDescriptorsParsesToNothing) {
  mParser.run();
  EXPECT_EQ(QNCLPS_Parsed, mParser.getState());
  QNCPointer<QNCCommandLineArgument> lArgument;
  EXPECT_EQ("Option '-d' is not on the command line",
            qntest::thrown<QNCNotFoundEx>([&] { mParser.getArgument("-d", lArgument); }));
  EXPECT_TRUE(lArgument.isNull());
}

TEST_F(CommandLineParserTest, ValueOptionsCarryTheirValueAndFlagsCarryNone) {
  parse("  -d 16\t-v   -I -5 -D TRUE -n 3 -c /etc/qn.conf ");
  EXPECT_EQ(QNCLPS_Parsed, mParser.getState());
  EXPECT_EQ("16", valueOf("-d"));
  EXPECT_EQ("-5", valueOf("-I")) << "a negative number is a value, not an option";
  EXPECT_EQ("TRUE", valueOf("-D"));
  EXPECT_EQ("3", valueOf("-n"));
  EXPECT_EQ("/etc/qn.conf", valueOf("-c"));
  EXPECT_TRUE(isFlag("-v"));
  QNCPointer<QNCCommandLineArgument> lArgument;
  EXPECT_THROW(mParser.getArgument("-b", lArgument), QNCNotFoundEx);
  EXPECT_THROW(mParser.getArgument("-V", lArgument), QNCNotFoundEx) << "option texts are compared exactly";
}

TEST_F(CommandLineParserTest, BadLinesAreRefusedNamingTheOffendingWord) {
  EXPECT_EQ("Unknown option '-x'", refusal("-d 1 -x"));
  EXPECT_EQ("Unknown option '-d16'", refusal("-d16"));
  EXPECT_EQ("Unknown option '--help'", refusal("--help"));
  EXPECT_EQ("Option '-d' needs a value", refusal("-d"));
  EXPECT_EQ("Option '-d' needs a value", refusal("-d -v"));
  EXPECT_EQ("Option '-c' needs a value", refusal("-c -d 16"));
  EXPECT_EQ("Option '-v' takes no value, got '3'", refusal("-v 3"));
  EXPECT_EQ("Unexpected argument 'start'", refusal("start -v"));
  EXPECT_EQ("Unexpected argument '17'", refusal("-d 16 17"));
  EXPECT_EQ("Option '-d' given more than once", refusal("-d 1 -d 2"));
  EXPECT_EQ("Option '-s' given more than once", refusal("-s -s"));
}

// A failed run must not leave the arguments of an earlier successful one behind: a handler
// would act on options that are not on the current line.
TEST_F(CommandLineParserTest, FailedRunKeepsNoArgumentsFromBefore) {
  parse("-d 16");
  EXPECT_EQ("16", valueOf("-d"));
  EXPECT_NE("", refusal("-d 8 -x"));
  QNCPointer<QNCCommandLineArgument> lArgument;
  EXPECT_THROW(mParser.getArgument("-d", lArgument), QNCNotFoundEx);
  parse("-b 5");
  EXPECT_EQ("5", valueOf("-b"));
  EXPECT_THROW(mParser.getArgument("-d", lArgument), QNCNotFoundEx);
}

// A descriptor that fills its whole array has no NUL; matching must stay inside the array.
TEST_F(CommandLineParserTest, DescriptorWithoutTerminatorMatchesItsFullText) {
  QNSCommandLineArgumentDesc lLong = {};
  const std::string lText = "-abcdefghijklmno";  // 16 characters: the whole array
  ASSERT_EQ(sizeof lLong.mOption, lText.size());
  for (size_t lIndex = 0; lIndex < lText.size(); ++lIndex) lLong.mOption[lIndex] = lText[lIndex];
  mDesc.append(lLong);
  parse("-abcdefghijklmno");
  EXPECT_TRUE(isFlag("-abcdefghijklmno"));
  EXPECT_EQ("Unknown option '-abcdefghijklmnop'", refusal("-abcdefghijklmnop"));
}

}  // namespace
