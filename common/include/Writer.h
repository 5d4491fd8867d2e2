#pragma once
// QNCWriter: the sending end of a buffer channel, implemented by the application (or by the
// descriptor-based ends of this library). Several threads using one writer must be kept apart
// by the writer itself.

#include "Pointer.h"

class QNCBuffer;

class QNCWriter {
 public:
  virtual ~QNCWriter() = default;

  // Sends the buffer's used bytes and stores the number sent in arCount. Failures are
  // exceptions of the family.
  virtual void write(const QNCPointer<QNCBuffer>& acrBuffer, unsigned int& arCount) = 0;

 protected:
  QNCWriter() = default;
};
