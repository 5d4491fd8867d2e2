// The value types of common/ (the counted pointer, the containers, strings, exceptions), then
// the operating-system layer and the C library wrappers under them: error reports, calls
// interrupted by signals, and the primitives under the conditionals and mutexes.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <pthread.h>
#include <signal.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <chrono>
#include <climits>
#include <cstring>
#include <functional>
#include <memory>
#include <string>
#include <thread>

#include "Clib.h"
#include "Mutex.h"
#include "Os.h"
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
  inline static std::vector<int> sDestroyed;
  inline static std::function<void(int)> sOnDestroy;
  explicit QNSTracked(int aId = 0) : mId(aId) {}
  virtual ~QNSTracked() {
    sDestroyed.push_back(mId);
    if (sOnDestroy) sOnDestroy(mId);
  }
  int mId;
};

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
    return QNCPointer<QNSTracked>(new (std::nothrow) QNSTracked(aId));
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
    QNCPointer<QNSNode> lHead(new (std::nothrow) QNSNode(1));
    lHead->mNext = QNCPointer<QNSNode>(new (std::nothrow) QNSNode(2));
    lHead->mNext->mNext = QNCPointer<QNSNode>(new (std::nothrow) QNSNode(3));
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
  auto* lpDerived = new QNCPointer<QNSDerivedTracked>(new (std::nothrow) QNSDerivedTracked);
  QNCPointer<QNSTracked> lBase(*lpDerived);
  delete lpDerived;
  EXPECT_TRUE(destroyed().empty());
  lBase.reset();
  EXPECT_EQ((std::vector<int>{-7, 7}), destroyed());
}

// Copies released at the same time on several threads destroy the object once, on whichever
// thread sees the count reach 0, and that thread sees another holder's write (the release/acquire
// pair; ThreadSanitizer checks it). A counter that is not atomic also fails the stress cases of
// the buffer pool and the containers under ThreadSanitizer.
TEST_F(PointerTest, CopiesReleasedOnManyThreadsDestroyTheObjectOnce) {
  std::vector<QNCPointer<QNSTracked>> lCopies(4, make(0));
  std::vector<std::thread> lThreads;
  for (int lIndex = 0; lIndex < 4; ++lIndex) {
    lThreads.emplace_back([lMine = std::move(lCopies[lIndex]), lIndex]() mutable {
      for (int lCopy = 0; lCopy < 20000; ++lCopy) QNCPointer<QNSTracked> lLocal(lMine);
      if (lIndex == 0) lMine->mId = 1;  // the one writer
      lMine.reset();
    });
  }
  for (auto& lThread : lThreads) lThread.join();
  EXPECT_EQ(std::vector<int>{1}, destroyed());
}

// An element whose copies fail with std::bad_alloc on request, as an allocation inside a copy
// would; the containers must turn that into their own exception and stay unchanged.
struct QNSFragile {
  inline static bool sFailCopies = false;
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

// --- The operating-system layer.
using std::chrono::milliseconds;

std::atomic<int> gsHandled{0};
void countSignal(int) { ++gsHandled; }

// Installs a no-op SIGUSR1 handler without SA_RESTART, so that a blocked call it interrupts
// returns EINTR instead of being restarted by the kernel.
class InterruptingSignal {
 public:
  InterruptingSignal() {
    struct sigaction lAction = {};
    lAction.sa_handler = countSignal;
    sigemptyset(&lAction.sa_mask);
    sigaction(SIGUSR1, &lAction, &mPrevious);
  }
  ~InterruptingSignal() { sigaction(SIGUSR1, &mPrevious, nullptr); }

  // Runs aCall on a thread and, whenever that thread is found asleep in the kernel, sends it
  // SIGUSR1 until the handler has run; then calls aRelease (which lets the call finish) and joins.
  // Returns whether the handler ran while the thread was blocked.
  bool interrupt(const std::function<void()>& acrCall, const std::function<void()>& acrRelease) {
    std::atomic<long> lTid{0};
    std::thread lThread([&] {
      lTid = syscall(SYS_gettid);
      acrCall();
    });
    const int lBefore = gsHandled;
    for (int lPoll = 0; lPoll < 1000 && gsHandled == lBefore; ++lPoll) {
      std::this_thread::sleep_for(milliseconds(10));
      if (lTid != 0 && isSleeping(lTid)) pthread_kill(lThread.native_handle(), SIGUSR1);
    }
    const bool lInterrupted = gsHandled != lBefore;
    acrRelease();
    lThread.join();
    return lInterrupted;
  }

 private:
  static bool isSleeping(long aTid) {
    const std::string lStat = qntest::readFile("/proc/self/task/" + std::to_string(aTid) + "/stat");
    const size_t lEnd = lStat.rfind(')');  // the state follows the command name in parentheses
    return lEnd != std::string::npos && lStat.compare(lEnd, 3, ") S") == 0;
  }

  struct sigaction mPrevious;
};

class ClibTest : public ::testing::Test {
 protected:
  void SetUp() override { ASSERT_EQ(0, pipe(mPipe)); }
  void TearDown() override {
    close(mPipe[0]);
    close(mPipe[1]);
  }

