#include "Buffer.h"

#include <cstring>
#include <new>

#include "QNException.h"

namespace {
unsigned char* allocateStorage(unsigned int aCapacity) {
  // new[] of 0 bytes still yields a unique address, so every buffer has a valid byte 0 address.
  unsigned char* lStorage = new (std::nothrow) unsigned char[aCapacity];
  if (lStorage == nullptr) throw QNCNoMemoryEx("Out of Memory", 2);
  return lStorage;
}
}  // namespace

QNCBuffer::QNCBuffer(unsigned int acUseLength, unsigned int acMaxLength)
    : mStorage(nullptr),
      mLength(acUseLength),
      mCapacity(acMaxLength < acUseLength ? acUseLength : acMaxLength),
      mOwnsStorage(true) {
  mStorage = allocateStorage(mCapacity);
}

QNCBuffer::QNCBuffer(const unsigned char* apBytes, unsigned int aLength)
    : mStorage(nullptr), mLength(aLength), mCapacity(aLength), mOwnsStorage(true) {
  mStorage = allocateStorage(mCapacity);
  if (aLength != 0) memcpy(mStorage, apBytes, aLength);
}

QNCBuffer::~QNCBuffer() {
  if (mOwnsStorage) delete[] mStorage;
}

unsigned char QNCBuffer::byte(unsigned int aIndex) const {
  if (aIndex >= mLength) throw QNCInvalidEx("Buffer index beyond the used length", 6);
  return mStorage[aIndex];
}

QNCBuffer::operator const unsigned char*() const { return mStorage; }

QNCBuffer::operator unsigned char*() { return mStorage; }

void QNCBuffer::setLength(unsigned int aLength) {
  if (aLength > mCapacity) throw QNCInvalidEx("Buffer length beyond its capacity", 6);
  mLength = aLength;
}
