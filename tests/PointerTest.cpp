#include <gtest/gtest.h>

#include <atomic>
#include <cstdlib>
#include <functional>
#include <new>
#include <thread>
#include <vector>

#include "DeathTestSupport.h"
#include "Pointer.h"
#include "QNException.h"
#include "TestSupport.h"

namespace {

// An object that records its destruction; an optional hook runs inside the destructor, so a
// test can look at the world at the moment the object dies.
struct QNSTracked {
  static std::vector<int> sDestroyed;
  static std::function<void(int)> sOnDestroy;

  explicit QNSTracked(int aId = 0) : mId(aId) {}
  virtual ~QNSTracked() {
    sDestroyed.push_back(mId);
    if (sOnDestroy) sOnDestroy(mId);
  }
  int mId;
};
std::vector<int> QNSTracked::sDestroyed;
std::function<void(int)> QNSTracked::sOnDestroy;

// Its destructor records the negated id before the base part records the id itself.
struct QNSDerivedTracked : QNSTracked {
  QNSDerivedTracked() : QNSTracked(7) {}
  ~QNSDerivedTracked() override { sDestroyed.push_back(-mId); }
};

class PointerTest : public ::testing::Test {
 protected:
  void SetUp() override {
    QNSTracked::sDestroyed.clear();
    QNSTracked::sOnDestroy = nullptr;
  }

