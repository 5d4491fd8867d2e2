#include <gtest/gtest.h>

#include <climits>
#include <functional>
#include <new>
#include <string>

#include "DeathTestSupport.h"
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
  QNSFragile& operator=(const QNSFragile& acrOther) {
    if (sFailCopies) throw std::bad_alloc();
    mValue = acrOther.mValue;
    return *this;
  }
  int mValue;
};
bool QNSFragile::sFailCopies = false;

class ContainerTest : public ::testing::Test {
 protected:
  void SetUp() override { QNSFragile::sFailCopies = false; }
  void TearDown() override { QNSFragile::sFailCopies = false; }
};

template <class Exception>
void expectThrown(const std::function<void()>& acrCall, const char* apMessage, unsigned int aCode) {
  try {
    acrCall();
    ADD_FAILURE() << "nothing thrown, expected \"" << apMessage << "\"";
  } catch (const Exception& acrException) {
    EXPECT_STREQ(apMessage, acrException.what());
    EXPECT_EQ(aCode, acrException.getCode());
  }
}

// --- Vector

TEST_F(ContainerTest, VectorIndexAtTheEndIsOutOfBounds) {
  QNCVector<int> lVector(2);
  expectThrown<QNCInvalidEx>([&] { (void)lVector[0]; }, "Vector out of bounds access", 6);
  lVector.append(10);
  lVector.append(20);
  EXPECT_EQ(20, lVector[1]);
  expectThrown<QNCInvalidEx>([&] { (void)lVector[lVector.numberOfElements()]; }, "Vector out of bounds access", 6);
  const QNCVector<int>& lrConst = lVector;
  expectThrown<QNCInvalidEx>([&] { (void)lrConst[2]; }, "Vector out of bounds access", 6);
  expectThrown<QNCInvalidEx>([&] { (void)lrConst[UINT_MAX]; }, "Vector out of bounds access", 6);
  EXPECT_EQ(2u, lVector.numberOfElements());
  EXPECT_EQ(10, lrConst[0]);
}

// More elements than any vector of this type can hold: the standard library's length_error.
struct QNSHuge {
  char mBytes[1ULL << 32];
};

TEST_F(ContainerTest, VectorReserveBeyondTheLimitIsInvalid) {
  expectThrown<QNCInvalidEx>([] { QNCVector<QNSHuge> lVector(UINT_MAX); }, "Cannot reserve space for Vector", 6);
}

TEST_F(ContainerTest, VectorReserveThatCannotBeAllocatedIsOutOfMemory) {
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
  GTEST_SKIP() << "the sanitizers' allocators end the process instead of throwing std::bad_alloc";
#endif
  struct QNSMegabyte {
    char mBytes[1 << 20];
  };
  // 2^30 MiB is beyond any address space, whatever the overcommit policy.
  expectThrown<QNCNoMemoryEx>([] { QNCVector<QNSMegabyte> lVector(1U << 30); }, "Out of Memory", 2);
}

TEST_F(ContainerTest, VectorAppendFailureIsOutOfMemoryAndLeavesItUnchanged) {
  QNCVector<QNSFragile> lVector;
  lVector.append(QNSFragile(1));
  QNSFragile::sFailCopies = true;
  expectThrown<QNCNoMemoryEx>([&] { lVector.append(QNSFragile(2)); }, "Out of Memory", 2);
  QNSFragile::sFailCopies = false;
  ASSERT_EQ(1u, lVector.numberOfElements());
  EXPECT_EQ(1, lVector[0].mValue);
}

TEST_F(ContainerTest, VectorAssignmentCopiesAndFailsAsOutOfMemory) {
  QNCVector<QNSFragile> lSource;
  lSource.append(QNSFragile(1));
  lSource.append(QNSFragile(2));
  QNCVector<QNSFragile> lTarget;
  lTarget = lSource;
  lTarget[0].mValue = 9;
  EXPECT_EQ(1, lSource[0].mValue);
  ASSERT_EQ(2u, lTarget.numberOfElements());

  QNCVector<QNSFragile>& lrSelf = lTarget;
  QNSFragile::sFailCopies = true;
  lTarget = lrSelf;  // copies nothing, so cannot fail
  QNCVector<QNSFragile> lEmpty;
  expectThrown<QNCNoMemoryEx>([&] { lEmpty = lSource; }, "Out of Memory", 2);
  QNSFragile::sFailCopies = false;
  EXPECT_EQ(9, lTarget[0].mValue);
}

// --- List

