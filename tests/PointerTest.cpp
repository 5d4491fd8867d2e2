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

struct QNSDerivedTracked : QNSTracked {
  explicit QNSDerivedTracked(bool* apDerivedGone) : QNSTracked(7), mpDerivedGone(apDerivedGone) {}
  ~QNSDerivedTracked() override { *mpDerivedGone = true; }
  bool* mpDerivedGone;
};

// Storage that must be given back with free(): its class-level delete operators only count, so
// a release through delete or delete[] shows up as a count instead of a crash.
struct QNSMallocProbe {
  static int sDeleteCalls;
  static void operator delete(void* apMemory) {
    ++sDeleteCalls;
    free(apMemory);
  }
  static void operator delete[](void* apMemory) {
    ++sDeleteCalls;
    free(apMemory);
  }
  int mValue;
};
int QNSMallocProbe::sDeleteCalls = 0;

// An array element whose class counts the array deletions, to tell delete[] from delete.
struct QNSArrayProbe {
  static int sArrayDeletes;
  static std::vector<int> sDestroyed;
  static void* operator new[](size_t aSize) { return ::operator new[](aSize); }
  static void operator delete[](void* apMemory) {
    ++sArrayDeletes;
    ::operator delete[](apMemory);
  }
  ~QNSArrayProbe() { sDestroyed.push_back(mId); }
  int mId = 0;
};
int QNSArrayProbe::sArrayDeletes = 0;
std::vector<int> QNSArrayProbe::sDestroyed;

class PointerTest : public ::testing::Test {
 protected:
  void SetUp() override {
    QNSTracked::sDestroyed.clear();
    QNSTracked::sOnDestroy = nullptr;
    QNSMallocProbe::sDeleteCalls = 0;
    QNSArrayProbe::sArrayDeletes = 0;
    QNSArrayProbe::sDestroyed.clear();
  }
  void TearDown() override { QNSTracked::sOnDestroy = nullptr; }

  static QNCPointer<QNSTracked> make(int aId) {
    return QNCPointer<QNSTracked>(new (std::nothrow) QNSTracked(aId), QNPST_Individual, QNPAT_New);
  }
};

TEST_F(PointerTest, NullObjectThrowsOutOfMemoryCodeTwo) {
  try {
    QNCPointer<QNSTracked> lPointer(static_cast<QNSTracked*>(nullptr), QNPST_Individual, QNPAT_New);
    FAIL() << "a null object was accepted";
  } catch (const QNCHaltEx& acrException) {
    // Caught as the halt category on purpose: out of memory is a reason to stop.
    EXPECT_STREQ("Out of Memory", acrException.what());
    EXPECT_EQ(2u, acrException.getCode());
    EXPECT_NE(nullptr, dynamic_cast<const QNCNoMemoryEx*>(&acrException));
  }
  EXPECT_TRUE(QNSTracked::sDestroyed.empty());
}

TEST_F(PointerTest, LastOfThreeCopiesDestroysTheObjectOnce) {
  auto* lpFirst = new QNCPointer<QNSTracked>(make(1));
  auto* lpSecond = new QNCPointer<QNSTracked>(*lpFirst);
  QNCPointer<QNSTracked> lThird;
  lThird = *lpSecond;
  EXPECT_EQ(lpFirst->get(), lThird.get());

  delete lpFirst;
  delete lpSecond;
  EXPECT_TRUE(QNSTracked::sDestroyed.empty()) << "destroyed while a copy still held it";
  EXPECT_EQ(1, lThird->mId);

  lThird.reset();
  EXPECT_EQ(std::vector<int>{1}, QNSTracked::sDestroyed);
}

TEST_F(PointerTest, SelfAssignmentKeepsTheObjectAndItsCount) {
  {
    QNCPointer<QNSTracked> lOnly = make(1);
    QNCPointer<QNSTracked>& lrAlias = lOnly;
    // With one reference, a release before the new reference is taken would destroy the object.
    lOnly = lrAlias;
    EXPECT_TRUE(QNSTracked::sDestroyed.empty());
    EXPECT_EQ(1, lOnly->mId);
    lOnly = lrAlias;
  }
  // A counter that self-assignment had raised would keep the object alive here.
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
  EXPECT_EQ(2, lA->mId);
  lB.reset();
  EXPECT_EQ(std::vector<int>{1}, QNSTracked::sDestroyed) << "B's object died while A still held it";
  lA.reset();
  EXPECT_EQ((std::vector<int>{1, 2}), QNSTracked::sDestroyed);
}

