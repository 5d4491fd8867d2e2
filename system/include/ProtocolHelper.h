#pragma once
// QNCProtocolHelper: frames protocol messages on the buffer channels.
//
// Wire format, one direction of a stream: a 4-byte body length (unsigned int in host byte order,
// least significant byte first on x86-64; it counts the body only), then the body, unchanged.
// No other header, trailer or checksum. The prefix is optional per call: write(..., true) sends
// the body alone, read(..., n) with n != 0 reads a body of n bytes without a prefix.
//
// Reading a message:
// - every reader call that throws QNCTryAgainEx is retried, after mRetrySleepTime milliseconds,
//   up to 301 attempts per call; other exceptions of the reader pass to the caller unchanged;
// - the 4-byte prefix is gathered across as many reader calls as it takes;
// - each body read is offered exactly the bytes still missing, so no read goes past the end of
//   the message, and the body is gathered from as many calls as it takes;
// - a read call that delivers 0 bytes (the peer closed the stream), or 301 attempts in a row
//   that meet QNCTryAgainEx, ends the message with the error line "Failed in reading %u read %u"
//   and QNCReadFailedEx "Failed in reading the chunk" (328) — for the prefix and the body alike;
//   a reader that reports more bytes than it was offered is the same error;
// - a prefix of 0 (an empty message) yields a buffer of used length 0;
// - with a maximum message size set, a prefix above it is refused with the error line
//   "Message of %u bytes exceeds the maximum of %u" and QNCReadFailedEx "Message exceeds the
//   maximum size" (328) before anything is allocated (a guard against a peer that sends a huge
//   length); by default there is no maximum;
// - on failure the caller's buffer is left as it was; the bytes of the message already taken
//   from the reader are lost and the stream stands in the middle of a message.
// Writing a message: one writer call for the prefix (unless acWithoutSize), one for the body; the
// counts are traced, not checked.
// Prefixes are read and written through a 4-byte buffer that each thread keeps and reuses while
// no reader or writer holds on to it, so a framed message allocates only its body's buffer (its
// object and bytes in one block, and its counter).
// Trace: read() and write() look at the trace level once; with trace on every trace line of the
// call is written as the mask decides at that moment, with trace off the call tests no line.
//
// Threads: no lock, and no shared state that changes after construction (the prefix buffers are
// per thread), so any number of threads may use one helper. Threads sharing one reader or writer keep whole
// messages apart themselves.

#include "Pointer.h"

class QNCBuffer;
class QNCReader;
class QNCWriter;

class QNCProtocolHelper {
 public:
  // acRetrySleepTime: milliseconds to sleep after a reader call that met QNCTryAgainEx (0: retry
  // at once). aMaxMessageSize: the largest body read() accepts from a prefix (0: no maximum).
  explicit QNCProtocolHelper(unsigned int acRetrySleepTime, unsigned int aMaxMessageSize = 0);
  virtual ~QNCProtocolHelper();

  // Reads one message; on success arBuffer refers to a new buffer holding exactly the body.
  // Throws QNCReadFailedEx as above, QNCNoMemoryEx when a buffer cannot be allocated.
  virtual void read(QNCPointer<QNCReader>& arReader, QNCPointer<QNCBuffer>& arBuffer, unsigned int acSize);

  // Writes one message whose body is the buffer's used bytes.
  virtual void write(QNCPointer<QNCWriter>& arWriter, const QNCPointer<QNCBuffer>& acrBuffer,
                     bool acWithoutSize);

 private:
  // Each operation looks at the trace level once and runs these with their trace lines (acTrace)
  // or without any, so a masked-off helper pays no test per line.
  template <bool acTrace>
  void _read(QNCPointer<QNCReader>& arReader, QNCPointer<QNCBuffer>& arBuffer, unsigned int acSize);
  template <bool acTrace>
  void _write(QNCPointer<QNCWriter>& arWriter, const QNCPointer<QNCBuffer>& acrBuffer, bool acWithoutSize);
  template <bool acTrace>
  void __readSize(QNCPointer<QNCReader>& arReader, unsigned int& arSize);
  template <bool acTrace>
  void __readActual(QNCPointer<QNCReader>& arReader, unsigned int& arCount, QNCPointer<QNCBuffer>& arBuffer);
  template <bool acTrace>
  void __read(QNCPointer<QNCReader>& arReader, QNCPointer<QNCBuffer>& arBuffer, unsigned int& arCount);
  template <bool acTrace>
  void __writeSize(QNCPointer<QNCWriter>& arWriter, unsigned int aSize);
  template <bool acTrace>
  void __writeActual(QNCPointer<QNCWriter>& arWriter, const QNCPointer<QNCBuffer>& acrBuffer);
  // Gathers acTotal bytes into arTarget (capacity at least acTotal) through reads offered exactly
  // the missing length.
  template <bool acTrace>
  void __gather(QNCPointer<QNCReader>& arReader, QNCPointer<QNCBuffer>& arTarget, unsigned int acTotal);

  const unsigned int mRetrySleepTime;
  const unsigned int mMaxMessageSize;
};
