#include <gtest/gtest.h>

#include <climits>
#include <functional>
#include <new>
#include <string>

#include "DeathTestSupport.h"
#include "LogSupport.h"
#include "Logger.h"
#include "QNList.h"
#include "QNMap.h"
#include "QNQueue.h"
#include "QNString.h"
#include "QNVector.h"
#include "TestSupport.h"

namespace {

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

class ContainerTest : public ::testing::Test {
 protected:
  void SetUp() override { QNSFragile::sFailCopies = false; }
};

const char* const kOutOfBounds = "Vector out of bounds access (code 6)";
const char* const kNoMemory = "Out of Memory (code 2)";
const char* const kNotFound = "Not Found (code 8)";

TEST_F(ContainerTest, VectorIndexAtOrBeyondTheEndIsOutOfBounds) {
  QNCVector<int> lVector(2);
  lVector.append(10);
  lVector.append(20);
  const QNCVector<int>& lrConst = lVector;
  for (unsigned int lIndex : {2u, UINT_MAX}) {
    EXPECT_EQ(kOutOfBounds, qntest::thrown<QNCInvalidEx>([&] { (void)lVector[lIndex]; }, true)) << lIndex;
    EXPECT_EQ(kOutOfBounds, qntest::thrown<QNCInvalidEx>([&] { (void)lrConst[lIndex]; }, true)) << lIndex;
  }
  EXPECT_EQ(20, lVector[1]);
  EXPECT_EQ(20, lrConst[1]);
}

// More elements than any vector of this type can hold: the standard library's length_error.
struct QNSHuge {
  char mBytes[1ULL << 32];
};

TEST_F(ContainerTest, VectorReserveBeyondTheLimitIsInvalid) {
  EXPECT_EQ("Cannot reserve space for Vector (code 6)",
            qntest::thrown<QNCInvalidEx>([] { QNCVector<QNSHuge> lVector(UINT_MAX); }, true));
}

TEST_F(ContainerTest, VectorReserveThatCannotBeAllocatedIsOutOfMemory) {
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
  GTEST_SKIP() << "the sanitizers' allocators end the process instead of throwing std::bad_alloc";
#endif
  struct QNSMegabyte {
    char mBytes[1 << 20];
  };
  // 2^30 MiB is beyond any address space, whatever the overcommit policy.
  EXPECT_EQ(kNoMemory, qntest::thrown<QNCNoMemoryEx>([] { QNCVector<QNSMegabyte> lVector(1U << 30); }, true));
}

// Every operation that copies an element (into a fresh node or a recycled one) turns the copy's
// std::bad_alloc into QNCNoMemoryEx and leaves the container as it was. Assigning a container to itself
// copies nothing, so it cannot fail.
TEST_F(ContainerTest, FailedCopyIsOutOfMemoryAndLeavesTheContainerUnchanged) {
  QNCVector<QNSFragile> lVector;
  lVector.append(QNSFragile(1));
  QNCList<QNSFragile> lList;
  lList.pushBack(QNSFragile(1));
  QNCQueue<QNSFragile> lQueue;  // not default-constructible: no node recycling
  lQueue.enqueue(QNSFragile(1));
  QNCQueue<QNSRecyclable> lRecycling;
  lRecycling.enqueue(QNSRecyclable(0));
  lRecycling.enqueue(QNSRecyclable(1));
  (void)lRecycling.dequeue();   // leaves a node to recycle
  const QNSRecyclable lTwo(2);  // an lvalue: enqueue must copy it into the recycled node
  QNCVector<QNSFragile> lOtherVector;
  QNCList<QNSFragile> lOtherList;
  QNCVector<QNSFragile>& lrSameVector = lVector;

  QNSFragile::sFailCopies = true;
  EXPECT_EQ(kNoMemory, qntest::thrown<QNCNoMemoryEx>([&] { lVector.append(QNSFragile(2)); }, true));
  EXPECT_EQ(kNoMemory, qntest::thrown<QNCNoMemoryEx>([&] { lOtherVector = lVector; }, true));
  lVector = lrSameVector;
  EXPECT_EQ(kNoMemory, qntest::thrown<QNCNoMemoryEx>([&] { lList.pushBack(QNSFragile(2)); }, true));
  EXPECT_EQ(kNoMemory, qntest::thrown<QNCNoMemoryEx>([&] { lList.pushFront(QNSFragile(0)); }, true));
  EXPECT_EQ(kNoMemory, qntest::thrown<QNCNoMemoryEx>([&] { lOtherList = lList; }, true));
  EXPECT_EQ(kNoMemory, qntest::thrown<QNCNoMemoryEx>([&] { (void)lQueue.dequeue(); }, true));
  EXPECT_EQ(kNoMemory, qntest::thrown<QNCNoMemoryEx>([&] { lQueue.enqueue(QNSFragile(2)); }, true));
  EXPECT_EQ(kNoMemory, qntest::thrown<QNCNoMemoryEx>([&] { lRecycling.enqueue(lTwo); }, true));
  QNSFragile::sFailCopies = false;

  ASSERT_EQ(1u, lVector.numberOfElements());
  EXPECT_EQ(1, lVector[0].mValue);
  ASSERT_EQ(1u, lList.numberOfElements());
  EXPECT_EQ(1, lList.front().mValue);
  ASSERT_EQ(1u, lQueue.numberOfElements());
  EXPECT_EQ(1, lQueue.dequeue().mValue);
  ASSERT_EQ(1u, lRecycling.numberOfElements());
  lRecycling.enqueue(lTwo);
  EXPECT_EQ(1, lRecycling.dequeue().mValue);
  EXPECT_EQ(2, lRecycling.dequeue().mValue);
}

TEST_F(ContainerTest, EmptyListOperationsAreNotFoundAndLeaveItUsable) {
  QNCList<int> lList;
  const QNCList<int>& lrConst = lList;
  const std::function<void()> lOnEmpty[] = {
      [&] { lList.popFront(); },   [&] { lList.popBack(); },       [&] { (void)lList.front(); },
      [&] { (void)lList.back(); }, [&] { (void)lrConst.front(); }, [&] { (void)lrConst.back(); },
  };
  for (const auto& lrCall : lOnEmpty) EXPECT_EQ(kNotFound, qntest::thrown<QNCNotFoundEx>(lrCall, true));
  EXPECT_TRUE(lList.isEmpty());

  lList.pushBack(2);
  lList.pushFront(1);
  lList.pushBack(3);
  EXPECT_EQ(1, lrConst.front());
  EXPECT_EQ(3, lrConst.back());
  lList.popFront();
  lList.popBack();
  EXPECT_EQ(2, lList.front());
  EXPECT_EQ(2, lList.back());
}

// --- Map (its failures are logged)

class MapTest : public qntest::LoggedTest {};

TEST_F(MapTest, DuplicateInsertKeepsTheOldValueAndLogsOneError) {
  QNCMap<QNCString, int> lMap;
  lMap.insert(QNCString("key"), 1);
  EXPECT_EQ("Element already exists in map.. can't insert (code 10)",
            qntest::thrown<QNCExistsEx>([&] { lMap.insert(QNCString("key"), 2); }, true));
  EXPECT_EQ(1, lMap.get(QNCString("key")));
  EXPECT_EQ(1u, lMap.numberOfElements());
  const std::string lLog = log();
  EXPECT_EQ(1u, qntest::countOf(lLog, "Element already existed in the map"));
  EXPECT_EQ("-E-", qntest::levelOf(lLog, "Element already existed in the map")) << lLog;
}

// String keys are told apart by their whole text: "ab" is not "a", "" is a key of its own.
TEST_F(MapTest, MissingKeyIsNotFoundAfterAnInfoLine) {
  QNCMap<QNCString, int> lMap;
  lMap.insert(QNCString("a"), 1);
  const QNCMap<QNCString, int>& lrConst = lMap;
  const char* const kNoElement = "No element for the key exists in map (code 8)";
  EXPECT_EQ(kNoElement, qntest::thrown<QNCNotFoundEx>([&] { (void)lMap.get(QNCString("ab")); }, true));
  EXPECT_EQ(kNoElement, qntest::thrown<QNCNotFoundEx>([&] { (void)lrConst.get(QNCString("")); }, true));
  const std::string lLog = log();
  EXPECT_EQ(2u, qntest::countOf(lLog, "Element does not exist in the map"));
  EXPECT_EQ("-I-", qntest::levelOf(lLog, "Element does not exist in the map")) << lLog;

  lMap.insert(QNCString("ab"), 2);
  lMap.insert(QNCString(""), 3);
  EXPECT_EQ(1, lMap.get(QNCString("a")));
  EXPECT_EQ(2, lMap.get(QNCString("ab")));
  EXPECT_EQ(3, lrConst.get(QNCString("")));
}

}  // namespace
