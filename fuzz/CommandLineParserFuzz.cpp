// Fuzz target: an arbitrary command line parsed by QNCCommandLineParser against a table like
// qnsensord's (the eight common options and -n).
//
// Input layout: the command line, up to the first NUL byte (the system joins the process's
// arguments into one text, which cannot hold a NUL).
//
// Properties, for every input:
// - run() succeeds or throws a QNCException; a rejected line is a QNCInvalidEx whose message is
//   one of the documented forms, leaves the state "failed" and keeps no argument;
// - after success, for every option of the table getArgument() either finds it or throws
//   QNCNotFoundEx; a found value-taking option is a QNCOptionValueArgument holding the word that
//   followed the option (never itself an option), a found flag is not; the options found with their values
//   account for every word of the line exactly once;
// - a second run() over the same line ends the same way.

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <iterator>
#include <string>
#include <vector>

#include "CommandLineParser.h"
#include "FuzzSupport.h"
#include "QNException.h"

namespace {

const QNSCommandLineArgumentDesc kOptions[] = {
    {"-v", 0, "", "version"},          {"-h", 0, "", "help"},          {"-s", 0, "", "stop"},
    {"-c", 1, "file", "config"},       {"-d", 1, "mask", "levels"},    {"-b", 1, "seconds", "heartbeat"},
    {"-D", 1, "true|false", "daemon"}, {"-I", 1, "minutes", "reopen"}, {"-n", 1, "count", "channels"},
};

// The words of the line as the parser's contract defines them: runs of spaces and tabs separate.
std::vector<std::string> words(const std::string& acrLine) {
  std::vector<std::string> lWords;
  for (size_t lAt = acrLine.find_first_not_of(" \t"); lAt != std::string::npos;
       lAt = acrLine.find_first_not_of(" \t", lAt)) {
    const size_t lEnd = acrLine.find_first_of(" \t", lAt);
    lWords.push_back(acrLine.substr(lAt, lEnd - lAt));
    lAt = lEnd;
  }
  return lWords;
}

bool isOption(const std::string& acrWord) {
  return std::any_of(std::begin(kOptions), std::end(kOptions),
                     [&](const QNSCommandLineArgumentDesc& acrDesc) { return acrWord == acrDesc.mOption; });
}

// Outcome of one run(): true when it succeeded.
bool runOnce(QNCCommandLineParser& arParser) {
  try {
    arParser.run();
    QN_FUZZ_CHECK(arParser.getState() == QNCLPS_Parsed);
    return true;
  } catch (const QNCInvalidEx& acrException) {
    const std::string lMessage = acrException.what();
    QN_FUZZ_CHECK(lMessage.rfind("Unknown option '", 0) == 0 || lMessage.rfind("Option '", 0) == 0 ||
                  lMessage.rfind("Unexpected argument '", 0) == 0);
  } catch (const QNCException&) {
    // Another member of the family (no memory): a clear error as well.
  } catch (...) {
    qnfuzz::foreignException("QNCCommandLineParser::run");
  }
  QN_FUZZ_CHECK(arParser.getState() == QNCLPS_Failed);
  return false;
}

void checkParsed(QNCCommandLineParser& arParser, const std::vector<std::string>& acrWords) {
  size_t lAccounted = 0;
  for (const QNSCommandLineArgumentDesc& lrDesc : kOptions) {
    QNCPointer<QNCCommandLineArgument> lArgument;
    try {
      arParser.getArgument(lrDesc.mOption, lArgument);
    } catch (const QNCNotFoundEx&) {
      continue;
    }
    QN_FUZZ_CHECK(strcmp(lArgument->getOption().get(), lrDesc.mOption) == 0);
    size_t lAt = 0;
    while (lAt < acrWords.size() && acrWords[lAt] != lrDesc.mOption) ++lAt;
    QN_FUZZ_CHECK(lAt < acrWords.size());
    QNCOptionValueArgument* lpValue = dynamic_cast<QNCOptionValueArgument*>(lArgument.get());
    if (lrDesc.mTakesValue != 0) {
      QN_FUZZ_CHECK(lpValue != nullptr);
      QN_FUZZ_CHECK(lAt + 1 < acrWords.size());
      QN_FUZZ_CHECK(acrWords[lAt + 1] == lpValue->getValue().get());
      QN_FUZZ_CHECK(!isOption(lpValue->getValue().get()));  // an option is never taken as a value
      lAccounted += 2;
    } else {
      QN_FUZZ_CHECK(lpValue == nullptr);
      lAccounted += 1;
    }
  }
  QN_FUZZ_CHECK(lAccounted == acrWords.size());
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* apData, size_t aSize) {
  const std::string lLine(reinterpret_cast<const char*>(apData),
                          strnlen(reinterpret_cast<const char*>(apData), aSize));
  QNCVector<QNSCommandLineArgumentDesc> lTable;
  for (const QNSCommandLineArgumentDesc& lrDesc : kOptions) lTable.append(lrDesc);

  QNCCommandLineParser lParser;
  lParser.setArgumentDesc(lTable);
  lParser.setCommandLine(QNCString(lLine.c_str()));
  const bool lParsed = runOnce(lParser);
  // A failed run keeps no argument: against no words, any option found breaks a property.
  checkParsed(lParser, lParsed ? words(lLine) : std::vector<std::string>());
  QN_FUZZ_CHECK(runOnce(lParser) == lParsed);
  return 0;
}
