#pragma once
// QNCBuffer: contiguous byte storage of a fixed capacity with a used length, the number of bytes
// that count as its contents. Handled through QNCPointer<QNCBuffer>; the two subclasses,
// QNCAllocatedBuffer (AllocatedBuffer.h) and QNCLocalBuffer (LocalBuffer.h), only fix how a
// buffer is made.
//
// Guarantees:
// - The storage is one contiguous block of getCapacity() bytes that never moves or changes size
//   while the buffer lives; both data accessors return its first byte.
// - 0 <= getLength() <= getCapacity() always holds. setLength() never grows the storage: a used
//   length beyond the capacity is refused with QNCInvalidEx, so a buffer never claims bytes it
//   cannot hold (the buffer pool relies on this to never hand out a buffer that is too small).
// - byte() reads only inside the used length; an index at or beyond it is refused with
//   QNCInvalidEx rather than returning stale or unowned bytes.
// - New storage is not cleared. A reused buffer keeps the bytes of its previous user, so no
//   caller may count on fresh contents.
//
// Threads: one thread at a time. A buffer handed between threads through a queue or the pool is
// published by that structure's lock.

#include <new>

class QNCBuffer {
 public:
  // Owns new storage of acMaxLength bytes, or acUseLength bytes when acMaxLength is 0; the used
  // length is acUseLength. Whether acUseLength fits acMaxLength is the subclass's check
  // (QNCAllocatedBuffer asserts it); should it not, the storage is made acUseLength bytes so
  // the invariant above still holds. Throws QNCNoMemoryEx "Out of Memory" (2) when the storage
  // cannot be allocated.
  QNCBuffer(unsigned int acUseLength, unsigned int acMaxLength);

  // A buffer whose contents are a copy of the aLength bytes at apBytes (capacity and used length
  // aLength). Copying, not referring, keeps the buffer valid whatever happens to apBytes later
  // and makes the write accessor safe. Throws QNCNoMemoryEx "Out of Memory" (2).
  QNCBuffer(const unsigned char* apBytes, unsigned int aLength);

  QNCBuffer(const QNCBuffer&) = delete;
  QNCBuffer& operator=(const QNCBuffer&) = delete;
  virtual ~QNCBuffer();

  // A buffer may have been allocated with its storage behind it (QNCAllocatedBuffer::
  // createJoint), so it is always released whole, whatever size its class has. The second form
  // releases a buffer made with new (std::nothrow) whose constructor threw.
  static void operator delete(void* apObject) noexcept { ::operator delete(apObject); }
  static void operator delete(void* apObject, const std::nothrow_t&) noexcept { ::operator delete(apObject); }

  // The byte at aIndex. Throws QNCInvalidEx "Buffer index beyond the used length" (6) when
  // aIndex >= getLength().
  virtual unsigned char byte(unsigned int aIndex) const;

  // Byte 0 of the storage, for reading getLength() bytes (getCapacity() are addressable).
  virtual operator const unsigned char*() const;

  // The used length: the number of payload bytes.
  virtual unsigned int getLength() const { return mLength; }

  // Byte 0 of the storage, for writing up to getCapacity() bytes.
  virtual operator unsigned char*();

  // Sets the used length; the bytes are left as they are. Throws QNCInvalidEx "Buffer length
  // beyond its capacity" (6) when aLength > getCapacity(); the used length is then unchanged.
  virtual void setLength(unsigned int aLength);

  // The number of bytes the storage holds; fixed for the buffer's life.
  unsigned int getCapacity() const { return mCapacity; }

 protected:
  // Over aCapacity bytes of storage at apStorage that the subclass allocated together with the
  // object: they are neither allocated nor freed here. acUseLength <= aCapacity.
  QNCBuffer(unsigned char* apStorage, unsigned int acUseLength, unsigned int aCapacity) noexcept
      : mStorage(apStorage), mLength(acUseLength), mCapacity(aCapacity), mOwnsStorage(false) {}

 private:
  unsigned char* mStorage;  // mCapacity bytes: new[] and owned, or inside the object's allocation
  unsigned int mLength;
  unsigned int mCapacity;
  bool mOwnsStorage;  // mStorage came from new[]
};
