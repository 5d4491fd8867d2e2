#include "ProtocolHelper.h"

#include <new>
#include <utility>

#include "AllocatedBuffer.h"
#include "Clib.h"
#include "Logger.h"
#include "QNException.h"
#include "Reader.h"
#include "WarningLimiter.h"
#include "Writer.h"

namespace {
constexpr unsigned int kMaxAttempts = 301;
constexpr unsigned int kReadFailedCode = 328;

// Object and bytes in one allocation: a message buffer is made per message and dropped by the
// caller.
QNCPointer<QNCBuffer> newBuffer(unsigned int acLength) {
  return QNCPointer<QNCBuffer>(QNCAllocatedBuffer::createJoint(acLength), QNPST_Individual, QNPAT_New);
}

// This thread's 4-byte buffer for size prefixes, so that framing a message allocates nothing for
// its prefix. Initial-exec: reached with one instruction instead of a call per access; the few
// bytes fit the static space the C library keeps even for a library loaded with dlopen.
[[gnu::tls_model("initial-exec")]] thread_local QNCPointer<QNCBuffer> tPrefix;

// Lends the prefix buffer to one read or write of a prefix and takes it back on every way out.
// Moved, not copied, so the loan costs no counter traffic. When a reader or writer kept a
// reference to the last buffer, it keeps that buffer unchanged and a new one is lent instead; a
// call that frames another message on this thread meanwhile (from inside a reader, say) finds no
// buffer to borrow and makes its own.
class QNCPrefixLoan {
 public:
  QNCPrefixLoan() : mBuffer(std::move(tPrefix)) {
    if (!mBuffer.isSoleOwner()) mBuffer = newBuffer(sizeof(unsigned int));
  }
  ~QNCPrefixLoan() { tPrefix = std::move(mBuffer); }
  QNCPrefixLoan(const QNCPrefixLoan&) = delete;
  QNCPrefixLoan& operator=(const QNCPrefixLoan&) = delete;

  QNCPointer<QNCBuffer> mBuffer;
};

// A peer decides how often a message is oversized, so its line is rate-limited (WarningLimiter.h).
// Made on first use: after the logger's statics, and destroyed before them.
QNCWarningLimiter& oversizeLines() {
  static QNCWarningLimiter sLimiter("oversized messages");
  return sLimiter;
}
}  // namespace

QNCProtocolHelper::QNCProtocolHelper(unsigned int acRetrySleepTime, unsigned int aMaxMessageSize)
    : mRetrySleepTime(acRetrySleepTime), mMaxMessageSize(aMaxMessageSize) {
  QN_ENTERED();
  QN_LEFT();
}

QNCProtocolHelper::~QNCProtocolHelper() {
  QN_ENTERED();
  QN_LEFT();
}

void QNCProtocolHelper::read(QNCPointer<QNCReader>& arReader, QNCPointer<QNCBuffer>& arBuffer,
                             unsigned int acSize) {
  if (QNIsLogLevelOn(QNLL_Trace)) {
    _read<true>(arReader, arBuffer, acSize);
  } else {
    _read<false>(arReader, arBuffer, acSize);
  }
}

void QNCProtocolHelper::write(QNCPointer<QNCWriter>& arWriter, const QNCPointer<QNCBuffer>& acrBuffer,
                              bool acWithoutSize) {
  if (QNIsLogLevelOn(QNLL_Trace)) {
    _write<true>(arWriter, acrBuffer, acWithoutSize);
  } else {
    _write<false>(arWriter, acrBuffer, acWithoutSize);
  }
}

// Trace lines exist only in the instantiations with acTrace, where each is written as the mask
// decides at that moment. The _AS form names the public operation whose work runs in a helper.
#define QN_HELPER_TRACE(...)                \
  do {                                      \
    if (acTrace) QN_LOG_TRACE(__VA_ARGS__); \
  } while (0)
