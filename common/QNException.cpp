#include "QNException.h"

#include <cstring>
#include <exception>

QNCException::QNCException() noexcept : mCode(0) { mMessage[0] = '\0'; }

QNCException::QNCException(const char* apMessage, unsigned int aCode) noexcept : mCode(aCode) {
  _store(apMessage);
}

QNCException::QNCException(const QNCException& acrCopy) noexcept : mCode(acrCopy.mCode) {
  _store(acrCopy.mMessage);
}

QNCException& QNCException::operator=(const QNCException& acrCopy) noexcept {
  if (this != &acrCopy) {
    _store(acrCopy.mMessage);
    mCode = acrCopy.mCode;
  }
  return *this;
}

QNCException::~QNCException() = default;

const char* QNCException::what() const noexcept { return mMessage; }

const char* QNCurrentExceptionText() noexcept {
  // Rethrowing the exception being handled reaches the same object, which lives until the
  // caller's handler ends, so its text may be returned.
  try {
    throw;
  } catch (const QNCException& acrException) {
    return acrException.what();
  } catch (const std::exception& acrException) {
    return acrException.what();
  } catch (...) {
    return "unknown exception";
  }
}

void QNCException::_store(const char* apMessage) noexcept {
  // A null message is stored as the empty text rather than read.
  if (apMessage == nullptr) {
    mMessage[0] = '\0';
    return;
  }
  const size_t lLength = strnlen(apMessage, kMaxMessage - 1);
  memcpy(mMessage, apMessage, lLength);
  mMessage[lLength] = '\0';
}

// Out-of-line destructors anchor each class's type information in the library, so that an
// exception thrown in the library is caught by its class in the application.
#define QN_DEFINE_EXCEPTION(Name) Name::~Name() = default
QN_DEFINE_EXCEPTION(QNCGenericException);
QN_DEFINE_EXCEPTION(QNCHaltEx);
QN_DEFINE_EXCEPTION(QNCOsException);
QN_DEFINE_EXCEPTION(QNCOpsException);
QN_DEFINE_EXCEPTION(QNCClibEx);
QN_DEFINE_EXCEPTION(QNCNotFoundEx);
QN_DEFINE_EXCEPTION(QNCInvalidEx);
QN_DEFINE_EXCEPTION(QNCExistsEx);
QN_DEFINE_EXCEPTION(QNCNoArgsEx);
QN_DEFINE_EXCEPTION(QNCNotImplementedEx);
QN_DEFINE_EXCEPTION(QNCNoMemoryEx);
QN_DEFINE_EXCEPTION(QNCParentExitEx);
QN_DEFINE_EXCEPTION(QNCExitConditionEx);
QN_DEFINE_EXCEPTION(QNCReadFailedEx);
QN_DEFINE_EXCEPTION(QNCProcessCreationFailedEx);
QN_DEFINE_EXCEPTION(QNCTryAgainEx);
QN_DEFINE_EXCEPTION(QNCTimeOutEx);
QN_DEFINE_EXCEPTION(QNCOpenFailedEx);
QN_DEFINE_EXCEPTION(QNCCloseFailedEx);
QN_DEFINE_EXCEPTION(QNCFileLockFailedEx);
QN_DEFINE_EXCEPTION(QNCWriteFailedEx);
QN_DEFINE_EXCEPTION(QNCTerminateFailedEx);
QN_DEFINE_EXCEPTION(QNCClibStatFailedEx);
QN_DEFINE_EXCEPTION(QNCClibGetProcStatusFailedEx);
