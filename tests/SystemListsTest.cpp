// The system object's numbered synchronised lists, used from one thread: element order, empty
// lists, walks with listErase, and the lifetime of the objects that pass through.

#include <gtest/gtest.h>

#include <atomic>
#include <functional>
#include <vector>

#include "Logger.h"
#include "TableSystem.h"
#include "TestSupport.h"

namespace {

using qntest::idOf;
using qntest::makeItem;

class SystemListsTest : public ::testing::Test {
 protected:
  qntest::TableSystem mSystem{1, 0, 2};
};

std::vector<int> walk(const QNCSystem& acrSystem, unsigned int aList) {
  std::vector<int> lIds;
  for (auto lIt = acrSystem.listBegin(aList); lIt != acrSystem.listEnd(aList); ++lIt)
    lIds.push_back(idOf(*lIt));
  return lIds;
}

TEST_F(SystemListsTest, EnlistFrontAndDelistBackWorkAtTheOtherEnd) {
  mSystem.enlist(0, makeItem(1));
  mSystem.enlist(0, makeItem(2));
  mSystem.enlistFront(0, makeItem(3));
  mSystem.enlist(1, makeItem(4));  // lists with different numbers are independent
  EXPECT_EQ((std::vector<int>{3, 1, 2}), walk(mSystem, 0));
  EXPECT_EQ(3, idOf(mSystem.listFront(0)));
  EXPECT_EQ(3u, mSystem.listSize(0));  // listFront copies, it does not remove
  EXPECT_EQ(2, idOf(mSystem.delistBack(0)));
  EXPECT_EQ(3, idOf(mSystem.delist(0)));
  EXPECT_EQ(1, idOf(mSystem.delistBack(0)));
  EXPECT_TRUE(mSystem.isListEmpty(0));
  EXPECT_EQ((std::vector<int>{4}), walk(mSystem, 1));
}

// Each removal on an empty list must release the list's lock on its way out: the enlist that
// follows would otherwise block for ever.
TEST_F(SystemListsTest, RemovingFromEmptyListThrowsNotFoundAndLeavesItUsable) {
  const std::vector<std::function<void()>> lRemovals = {
      [&] { mSystem.delist(0); }, [&] { mSystem.delistBack(0); }, [&] { mSystem.listFront(0); }};
  for (int lRound = 0; lRound < static_cast<int>(lRemovals.size()); ++lRound) {
    EXPECT_EQ("Not Found (code 8)", qntest::thrown<QNCNotFoundEx>(lRemovals[lRound], true)) << lRound;
    ASSERT_TRUE(
        qntest::returnsWithin([&] { mSystem.enlist(0, makeItem(lRound)); }, std::chrono::seconds(10)));
    EXPECT_EQ(lRound, idOf(mSystem.delist(0)));
  }
}

// listErase moves the iterator to the next element, and to the end after the last one.
TEST_F(SystemListsTest, WalkThatErasesEveryOtherElementKeepsTheRestInOrder) {
  for (int lId = 0; lId < 7; ++lId) mSystem.enlist(0, makeItem(lId));
  for (auto lIt = mSystem.listBegin(0); lIt != mSystem.listEnd(0);) {
    if (idOf(*lIt) % 2 == 0) {
      mSystem.listErase(0, lIt);
    } else {
      ++lIt;
    }
  }
  EXPECT_EQ((std::vector<int>{1, 3, 5}), walk(mSystem, 0));
  EXPECT_EQ(3u, mSystem.listSize(0));
}

TEST_F(SystemListsTest, EveryWayOutReleasesTheListsReferenceExactlyOnce) {
  std::atomic<int> lDestroyed{0};
  for (int lId = 0; lId < 6; ++lId) mSystem.enlist(0, makeItem(lId, &lDestroyed));
  QNCPointer<QNCQueueable> lTaken = mSystem.delist(0);
  mSystem.delistBack(0);
  auto lIt = mSystem.listBegin(0);
  mSystem.listErase(0, lIt);
  EXPECT_EQ(2, lDestroyed.load());  // the delisted object lives while it is held
  mSystem.listClear(0);
  EXPECT_TRUE(mSystem.isListEmpty(0));
  EXPECT_EQ(5, lDestroyed.load());
  EXPECT_EQ(0, idOf(lTaken));
  QNCPointer<QNCQueueable> lShared = lTaken;
  lTaken.reset();
  EXPECT_EQ(5, lDestroyed.load());
  lShared.reset();
  EXPECT_EQ(6, lDestroyed.load());
}

// An element whose destructor uses the list it leaves: removing it must not hold the list's
// lock while the element is destroyed, or the destructor would deadlock on it.
class Reenlisting : public QNCQueueable {
 public:
  Reenlisting(QNCSystem& arSystem, std::atomic<int>& arDestroyed)
      : mSystem(arSystem), mDestroyed(arDestroyed) {}
  ~Reenlisting() override {
    mDestroyed.fetch_add(1);
    mSystem.enlist(0, makeItem(99));
  }

 private:
  QNCSystem& mSystem;
  std::atomic<int>& mDestroyed;
};

TEST_F(SystemListsTest, ElementsAreDestroyedOutsideTheListLock) {
  std::atomic<int> lDestroyed{0};
  auto lReenlisting = [&] {
    return QNCPointer<QNCQueueable>(new (std::nothrow) Reenlisting(mSystem, lDestroyed));
  };
  const bool lReturned = qntest::returnsWithin(
      [&] {
        mSystem.enlist(0, lReenlisting());
        mSystem.listClear(0);  // leaves the element added by the destructor
        mSystem.delist(0);
        mSystem.enlist(0, lReenlisting());
        auto lIt = mSystem.listBegin(0);
        mSystem.listErase(0, lIt);
      },
      std::chrono::seconds(10));
  ASSERT_TRUE(lReturned);
  EXPECT_EQ(2, lDestroyed.load());
  EXPECT_EQ((std::vector<int>{99}), walk(mSystem, 0));
}

TEST(SynchListTest, DestructionReleasesTheElementsItHolds) {
  std::atomic<int> lDestroyed{0};
  QNCPointer<QNCQueueable> lKept = makeItem(1, &lDestroyed);
  {
    QNCSynchList lList;
    lList.enlist(lKept);
    lList.enlist(makeItem(2, &lDestroyed));
  }
  EXPECT_EQ(1, lDestroyed.load());
  EXPECT_EQ(1, idOf(lKept));
}

}  // namespace
