#pragma once
// QNCLocalBuffer: a QNCBuffer made over given bytes: its contents are a copy of the aLength bytes
// at apBytes, so the buffer stays valid after those bytes are gone. It adds nothing to
// QNCBuffer. Made with new (std::nothrow) into a QNCPointer, as QNCAllocatedBuffer.
//
// Threads: as QNCBuffer.

#include "Buffer.h"

class QNCLocalBuffer : public QNCBuffer {
 public:
  // Throws QNCNoMemoryEx "Out of Memory" (2) when the copy cannot be allocated.
  QNCLocalBuffer(const unsigned char* apBytes, unsigned int aLength) : QNCBuffer(apBytes, aLength) {}

  ~QNCLocalBuffer() override {}
};
