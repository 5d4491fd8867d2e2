#pragma once
// The exception family of the system.
//
// Every failure a caller can react to is thrown by value as one of these classes and caught by
// reference. Each carries a copy of its message (what()) and a numeric code (getCode()).
// The message is copied into storage inside the object, so a text formatted in a local buffer
// stays readable after that buffer is gone; a message longer than kMaxMessage - 1 characters is
// cut. Copying an exception never allocates and never throws.
//
// Every class below the root derives virtually and publicly, so a class with two parents
// (QNCNoMemoryEx is both a QNCGenericException and a QNCHaltEx) holds one shared QNCException and
// can be caught through either parent.
//
// Immutable after construction: safe to read from any thread.

#include <new>

class QNCException {
 public:
  static constexpr unsigned int kMaxMessage = 1024;

  QNCException(const char* apMessage, unsigned int aCode) noexcept;
  QNCException(const QNCException& acrCopy) noexcept;
  QNCException& operator=(const QNCException& acrCopy) noexcept;
  virtual ~QNCException();

  // The stored message; valid as long as this object.
  virtual const char* what() const noexcept;

  unsigned int getCode() const noexcept { return mCode; }

 protected:
  // Used only while a virtual base is initialised by a more derived class.
  QNCException() noexcept;

 private:
  void _store(const char* apMessage) noexcept;

  char mMessage[kMaxMessage];
  unsigned int mCode;
};

// The message of the exception now being handled: what() of a QNCException or a std::exception,
// else "unknown exception". Call it only inside a catch block; the text lives as long as that
// handler. For code that must survive whatever a callback throws and report it.
const char* QNCurrentExceptionText() noexcept;

// Declares one member of the family. Categories keep a protected default constructor so that
// their descendants initialise the shared root themselves.
#define QN_DECLARE_EXCEPTION(Name, ...)                                                          \
  class Name : __VA_ARGS__ {                                                                     \
   public:                                                                                       \
    Name(const char* apMessage, unsigned int aCode) noexcept : QNCException(apMessage, aCode) {} \
    ~Name() override;                                                                            \
                                                                                                 \
   protected:                                                                                    \
    Name() noexcept = default;                                                                   \
  }

// Categories.
QN_DECLARE_EXCEPTION(QNCGenericException, public virtual QNCException);  // the library's own logic
QN_DECLARE_EXCEPTION(QNCHaltEx, public virtual QNCException);            // the process must stop
QN_DECLARE_EXCEPTION(QNCOsException, public virtual QNCException);       // a system call failed
QN_DECLARE_EXCEPTION(QNCOpsException, public virtual QNCException);      // stopping another instance
QN_DECLARE_EXCEPTION(QNCClibEx, public virtual QNCException);            // a Clib wrapper failed

// Errors of the library's logic and data structures.
QN_DECLARE_EXCEPTION(QNCNotFoundEx, public virtual QNCGenericException);
QN_DECLARE_EXCEPTION(QNCInvalidEx, public virtual QNCGenericException);
QN_DECLARE_EXCEPTION(QNCExistsEx, public virtual QNCGenericException);
QN_DECLARE_EXCEPTION(QNCNoArgsEx, public virtual QNCGenericException);
QN_DECLARE_EXCEPTION(QNCNotImplementedEx, public virtual QNCGenericException);

// Conditions after which the process stops.
QN_DECLARE_EXCEPTION(QNCNoMemoryEx, public virtual QNCGenericException, public virtual QNCHaltEx);
QN_DECLARE_EXCEPTION(QNCParentExitEx, public virtual QNCGenericException, public virtual QNCHaltEx);
QN_DECLARE_EXCEPTION(QNCExitConditionEx, public virtual QNCGenericException, public virtual QNCHaltEx);

// Failed operating-system operations.
QN_DECLARE_EXCEPTION(QNCReadFailedEx, public virtual QNCOsException);
QN_DECLARE_EXCEPTION(QNCProcessCreationFailedEx, public virtual QNCOsException);
QN_DECLARE_EXCEPTION(QNCTryAgainEx, public virtual QNCOsException);
QN_DECLARE_EXCEPTION(QNCTimeOutEx, public virtual QNCOsException);
QN_DECLARE_EXCEPTION(QNCOpenFailedEx, public virtual QNCOsException);
QN_DECLARE_EXCEPTION(QNCCloseFailedEx, public virtual QNCOsException);
QN_DECLARE_EXCEPTION(QNCFileLockFailedEx, public virtual QNCOsException);
QN_DECLARE_EXCEPTION(QNCWriteFailedEx, public virtual QNCOsException);  // a write or send failed

// The failed stop of a running instance.
QN_DECLARE_EXCEPTION(QNCTerminateFailedEx, public virtual QNCOpsException);

// Failed Clib wrappers.
QN_DECLARE_EXCEPTION(QNCClibStatFailedEx, public virtual QNCClibEx);
QN_DECLARE_EXCEPTION(QNCClibGetProcStatusFailedEx, public virtual QNCClibEx);

// Runs acrCall and returns what it returns, reporting a std::bad_alloc from it as the family's
// QNCNoMemoryEx "Out of Memory" (2): the one place that translates a standard container's
// allocation failure. Anything else acrCall throws passes unchanged.
template <class Call>
decltype(auto) QNNoMemoryToException(const Call& acrCall) {
  try {
    return acrCall();
  } catch (const std::bad_alloc&) {
    throw QNCNoMemoryEx("Out of Memory", 2);
  }
}