TEST_F(PointerTest, AssignmentBetweenCopiesOfOneObjectKeepsIt) {
  QNCPointer<QNSTracked> lA = make(1);
  QNCPointer<QNSTracked> lB(lA);
  lA = lB;
  lB.reset();
  EXPECT_TRUE(QNSTracked::sDestroyed.empty());
  lA.reset();
  EXPECT_EQ(std::vector<int>{1}, QNSTracked::sDestroyed);
}

// A node of a singly linked chain, the shape in which a pointer is assigned from a member of the
// very object it is about to release.
struct QNSNode {
  explicit QNSNode(int aId) : mTracked(aId) {}
  QNSTracked mTracked;
  QNCPointer<QNSNode> mNext;
};

// Regression: "lHead = lHead->mNext" and its move form read the source after releasing the old
// head, and the old head owned the source, so the fields came from freed memory.
TEST_F(PointerTest, AssigningFromAMemberOfTheReleasedObject) {
  auto makeChain = [] {
    QNCPointer<QNSNode> lHead(new (std::nothrow) QNSNode(1), QNPST_Individual, QNPAT_New);
    lHead->mNext = QNCPointer<QNSNode>(new (std::nothrow) QNSNode(2), QNPST_Individual, QNPAT_New);
    lHead->mNext->mNext = QNCPointer<QNSNode>(new (std::nothrow) QNSNode(3), QNPST_Individual, QNPAT_New);
    return lHead;
  };
  {
    QNCPointer<QNSNode> lHead = makeChain();
    lHead = lHead->mNext;
    EXPECT_EQ(std::vector<int>{1}, QNSTracked::sDestroyed);
    ASSERT_FALSE(lHead.isNull());
    EXPECT_EQ(2, lHead->mTracked.mId);
    lHead = std::move(lHead->mNext);
    EXPECT_EQ((std::vector<int>{1, 2}), QNSTracked::sDestroyed);
    ASSERT_FALSE(lHead.isNull());
    EXPECT_EQ(3, lHead->mTracked.mId);
  }
  EXPECT_EQ((std::vector<int>{1, 2, 3}), QNSTracked::sDestroyed);
}

TEST_F(PointerTest, ArrayRunsEveryDestructorLastFirstThroughArrayDelete) {
  QNSArrayProbe* lpArray = new QNSArrayProbe[3];
  for (int lIndex = 0; lIndex < 3; ++lIndex) lpArray[lIndex].mId = lIndex + 1;
  {
    QNCPointer<QNSArrayProbe> lFirst(lpArray, QNPST_Array, QNPAT_New);
    QNCPointer<QNSArrayProbe> lCopy(lFirst);
    EXPECT_EQ(1, (*lCopy).mId) << "operator* gives the first element";
    lFirst.reset();
    EXPECT_TRUE(QNSArrayProbe::sDestroyed.empty());
  }
  EXPECT_EQ((std::vector<int>{3, 2, 1}), QNSArrayProbe::sDestroyed);
  EXPECT_EQ(1, QNSArrayProbe::sArrayDeletes);
}

TEST_F(PointerTest, MallocStorageIsReleasedWithFree) {
  auto* lpStorage = static_cast<QNSMallocProbe*>(malloc(sizeof(QNSMallocProbe)));
  ASSERT_NE(nullptr, lpStorage);
  lpStorage->mValue = 5;
  {
    QNCPointer<QNSMallocProbe> lPointer(lpStorage, QNPST_Individual, QNPAT_Malloc);
    QNCPointer<QNSMallocProbe> lCopy(lPointer);
    EXPECT_EQ(5, lCopy->mValue);
  }
  // The storage is gone (the leak checker of the sanitizer build sees a missing free) and no
  // delete operator was involved.
  EXPECT_EQ(0, QNSMallocProbe::sDeleteCalls);
}

TEST_F(PointerTest, BasePointerDestroysTheDerivedObject) {
  bool lDerivedGone = false;
  {
    QNCPointer<QNSTracked> lBase(new (std::nothrow) QNSDerivedTracked(&lDerivedGone), QNPST_Individual, QNPAT_New);
    EXPECT_EQ(7, lBase->mId);
  }
  EXPECT_TRUE(lDerivedGone);
  EXPECT_EQ(std::vector<int>{7}, QNSTracked::sDestroyed);
}

TEST_F(PointerTest, BaseCopyOfDerivedPointerSharesTheCounter) {
  bool lDerivedGone = false;
  auto* lpDerived = new QNCPointer<QNSDerivedTracked>(new (std::nothrow) QNSDerivedTracked(&lDerivedGone),
                                                      QNPST_Individual, QNPAT_New);
  QNCPointer<QNSTracked> lBase(*lpDerived);
  delete lpDerived;
  EXPECT_FALSE(lDerivedGone);
  lBase.reset();
  EXPECT_TRUE(lDerivedGone);
  EXPECT_EQ(std::vector<int>{7}, QNSTracked::sDestroyed);
}

