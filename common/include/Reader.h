#pragma once
// QNCReader: the receiving end of a buffer channel, implemented by the application (or by the
// descriptor-based ends of this library). The system object and the protocol helper only call
// these operations; several threads using one reader must be kept apart by the reader itself.

#include "Pointer.h"

class QNCBuffer;

class QNCReader {
 public:
  virtual ~QNCReader() = default;

  // Delivers received bytes, at most arBuffer's used length, into the buffer arBuffer refers to
  // (from its first byte on; a reader may also put another buffer into arBuffer) and stores the
  // number delivered in arCount; 0 means the end of the stream. Throws QNCTryAgainEx when nothing
  // can be delivered yet; any other failure is an exception of the family.
  virtual void read(QNCPointer<QNCBuffer>& arBuffer, unsigned int& arCount) = 0;

  // Blocks until data is there (true) or acWaitTime milliseconds have passed (false).
  virtual bool waitForActivity(unsigned int acWaitTime) = 0;

 protected:
  QNCReader() = default;
};
