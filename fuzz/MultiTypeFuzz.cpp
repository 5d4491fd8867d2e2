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

#include <climits>
#include <cstdint>
#include <cstring>
#include <string>

#include "FuzzSupport.h"
#include "MultiType.h"
#include "QNException.h"

namespace {

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

// A number is accepted exactly when the independent reading accepts it, as that value, and its
// encoding decodes back to the same value.
void checkNumber(const QNCString& acrText, const QNCMultiType& acrStart, bool aSigned, long long aMin,
                 unsigned long long aMax) {
  long long lExpected = 0;
  const bool lValid = qnfuzz::decimal(acrText.get(), aSigned, aMin, aMax, lExpected);
  QNCMultiType lValue(acrStart);
  QN_FUZZ_CHECK(decodes(lValue, acrText) == lValid);
  if (!lValid) return;
  auto lRead = [aSigned](const QNCMultiType& acrValue) {
    return aSigned ? static_cast<long long>(static_cast<signed char>(acrValue))
                   : static_cast<long long>(static_cast<unsigned int>(acrValue));
  };
  QN_FUZZ_CHECK(lRead(lValue) == lExpected);
  QNCString lEncoded;
  lValue.encode(lEncoded);
  QNCMultiType lAgain(acrStart);
  QN_FUZZ_CHECK(decodes(lAgain, lEncoded) && lRead(lAgain) == lExpected);
}

void checkText(const QNCString& acrText) {
  QNCMultiType lValue("before");
  QN_FUZZ_CHECK(decodes(lValue, acrText));
  QN_FUZZ_CHECK(lValue.getText() == acrText);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* apData, size_t aSize) {
  const std::string lText(reinterpret_cast<const char*>(apData),
                          strnlen(reinterpret_cast<const char*>(apData), aSize));
  const QNCString lString(lText.c_str());
  checkNumber(lString, QNCMultiType(7u), false, 0, UINT_MAX);
  checkNumber(lString, QNCMultiType(static_cast<signed char>(7)), true, SCHAR_MIN, SCHAR_MAX);
  checkText(lString);
  return 0;
}
