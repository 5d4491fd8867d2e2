#include "KeyValueFormatParser.h"

#include <fcntl.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <new>
#include <string>
#include <unordered_map>

#include "Clib.h"
#include "OsError.h"
#include "QNException.h"

struct QNCKeyValueFormatParser::QNSEntry {
  QNCString mKey;
  QNCString mValue;
  unsigned int mLine;
};

namespace {
const char* const kBlanks = " \t\r";  // '\r' too, so files written with CRLF read the same

std::string trim(const std::string& acrText) {
  const size_t lFirst = acrText.find_first_not_of(kBlanks);
  if (lFirst == std::string::npos) return std::string();
  const size_t lLast = acrText.find_last_not_of(kBlanks);
  return acrText.substr(lFirst, lLast - lFirst + 1);
}

std::string foldCase(const std::string& acrText) {
  std::string lFolded(acrText);
  for (char& lChar : lFolded) {
    if (lChar >= 'A' && lChar <= 'Z') lChar = static_cast<char>(lChar - 'A' + 'a');
  }
  return lFolded;
}

// The whole file. Failures name the path, never just a descriptor.
std::string readWholeFile(const QNCString& acrPath) {
  const int lFd = ClibOpen(acrPath.get(), O_RDONLY | O_CLOEXEC, 0);
  std::string lContents;
  try {
    char lChunk[4096];
    for (;;) {
      unsigned int lRead = 0;
      try {
        lRead = ClibRead(lFd, lChunk, sizeof lChunk);
      } catch (const QNCReadFailedEx& acrException) {
        OsThrowPathError<QNCReadFailedEx>(static_cast<int>(acrException.getCode()), "read", acrPath.get());
      }
      if (lRead == 0) break;
      lContents.append(lChunk, lRead);
    }
  } catch (const std::bad_alloc&) {
    ClibCloseQuietly(lFd);
    throw QNCNoMemoryEx("Out of Memory", 2);
  } catch (...) {
    ClibCloseQuietly(lFd);
    throw;
  }
  ClibClose(lFd);
  return lContents;
}

template <class E>
[[noreturn]] void throwAt(const QNCString& acrPath, unsigned int aLine, const std::string& acrText) {
  const std::string lMessage = std::string(acrPath.get()) + ":" + std::to_string(aLine) + ": " + acrText;
  throw E(lMessage.c_str(), 6);
}
}  // namespace

QNCKeyValueFormatParser::QNCKeyValueFormatParser(const QNCString& acrFilePath,
                                                 const QNCString& acrCommentMarkers,
                                                 bool aCaseInsensitiveKeys, bool aAllowDuplicateKeys)
    : mFilePath(acrFilePath),
      mCommentMarkers(acrCommentMarkers.isEmpty() ? QNCString("#;") : acrCommentMarkers),
      mCaseInsensitiveKeys(aCaseInsensitiveKeys),
      mAllowDuplicateKeys(aAllowDuplicateKeys) {}

QNCKeyValueFormatParser::~QNCKeyValueFormatParser() = default;

void QNCKeyValueFormatParser::parse() { parse(QNCString(mFilePath)); }

