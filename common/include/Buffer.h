#pragma once
// QNCBuffer: contiguous byte storage of a fixed capacity with a used length, the number of bytes
// that count as its contents. Handled through QNCPointer<QNCBuffer>.
// (Completed together with the buffer pool.)

class QNCBuffer {
 public:
  QNCBuffer(unsigned int acUseLength, unsigned int acMaxLength);
  QNCBuffer(const unsigned char* apBytes, unsigned int aLength);
  QNCBuffer(const QNCBuffer&) = delete;
  QNCBuffer& operator=(const QNCBuffer&) = delete;
  virtual ~QNCBuffer();

  virtual unsigned char byte(unsigned int aIndex) const;
  virtual operator const unsigned char*() const;
  virtual unsigned int getLength() const { return mLength; }
  virtual operator unsigned char*();
  virtual void setLength(unsigned int aLength);

  unsigned int getCapacity() const { return mCapacity; }

 private:
  unsigned char* mStorage;
  unsigned int mLength;
  unsigned int mCapacity;
};
