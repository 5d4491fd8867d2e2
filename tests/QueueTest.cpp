#include <gtest/gtest.h>

#include <memory>
#include <string>

#include "QNException.h"
#include "QNQueue.h"
#include "QNString.h"
#include "TestSupport.h"

namespace {

// A recyclable element (nothrow default construction and moves) whose moves copy, so a moved-from
// element still holds its reference: only a node emptied after the dequeue lets the reference go.
// (A QNCPointer would not do: moving it out already empties the node.)
struct QNSSticky {
  QNSSticky() noexcept = default;
  explicit QNSSticky(const std::shared_ptr<int>& acrValue) noexcept : mValue(acrValue) {}
  QNSSticky(const QNSSticky&) = default;
  QNSSticky(QNSSticky&& arOther) noexcept : mValue(arOther.mValue) {}
  QNSSticky& operator=(const QNSSticky&) = default;
  QNSSticky& operator=(QNSSticky&& arOther) noexcept {
    mValue = arOther.mValue;
    return *this;
  }
  std::shared_ptr<int> mValue;
};

// A recycled node must not keep the element it once held alive.
TEST(QueueTest, DequeuedElementIsReleasedWithItsLastOutsideReference) {
  QNCQueue<QNSSticky> lQueue;
  const auto lValue = std::make_shared<int>(1);
  lQueue.enqueue(QNSSticky(lValue));
  (void)lQueue.dequeue();
  EXPECT_EQ(1, lValue.use_count()) << "the recycled node still holds the element";
}

// int is recycled through spare nodes (nothrow default construction and moves), QNCString is not:
// either way the order holds across recycled and fresh nodes, and a dequeue on an empty queue
// is "Not Found" (8) and leaves the queue usable.
template <class T, class Make>
void expectFirstInFirstOut(const Make& acrMake) {
  QNCQueue<T> lQueue;
  const std::string kNotFound = "Not Found (code 8)";
  EXPECT_EQ(kNotFound, qntest::thrown<QNCNotFoundEx>([&] { (void)lQueue.dequeue(); }, true));
  for (int lValue = 1; lValue <= 3; ++lValue) lQueue.enqueue(acrMake(lValue));
  EXPECT_EQ(acrMake(1), lQueue.dequeue());
  EXPECT_EQ(acrMake(2), lQueue.dequeue());
  for (int lValue = 4; lValue <= 6; ++lValue) lQueue.enqueue(acrMake(lValue));  // 6 needs a fresh node
  EXPECT_EQ(4u, lQueue.numberOfElements());
  for (int lValue = 3; lValue <= 6; ++lValue) EXPECT_EQ(acrMake(lValue), lQueue.dequeue());
  EXPECT_EQ(kNotFound, qntest::thrown<QNCNotFoundEx>([&] { (void)lQueue.dequeue(); }, true));
  lQueue.enqueue(acrMake(7));
  EXPECT_EQ(acrMake(7), lQueue.dequeue());
  EXPECT_TRUE(lQueue.isEmpty());
}

TEST(QueueTest, FirstInFirstOutAcrossRecycledNodesAndEmptyDequeues) {
  expectFirstInFirstOut<int>([](int aValue) { return aValue; });
  expectFirstInFirstOut<QNCString>([](int aValue) { return QNCString(std::to_string(aValue).c_str()); });
}

}  // namespace