TEST_F(ContainerTest, EmptyListOperationsAreNotFoundAndLeaveItUsable) {
  QNCList<int> lList;
  const QNCList<int>& lrConst = lList;
  expectThrown<QNCNotFoundEx>([&] { lList.popFront(); }, "Not Found", 8);
  expectThrown<QNCNotFoundEx>([&] { lList.popBack(); }, "Not Found", 8);
  expectThrown<QNCNotFoundEx>([&] { (void)lList.front(); }, "Not Found", 8);
  expectThrown<QNCNotFoundEx>([&] { (void)lList.back(); }, "Not Found", 8);
  expectThrown<QNCNotFoundEx>([&] { (void)lrConst.front(); }, "Not Found", 8);
  expectThrown<QNCNotFoundEx>([&] { (void)lrConst.back(); }, "Not Found", 8);
  EXPECT_TRUE(lList.isEmpty());
  EXPECT_EQ(0u, lList.numberOfElements());

  lList.pushBack(2);
  lList.pushFront(1);
  lList.pushBack(3);
  EXPECT_EQ(1, lList.front());
  EXPECT_EQ(3, lList.back());
  lList.popFront();
  lList.popBack();
  EXPECT_EQ(2, lList.front());
  lList.popBack();
  expectThrown<QNCNotFoundEx>([&] { lList.popFront(); }, "Not Found", 8);
}

TEST_F(ContainerTest, ListPushFailureIsOutOfMemoryAndLeavesItUnchanged) {
  QNCList<QNSFragile> lList;
  lList.pushBack(QNSFragile(1));
  QNSFragile::sFailCopies = true;
  expectThrown<QNCNoMemoryEx>([&] { lList.pushBack(QNSFragile(2)); }, "Out of Memory", 2);
  expectThrown<QNCNoMemoryEx>([&] { lList.pushFront(QNSFragile(0)); }, "Out of Memory", 2);
  QNCList<QNSFragile> lOther;
  expectThrown<QNCNoMemoryEx>([&] { lOther = lList; }, "Out of Memory", 2);
  QNSFragile::sFailCopies = false;
  ASSERT_EQ(1u, lList.numberOfElements());
  EXPECT_EQ(1, lList.front().mValue);
}

// --- Queue

TEST_F(ContainerTest, QueueIsFirstInFirstOutAndEmptyDequeueIsNotFound) {
  QNCQueue<int> lQueue;
  expectThrown<QNCNotFoundEx>([&] { (void)lQueue.dequeue(); }, "Not Found", 8);
  EXPECT_TRUE(lQueue.isEmpty());
  for (int lValue = 1; lValue <= 3; ++lValue) lQueue.enqueue(lValue);
  EXPECT_EQ(1, lQueue.dequeue());
  EXPECT_EQ(2, lQueue.dequeue());
  lQueue.enqueue(4);
  EXPECT_EQ(3, lQueue.dequeue());
  EXPECT_EQ(4, lQueue.dequeue());
  expectThrown<QNCNotFoundEx>([&] { (void)lQueue.dequeue(); }, "Not Found", 8);
  lQueue.enqueue(5);
  EXPECT_EQ(5, lQueue.dequeue());
}

TEST_F(ContainerTest, QueueKeepsItsHeadWhenTheCopyFails) {
  QNCQueue<QNSFragile> lQueue;
  lQueue.enqueue(QNSFragile(1));
  lQueue.enqueue(QNSFragile(2));
  QNSFragile::sFailCopies = true;
  expectThrown<QNCNoMemoryEx>([&] { (void)lQueue.dequeue(); }, "Out of Memory", 2);
  expectThrown<QNCNoMemoryEx>([&] { lQueue.enqueue(QNSFragile(3)); }, "Out of Memory", 2);
  QNSFragile::sFailCopies = false;
  EXPECT_EQ(1, lQueue.dequeue().mValue);
  EXPECT_EQ(2, lQueue.dequeue().mValue);
  EXPECT_TRUE(lQueue.isEmpty());
}

// An element the queue recycles nodes for (default-constructible, moved without throwing) whose
// copies fail on request: the copy into a recycled node must fail like a fresh allocation.
struct QNSRecyclable {
  static bool sFailCopies;
  QNSRecyclable() noexcept = default;
  explicit QNSRecyclable(int aValue) noexcept : mValue(aValue) {}
  QNSRecyclable(const QNSRecyclable& acrOther) : mValue(acrOther.mValue) {
    if (sFailCopies) throw std::bad_alloc();
  }
  QNSRecyclable(QNSRecyclable&&) noexcept = default;
  QNSRecyclable& operator=(const QNSRecyclable& acrOther) {
    if (sFailCopies) throw std::bad_alloc();
    mValue = acrOther.mValue;
    return *this;
  }
  QNSRecyclable& operator=(QNSRecyclable&&) noexcept = default;
  int mValue = 0;
};
bool QNSRecyclable::sFailCopies = false;

