// The value types of common/: the counted pointer, the containers, strings, exceptions and the
// numeric identifiers.

#include <gtest/gtest.h>

#include <atomic>
#include <climits>
#include <cstring>
#include <functional>
#include <memory>
#include <thread>

#include "Pointer.h"
#include "QNList.h"
#include "QNMap.h"
#include "QNQueue.h"
#include "QNString.h"
#include "QNVector.h"
#include "TestSupport.h"

namespace {

using qntest::thrown;

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

// A node of a singly linked chain: a pointer assigned from a member of the object it releases.
struct QNSNode {
  explicit QNSNode(int aId) : mTracked(aId) {}
  QNSTracked mTracked;
  QNCPointer<QNSNode> mNext;
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
  static std::vector<int>& destroyed() { return QNSTracked::sDestroyed; }
};

// Copies share one object and only the last reference destroys it. Assigning a pointer to itself
// while it holds the only reference must neither destroy the object nor raise its counter.
// Assignment releases the old object before it takes the new one; a move hands the reference
// over and empties its source.
TEST_F(PointerTest, OnlyTheLastReferenceDestroysTheObject) {
  EXPECT_EQ(
      "Out of Memory (code 2)",
      thrown<QNCNoMemoryEx>([] { QNCPointer<QNSTracked> lNull(static_cast<QNSTracked*>(nullptr)); }, true));
  {
    auto* lpFirst = new QNCPointer<QNSTracked>(make(1));
    QNCPointer<QNSTracked> lSecond(*lpFirst), lThird;
    lThird = lSecond;
    lThird = lSecond;  // already shares it: the count must stay right
    delete lpFirst;
    lSecond.reset();
    QNCPointer<QNSTracked>& lrAlias = lThird;
    lThird = lrAlias;
    EXPECT_TRUE(destroyed().empty()) << "destroyed while a copy still held it";
    QNCPointer<QNSTracked> lOther = make(2);
    QNSTracked* lpSeenInOther = nullptr;
    QNSTracked::sOnDestroy = [&](int aId) {
      if (aId == 2) lpSeenInOther = lOther.get();
    };
    lOther = lThird;
    EXPECT_EQ(std::vector<int>{2}, destroyed());
    EXPECT_NE(lThird.get(), lpSeenInOther) << "the new object was taken before the old one was destroyed";
    QNCPointer<QNSTracked> lMoved(std::move(lOther));
    EXPECT_TRUE(lOther.isNull());  // NOLINT: the moved-from state is part of the contract
    lThird = std::move(lMoved);
    EXPECT_TRUE(lMoved.isNull());  // NOLINT: as above
  }
  EXPECT_EQ((std::vector<int>{2, 1}), destroyed());
}

// Regression: "lHead = lHead->mNext" and its move form read the source after releasing the old
// head, and the old head owned the source, so the fields came from freed memory.
TEST_F(PointerTest, AssigningFromAMemberOfTheReleasedObject) {
  {
    QNCPointer<QNSNode> lHead(new (std::nothrow) QNSNode(1), QNPST_Individual, QNPAT_New);
    lHead->mNext = QNCPointer<QNSNode>(new (std::nothrow) QNSNode(2), QNPST_Individual, QNPAT_New);
    lHead->mNext->mNext = QNCPointer<QNSNode>(new (std::nothrow) QNSNode(3), QNPST_Individual, QNPAT_New);
    lHead = lHead->mNext;
    EXPECT_EQ(2, lHead->mTracked.mId);
    lHead = std::move(lHead->mNext);
    EXPECT_EQ((std::vector<int>{1, 2}), destroyed());
    EXPECT_EQ(3, lHead->mTracked.mId);
  }
  EXPECT_EQ((std::vector<int>{1, 2, 3}), destroyed());
}

// An array runs every destructor, last first (delete instead of delete[] would run one); a base
// pointer copied from a derived one shares its counter and destroys the whole object.
TEST_F(PointerTest, ArraysAndDerivedObjectsAreDestroyedWhole) {
  QNSTracked* lpArray = new QNSTracked[3];
  for (int lIndex = 0; lIndex < 3; ++lIndex) lpArray[lIndex].mId = lIndex + 1;
  QNCPointer<QNSTracked>(lpArray, QNPST_Array, QNPAT_New).reset();
  EXPECT_EQ((std::vector<int>{3, 2, 1}), destroyed());
  destroyed().clear();
  auto* lpDerived =
      new QNCPointer<QNSDerivedTracked>(new (std::nothrow) QNSDerivedTracked, QNPST_Individual, QNPAT_New);
  QNCPointer<QNSTracked> lBase(*lpDerived);
  delete lpDerived;
  EXPECT_TRUE(destroyed().empty());
  lBase.reset();
  EXPECT_EQ((std::vector<int>{-7, 7}), destroyed());
}

// Copies released at the same time on many threads: a counter that is not atomic loses updates
// and destroys the object twice or never.
TEST_F(PointerTest, CopiesReleasedOnManyThreadsDestroyTheObjectOnce) {
  for (int lRound = 0; lRound < 20; ++lRound) {
    destroyed().clear();
    std::vector<QNCPointer<QNSTracked>> lCopies(8, make(0));
    std::atomic<bool> lGo{false};
    std::vector<std::thread> lThreads;
    for (int lIndex = 0; lIndex < 8; ++lIndex) {
      lThreads.emplace_back([&lGo, lMine = std::move(lCopies[lIndex]), lIndex]() mutable {
        while (!lGo.load()) std::this_thread::yield();
        for (int lCopy = 0; lCopy < 20000; ++lCopy) {
          QNCPointer<QNSTracked> lLocal(lMine);
          // One writer; whichever thread destroys the object reads this field and must see it.
          if (lIndex == 0 && lCopy == 0) lLocal->mId = 1;
        }
        lMine.reset();
      });
    }
    lGo.store(true);
    for (auto& lThread : lThreads) lThread.join();
    ASSERT_EQ(std::vector<int>{1}, destroyed()) << "round " << lRound;
  }
}

// An element whose copies fail with std::bad_alloc on request, as an allocation inside a copy
// would; the containers must turn that into their own exception and stay unchanged.
struct QNSFragile {
  static bool sFailCopies;
  explicit QNSFragile(int aValue) : mValue(aValue) {}
  QNSFragile(const QNSFragile& acrOther) : mValue(acrOther.mValue) {
    if (sFailCopies) throw std::bad_alloc();
  }
  QNSFragile(QNSFragile&&) noexcept = default;
  QNSFragile& operator=(const QNSFragile& acrOther) {
    if (sFailCopies) throw std::bad_alloc();
    mValue = acrOther.mValue;
    return *this;
  }
  QNSFragile& operator=(QNSFragile&&) noexcept = default;
  int mValue;
};
bool QNSFragile::sFailCopies = false;

// The same, default-constructible as well: a queue recycles its nodes for it, and a copy into a
// recycled node must fail like a fresh allocation.
struct QNSRecyclable : QNSFragile {
  explicit QNSRecyclable(int aValue = 0) noexcept : QNSFragile(aValue) {}
};

struct QNSHuge {
  char mBytes[1ULL << 32];
};

const char* const kNoMemory = "Out of Memory (code 2)";

TEST(ContainerTest, VectorIndexAtOrBeyondTheEndAndImpossibleReservesAreRefused) {
  QNCVector<int> lVector(2);
  lVector.append(10);
  lVector.append(20);
  const QNCVector<int>& lrConst = lVector;
  for (unsigned int lIndex : {2u, UINT_MAX}) {
    EXPECT_EQ("Vector out of bounds access (code 6)",
              thrown<QNCInvalidEx>([&] { (void)lVector[lIndex]; }, true));
    EXPECT_THROW((void)lrConst[lIndex], QNCInvalidEx);
  }
  EXPECT_EQ(20, lrConst[1]);
  EXPECT_EQ("Cannot reserve space for Vector (code 6)",
            thrown<QNCInvalidEx>([] { QNCVector<QNSHuge> lHuge(UINT_MAX); }, true));
}

// Every operation that copies an element (into a fresh node or a recycled one) turns the copy's
// std::bad_alloc into QNCNoMemoryEx and leaves the container as it was.
TEST(ContainerTest, FailedCopyIsOutOfMemoryAndLeavesTheContainerUnchanged) {
  QNCVector<QNSFragile> lVector, lOtherVector;
  lVector.append(QNSFragile(1));
  QNCList<QNSFragile> lList, lOtherList;
  lList.pushBack(QNSFragile(1));
  QNCQueue<QNSFragile> lQueue;  // not default-constructible: no node recycling
  lQueue.enqueue(QNSFragile(1));
  lQueue.enqueue(QNSFragile(3));  // first in, first out: 1 comes back first
  QNCQueue<QNSRecyclable> lRecycling;
  lRecycling.enqueue(QNSRecyclable(0));
  lRecycling.enqueue(QNSRecyclable(1));
  (void)lRecycling.dequeue();   // leaves a node to recycle
  const QNSRecyclable lTwo(2);  // an lvalue: enqueue must copy it into the recycled node
  QNSFragile::sFailCopies = true;
  const std::function<void()> lCopies[] = {[&] { lVector.append(QNSFragile(2)); },
                                           [&] { lOtherVector = lVector; },
                                           [&] { lList.pushBack(QNSFragile(2)); },
                                           [&] { lList.pushFront(QNSFragile(0)); },
                                           [&] { lOtherList = lList; },
                                           [&] { (void)lQueue.dequeue(); },
                                           [&] { lQueue.enqueue(QNSFragile(2)); },
                                           [&] { lRecycling.enqueue(lTwo); }};
  for (const auto& lrCopy : lCopies) EXPECT_EQ(kNoMemory, thrown<QNCNoMemoryEx>(lrCopy, true));
  QNSFragile::sFailCopies = false;
  ASSERT_EQ(1u, lVector.numberOfElements());
  EXPECT_EQ(1, lVector[0].mValue);
  ASSERT_EQ(1u, lList.numberOfElements());
  EXPECT_EQ(1, lList.front().mValue);
  EXPECT_EQ(1, lQueue.dequeue().mValue);
  lRecycling.enqueue(lTwo);
  EXPECT_EQ(1, lRecycling.dequeue().mValue);
  EXPECT_EQ(2, lRecycling.dequeue().mValue);
}

TEST(ContainerTest, EmptyListOperationsAreNotFoundAndLeaveItUsable) {
  QNCList<int> lList;
  const QNCList<int>& lrConst = lList;
  const std::function<void()> lOnEmpty[] = {[&] { lList.popFront(); },      [&] { lList.popBack(); },
                                            [&] { (void)lList.front(); },   [&] { (void)lList.back(); },
                                            [&] { (void)lrConst.front(); }, [&] { (void)lrConst.back(); }};
  for (const auto& lrCall : lOnEmpty) EXPECT_EQ("Not Found (code 8)", thrown<QNCNotFoundEx>(lrCall, true));
  lList.pushBack(2);
  lList.pushFront(1);
  lList.pushBack(3);
  lList.popFront();
  lList.popBack();
  EXPECT_EQ(2, lrConst.front());
  EXPECT_EQ(2, lrConst.back());
}

// A recyclable element whose moves copy, so a moved-from element still holds its reference: only
// a node emptied after the dequeue lets the reference go.
struct QNSSticky {
  QNSSticky() noexcept = default;
  explicit QNSSticky(std::shared_ptr<int> aValue) noexcept : mValue(std::move(aValue)) {}
  QNSSticky(const QNSSticky&) noexcept = default;  // declared, so there is no move: moves copy
  QNSSticky& operator=(const QNSSticky&) noexcept = default;
  std::shared_ptr<int> mValue;
};

// A dequeued element leaves the recycled node at once, even when its moves copy.
TEST(QueueTest, ARecycledNodeReleasesItsElement) {
  QNCQueue<QNSSticky> lRecycling;
  const auto lValue = std::make_shared<int>(1);
  lRecycling.enqueue(QNSSticky(lValue));
  (void)lRecycling.dequeue();
  EXPECT_EQ(1, lValue.use_count()) << "the recycled node still holds the element";
}

TEST(MapTest, DuplicateKeepsTheOldValueAndMissingKeyIsNotFound) {
  QNCMap<QNCString, int> lMap;
  lMap.insert(QNCString("a"), 1);
  EXPECT_EQ("Element already exists in map.. can't insert (code 10)",
            thrown<QNCExistsEx>([&] { lMap.insert(QNCString("a"), 2); }, true));
  EXPECT_EQ(1, lMap.get(QNCString("a")));
  EXPECT_EQ(1u, lMap.numberOfElements());
  // String keys are told apart by their whole text: "ab" is not "a", "" is a key of its own.
  const QNCMap<QNCString, int>& lrConst = lMap;
  EXPECT_EQ("No element for the key exists in map (code 8)",
            thrown<QNCNotFoundEx>([&] { (void)lMap.get(QNCString("ab")); }, true));
  EXPECT_THROW((void)lrConst.get(QNCString("")), QNCNotFoundEx);
}

// Copies never share storage; appending a text to itself reads it before it grows.
TEST(StringTest, CopiesShareNothing) {
  QNCString lSource("base"), lCopy(lSource), lAssigned("other");
  lAssigned = lSource;
  lCopy += QNCString("-copy");
  lAssigned += lAssigned;
  EXPECT_STREQ("base", lSource.get());
  EXPECT_STREQ("base-copy", lCopy.get());
  EXPECT_STREQ("basebase", lAssigned.get());
}

// Each class is caught through every base of its category and never through another; with two
// categories and a shared virtual root, a non-virtual path would make the root ambiguous. A
// message is a copy, cut to the maximum.
template <class Base, class E>
bool caughtAs(const E& acrException) {
  try {
    throw acrException;
  } catch (const Base&) {
    return true;
  } catch (...) {
    return false;
  }
}

TEST(ExceptionTest, ClassesAreCaughtThroughTheirCategoryAndMessagesAreBoundedCopies) {
  const QNCNoMemoryEx lNoMemory("Out of Memory", 2);
  EXPECT_TRUE(caughtAs<QNCHaltEx>(lNoMemory) && caughtAs<QNCGenericException>(lNoMemory) &&
              caughtAs<QNCException>(lNoMemory));
  EXPECT_FALSE(caughtAs<QNCOsException>(lNoMemory));
  const QNCExistsEx lExists("exists", 10);
  EXPECT_TRUE(caughtAs<QNCGenericException>(lExists));
  EXPECT_FALSE(caughtAs<QNCOsException>(lExists) || caughtAs<QNCHaltEx>(lExists));
  char lBuffer[64];
  snprintf(lBuffer, sizeof lBuffer, "bad frame at %d", 42);
  const QNCReadFailedEx lException(lBuffer, 328);
  memset(lBuffer, 'x', sizeof lBuffer - 1);
  EXPECT_STREQ("bad frame at 42", lException.what());
  EXPECT_EQ(QNCException::kMaxMessage - 1, strlen(QNCInvalidEx(std::string(5000, 'm').c_str(), 6).what()));
}

}  // namespace