  qntest::TempDir mDir;
  int mPipe[2];
};

TEST_F(ClibTest, FailuresNameTheCallTheObjectAndTheSystemText) {
  const std::string lMissing = mDir.file("missing/x.pid");
  EXPECT_EQ("open '" + lMissing + "': No such file or directory (code " + std::to_string(ENOENT) + ")",
            qntest::thrown<QNCOpenFailedEx>([&] { ClibOpen(lMissing.c_str(), O_RDONLY, 0); }, true));

  const std::string lFile = mDir.file("log");
  const int lWriteOnly = ClibOpen(lFile.c_str(), O_WRONLY | O_CREAT, 0600);
  char lByte;
  EXPECT_EQ("read fd " + std::to_string(lWriteOnly) + " '" + lFile + "': Bad file descriptor",
            qntest::thrown<QNCReadFailedEx>([&] { ClibRead(lWriteOnly, &lByte, 1); }));
  ClibClose(lWriteOnly);

  // A pipe nobody reads, with SIGPIPE ignored as a service does: the write fails with EPIPE
  // instead of looping or reporting success.
  close(mPipe[0]);
  mPipe[0] = -1;
  const sighandler_t lPrevious = signal(SIGPIPE, SIG_IGN);
  const std::string lBroken = qntest::thrown<QNCWriteFailedEx>([&] { ClibWrite(mPipe[1], "x", 1); }, true);
  signal(SIGPIPE, lPrevious);
  EXPECT_NE(std::string::npos, lBroken.find(": Broken pipe (code " + std::to_string(EPIPE) + ")")) << lBroken;
}

// A handler without SA_RESTART makes a blocked call return EINTR; the raw read shows that the
// set-up does interrupt it. The wrappers must go on: the read returns the data, the write that
// was cut short writes the rest from where it stopped.
TEST_F(ClibTest, SignalsDuringBlockedCallsNeverSurface) {
  InterruptingSignal lSignal;
  char lByte = 0;
  int lRawErrno = 0;
  ASSERT_TRUE(lSignal.interrupt([&] { lRawErrno = read(mPipe[0], &lByte, 1) < 0 ? errno : 0; }, [] {}));
  ASSERT_EQ(EINTR, lRawErrno);

  unsigned int lRead = 0;
  ASSERT_TRUE(lSignal.interrupt([&] { EXPECT_NO_THROW(lRead = ClibRead(mPipe[0], &lByte, 1)); },
                                [&] { ClibWrite(mPipe[1], "r", 1); }));
  EXPECT_EQ(1u, lRead);
  EXPECT_EQ('r', lByte);

  // Many times the pipe's capacity, and no byte equal to its neighbours: a write that restarted
  // from the beginning, or skipped or repeated a piece, shows in what arrives.
  std::string lSent(1 << 20, '\0');
  for (size_t lIndex = 0; lIndex < lSent.size(); ++lIndex)
    lSent[lIndex] = static_cast<char>(lIndex * 7 + lIndex / 251);
  unsigned int lWritten = 0;
  std::string lReceived;
  ASSERT_TRUE(lSignal.interrupt(
      [&] { lWritten = ClibWrite(mPipe[1], lSent.data(), static_cast<unsigned int>(lSent.size())); },
      [&] {
        char lChunk[65536];
        while (lReceived.size() < lSent.size())
          lReceived.append(lChunk, ClibRead(mPipe[0], lChunk, sizeof lChunk));
      }));
  EXPECT_EQ(lSent.size(), lWritten);
  EXPECT_TRUE(lSent == lReceived) << "received " << lReceived.size() << " bytes, not the ones sent";
}

// The deadline is computed on the monotonic clock; a condition variable left on the wall clock
// would see it as long past and time out at once. Signals given before the wait found nobody
// waiting and must not end it early; the time-out returns with the mutex held (an ordinary mutex
// refuses a second lock even to its holder).
TEST(ConditionalTest, TimedWaitNobodySignalsThrowsAfterTheTimeWithTheMutexHeld) {
  pthread_mutex_t lMutex;
  pthread_cond_t lCondition;
  OsInitMutex(lMutex);
  OsInitConditional(lCondition);
  OsSignal(lCondition);
  OsLockMutex(lMutex);
  OsSignal(lCondition);
  const auto lStart = std::chrono::steady_clock::now();
  const std::string lThrown =
      qntest::thrown<QNCTimeOutEx>([&] { OsConditionalTimedWait(lCondition, lMutex, 200); }, true);
  const auto lElapsed = std::chrono::steady_clock::now() - lStart;
  EXPECT_NE(std::string::npos, lThrown.find(" (code " + std::to_string(ETIMEDOUT) + ")")) << lThrown;
  EXPECT_GE(lElapsed, milliseconds(200));
  EXPECT_LT(lElapsed, milliseconds(200 + 5000));
  EXPECT_EQ(EBUSY, pthread_mutex_trylock(&lMutex)) << "the time-out arrived without the mutex";
  OsUnlockMutex(lMutex);
  OsDestroyConditional(lCondition);
  OsDestroyMutex(lMutex);
}

// Destroying a mutex that is still locked makes pthread_mutex_destroy fail with EBUSY; the
// destructor swallows that and leaves the system mutex as it was: still valid and locked.
TEST(MutexTest, DestroyingALockedMutexIsSwallowed) {
#if !defined(__SANITIZE_THREAD__)  // ThreadSanitizer reports exactly what this provokes
  alignas(QNCMutex) unsigned char lStorage[sizeof(QNCMutex)];
  QNCMutex* lpMutex = new (lStorage) QNCMutex();
  pthread_mutex_t* lpSystemMutex = &lpMutex->getMutex();
  lpMutex->lock();
  EXPECT_NO_THROW(lpMutex->~QNCMutex());
  EXPECT_EQ(0, pthread_mutex_unlock(lpSystemMutex));
  EXPECT_EQ(0, pthread_mutex_destroy(lpSystemMutex));
#endif
}

}  // namespace
