#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "KeyValueFormatParser.h"
#include "QNException.h"
#include "TestSupport.h"

namespace {

class KeyValueFormatParserTest : public ::testing::Test {
 protected:
  // Writes the text to a file of the temporary directory and returns its path.
  std::string write(const std::string& acrName, const std::string& acrText) {
    const std::string lPath = mDir.file(acrName);
    qntest::writeFile(lPath, acrText);
    return lPath;
  }

  // The message of the exception E that parsing the file throws.
  template <class E>
  std::string parseError(QNCKeyValueFormatParser& arParser, const std::string& acrPath) {
    return qntest::thrown<E>([&] { arParser.parse(QNCString(acrPath.c_str())); });
  }

  qntest::TempDir mDir;
};

TEST_F(KeyValueFormatParserTest, ReadsKeysAndValuesSkippingCommentsBlanksAndBlankLines) {
  const std::string lPath = write("a.conf",
                                  "# the sensor service\n"
                                  "\n"
                                  "   ; another comment\n"
                                  "  Port   =   4711  \n"
                                  "\tName\t=\tfront door\t\r\n"
                                  "Query = a=b=c\n"
                                  "Empty =\n"
                                  "last=1");  // no final newline
  QNCKeyValueFormatParser lParser(QNCString(lPath.c_str()), QNCString(""), false, false);
  lParser.parse();

  QNCVector<QNCString> lKeys;
  lParser.getKeys(lKeys);
  const std::vector<std::string> lExpectedKeys = {"Port", "Name", "Query", "Empty", "last"};
  ASSERT_EQ(lExpectedKeys.size(), lKeys.numberOfElements());
  for (unsigned int lIndex = 0; lIndex < lExpectedKeys.size(); ++lIndex)
    EXPECT_EQ(lExpectedKeys[lIndex], lKeys[lIndex].get());
  EXPECT_EQ(4711u, lParser.getUnsigned("Port"));
  EXPECT_STREQ("front door", lParser.getValue("Name").get());  // inner blank kept
  EXPECT_STREQ("a=b=c", lParser.getValue("Query").get());      // only the first '=' separates
  EXPECT_STREQ("", lParser.getValue("Empty").get());
  EXPECT_EQ(4u, lParser.getLine("Port"));
  EXPECT_EQ(8u, lParser.getLine("last"));
  EXPECT_FALSE(lParser.hasKey("name"));  // exact comparison by default
  const std::string lMissing = qntest::thrown<QNCNotFoundEx>([&] { lParser.getValue("colour"); });
  EXPECT_NE(std::string::npos, lMissing.find("'colour'")) << lMissing;
  EXPECT_THROW(lParser.getLine("colour"), QNCNotFoundEx);
}

TEST_F(KeyValueFormatParserTest, CommentMarkersAndKeyCaseFollowTheConstructor) {
  const std::string lPath = write("b.conf", "// note\n# not a comment here = yes\nHOST = x\n");
  QNCKeyValueFormatParser lParser(QNCString(lPath.c_str()), QNCString("/"), true, false);
  lParser.parse();
  EXPECT_STREQ("yes", lParser.getValue("# not a comment here").get());
  EXPECT_STREQ("x", lParser.getValue("host").get());
  EXPECT_TRUE(lParser.hasKey("Host"));
}

TEST_F(KeyValueFormatParserTest, MalformedLinesAreReportedWithFileAndLine) {
  QNCKeyValueFormatParser lParser(QNCString(""), QNCString(""), false, false);
  const std::string lNoEquals = write("c.conf", "a = 1\n\njust words\n");
  EXPECT_EQ(lNoEquals + ":3: expected 'key = value'", parseError<QNCInvalidEx>(lParser, lNoEquals));
  const std::string lNoKey = write("d.conf", "  = 5\n");
  EXPECT_EQ(lNoKey + ":1: expected 'key = value'", parseError<QNCInvalidEx>(lParser, lNoKey));
  const std::string lNul = write("e.conf", std::string("a = 1\nb = x\0y\n", 14));
  EXPECT_EQ(lNul + ":2: expected 'key = value'", parseError<QNCInvalidEx>(lParser, lNul));
}

TEST_F(KeyValueFormatParserTest, DuplicatesAreRefusedOrReplaceByChoice) {
  const std::string lPath = write("f.conf", "a = 1\nb = 2\nA = 3\na = 4\n");

  QNCKeyValueFormatParser lStrict(QNCString(""), QNCString(""), false, false);
  EXPECT_EQ(lPath + ":4: key 'a' already set on line 1", parseError<QNCExistsEx>(lStrict, lPath));
  QNCKeyValueFormatParser lFolding(QNCString(""), QNCString(""), true, false);
  EXPECT_EQ(lPath + ":3: key 'A' already set on line 1", parseError<QNCExistsEx>(lFolding, lPath));

  QNCKeyValueFormatParser lLenient(QNCString(""), QNCString(""), false, true);
  lLenient.parse(QNCString(lPath.c_str()));
  EXPECT_STREQ("4", lLenient.getValue("a").get());  // the later line wins
  EXPECT_EQ(4u, lLenient.getLine("a"));
  QNCVector<QNCString> lKeys;
  lLenient.getKeys(lKeys);
  ASSERT_EQ(3u, lKeys.numberOfElements());
  EXPECT_STREQ("a", lKeys[0].get());  // keeps the place of its first appearance
}

TEST_F(KeyValueFormatParserTest, GetUnsignedRefusesWhatIsNotADecimalNumberInRange) {
  const std::string lPath = write("g.conf",
                                  "max = 4294967295\nover = 4294967296\nhuge = 99999999999999999999999\n"
                                  "neg = -1\nplus = +1\nhex = 0x10\nempty =\nmixed = 12ab\n");
  QNCKeyValueFormatParser lParser(QNCString(lPath.c_str()), QNCString(""), false, false);
  lParser.parse();
  EXPECT_EQ(4294967295u, lParser.getUnsigned("max"));
  const char* const lBad[] = {"over", "huge", "neg", "plus", "hex", "empty", "mixed"};
  for (unsigned int lIndex = 0; lIndex < sizeof lBad / sizeof lBad[0]; ++lIndex) {
    EXPECT_EQ(lPath + ":" + std::to_string(lIndex + 2) + ": key '" + lBad[lIndex] +
                  "' expects a number, got '" + lParser.getValue(lBad[lIndex]).get() + "'",
              qntest::thrown<QNCInvalidEx>([&] { lParser.getUnsigned(lBad[lIndex]); }));
  }
  EXPECT_THROW(lParser.getUnsigned("missing"), QNCNotFoundEx);
}

// A file that cannot be opened, read or parsed leaves what was read before; a good one replaces it.
TEST_F(KeyValueFormatParserTest, OnlyASuccessfulParseReplacesThePreviousContents) {
  const std::string lGood = write("good.conf", "a = 1\n");
  QNCKeyValueFormatParser lParser(QNCString(lGood.c_str()), QNCString(""), false, false);
  lParser.parse();

  const std::string lMissing = mDir.file("missing.conf");
  const std::string lOpenError = parseError<QNCOpenFailedEx>(lParser, lMissing);
  EXPECT_NE(std::string::npos, lOpenError.find("'" + lMissing + "'")) << lOpenError;
  // A directory opens but cannot be read.
  const std::string lReadError = parseError<QNCReadFailedEx>(lParser, mDir.path());
  EXPECT_NE(std::string::npos, lReadError.find("'" + mDir.path() + "'")) << lReadError;
  // A file that fails half-way keeps nothing of itself.
  const std::string lBroken = write("broken.conf", "b = 2\nbroken\n");
  EXPECT_NE("(nothing thrown)", parseError<QNCInvalidEx>(lParser, lBroken));
  EXPECT_STREQ("1", lParser.getValue("a").get());
  EXPECT_FALSE(lParser.hasKey("b"));
  EXPECT_EQ(lGood, lParser.getFilePath().get());

  const std::string lSecond = write("second.conf", "b = 2\n");
  lParser.parse(QNCString(lSecond.c_str()));
  EXPECT_FALSE(lParser.hasKey("a"));
  EXPECT_STREQ("2", lParser.getValue("b").get());
  EXPECT_EQ(lSecond, lParser.getFilePath().get());
}

}  // namespace
