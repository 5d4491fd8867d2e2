#include "CommandLineParser.h"

#include <cstdio>
#include <cstring>
#include <new>
#include <string>
#include <vector>

#include "QNException.h"

namespace {

[[noreturn]] void throwBadCommandLine(const char* apFormat, const char* apFirst, const char* apSecond = "") {
  char lMessage[QNCException::kMaxMessage];
  snprintf(lMessage, sizeof lMessage, apFormat, apFirst, apSecond);
  throw QNCInvalidEx(lMessage, 6);
}

bool isBlank(char aChar) { return aChar == ' ' || aChar == '\t'; }

// The words of acrLine; runs of blanks separate words, and blanks at either end are ignored.
std::vector<std::string> splitWords(const QNCString& acrLine) {
  std::vector<std::string> lWords;
  const char* lpCursor = acrLine.get();
  while (*lpCursor != '\0') {
    while (isBlank(*lpCursor)) ++lpCursor;
    const char* lpStart = lpCursor;
    while (*lpCursor != '\0' && !isBlank(*lpCursor)) ++lpCursor;
    if (lpCursor != lpStart) QNNoMemoryToException([&] { lWords.emplace_back(lpStart, lpCursor); });
  }
  return lWords;
}

}  // namespace

void QNCCommandLineParser::run() {
  mArguments.clear();
  mState = QNCLPS_Failed;
  const std::vector<std::string> lWords = splitWords(mCommandLine);
  QNCVector<QNCPointer<QNCCommandLineArgument>> lArguments(10);
  // The last option seen that takes no value: a plain word after it is a misplaced value.
  const char* lpPreviousFlag = nullptr;

  for (size_t lIndex = 0; lIndex < lWords.size(); ++lIndex) {
    const char* lpWord = lWords[lIndex].c_str();
    const QNSCommandLineArgumentDesc* lpDesc = _findDesc(lpWord);
    if (lpDesc == nullptr) {
      if (lpWord[0] == '-') throwBadCommandLine("Unknown option '%s'", lpWord);
      if (lpPreviousFlag != nullptr)
        throwBadCommandLine("Option '%s' takes no value, got '%s'", lpPreviousFlag, lpWord);
      throwBadCommandLine("Unexpected argument '%s'", lpWord);
    }
    for (unsigned int lSeen = 0; lSeen < lArguments.numberOfElements(); ++lSeen) {
      if (lArguments[lSeen]->getOption() == QNCString(lpWord))
        throwBadCommandLine("Option '%s' given more than once", lpWord);
    }
    if (lpDesc->mTakesValue != 0) {
      if (lIndex + 1 == lWords.size() || _findDesc(lWords[lIndex + 1].c_str()) != nullptr)
        throwBadCommandLine("Option '%s' needs a value", lpWord);
      ++lIndex;
      lArguments.append(QNCPointer<QNCCommandLineArgument>(QNCPointer<QNCOptionValueArgument>(
          new (std::nothrow) QNCOptionValueArgument(lpWord, lWords[lIndex].c_str()), QNPST_Individual,
          QNPAT_New)));
      lpPreviousFlag = nullptr;
    } else {
      lArguments.append(QNCPointer<QNCCommandLineArgument>(new (std::nothrow) QNCCommandLineArgument(lpWord),
                                                           QNPST_Individual, QNPAT_New));
      lpPreviousFlag = lpWord;
    }
  }
  mArguments = lArguments;
  mState = QNCLPS_Parsed;
}

void QNCCommandLineParser::getArgument(const QNCString& aOption,
                                       QNCPointer<QNCCommandLineArgument>& aArgument) {
  const unsigned int lIndex = _indexOfArgument(aOption.get());
  if (lIndex == mArguments.numberOfElements()) {
    char lMessage[QNCException::kMaxMessage];
    snprintf(lMessage, sizeof lMessage, "Option '%s' is not on the command line", aOption.get());
    throw QNCNotFoundEx(lMessage, 8);
  }
  aArgument = mArguments[lIndex];
}

const QNSCommandLineArgumentDesc* QNCCommandLineParser::_findDesc(const char* apWord) const {
  for (unsigned int lIndex = 0; lIndex < mArgumentDesc.numberOfElements(); ++lIndex) {
    const QNSCommandLineArgumentDesc& lrDesc = mArgumentDesc[lIndex];
    // Bounded: a descriptor is application data and might fill its array without a NUL.
    const size_t lLength = strnlen(lrDesc.mOption, sizeof lrDesc.mOption);
    if (lLength != 0 && strncmp(lrDesc.mOption, apWord, lLength) == 0 && apWord[lLength] == '\0')
      return &lrDesc;
  }
  return nullptr;
}

unsigned int QNCCommandLineParser::_indexOfArgument(const char* apOption) const {
  unsigned int lIndex = 0;
  for (; lIndex < mArguments.numberOfElements(); ++lIndex) {
    if (strcmp(mArguments[lIndex]->getOption().get(), apOption) == 0) break;
  }
  return lIndex;
}