#define QN_HELPER_TRACE_AS(acpFunction, ...)                                                         \
  do {                                                                                               \
    if (acTrace && QNIsLogLevelOn(QNLL_Trace))                                                       \
      PrintLogMessageWithTimeStamp(QNLL_Trace, "-T-", __LINE__, acpFunction, __FILE__, __VA_ARGS__); \
  } while (0)

template <bool acTrace>
void QNCProtocolHelper::_read(QNCPointer<QNCReader>& arReader, QNCPointer<QNCBuffer>& arBuffer,
                              unsigned int acSize) {
  QN_HELPER_TRACE_AS("read", "%s", "Entered");
  unsigned int lreadsize = acSize;
  if (lreadsize == 0) __readSize<acTrace>(arReader, lreadsize);
  if (mMaxMessageSize != 0 && lreadsize > mMaxMessageSize) {
    if (oversizeLines().admit())
      QN_LOG_ERROR("Message of %u bytes exceeds the maximum of %u", lreadsize, mMaxMessageSize);
    throw QNCReadFailedEx("Message exceeds the maximum size", kReadFailedCode);
  }
  QN_HELPER_TRACE_AS("read", "Creating a buffer of '%u' size for receiving", lreadsize);
  if (lreadsize == 0) {
    // An empty message: a buffer cannot be made with a used length of 0, so make room for one
    // byte and use none of it.
    QNCPointer<QNCBuffer> lEmpty = newBuffer(1);
    lEmpty->setLength(0);
    arBuffer = lEmpty;
    QN_HELPER_TRACE_AS("read", "%s", "Left");
    return;
  }
  QNCPointer<QNCBuffer> lMessage = newBuffer(lreadsize);
  __gather<acTrace>(arReader, lMessage, lreadsize);
  arBuffer = std::move(lMessage);
  QN_HELPER_TRACE_AS("read", "%s", "Left");
}

template <bool acTrace>
void QNCProtocolHelper::_write(QNCPointer<QNCWriter>& arWriter, const QNCPointer<QNCBuffer>& acrBuffer,
                               bool acWithoutSize) {
  QN_HELPER_TRACE_AS("write", "%s", "Entered");
  if (!acWithoutSize) __writeSize<acTrace>(arWriter, acrBuffer->getLength());
  __writeActual<acTrace>(arWriter, acrBuffer);
  QN_HELPER_TRACE_AS("write", "%s", "Left");
}

template <bool acTrace>
void QNCProtocolHelper::__readSize(QNCPointer<QNCReader>& arReader, unsigned int& arSize) {
  QN_HELPER_TRACE("%s", "Entered");
  QNCPrefixLoan lPrefix;
  __gather<acTrace>(arReader, lPrefix.mBuffer, sizeof arSize);
  const QNCBuffer& lBytes = *lPrefix.mBuffer;
  ClibMemcpy(&arSize, static_cast<const unsigned char*>(lBytes), sizeof arSize);
  QN_HELPER_TRACE("Protocol Message to read is of '%u' bytes", arSize);
  QN_HELPER_TRACE("%s", "Left");
}

