// The system object's numbered synchronised queues, used from one thread.

#include <gtest/gtest.h>

#include <atomic>
#include <functional>
#include <vector>

#include "TableSystem.h"
#include "TestSupport.h"

namespace {

using qntest::idOf;
using qntest::makeItem;

class SystemQueuesTest : public ::testing::Test {
 protected:
  qntest::TableSystem mSystem{1, 2, 0};
};

TEST_F(SystemQueuesTest, ElementsLeaveTheirOwnQueueInTheOrderTheyCame) {
  for (int lId = 1; lId <= 3; ++lId) mSystem.enqueue(0, makeItem(lId));
  mSystem.enqueue(1, makeItem(5));
  EXPECT_EQ(1, idOf(mSystem.queueFront(0)));
  EXPECT_EQ(1, idOf(mSystem.dequeue(0)));  // queueFront left the head in place
  EXPECT_EQ(2, idOf(mSystem.dequeue(0)));
  mSystem.enqueue(0, makeItem(4));
  EXPECT_EQ(3, idOf(mSystem.dequeue(0)));
  EXPECT_EQ(4, idOf(mSystem.dequeue(0)));
  EXPECT_TRUE(mSystem.isQueueEmpty(0));
  EXPECT_EQ(5, idOf(mSystem.dequeue(1)));
}

TEST_F(SystemQueuesTest, TakingFromAnEmptyQueueThrowsNotFoundAndLeavesItUsable) {
  const std::vector<std::function<void()>> lTakes = {[&] { mSystem.dequeue(0); },
                                                     [&] { mSystem.queueFront(0); }};
  for (int lRound = 0; lRound < static_cast<int>(lTakes.size()); ++lRound) {
    EXPECT_EQ("Not Found (code 8)", qntest::thrown<QNCNotFoundEx>(lTakes[lRound], true)) << lRound;
    ASSERT_TRUE(
        qntest::returnsWithin([&] { mSystem.enqueue(0, makeItem(lRound)); }, std::chrono::seconds(10)));
    EXPECT_EQ(lRound, idOf(mSystem.dequeue(0)));
  }
}

TEST_F(SystemQueuesTest, DequeueHandsOverAndClearReleasesEachReferenceOnce) {
  std::atomic<int> lDestroyed{0};
  const QNCPointer<QNCQueueable> lKept = makeItem(3, &lDestroyed);
  mSystem.enqueue(0, makeItem(1, &lDestroyed));
  mSystem.enqueue(0, makeItem(2, &lDestroyed));
  mSystem.enqueue(0, lKept);
  QNCPointer<QNCQueueable> lTaken = mSystem.dequeue(0);
  mSystem.queueClear(0);
  EXPECT_TRUE(mSystem.isQueueEmpty(0));
  EXPECT_EQ(1, lDestroyed.load());  // the two still held by this test survive
  EXPECT_EQ(1, idOf(lTaken));
  EXPECT_EQ(3, idOf(lKept));
  lTaken.reset();
  EXPECT_EQ(2, lDestroyed.load());
}

// An element whose destructor uses the queue it leaves: the queue must not hold its lock while
// the element is destroyed.
class Requeueing : public QNCQueueable {
 public:
  explicit Requeueing(QNCSystem& arSystem) : mSystem(arSystem) {}
  ~Requeueing() override { mSystem.enqueue(0, makeItem(99)); }

 private:
  QNCSystem& mSystem;
};

TEST_F(SystemQueuesTest, ElementsAreDestroyedOutsideTheQueueLock) {
  const bool lReturned = qntest::returnsWithin(
      [&] {
        mSystem.enqueue(0, QNCPointer<QNCQueueable>(new (std::nothrow) Requeueing(mSystem)));
        mSystem.enqueue(0, makeItem(1));
        mSystem.queueClear(0);
      },
      std::chrono::seconds(10));
  ASSERT_TRUE(lReturned);
  EXPECT_EQ(99, idOf(mSystem.dequeue(0)));
  EXPECT_TRUE(mSystem.isQueueEmpty(0));
}

}  // namespace
