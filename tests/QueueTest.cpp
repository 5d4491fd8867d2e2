#include <gtest/gtest.h>

#include <new>

#include "Pointer.h"
#include "QNException.h"
#include "QNQueue.h"
#include "QNString.h"

namespace {

struct Tracked {
  explicit Tracked(bool& arDestroyed) : mDestroyed(arDestroyed) {}
  ~Tracked() { mDestroyed = true; }
  bool& mDestroyed;
};

// A recycled node must not keep the element it once held alive.
TEST(QueueTest, DequeuedElementIsReleasedWithItsLastOutsideReference) {
  QNCQueue<QNCPointer<Tracked>> lQueue;
  bool lDestroyed = false;
  lQueue.enqueue(QNCPointer<Tracked>(new (std::nothrow) Tracked(lDestroyed), QNPST_Individual, QNPAT_New));
  lQueue.dequeue();
  EXPECT_TRUE(lDestroyed);
  EXPECT_TRUE(lQueue.isEmpty());
}

TEST(QueueTest, OrderSurvivesNodeRecycling) {
  QNCQueue<QNCPointer<int>> lQueue;
  auto lMake = [](int aValue) { return QNCPointer<int>(new (std::nothrow) int(aValue), QNPST_Individual, QNPAT_New); };
  lQueue.enqueue(lMake(1));
  lQueue.enqueue(lMake(2));
  lQueue.enqueue(lMake(3));
  EXPECT_EQ(1, *lQueue.dequeue());
  EXPECT_EQ(2, *lQueue.dequeue());
  lQueue.enqueue(lMake(4));  // fills a recycled node
  lQueue.enqueue(lMake(5));
  lQueue.enqueue(lMake(6));  // needs a fresh one
  EXPECT_EQ(4u, lQueue.numberOfElements());
  EXPECT_EQ(3, *lQueue.dequeue());
  EXPECT_EQ(4, *lQueue.dequeue());
  EXPECT_EQ(5, *lQueue.dequeue());
  EXPECT_EQ(6, *lQueue.dequeue());
}

TEST(QueueTest, DequeueOnEmptyThrowsAndLeavesTheQueueUsable) {
  QNCQueue<QNCPointer<int>> lRecycling;
  QNCQueue<QNCString> lPlain;  // a type whose default construction may throw: no recycling
  for (int lRound = 0; lRound < 2; ++lRound) {
    try {
      lRecycling.dequeue();
      FAIL() << "dequeue on an empty queue returned";
    } catch (const QNCNotFoundEx& acrException) {
      EXPECT_STREQ("Not Found", acrException.what());
      EXPECT_EQ(8u, acrException.getCode());
    }
    EXPECT_THROW(lPlain.dequeue(), QNCNotFoundEx);
    lRecycling.enqueue(QNCPointer<int>(new (std::nothrow) int(7), QNPST_Individual, QNPAT_New));
    lPlain.enqueue(QNCString("seven"));
    EXPECT_EQ(7, *lRecycling.dequeue());
    EXPECT_EQ(QNCString("seven"), lPlain.dequeue());
  }
}

}  // namespace
