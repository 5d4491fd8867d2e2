// Fuzz target: a configuration file of arbitrary bytes read by QNCKeyValueFormatParser.
//
// Input layout: byte 0 chooses the parser's options (bit 0: keys without regard to case, bit 1:
// duplicates allowed, bit 2: byte 1 is the only comment marker); the rest is the file's contents.
// The parser reads through a path, so the contents go into a memory file opened by its
// /proc/self/fd path: nothing touches the disk and nothing is left behind.
//
// Properties, for every input:
// - parse() succeeds or throws a QNCException; a malformed line or a repeated key names the file
//   and the line; a failed parse keeps nothing;
// - after success every key getKeys() reports is found by hasKey(), getValue() and getLine(), is
//   not blank-padded, starts with no comment marker, comes from a line of the file, and appears
//   once (compared as the parser compares keys); getUnsigned() either gives the number the value
//   spells in decimal or throws QNCInvalidEx.

#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <set>
#include <string>

#include "FuzzSupport.h"
#include "KeyValueFormatParser.h"
#include "QNException.h"

namespace {

std::string gPath;  // the memory file's /proc/self/fd path, made on the first input

std::string folded(const char* apText, bool aFold) {
  std::string lText(apText);
  for (char& lrChar : lText) lrChar = aFold && lrChar >= 'A' && lrChar <= 'Z' ? lrChar - 'A' + 'a' : lrChar;
  return lText;
}

bool isBlank(char aChar) { return aChar == ' ' || aChar == '\t' || aChar == '\r'; }

bool startsWithPath(const char* apText) {
  return strncmp(apText, (gPath + ":").c_str(), gPath.size() + 1) == 0;
}

// getUnsigned() agrees with an independent reading of the value as a decimal unsigned int.
void checkUnsigned(const QNCKeyValueFormatParser& acrParser, const QNCString& acrKey) {
  long long lExpected = 0;
  const bool lInRange = qnfuzz::decimal(acrParser.getValue(acrKey).get(), false, 0, 0xFFFFFFFFull, lExpected);
  try {
    const unsigned int lNumber = acrParser.getUnsigned(acrKey);
    QN_FUZZ_CHECK(lInRange && lNumber == lExpected);
  } catch (const QNCInvalidEx& acrException) {
    QN_FUZZ_CHECK(!lInRange && strstr(acrException.what(), "expects a number") != nullptr);
  }
}

void checkParsed(const QNCKeyValueFormatParser& acrParser, const QNCVector<QNCString>& acrKeys,
                 const std::string& acrMarkers, bool aFold, unsigned int aLineCount) {
  std::set<std::string> lSeen;
  const unsigned int lCount = acrKeys.numberOfElements();
  for (unsigned int lIndex = 0; lIndex < lCount; ++lIndex) {
    const char* lpKey = acrKeys[lIndex].get();
    const size_t lLength = strlen(lpKey);
    QN_FUZZ_CHECK(lLength != 0);
    QN_FUZZ_CHECK(!isBlank(lpKey[0]) && !isBlank(lpKey[lLength - 1]));
    QN_FUZZ_CHECK(acrMarkers.find(lpKey[0]) == std::string::npos);
    QN_FUZZ_CHECK(strchr(lpKey, '=') == nullptr && strchr(lpKey, '\n') == nullptr);
    QN_FUZZ_CHECK(lSeen.insert(folded(lpKey, aFold)).second);
    // Lookups are linear in the number of keys; a file of thousands of keys is checked at both
    // ends so one input stays fast, while the uniqueness above covers every key.
    if (lIndex >= 128 && lIndex + 128 < lCount) continue;
    QN_FUZZ_CHECK(acrParser.hasKey(acrKeys[lIndex]));
    const char* lpValue = acrParser.getValue(acrKeys[lIndex]).get();
    const size_t lValueLength = strlen(lpValue);
    QN_FUZZ_CHECK(lValueLength == 0 || (!isBlank(lpValue[0]) && !isBlank(lpValue[lValueLength - 1])));
    QN_FUZZ_CHECK(strchr(lpValue, '\n') == nullptr);
    const unsigned int lLine = acrParser.getLine(acrKeys[lIndex]);
    QN_FUZZ_CHECK(lLine >= 1 && lLine <= aLineCount);
    checkUnsigned(acrParser, acrKeys[lIndex]);
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* apData, size_t aSize) {
  static const int sMemoryFile = memfd_create("qnfuzz-config", MFD_CLOEXEC);
  QN_FUZZ_CHECK(sMemoryFile >= 0);
  if (aSize == 0) return 0;
  gPath = "/proc/self/fd/" + std::to_string(sMemoryFile);
  const uint8_t lFlags = apData[0];
  const bool lFold = (lFlags & 1) != 0;
  const bool lAllowDuplicates = (lFlags & 2) != 0;
  std::string lMarkers = "#;";
  size_t lSkip = 1;
  if ((lFlags & 4) != 0 && aSize > 1) {
    lSkip = 2;
    if (apData[1] != 0) lMarkers = std::string(1, static_cast<char>(apData[1]));
  }
  QN_FUZZ_CHECK(ftruncate(sMemoryFile, 0) == 0 && lseek(sMemoryFile, 0, SEEK_SET) == 0);
  qnfuzz::writeAll(sMemoryFile, apData + lSkip, aSize - lSkip);
  const unsigned int lLineCount =
      1 + static_cast<unsigned int>(std::count(apData + lSkip, apData + aSize, '\n'));

  const QNCString lPath(gPath.c_str());
  QNCKeyValueFormatParser lParser(lPath, QNCString(lSkip == 2 ? lMarkers.c_str() : ""), lFold,
                                  lAllowDuplicates);
  bool lParsed = false;
  try {
    lParser.parse();
    lParsed = true;
  } catch (const QNCInvalidEx& acrException) {
    QN_FUZZ_CHECK(startsWithPath(acrException.what()));
    QN_FUZZ_CHECK(strstr(acrException.what(), "expected 'key = value'") != nullptr);
  } catch (const QNCExistsEx& acrException) {
    QN_FUZZ_CHECK(!lAllowDuplicates);
    QN_FUZZ_CHECK(startsWithPath(acrException.what()));
  } catch (const QNCException&) {
    // Another member of the family (no memory, an unreadable file): a clear error as well.
  } catch (...) {
    qnfuzz::foreignException("QNCKeyValueFormatParser::parse");
  }
  QNCVector<QNCString> lKeys;
  lParser.getKeys(lKeys);
  QN_FUZZ_CHECK(lParsed || lKeys.numberOfElements() == 0);  // a failed parse keeps nothing of the file
  checkParsed(lParser, lKeys, lMarkers, lFold, lLineCount);
  return 0;
}