TEST_F(PointerTest, MoveHandsOverWithoutReleasing) {
  QNCPointer<QNSTracked> lSource = make(1);
  QNCPointer<QNSTracked> lTarget(std::move(lSource));
  EXPECT_TRUE(lSource.isNull());  // NOLINT: the moved-from state is part of the contract
  EXPECT_TRUE(QNSTracked::sDestroyed.empty());

  QNCPointer<QNSTracked> lOther = make(2);
  lOther = std::move(lTarget);  // lOther held the last reference to 2
  EXPECT_EQ(std::vector<int>{2}, QNSTracked::sDestroyed);
  EXPECT_EQ(1, lOther->mId);
  lOther.reset();
  EXPECT_EQ((std::vector<int>{2, 1}), QNSTracked::sDestroyed);
}

// Copies released at the same time on many threads: a counter that is not atomic loses updates
// and destroys the object twice or never.
TEST(PointerConcurrencyTest, CopiesReleasedOnManyThreadsDestroyTheObjectOnce) {
  constexpr int kThreads = 8;
  constexpr int kCopiesPerThread = 20000;
  for (int lRound = 0; lRound < 20; ++lRound) {
    std::atomic<int> lDestroyed{0};
    struct QNSCounted {
      explicit QNSCounted(std::atomic<int>* apDestroyed) : mpDestroyed(apDestroyed) {}
      ~QNSCounted() { mpDestroyed->fetch_add(1); }
      std::atomic<int>* mpDestroyed;
      int mPayload = 0;
    };
    std::vector<QNCPointer<QNSCounted>> lCopies;
    {
      QNCPointer<QNSCounted> lOriginal(new (std::nothrow) QNSCounted(&lDestroyed), QNPST_Individual, QNPAT_New);
      for (int lIndex = 0; lIndex < kThreads; ++lIndex) lCopies.push_back(lOriginal);
    }
    std::atomic<bool> lGo{false};
    std::vector<std::thread> lThreads;
    for (int lIndex = 0; lIndex < kThreads; ++lIndex) {
      lThreads.emplace_back([&lGo, lMine = std::move(lCopies[lIndex]), lIndex]() mutable {
        while (!lGo.load()) std::this_thread::yield();
        for (int lCopy = 0; lCopy < kCopiesPerThread; ++lCopy) {
          QNCPointer<QNSCounted> lLocal(lMine);
          // One writer; whichever thread destroys the object must see this write.
          if (lIndex == 0 && lCopy == 0) lLocal->mPayload = 1;
        }
        lMine.reset();
      });
    }
    lGo.store(true);
    for (auto& lThread : lThreads) lThread.join();
    ASSERT_EQ(1, lDestroyed.load()) << "round " << lRound;
  }
}

TEST(PointerDeathTest, CopyingAnEmptyPointerIsAnAssertion) {
  EXPECT_EXIT(
      {
        QNCPointer<int> lEmpty;
        QNCPointer<int> lCopy(lEmpty);
      },
      ::testing::ExitedWithCode(1), qntest::assertionFailure("0 != acrCopy.mPointer"));
}

TEST(PointerDeathTest, AssigningFromAnEmptyPointerIsAnAssertion) {
  EXPECT_EXIT(
      {
        QNCPointer<int> lEmpty;
        QNCPointer<int> lTarget(new (std::nothrow) int(3), QNPST_Individual, QNPAT_New);
        lTarget = lEmpty;
      },
      ::testing::ExitedWithCode(1), qntest::assertionFailure("0 != acrCopy.mPointer"));
}

TEST(PointerDeathTest, ArrowOnAnArrayPointerIsAnAssertion) {
  EXPECT_EXIT(
      {
        QNCPointer<QNSArrayProbe> lArray(new QNSArrayProbe[2], QNPST_Array, QNPAT_New);
        (void)lArray->mId;
      },
      ::testing::ExitedWithCode(1), qntest::assertionFailure("QNPST_Individual == mSizeType"));
}

TEST(PointerDeathTest, DereferencingAnEmptyPointerIsAnAssertion) {
  EXPECT_EXIT(
      {
        QNCPointer<QNSArrayProbe> lEmpty;
        (void)lEmpty->mId;
      },
      ::testing::ExitedWithCode(1), qntest::assertionFailure("0 != mPointer"));
  EXPECT_EXIT(
      {
        QNCPointer<int> lEmpty;
        (void)*lEmpty;
      },
      ::testing::ExitedWithCode(1), qntest::assertionFailure("0 != mPointer"));
}

}  // namespace
