#pragma once
// QNCAllocatedBuffer: a QNCBuffer with storage of its own, made from a used length and a maximum
// length (the capacity; 0 means "exactly the used length"). It adds nothing to QNCBuffer.
//
// Make it with new (std::nothrow) and hand it at once to
// QNCPointer<QNCBuffer>(p, QNPST_Individual, QNPAT_New); a failed allocation of the object then
// shows as QNCNoMemoryEx "Out of Memory" (2) from the pointer, a failed allocation of the
// storage as the same exception from the constructor.
//
// Threads: as QNCBuffer.

#include <new>

#include "Assert.h"
#include "Buffer.h"

class QNCAllocatedBuffer : public QNCBuffer {
 public:
  // Used length acUseLength, capacity acMaxLength (or acUseLength when acMaxLength is 0).
  // A zero used length, or a used length above a non-zero maximum, is a bug of the caller: the
  // constructor asserts both (exit status 1) after the storage has been made.
  QNCAllocatedBuffer(unsigned int acUseLength, unsigned int acMaxLength)
      : QNCBuffer(acUseLength, acMaxLength) {
    QN_ASSERT(acUseLength != 0);
    QN_ASSERT(acMaxLength == 0 || acUseLength <= acMaxLength);
  }

  // A buffer of used length and capacity acUseLength (not 0: asserted) whose storage lies in the
  // object's own allocation: one allocation instead of two, for buffers made and dropped per
  // message. Null when memory is short; hand it at once to a QNCPointer as above, which then
  // throws QNCNoMemoryEx "Out of Memory" (2).
  static QNCAllocatedBuffer* createJoint(unsigned int acUseLength) noexcept {
    void* const lpBlock = ::operator new(sizeof(QNCAllocatedBuffer) + acUseLength, std::nothrow);
    if (lpBlock == nullptr) return nullptr;
    return new (lpBlock) QNCAllocatedBuffer(
        QNSJoint(), static_cast<unsigned char*>(lpBlock) + sizeof(QNCAllocatedBuffer), acUseLength);
  }

  ~QNCAllocatedBuffer() override {}

 private:
  struct QNSJoint {};  // tells this constructor from the public one, whatever literals a caller passes
  QNCAllocatedBuffer(QNSJoint, unsigned char* apStorage, unsigned int acUseLength) noexcept
      : QNCBuffer(apStorage, acUseLength, acUseLength) {
    QN_ASSERT(acUseLength != 0);
  }
};
