// The system object's buffer channels (send, receive, waitForActivity) and the assertions that
// guard every numbered service.

#include <gtest/gtest.h>

#include "Buffer.h"
#include "DeathTestSupport.h"
#include "TableSystem.h"

namespace {

// Channel ends that record what reached them. Reader n and writer n are separate objects.
class RecordingWriter : public QNCWriter {
 public:
  explicit RecordingWriter(unsigned int aMark) : mMark(aMark) {}
  void write(const QNCPointer<QNCBuffer>& acrBuffer, unsigned int& arCount) override {
    mLastBuffer = &acrBuffer;
    arCount = mMark;
  }
  unsigned int mMark;
  const QNCPointer<QNCBuffer>* mLastBuffer = nullptr;
};

class RecordingReader : public QNCReader {
 public:
  explicit RecordingReader(unsigned int aMark) : mMark(aMark) {}
  void read(QNCPointer<QNCBuffer>& arBuffer, unsigned int& arCount) override {
    mLastBuffer = &arBuffer;
    arCount = mMark;
  }
  bool waitForActivity(unsigned int acWaitTime) override {
    mLastWaitTime = acWaitTime;
    return false;
  }
  unsigned int mMark;
  unsigned int mLastWaitTime = 0;
  QNCPointer<QNCBuffer>* mLastBuffer = nullptr;
};

class SystemChannelsTest : public ::testing::Test {
 protected:
  SystemChannelsTest() {
    for (unsigned int lNumber = 0; lNumber < 3; ++lNumber) {
      mReaders[lNumber] = new (std::nothrow) RecordingReader(100 + lNumber);
      mWriters[lNumber] = new (std::nothrow) RecordingWriter(200 + lNumber);
      mSystem.addReader(QNCPointer<QNCReader>(mReaders[lNumber]));
      mSystem.addWriter(QNCPointer<QNCWriter>(mWriters[lNumber]));
    }
  }

