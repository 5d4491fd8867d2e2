#include <gtest/gtest.h>
#include <unistd.h>

#include <atomic>
#include <string>

#include "FdReader.h"
#include "FdWriter.h"
#include "IpAddress.h"
#include "KeyValueFormatParser.h"
#include "LogSupport.h"
#include "QNException.h"
#include "System.h"
#include "TableSystem.h"
#include "TestSupport.h"
#include "ThreadComponent.h"
#include "ThreadPool.h"
#include "programs/TestSystem.h"

namespace {

// A thread that sleeps until it is asked to exit.
class WaitingComponent : public QNCThreadComponent {
 public:
  explicit WaitingComponent(const char* apName) : QNCThreadComponent(apName) {}
  ~WaitingComponent() override { waitForExit(); }

 protected:
  void run() override {
    while (!waitForExitRequest(3600u * 1000u)) {
    }
  }
};

// A thread that ends by itself at once but refuses exit requests with exception E.
template <class E>
class RefusingComponent : public QNCThreadComponent {
 public:
  explicit RefusingComponent(const char* apName) : QNCThreadComponent(apName) {}
  ~RefusingComponent() override { waitForExit(); }
  void requestExit() override {
    ++mRequests;
    throw E("cannot take the request", 6);
  }
  std::atomic<int> mRequests{0};

 protected:
  void run() override {}
};

// The application side of the tests: the three abstract operations, and access to the tables.
class TestSystem : public QNCBareTestSystem {
 public:
  ~TestSystem() override {
    // The threads must be gone before the tables that own them: tell and join them. A
    // component that refuses with another exception has ended by itself (RefusingComponent).
    try {
      makeThreadsToExit();
    } catch (const QNCException&) {
    }
    waitForThreads();
  }

  // Counts only calls made once both parsers exist: the application's descriptors go into them.
  void setCommandLineArgumentDesc() override {
    if (hasParsers()) ++mDescriptorCalls;
  }
  void createShutDownEvent() override {
    ++mShutDownEvents;
    mFlagAtShutDownEvent = isSetForExit();
  }

  template <class T>
  T& addComponent(T* apComponent) {
    mThreadComponents.append(QNCPointer<QNCThreadComponent>(apComponent, QNPST_Individual, QNPAT_New));
    return *apComponent;
  }
  QNCThreadPool& addPool(const char* apName, unsigned int aThreads) {
    auto* lpPool = new QNCThreadPool(apName, aThreads);
    mThreadPools.append(QNCPointer<QNCThreadPool>(lpPool, QNPST_Individual, QNPAT_New));
    return *lpPool;
  }
  bool hasParsers() const { return !mCommandLineParser.isNull() && !mConfigFileParser.isNull(); }

