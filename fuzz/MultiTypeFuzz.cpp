// Fuzz target: arbitrary text decoded by QNCMultiType into each of its three kinds.
//
// Input layout: the text, up to the first NUL byte (a QNCString cannot hold one).
//
// Properties, for every input and kind:
// - decode() succeeds or throws QNCInvalidEx; the value keeps its kind either way;
// - a number is accepted exactly when the text is an optional '-' (signed byte only) followed by
//   decimal digits naming a value in the kind's range, judged here by strtoll/strtoull; the value
//   read is that number, and its encoding decodes back to the same value;
// - a text is taken unchanged.

#include <cerrno>
#include <climits>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <string>

#include "FuzzSupport.h"
#include "Logger.h"
#include "MultiType.h"
#include "QNException.h"

namespace {

bool onlyDigits(const char* apText) {
  return *apText != '\0' && strspn(apText, "0123456789") == strlen(apText);
}

// Decodes acrText into arValue: true on success, false on QNCInvalidEx; the kind never changes.
bool decodes(QNCMultiType& arValue, const QNCString& acrText) {
  const QNEMultiTypeKind lKind = arValue.getKind();
  bool lAccepted = false;
  try {
    arValue.decode(acrText);
    lAccepted = true;
  } catch (const QNCInvalidEx& acrException) {
    QN_FUZZ_CHECK(acrException.what()[0] == '\'');  // the message quotes the refused text
  } catch (const QNCException&) {
    // Another member of the family (no memory): a clear error as well.
  } catch (...) {
    qnfuzz::foreignException("QNCMultiType::decode");
  }
  QN_FUZZ_CHECK(arValue.getKind() == lKind);
  return lAccepted;
}

void checkUnsigned(const QNCString& acrText) {
  const char* lpText = acrText.get();
  errno = 0;
  const unsigned long long lExpected = onlyDigits(lpText) ? strtoull(lpText, nullptr, 10) : 0;
  const bool lValid = onlyDigits(lpText) && errno != ERANGE && lExpected <= UINT_MAX;

  QNCMultiType lValue(7u);
  QN_FUZZ_CHECK(decodes(lValue, acrText) == lValid);
  if (!lValid) return;
  QN_FUZZ_CHECK(static_cast<unsigned int>(lValue) == lExpected);
  QNCString lEncoded;
  lValue.encode(lEncoded);
  QNCMultiType lAgain(7u);
  QN_FUZZ_CHECK(decodes(lAgain, lEncoded));
  QN_FUZZ_CHECK(static_cast<unsigned int>(lAgain) == lExpected);
}

void checkSignedByte(const QNCString& acrText) {
  const char* lpText = acrText.get();
  const char* lpDigits = lpText[0] == '-' ? lpText + 1 : lpText;
  errno = 0;
  const long long lExpected = onlyDigits(lpDigits) ? strtoll(lpText, nullptr, 10) : 0;
  const bool lValid =
      onlyDigits(lpDigits) && errno != ERANGE && lExpected >= SCHAR_MIN && lExpected <= SCHAR_MAX;

  QNCMultiType lValue(static_cast<signed char>(7));
  QN_FUZZ_CHECK(decodes(lValue, acrText) == lValid);
  if (!lValid) return;
  QN_FUZZ_CHECK(static_cast<signed char>(lValue) == lExpected);
  QNCString lEncoded;
  lValue.encode(lEncoded);
  QNCMultiType lAgain(static_cast<signed char>(7));
  QN_FUZZ_CHECK(decodes(lAgain, lEncoded));
  QN_FUZZ_CHECK(static_cast<signed char>(lAgain) == lExpected);
}

void checkText(const QNCString& acrText) {
  QNCMultiType lValue("before");
  QN_FUZZ_CHECK(decodes(lValue, acrText));
  QN_FUZZ_CHECK(lValue.getText() == acrText);
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  setLogCode(0);
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* apData, size_t aSize) {
  const std::string lText(reinterpret_cast<const char*>(apData),
                          strnlen(reinterpret_cast<const char*>(apData), aSize));
  const QNCString lString(lText.c_str());
  checkUnsigned(lString);
  checkSignedByte(lString);
  checkText(lString);
  return 0;
}