TEST_F(ContainerTest, QueueCopyIntoARecycledNodeFailsAsOutOfMemory) {
  QNSRecyclable::sFailCopies = false;
  QNCQueue<QNSRecyclable> lQueue;
  lQueue.enqueue(QNSRecyclable(1));
  lQueue.enqueue(QNSRecyclable(2));
  EXPECT_EQ(1, lQueue.dequeue().mValue);  // leaves a node to recycle
  QNSRecyclable::sFailCopies = true;
  const QNSRecyclable lThree(3);  // an lvalue: enqueue must copy it into the recycled node
  expectThrown<QNCNoMemoryEx>([&] { lQueue.enqueue(lThree); }, "Out of Memory", 2);
  QNSRecyclable::sFailCopies = false;
  EXPECT_EQ(1u, lQueue.numberOfElements());
  lQueue.enqueue(QNSRecyclable(4));
  EXPECT_EQ(2, lQueue.dequeue().mValue);
  EXPECT_EQ(4, lQueue.dequeue().mValue);
  EXPECT_TRUE(lQueue.isEmpty());
}

// --- Map (its failures are logged, so these tests open a log of their own)

class MapTest : public ::testing::Test {
 protected:
  void SetUp() override {
    setLogCode(255);
    CreateLogger(QNCString(mDir.file("map.log").c_str()));
  }
  void TearDown() override { destroyLogger(); }

  std::string log() {
    flushLogger();
    return qntest::readFile(mDir.file("map.log"));
  }

  qntest::TempDir mDir;
};

TEST_F(MapTest, DuplicateInsertKeepsTheOldValueAndLogsOneError) {
  QNCMap<QNCString, int> lMap;
  lMap.insert(QNCString("key"), 1);
  expectThrown<QNCExistsEx>([&] { lMap.insert(QNCString("key"), 2); },
                            "Element already exists in map.. can't insert", 10);
  EXPECT_EQ(1, lMap.get(QNCString("key")));
  EXPECT_EQ(1u, lMap.numberOfElements());

  const std::string lLog = log();
  EXPECT_EQ(1u, qntest::countOf(lLog, "Element already existed in the map"));
  const size_t lAt = lLog.find("Element already existed in the map");
  ASSERT_NE(std::string::npos, lAt);
  const size_t lLineStart = lLog.rfind('\n', lAt) == std::string::npos ? 0 : lLog.rfind('\n', lAt);
  EXPECT_NE(std::string::npos, lLog.substr(lLineStart, lAt - lLineStart).find("-E-")) << lLog;
}

TEST_F(MapTest, MissingKeyIsNotFoundAfterAnInfoLine) {
  QNCMap<QNCString, int> lMap;
  lMap.insert(QNCString("a"), 1);
  const QNCMap<QNCString, int>& lrConst = lMap;
  try {
    (void)lMap.get(QNCString("ab"));
    ADD_FAILURE() << "missing key found";
  } catch (const QNCNotFoundEx& acrException) {
    EXPECT_STREQ("No element for the key exists in map", acrException.what());
    EXPECT_EQ(8u, acrException.getCode());
    // The line is out before the exception reaches its catcher.
    EXPECT_EQ(1u, qntest::countOf(log(), "Element does not exist in the map"));
  }
  expectThrown<QNCNotFoundEx>([&] { (void)lrConst.get(QNCString("")); }, "No element for the key exists in map", 8);

  const std::string lLog = log();
  EXPECT_EQ(2u, qntest::countOf(lLog, "Element does not exist in the map"));
  const size_t lAt = lLog.find("Element does not exist in the map");
  const size_t lLineStart = lLog.rfind('\n', lAt) == std::string::npos ? 0 : lLog.rfind('\n', lAt);
  EXPECT_NE(std::string::npos, lLog.substr(lLineStart, lAt - lLineStart).find("-I-")) << lLog;
}

TEST_F(MapTest, StringKeysAreDistinguishedByTheirWholeText) {
  QNCMap<QNCString, int> lMap;
  lMap.insert(QNCString("a"), 1);
  lMap.insert(QNCString("ab"), 2);
  lMap.insert(QNCString(""), 3);
  EXPECT_EQ(1, lMap.get(QNCString("a")));
  EXPECT_EQ(2, lMap.get(QNCString("ab")));
  EXPECT_EQ(3, lMap.get(QNCString("")));
  lMap.get(QNCString("ab")) = 4;
  EXPECT_EQ(4, lMap.get(QNCString("ab")));
}

}  // namespace
