#include <gtest/gtest.h>

#include <new>

#include "AllocatedBuffer.h"
#include "LocalBuffer.h"
#include "Pointer.h"
#include "QNException.h"

namespace {

QNCPointer<QNCBuffer> makeBuffer(unsigned int aUseLength, unsigned int aMaxLength) {
  return QNCPointer<QNCBuffer>(new (std::nothrow) QNCAllocatedBuffer(aUseLength, aMaxLength),
                               QNPST_Individual, QNPAT_New);
}

TEST(BufferTest, UsedLengthMovesWithinTheCapacityAndTheBytesStay) {
  // A maximum of 0 makes room for exactly the used length.
  EXPECT_EQ(10u, makeBuffer(10, 0)->getCapacity());
  QNCPointer<QNCBuffer> lBuffer = makeBuffer(10, 64);
  EXPECT_EQ(10u, lBuffer->getLength());
  lBuffer->setLength(64);
  unsigned char* lBytes = *lBuffer;
  for (unsigned int lIndex = 0; lIndex < 64; ++lIndex)
    lBytes[lIndex] = static_cast<unsigned char>(lIndex + 1);
  EXPECT_EQ(64, lBuffer->byte(63));
  // Shrinking to nothing and growing back keeps the bytes: the storage never moves.
  lBuffer->setLength(0);
  lBuffer->setLength(1);
  EXPECT_EQ(1, lBuffer->byte(0));
}

TEST(BufferTest, LengthBeyondCapacityAndBytesBeyondTheUsedLengthAreRefused) {
  QNCPointer<QNCBuffer> lBuffer = makeBuffer(4, 64);
  try {
    lBuffer->setLength(65);
    FAIL() << "setLength beyond the capacity was accepted";
  } catch (const QNCInvalidEx& acrException) {
    EXPECT_STREQ("Buffer length beyond its capacity", acrException.what());
    EXPECT_EQ(6u, acrException.getCode());
  }
  EXPECT_EQ(4u, lBuffer->getLength());
  (*lBuffer)[3] = 7;
  EXPECT_EQ(7, lBuffer->byte(3));
  // Index 4 lies inside the storage but beyond the contents.
  EXPECT_THROW(lBuffer->byte(4), QNCInvalidEx);
  lBuffer->setLength(0);
  EXPECT_THROW(lBuffer->byte(0), QNCInvalidEx);
}

TEST(BufferTest, LocalBufferHoldsACopyOfTheBytesInMemoryOrder) {
  unsigned int lValue = 0x04030201u;
  const QNCPointer<QNCBuffer> lBuffer(
      new (std::nothrow) QNCLocalBuffer(reinterpret_cast<const unsigned char*>(&lValue), sizeof lValue),
      QNPST_Individual, QNPAT_New);
  EXPECT_EQ(4u, lBuffer->getLength());
  lValue = 0;  // the buffer does not refer to the caller's bytes
  EXPECT_EQ(0x01, lBuffer->byte(0));
  EXPECT_EQ(0x04, lBuffer->byte(3));
}

TEST(BufferDeathTest, AllocatedBufferAssertsItsLengths) {
  EXPECT_EXIT(makeBuffer(0, 64), ::testing::ExitedWithCode(1),
              "QNCAllocatedBuffer \\(common/include/AllocatedBuffer.h:[0-9]+\\) Assertion \\[ acUseLength != "
              "0 \\] failed");
  EXPECT_EXIT(makeBuffer(65, 64), ::testing::ExitedWithCode(1),
              "Assertion \\[ acMaxLength == 0 \\|\\| acUseLength <= acMaxLength \\] failed");
  // The limit itself is valid.
  EXPECT_EQ(64u, makeBuffer(64, 64)->getLength());
}

}  // namespace