  qntest::TableSystem mSystem{2, 2, 2};
  RecordingReader* mReaders[3];  // owned by mSystem
  RecordingWriter* mWriters[3];
};

TEST_F(SystemChannelsTest, SendReceiveAndWaitForActivityReachTheEndsWithTheirNumber) {
  QNCPointer<QNCBuffer> lBuffer;
  unsigned int lCount = 0;
  mSystem.send(1, lBuffer, lCount);
  EXPECT_EQ(201u, lCount);
  EXPECT_EQ(&lBuffer, mWriters[1]->mLastBuffer);
  mSystem.receive(1, lBuffer, lCount);
  EXPECT_EQ(101u, lCount);
  EXPECT_EQ(&lBuffer, mReaders[1]->mLastBuffer);
  mSystem.receive(2, lBuffer, lCount);
  EXPECT_EQ(102u, lCount);
  mSystem.waitForActivity(2, 250);
  EXPECT_EQ(250u, mReaders[2]->mLastWaitTime);
}

// --- Numbers out of range end the process with exactly one "-H-" line, the assertion's text,
// and exit status 1.

const auto kCondition =
    qntest::assertionFailure("acConditionNo < this->mWaitConditionals.numberOfElements()");
const auto kQueue = qntest::assertionFailure("acQueueNo < this->mQueues.numberOfElements()");
const auto kList = qntest::assertionFailure("acListNo < this->mLists.numberOfElements()");
const auto kReader = qntest::assertionFailure("acReaderNo < this->mReaders.numberOfElements()");
const auto kWriter = qntest::assertionFailure("acWriterNo < this->mWriters.numberOfElements()");
const auto kWaitTime = qntest::assertionFailure("acWaitTime > 0");

using SystemChannelsDeathTest = SystemChannelsTest;
using ::testing::ExitedWithCode;

TEST_F(SystemChannelsDeathTest, ConditionalNumberOutOfRange) {
  EXPECT_EXIT(mSystem.wait(2), ExitedWithCode(1), kCondition);
  EXPECT_EXIT(mSystem.timedWait(2, 10), ExitedWithCode(1), kCondition);
  EXPECT_EXIT(mSystem.signal(2), ExitedWithCode(1), kCondition);
  // The conditional's number is checked before the queue's or list's.
  EXPECT_EXIT(mSystem.waitOnEmptyQueue(2, 9), ExitedWithCode(1), kCondition);
  EXPECT_EXIT(mSystem.waitOnEmptyList(2, 9), ExitedWithCode(1), kCondition);
}

TEST_F(SystemChannelsDeathTest, QueueNumberOutOfRange) {
  EXPECT_EXIT(mSystem.waitOnEmptyQueue(0, 2), ExitedWithCode(1), kQueue);
  EXPECT_EXIT(mSystem.enqueue(2, qntest::makeItem(1)), ExitedWithCode(1), kQueue);
  EXPECT_EXIT(mSystem.dequeue(2), ExitedWithCode(1), kQueue);
  EXPECT_EXIT(mSystem.queueFront(2), ExitedWithCode(1), kQueue);
  EXPECT_EXIT(mSystem.queueClear(2), ExitedWithCode(1), kQueue);
  EXPECT_EXIT(mSystem.isQueueEmpty(2), ExitedWithCode(1), kQueue);
}

TEST_F(SystemChannelsDeathTest, ListNumberOutOfRange) {
  QNCQueueableList::iterator lIt;
  const QNCSystem& lConstSystem = mSystem;
  EXPECT_EXIT(mSystem.waitOnEmptyList(0, 2), ExitedWithCode(1), kList);
  EXPECT_EXIT(mSystem.enlist(2, qntest::makeItem(1)), ExitedWithCode(1), kList);
  EXPECT_EXIT(mSystem.enlistFront(2, qntest::makeItem(1)), ExitedWithCode(1), kList);
  EXPECT_EXIT(mSystem.delist(2), ExitedWithCode(1), kList);
  EXPECT_EXIT(mSystem.delistBack(2), ExitedWithCode(1), kList);
  EXPECT_EXIT(mSystem.listFront(2), ExitedWithCode(1), kList);
  EXPECT_EXIT(mSystem.listClear(2), ExitedWithCode(1), kList);
  EXPECT_EXIT(mSystem.listSize(2), ExitedWithCode(1), kList);
  EXPECT_EXIT(mSystem.isListEmpty(2), ExitedWithCode(1), kList);
  EXPECT_EXIT(mSystem.listErase(2, lIt), ExitedWithCode(1), kList);
  EXPECT_EXIT(mSystem.listBegin(2), ExitedWithCode(1), kList);
  EXPECT_EXIT(mSystem.listEnd(2), ExitedWithCode(1), kList);
  EXPECT_EXIT(lConstSystem.listBegin(2), ExitedWithCode(1), kList);
  EXPECT_EXIT(lConstSystem.listEnd(2), ExitedWithCode(1), kList);
}

TEST_F(SystemChannelsDeathTest, ChannelNumberOutOfRangeOrNoWaitTime) {
  QNCPointer<QNCBuffer> lBuffer;
  unsigned int lCount = 0;
  EXPECT_EXIT(mSystem.send(3, lBuffer, lCount), ExitedWithCode(1), kWriter);
  EXPECT_EXIT(mSystem.receive(3, lBuffer, lCount), ExitedWithCode(1), kReader);
  EXPECT_EXIT(mSystem.waitForActivity(3, 100), ExitedWithCode(1), kReader);
  EXPECT_EXIT(mSystem.waitForActivity(0, 0), ExitedWithCode(1), kWaitTime);
  // A bad reader number is reported first (and, the process having ended, alone).
  EXPECT_EXIT(mSystem.waitForActivity(3, 0), ExitedWithCode(1), kReader);
}

}  // namespace
