#include "MultiType.h"

#include <cstdio>

#include "QNException.h"

namespace {

const char* kindName(QNEMultiTypeKind aKind) {
  switch (aKind) {
    case QNMTK_Text:
      return "text";
    case QNMTK_SignedByte:
      return "a signed byte";
    case QNMTK_Unsigned:
      return "an unsigned integer";
  }
  return "an unknown kind";
}

// Reads an optional '-' (when allowed) and then only decimal digits, stopping at any magnitude
// above aLimit. Returns false for anything else: empty text, blanks, '+', trailing characters.
bool parseDecimal(const char* apText, bool aAllowMinus, unsigned long long aLimit, bool& arNegative,
                  unsigned long long& arMagnitude) {
  arNegative = false;
  if (aAllowMinus && *apText == '-') {
    arNegative = true;
    ++apText;
  }
  if (*apText == '\0') return false;
  unsigned long long lMagnitude = 0;
  for (; *apText != '\0'; ++apText) {
    if (*apText < '0' || *apText > '9') return false;
    lMagnitude = lMagnitude * 10 + static_cast<unsigned long long>(*apText - '0');
    if (lMagnitude > aLimit) return false;
  }
  arMagnitude = lMagnitude;
  return true;
}

[[noreturn]] void throwNotAValue(const QNCString& acrText, QNEMultiTypeKind aKind) {
  char lMessage[QNCException::kMaxMessage];
  snprintf(lMessage, sizeof lMessage, "'%s' is not %s", acrText.get(), kindName(aKind));
  throw QNCInvalidEx(lMessage, 6);
}

}  // namespace

QNCMultiType::QNCMultiType(signed char aValue) : mKind(QNMTK_SignedByte), mSignedByte(0), mUnsigned(0) {
  set(aValue);
}

QNCMultiType::QNCMultiType(unsigned int aValue) : mKind(QNMTK_Unsigned), mSignedByte(0), mUnsigned(0) {
  set(aValue);
}

QNCMultiType::QNCMultiType(char const* apValue) : mKind(QNMTK_Text), mSignedByte(0), mUnsigned(0) {
  set(apValue);
}

QNCMultiType::~QNCMultiType() = default;

void QNCMultiType::set(signed char aValue) {
  mSignedByte = aValue;
  mKind = QNMTK_SignedByte;
}

void QNCMultiType::set(unsigned int aValue) {
  mUnsigned = aValue;
  mKind = QNMTK_Unsigned;
}

void QNCMultiType::set(char const* apValue) {
  // Copy first: if the copy fails (QNCNoMemoryEx), kind and value stay as they were.
  mText = QNCString(apValue);
  mKind = QNMTK_Text;
}

QNCMultiType::operator signed char() const {
  _requireKind(QNMTK_SignedByte);
  return mSignedByte;
}

QNCMultiType::operator unsigned int() const {
  _requireKind(QNMTK_Unsigned);
  return mUnsigned;
}

const QNCString& QNCMultiType::getText() const {
  _requireKind(QNMTK_Text);
  return mText;
}

const char* QNCMultiType::getKindName() const { return kindName(mKind); }

void QNCMultiType::encode(QNCString& arText) const {
  char lDigits[16];
  switch (mKind) {
    case QNMTK_Text:
      arText = mText;
      return;
    case QNMTK_SignedByte:
      snprintf(lDigits, sizeof lDigits, "%d", static_cast<int>(mSignedByte));
      break;
    case QNMTK_Unsigned:
      snprintf(lDigits, sizeof lDigits, "%u", mUnsigned);
      break;
  }
  arText = QNCString(lDigits);
}

void QNCMultiType::decode(const QNCString& acrText) {
  bool lNegative = false;
  unsigned long long lMagnitude = 0;
  switch (mKind) {
    case QNMTK_Text:
      mText = acrText;
      return;
    case QNMTK_SignedByte:
      // The magnitude limit 128 admits "-128"; "128" itself is refused below.
      if (!parseDecimal(acrText.get(), true, 128, lNegative, lMagnitude) || (!lNegative && lMagnitude == 128))
        throwNotAValue(acrText, mKind);
      mSignedByte =
          static_cast<signed char>(lNegative ? -static_cast<int>(lMagnitude) : static_cast<int>(lMagnitude));
      return;
    case QNMTK_Unsigned:
      if (!parseDecimal(acrText.get(), false, 0xFFFFFFFFULL, lNegative, lMagnitude))
        throwNotAValue(acrText, mKind);
      mUnsigned = static_cast<unsigned int>(lMagnitude);
      return;
  }
}

void QNCMultiType::_requireKind(QNEMultiTypeKind aKind) const {
  if (mKind == aKind) return;
  char lMessage[128];
  snprintf(lMessage, sizeof lMessage, "Setting value holds %s, not %s", kindName(mKind), kindName(aKind));
  throw QNCInvalidEx(lMessage, 6);
}
