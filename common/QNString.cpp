#include "QNString.h"

#include "Clib.h"

QNCString::QNCString(const char* apString) {
  QN_ASSERT(0 != apString);
  mString = QNCPointer<std::string>(new (std::nothrow) std::string(apString), QNPST_Individual, QNPAT_New);
}

QNCString::QNCString(const QNCString& acrCopy) {
  QN_ASSERT(acrCopy.mString != 0);
  mString =
      QNCPointer<std::string>(new (std::nothrow) std::string(*acrCopy.mString), QNPST_Individual, QNPAT_New);
}

QNCString& QNCString::operator=(const QNCString& acrCopy) {
  if (this == &acrCopy) return *this;
  QN_ASSERT(acrCopy.mString != 0);
  mString =
      QNCPointer<std::string>(new (std::nothrow) std::string(*acrCopy.mString), QNPST_Individual, QNPAT_New);
  return *this;
}

const char* QNCString::get() const {
  QN_ASSERT(mString != 0);
  return mString->c_str();
}

bool QNCString::isEmpty() const {
  QN_ASSERT(mString != 0);
  return mString->empty();
}

unsigned int QNCString::length() const {
  QN_ASSERT(mString != 0);
  return static_cast<unsigned int>(mString->size());
}

bool QNCString::operator==(const QNCString& acrString) const {
  QN_ASSERT(mString != 0);
  QN_ASSERT(acrString.mString != 0);
  return ClibStrcmp(mString->c_str(), acrString.mString->c_str()) == 0;
}

bool QNCString::operator<(const QNCString& acrString) const {
  QN_ASSERT(mString != 0);
  return *mString < *acrString.mString;
}

QNCString& QNCString::operator+=(const QNCString& acrString) {
  QN_ASSERT(mString != 0);
  QN_ASSERT(acrString.mString != 0);
  mString->append(*acrString.mString);
  return *this;
}