template <bool acTrace>
void QNCProtocolHelper::__gather(QNCPointer<QNCReader>& arReader, QNCPointer<QNCBuffer>& arTarget,
                                 unsigned int acTotal) {
  // The first read goes straight into the target; a chunk buffer is made only when a read comes
  // up short, and its bytes are copied into place. Every read is offered exactly the missing
  // length either way.
  unsigned char* lpTarget = *arTarget;
  QNCPointer<QNCBuffer> lChunk = arTarget;
  unsigned int lReadbynow = 0;
  unsigned int lcountsize = 0;
  while (acTotal > lReadbynow) {
    const unsigned int lMissing = acTotal - lReadbynow;
    if (lReadbynow != 0 && (lChunk.get() == arTarget.get() || lChunk->getCapacity() < lMissing)) {
      lChunk = newBuffer(lMissing);
    }
    lChunk->setLength(lMissing);
    QNCBuffer* const lpOffered = lChunk.get();
    __readActual<acTrace>(arReader, lcountsize, lChunk);
    QN_HELPER_TRACE("lReadbynow = %u, lcountsize = %u lreadsize = %u", lReadbynow, lcountsize, acTotal);
    if (lcountsize == 0 || lcountsize > lMissing) {
      QN_LOG_ERROR("Failed in reading %u read %u", acTotal, lReadbynow);
      throw QNCReadFailedEx("Failed in reading the chunk", kReadFailedCode);
    }
    // Bytes that did not land in place -- read into a chunk, or into a buffer of the reader's
    // own that it put into the pointer -- are copied there.
    const QNCBuffer& lDelivered = *lChunk;
    const unsigned char* lpDelivered = lDelivered;
    if (lpDelivered != lpTarget + lReadbynow || lChunk.get() != lpOffered) {
      ClibMemcpy(lpTarget + lReadbynow, lpDelivered, lcountsize);
    }
    lReadbynow += lcountsize;
    QN_HELPER_TRACE("Read %u bytes into localbuffer total read = %u", lcountsize, lReadbynow);
    lcountsize = 0;
  }
  arTarget->setLength(acTotal);
}

template <bool acTrace>
void QNCProtocolHelper::__readActual(QNCPointer<QNCReader>& arReader, unsigned int& arCount,
                                     QNCPointer<QNCBuffer>& arBuffer) {
  QN_HELPER_TRACE("%s", "Entered");
  unsigned int lCount = 0;
  __read<acTrace>(arReader, arBuffer, lCount);
  arCount = lCount;
  QN_HELPER_TRACE("Read '%u' bytes of Protocol Message (actual bytes - '%u')", arCount,
                  arBuffer->getLength());
  QN_HELPER_TRACE("%s", "Left");
}

template <bool acTrace>
void QNCProtocolHelper::__read(QNCPointer<QNCReader>& arReader, QNCPointer<QNCBuffer>& arBuffer,
                               unsigned int& arCount) {
  QN_HELPER_TRACE("%s", "Entered");
  for (unsigned int lAttempt = 0; lAttempt < kMaxAttempts; ++lAttempt) {
    try {
      arReader->read(arBuffer, arCount);
      break;
    } catch (QNCTryAgainEx&) {
      QN_HELPER_TRACE("Resource temporarily unavailable... Sleeping");
      if (mRetrySleepTime != 0) ClibSleepMS(mRetrySleepTime);
    }
  }
  QN_HELPER_TRACE("Read '%u' bytes", arCount);
  QN_HELPER_TRACE("%s", "Left");
}

template <bool acTrace>
void QNCProtocolHelper::__writeSize(QNCPointer<QNCWriter>& arWriter, unsigned int aSize) {
  QN_HELPER_TRACE("%s", "Entered");
  unsigned int lCount = 0;
  QNCPrefixLoan lPrefix;
  QNCBuffer& lBytes = *lPrefix.mBuffer;
  lBytes.setLength(sizeof aSize);
  ClibMemcpy(static_cast<unsigned char*>(lBytes), &aSize, sizeof aSize);
  arWriter->write(lPrefix.mBuffer, lCount);
  QN_HELPER_TRACE("Wrote '%u' bytes of Protocol Message Size of required '%u'", lCount,
                  static_cast<unsigned int>(sizeof aSize));
  QN_HELPER_TRACE("%s", "Left");
}

template <bool acTrace>
void QNCProtocolHelper::__writeActual(QNCPointer<QNCWriter>& arWriter,
                                      const QNCPointer<QNCBuffer>& acrBuffer) {
  QN_HELPER_TRACE("%s", "Entered");
  unsigned int lCount = 0;
  arWriter->write(acrBuffer, lCount);
  QN_HELPER_TRACE("Wrote '%u' bytes of Protocol Message of required '%u'", lCount, acrBuffer->getLength());
  QN_HELPER_TRACE("%s", "Left");
}