  int mDescriptorCalls = 0;
  int mShutDownEvents = 0;
  bool mFlagAtShutDownEvent = true;
};

class SystemLifecycleTest : public qntest::LoggedTest {};

using qntest::expectInOrder;
using qntest::levelOf;

// isInited is false for every number at or beyond the table size, before and after the start.
// A component that refuses the exit request with QNCInvalidEx (as one never started does) must
// not keep the components after it or any pool from being told, or waitForThreads would hang.
TEST_F(SystemLifecycleTest, StartsAndWaitsInOrderAndTellsEveryThreadPastOneThatRefuses) {
  TestSystem lSystem;
  EXPECT_FALSE(lSystem.isInited(0));
  auto& lRefusing = lSystem.addComponent(new RefusingComponent<QNCInvalidEx>("alpha"));
  auto& lWaiting = lSystem.addComponent(new WaitingComponent("beta"));
  QNCThreadPool& lWorkers = lSystem.addPool("workers", 2);
  QNCThreadPool& lSpare = lSystem.addPool("spare", 1);
  EXPECT_FALSE(lSystem.isInited(0));
  lSystem.startThreads();
  EXPECT_TRUE(lSystem.isInited(0));
  EXPECT_TRUE(lSystem.isInited(1));
  EXPECT_FALSE(lSystem.isInited(2));
  EXPECT_FALSE(lSystem.isInited(~0u));

  lSystem.makeThreadsToExit();
  EXPECT_EQ(1, lRefusing.mRequests);
  EXPECT_TRUE(lWaiting.isExitRequested());
  EXPECT_THROW(lWorkers.submit([] {}), QNCExitConditionEx);
  EXPECT_THROW(lSpare.submit([] {}), QNCExitConditionEx);
  lSystem.waitForThreads();  // returns: every thread was told
  const std::string lLog = log();
  expectInOrder(
      lLog, {"Started Thread: alpha\n", "Started Thread: beta\n", "Started Threads in Thread Pool: workers\n",
             "Started Threads in Thread Pool: spare\n", "Waiting for 'alpha' thread to exit\n",
             "Waiting for 'beta' thread to exit\n", "Waiting for threads in 'workers' ThreadPool to exit\n",
             "Waiting for threads in 'spare' ThreadPool to exit\n"});
  for (const char* lpLine :
       {"Started Thread: alpha", "Started Threads in Thread Pool: workers",
        "Waiting for 'alpha' thread to exit", "Waiting for threads in 'workers' ThreadPool to exit"})
    EXPECT_EQ("-N-", levelOf(lLog, lpLine)) << lpLine;
}

// Nothing is caught in startThreads: the component that cannot start ends it, and neither the
// components after it nor the pools are started. startThread then starts the one named, alone.
TEST_F(SystemLifecycleTest, StartThreadsStopsAtTheFirstComponentThatCannotStart) {
  TestSystem lSystem;
  lSystem.addComponent(new WaitingComponent("first")).init();  // a second init() is refused
  lSystem.addComponent(new WaitingComponent("second"));
  lSystem.addComponent(new WaitingComponent("third"));
  QNCThreadPool& lPool = lSystem.addPool("late", 1);
  EXPECT_THROW(lSystem.startThreads(), QNCInvalidEx);
  EXPECT_FALSE(lSystem.isInited(1));
  lPool.submit([] {});  // a pool that was never started still accepts work: it was not finished
  EXPECT_EQ(std::string::npos, log().find("Started Thread"));

  EXPECT_EQ("Vector out of bounds access", qntest::thrown<QNCInvalidEx>([&] { lSystem.startThread(3); }));
  lSystem.startThread(2);
  EXPECT_FALSE(lSystem.isInited(1));
  EXPECT_TRUE(lSystem.isInited(2));
  EXPECT_NE(std::string::npos, log().find("Started Thread: third\n"));
}

// Only QNCInvalidEx is passed over: another refusal reaches the caller, the flag already set.
TEST_F(SystemLifecycleTest, ExitFlagIsSetFirstAndNeverReturnsToFalse) {
  TestSystem lSystem;
  lSystem.addComponent(new RefusingComponent<QNCNotFoundEx>("odd"));
  lSystem.startThreads();
  EXPECT_FALSE(lSystem.isSetForExit());
  EXPECT_THROW(lSystem.makeThreadsToExit(), QNCNotFoundEx);
  EXPECT_FALSE(lSystem.mFlagAtShutDownEvent);  // the event comes before the flag is set
  EXPECT_TRUE(lSystem.isSetForExit());
  EXPECT_THROW(lSystem.makeThreadsToExit(), QNCNotFoundEx);  // a second signal repeats every step
  lSystem.setForExit();
  EXPECT_EQ(2, lSystem.mShutDownEvents);
  EXPECT_TRUE(lSystem.mFlagAtShutDownEvent);
  EXPECT_TRUE(lSystem.isSetForExit());
}

TEST_F(SystemLifecycleTest, PreInitCreatesTheParsersFirstAndInitFindsTheHostNameAndAddress) {
  TestSystem lSystem;
  lSystem.preInit();
  EXPECT_EQ(QNOS_Linux, lSystem.getOs());
  EXPECT_EQ(1, lSystem.mDescriptorCalls);
  lSystem.init();
  char lHostName[256] = {0};
  ASSERT_EQ(0, gethostname(lHostName, sizeof lHostName - 1));
  EXPECT_STREQ(lHostName, lSystem.getHostName().get());
  ASSERT_FALSE(lSystem.getAddress().isNull());
  const std::string lAddress = lSystem.getAddress()->getStringForm();
  const std::string lNumber = std::to_string(lSystem.getAddress()->getNumericForm());
  const std::string lLog = log();
  expectInOrder(lLog, {std::string("HostName: ") + lHostName + "\n",
                       "The IP Address of the host in number form: " + lNumber + " \n",
                       "IpAddress: " + lAddress + "\n"});
  EXPECT_EQ("-N-", levelOf(lLog, "HostName: "));
  EXPECT_EQ("-I-", levelOf(lLog, "The IP Address of the host in number form: "));
  EXPECT_EQ("-N-", levelOf(lLog, "IpAddress: "));
}

// Death tests run without a logger, so the assertion line reaches standard error.
TEST(SystemLifecycleDeathTest, ReaderOrWriterNumberAtTheTableSizeEndsTheProcess) {
  qntest::TableSystem lSystem(0, 0, 0);
  int lPipe[2];
  ASSERT_EQ(0, pipe(lPipe));
  lSystem.addReader(QNCPointer<QNCReader>(new QNCFdReader(lPipe[0]), QNPST_Individual, QNPAT_New));
  lSystem.addWriter(QNCPointer<QNCWriter>(new QNCFdWriter(lPipe[1]), QNPST_Individual, QNPAT_New));
  EXPECT_FALSE(lSystem.getReader(0).isNull());
  EXPECT_FALSE(lSystem.getWriter(0).isNull());
  EXPECT_EXIT(lSystem.getReader(1), ::testing::ExitedWithCode(1),
              "Assertion \\[ acReaderNo < this->mReaders.numberOfElements\\(\\) \\] failed");
  EXPECT_EXIT(lSystem.getWriter(1), ::testing::ExitedWithCode(1),
              "Assertion \\[ acWriterNo < this->mWriters.numberOfElements\\(\\) \\] failed");
}

}  // namespace