void QNCKeyValueFormatParser::parse(const QNCString& acrFilePath) {
  const std::string lContents = readWholeFile(acrFilePath);
  QNCVector<QNCPointer<QNSEntry>> lEntries;
  // Index of lEntries by (folded) key, for this parse only: duplicates are found in constant
  // time, so a long hostile file costs linear time, not quadratic.
  std::unordered_map<std::string, unsigned int> lIndex;
  try {
    unsigned int lLineNo = 0;
    size_t lStart = 0;
    while (lStart < lContents.size()) {
      size_t lEnd = lContents.find('\n', lStart);
      if (lEnd == std::string::npos) lEnd = lContents.size();
      const std::string lLine = trim(lContents.substr(lStart, lEnd - lStart));
      lStart = lEnd + 1;
      ++lLineNo;
      if (lLine.empty() || strchr(mCommentMarkers.get(), lLine[0]) != nullptr) continue;
      const size_t lEquals = lLine.find('=');
      const std::string lKey = lEquals == std::string::npos ? std::string() : trim(lLine.substr(0, lEquals));
      // A NUL byte would silently cut the text: such a line is reported, not half-read.
      if (lKey.empty() || lLine.find('\0') != std::string::npos) {
        throwAt<QNCInvalidEx>(acrFilePath, lLineNo, "expected 'key = value'");
      }
      const std::string lValue = trim(lLine.substr(lEquals + 1));
      const std::string lIndexKey = mCaseInsensitiveKeys ? foldCase(lKey) : lKey;
      const auto lFound = lIndex.find(lIndexKey);
      if (lFound == lIndex.end()) {
        QNSEntry* lpEntry =
            new (std::nothrow) QNSEntry{QNCString(lKey.c_str()), QNCString(lValue.c_str()), lLineNo};
        lEntries.append(QNCPointer<QNSEntry>(lpEntry, QNPST_Individual, QNPAT_New));
        lIndex.emplace(lIndexKey, lEntries.numberOfElements() - 1);
      } else if (mAllowDuplicateKeys) {
        // The later line wins; the key keeps the place of its first appearance.
        QNSEntry& arEntry = *lEntries[lFound->second];
        arEntry.mValue = QNCString(lValue.c_str());
        arEntry.mLine = lLineNo;
      } else {
        throwAt<QNCExistsEx>(
            acrFilePath, lLineNo,
            "key '" + lKey + "' already set on line " + std::to_string(lEntries[lFound->second]->mLine));
      }
    }
  } catch (const std::bad_alloc&) {
    throw QNCNoMemoryEx("Out of Memory", 2);
  }
  mEntries = lEntries;
  mFilePath = acrFilePath;
}

bool QNCKeyValueFormatParser::hasKey(const QNCString& acrKey) const {
  for (unsigned int lIndex = 0; lIndex < mEntries.numberOfElements(); ++lIndex) {
    if (_sameKey(mEntries[lIndex]->mKey, acrKey)) return true;
  }
  return false;
}

const QNCString& QNCKeyValueFormatParser::getValue(const QNCString& acrKey) const {
  return _find(acrKey).mValue;
}

unsigned int QNCKeyValueFormatParser::getUnsigned(const QNCString& acrKey) const {
  const QNSEntry& acrEntry = _find(acrKey);
  const char* lpText = acrEntry.mValue.get();
  unsigned long long lNumber = 0;
  bool lValid = *lpText != '\0';
  for (const char* lpChar = lpText; lValid && *lpChar != '\0'; ++lpChar) {
    lValid = *lpChar >= '0' && *lpChar <= '9';
    lNumber = lNumber * 10 + static_cast<unsigned int>(*lpChar - '0');
    lValid = lValid && lNumber <= 0xFFFFFFFFull;  // checked per digit, so it cannot wrap
  }
  if (!lValid) {
    throwAt<QNCInvalidEx>(
        mFilePath, acrEntry.mLine,
        std::string("key '") + acrEntry.mKey.get() + "' expects a number, got '" + lpText + "'");
  }
  return static_cast<unsigned int>(lNumber);
}

void QNCKeyValueFormatParser::getKeys(QNCVector<QNCString>& arKeys) const {
  QNCVector<QNCString> lKeys(mEntries.numberOfElements());
  for (unsigned int lIndex = 0; lIndex < mEntries.numberOfElements(); ++lIndex)
    lKeys.append(mEntries[lIndex]->mKey);
  arKeys = lKeys;
}

unsigned int QNCKeyValueFormatParser::getLine(const QNCString& acrKey) const { return _find(acrKey).mLine; }

bool QNCKeyValueFormatParser::_sameKey(const QNCString& acrStored, const QNCString& acrKey) const {
  if (!mCaseInsensitiveKeys) return acrStored == acrKey;
  return foldCase(acrStored.get()) == foldCase(acrKey.get());
}

const QNCKeyValueFormatParser::QNSEntry& QNCKeyValueFormatParser::_find(const QNCString& acrKey) const {
  for (unsigned int lIndex = 0; lIndex < mEntries.numberOfElements(); ++lIndex) {
    if (_sameKey(mEntries[lIndex]->mKey, acrKey)) return *mEntries[lIndex];
  }
  const std::string lMessage =
      std::string("key '") + acrKey.get() + "' not found in '" + mFilePath.get() + "'";
  throw QNCNotFoundEx(lMessage.c_str(), 8);
}