  static QNCPointer<QNSTracked> make(int aId) {
    return QNCPointer<QNSTracked>(new (std::nothrow) QNSTracked(aId), QNPST_Individual, QNPAT_New);
  }
};

TEST_F(PointerTest, NullObjectThrowsOutOfMemoryCodeTwo) {
  EXPECT_EQ("Out of Memory (code 2)",
            qntest::thrown<QNCNoMemoryEx>(
                [] { QNCPointer<QNSTracked> lPointer(static_cast<QNSTracked*>(nullptr)); }, true));
}

// Copies and assignments share one object and only the last reference destroys it. Assigning a
// pointer to itself while it holds the only reference must neither destroy the object (a release
// before the new reference is taken would) nor raise its counter (the object would then outlive
// its last pointer).
TEST_F(PointerTest, OnlyTheLastReferenceDestroysTheObjectEvenAfterSelfAssignment) {
  {
    auto* lpFirst = new QNCPointer<QNSTracked>(make(1));
    QNCPointer<QNSTracked> lSecond(*lpFirst);
    QNCPointer<QNSTracked> lThird;
    lThird = lSecond;
    lThird = lSecond;  // already shares it: the count must stay right
    delete lpFirst;
    lSecond.reset();
    QNCPointer<QNSTracked>& lrAlias = lThird;
    lThird = lrAlias;
    EXPECT_TRUE(QNSTracked::sDestroyed.empty()) << "destroyed while a copy still held it";
    EXPECT_EQ(1, lThird->mId);
  }
  EXPECT_EQ(std::vector<int>{1}, QNSTracked::sDestroyed);
}

TEST_F(PointerTest, AssignmentDestroysTheOldObjectBeforeTakingTheNewOne) {
  QNCPointer<QNSTracked> lA = make(1);
  QNCPointer<QNSTracked> lB = make(2);
  QNSTracked* lpSeenInA = nullptr;
  QNSTracked::sOnDestroy = [&](int aId) {
    if (aId == 1) lpSeenInA = lA.get();
  };

  lA = lB;

  ASSERT_EQ(std::vector<int>{1}, QNSTracked::sDestroyed);
  EXPECT_NE(lB.get(), lpSeenInA) << "A already held B's object while X was being destroyed";
  lB.reset();
  EXPECT_EQ(std::vector<int>{1}, QNSTracked::sDestroyed) << "B's object died while A still held it";
  EXPECT_EQ(2, lA->mId);
}

// A node of a singly linked chain, the shape in which a pointer is assigned from a member of the
// very object it is about to release.
struct QNSNode {
  explicit QNSNode(int aId) : mTracked(aId) {}
  QNSTracked mTracked;
  QNCPointer<QNSNode> mNext;
};

// Regression: "lHead = lHead->mNext" and its move form read the source after releasing the old
// head, and the old head owned the source, so the fields came from freed memory. The move form
// must also leave its source empty: the released node would otherwise release node 3 as well.
TEST_F(PointerTest, AssigningFromAMemberOfTheReleasedObject) {
  {
    QNCPointer<QNSNode> lHead(new (std::nothrow) QNSNode(1), QNPST_Individual, QNPAT_New);
    lHead->mNext = QNCPointer<QNSNode>(new (std::nothrow) QNSNode(2), QNPST_Individual, QNPAT_New);
    lHead->mNext->mNext = QNCPointer<QNSNode>(new (std::nothrow) QNSNode(3), QNPST_Individual, QNPAT_New);
    lHead = lHead->mNext;
    EXPECT_EQ(std::vector<int>{1}, QNSTracked::sDestroyed);
    EXPECT_EQ(2, lHead->mTracked.mId);
    lHead = std::move(lHead->mNext);
    EXPECT_EQ((std::vector<int>{1, 2}), QNSTracked::sDestroyed);
    EXPECT_EQ(3, lHead->mTracked.mId);
  }
  EXPECT_EQ((std::vector<int>{1, 2, 3}), QNSTracked::sDestroyed);
}

// delete instead of delete[] would run one destructor, not all three last first.
TEST_F(PointerTest, ArrayRunsEveryDestructorLastFirst) {
  QNSTracked* lpArray = new QNSTracked[3];
  for (int lIndex = 0; lIndex < 3; ++lIndex) lpArray[lIndex].mId = lIndex + 1;
  {
    QNCPointer<QNSTracked> lFirst(lpArray, QNPST_Array, QNPAT_New);
    QNCPointer<QNSTracked> lCopy(lFirst);
    EXPECT_EQ(1, (*lCopy).mId) << "operator* gives the first element";
    lFirst.reset();
    EXPECT_TRUE(QNSTracked::sDestroyed.empty());
  }
  EXPECT_EQ((std::vector<int>{3, 2, 1}), QNSTracked::sDestroyed);
}

// Storage from malloc() goes back with free(), which runs no destructor (delete or delete[] would);
// a storage never freed shows in the leak checker of the sanitizer builds.
TEST_F(PointerTest, MallocStorageIsReleasedWithFree) {
  void* lpStorage = malloc(sizeof(QNSTracked));
  ASSERT_NE(nullptr, lpStorage);
  {
    QNCPointer<QNSTracked> lPointer(new (lpStorage) QNSTracked(5), QNPST_Individual, QNPAT_Malloc);
    QNCPointer<QNSTracked> lCopy(lPointer);
  }
  EXPECT_TRUE(QNSTracked::sDestroyed.empty());
}

// A base pointer copied from a pointer to the derived class shares its counter, and the last one
// destroys the whole derived object.
TEST_F(PointerTest, BasePointerDestroysTheDerivedObject) {
  auto* lpDerived =
      new QNCPointer<QNSDerivedTracked>(new (std::nothrow) QNSDerivedTracked, QNPST_Individual, QNPAT_New);
  QNCPointer<QNSTracked> lBase(*lpDerived);
  delete lpDerived;
  EXPECT_TRUE(QNSTracked::sDestroyed.empty());
  lBase.reset();
  EXPECT_EQ((std::vector<int>{-7, 7}), QNSTracked::sDestroyed);
}

// A move hands the reference over without counting: the source is empty afterwards, so the target
// is the last reference. A move that copied would keep the object alive after the target's reset.
TEST_F(PointerTest, MoveHandsOverTheReferenceAndEmptiesTheSource) {
  QNCPointer<QNSTracked> lSource = make(1);
  QNCPointer<QNSTracked> lTarget(std::move(lSource));
  EXPECT_TRUE(lSource.isNull());  // NOLINT: the moved-from state is part of the contract
  QNCPointer<QNSTracked> lOther = make(2);
  lOther = std::move(lTarget);
  EXPECT_TRUE(lTarget.isNull());  // NOLINT: as above
  lOther.reset();
  EXPECT_EQ((std::vector<int>{2, 1}), QNSTracked::sDestroyed);
}

// Copies released at the same time on many threads: a counter that is not atomic loses updates
// and destroys the object twice or never.
TEST_F(PointerTest, CopiesReleasedOnManyThreadsDestroyTheObjectOnce) {
  constexpr int kThreads = 8;
  constexpr int kCopiesPerThread = 20000;
  for (int lRound = 0; lRound < 20; ++lRound) {
    QNSTracked::sDestroyed.clear();
    std::vector<QNCPointer<QNSTracked>> lCopies;
    {
      QNCPointer<QNSTracked> lOriginal = make(0);
      for (int lIndex = 0; lIndex < kThreads; ++lIndex) lCopies.push_back(lOriginal);
    }
    std::atomic<bool> lGo{false};
    std::vector<std::thread> lThreads;
    for (int lIndex = 0; lIndex < kThreads; ++lIndex) {
      lThreads.emplace_back([&lGo, lMine = std::move(lCopies[lIndex]), lIndex]() mutable {
        while (!lGo.load()) std::this_thread::yield();
        for (int lCopy = 0; lCopy < kCopiesPerThread; ++lCopy) {
          QNCPointer<QNSTracked> lLocal(lMine);
          // One writer; whichever thread destroys the object reads this field and must see it.
          if (lIndex == 0 && lCopy == 0) lLocal->mId = 1;
        }
        lMine.reset();
      });
    }
    lGo.store(true);
    for (auto& lThread : lThreads) lThread.join();
    ASSERT_EQ(std::vector<int>{1}, QNSTracked::sDestroyed) << "round " << lRound;
  }
}

// Empty pointers for the misuse cases.
const QNCPointer<int> gsEmpty;
const QNCPointer<QNSTracked> gsEmptyTracked;

// Copying or assigning from an empty pointer, "->" on an array and dereferencing an empty pointer
// are programming errors: each must stop the process with the assertion's line and status 1
// rather than crash or go on with a null object.
TEST(PointerDeathTest, MisuseIsAnAssertion) {
  const struct {
    std::function<void()> mMisuse;
    const char* mCondition;
  } lCases[] = {
      {[] { QNCPointer<int> lCopy(gsEmpty); }, "0 != acrCopy.mPointer"},
      {[] {
         QNCPointer<int> lTarget(new (std::nothrow) int(3), QNPST_Individual, QNPAT_New);
         lTarget = gsEmpty;
       },
       "0 != acrCopy.mPointer"},
      {[] { (void)QNCPointer<QNSTracked>(new QNSTracked[2], QNPST_Array, QNPAT_New)->mId; },
       "QNPST_Individual == mSizeType"},
      {[] { (void)gsEmptyTracked->mId; }, "0 != mPointer"},
      {[] { (void)*gsEmpty; }, "0 != mPointer"},
  };
  for (const auto& lrCase : lCases) {
    EXPECT_EXIT(lrCase.mMisuse(), ::testing::ExitedWithCode(1), qntest::assertionFailure(lrCase.mCondition));
  }
}

}  // namespace
