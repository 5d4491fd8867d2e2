#include <gtest/gtest.h>
#include <unistd.h>

#include <atomic>
#include <string>

#include "IpAddress.h"
#include "KeyValueFormatParser.h"
#include "LogSupport.h"
#include "Logger.h"
#include "QNException.h"
#include "Reader.h"
#include "System.h"
#include "TestSupport.h"
#include "ThreadComponent.h"
#include "ThreadPool.h"
#include "Writer.h"
#include "programs/TestSystem.h"

namespace {

constexpr unsigned int kHour = 3600u * 1000u;

// A thread that sleeps until it is asked to exit.
class WaitingComponent : public QNCThreadComponent {
 public:
  explicit WaitingComponent(const char* apName) : QNCThreadComponent(apName) {}
  ~WaitingComponent() override { waitForExit(); }

 protected:
  void run() override {
    while (!waitForExitRequest(kHour)) {
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

class NullReader : public QNCReader {
 public:
  void read(QNCPointer<QNCBuffer>&, unsigned int& arCount) override { arCount = 0; }
  bool waitForActivity(unsigned int) override { return false; }
};

class NullWriter : public QNCWriter {
 public:
  void write(const QNCPointer<QNCBuffer>&, unsigned int& arCount) override { arCount = 0; }
};

// The application side of the tests: the three abstract operations, and access to the tables.
class TestSystem : public QNCBareTestSystem {
 public:
  TestSystem() { mName = QNCString("testsystem"); }
  ~TestSystem() override {
    // The threads must be gone before the tables that own them: tell and join them. A
    // component that refuses with another exception has ended by itself (RefusingComponent).
    try {
      makeThreadsToExit();
    } catch (const QNCException&) {
    }
    waitForThreads();
  }

  void setCommandLineArgumentDesc() override { ++mDescriptorCalls; }
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
  void addReader() { mReaders.append(QNCPointer<QNCReader>(new NullReader, QNPST_Individual, QNPAT_New)); }
  void addWriter() { mWriters.append(QNCPointer<QNCWriter>(new NullWriter, QNPST_Individual, QNPAT_New)); }
  bool hasParsers() const { return !mCommandLineParser.isNull() && !mConfigFileParser.isNull(); }

  int mDescriptorCalls = 0;
  int mShutDownEvents = 0;
  bool mFlagAtShutDownEvent = true;
};

class SystemLifecycleTest : public qntest::LoggedTest {};

using qntest::expectInOrder;
using qntest::levelOf;

TEST_F(SystemLifecycleTest, StartsComponentsInOrderBeforePoolsAndWaitsInTheSameOrder) {
  TestSystem lSystem;
  lSystem.addComponent(new WaitingComponent("alpha"));
  lSystem.addComponent(new WaitingComponent("beta"));
  lSystem.addPool("workers", 2);
  lSystem.startThreads();
  EXPECT_TRUE(lSystem.isInited(0));
  EXPECT_TRUE(lSystem.isInited(1));
  lSystem.makeThreadsToExit();
  lSystem.waitForThreads();
  const std::string lLog = log();
  expectInOrder(
      lLog, {"Started Thread: alpha\n", "Started Thread: beta\n", "Started Threads in Thread Pool: workers\n",
             "Waiting for 'alpha' thread to exit\n", "Waiting for 'beta' thread to exit\n",
             "Waiting for threads in 'workers' ThreadPool to exit\n"});
  for (const char* lpLine :
       {"Started Thread: alpha", "Started Threads in Thread Pool: workers",
        "Waiting for 'alpha' thread to exit", "Waiting for threads in 'workers' ThreadPool to exit"})
    EXPECT_EQ("-N-", levelOf(lLog, lpLine)) << lpLine;
}

// Nothing is caught in startThreads: the component that cannot start ends it, and neither the
// components after it nor the pools are started.
TEST_F(SystemLifecycleTest, StartThreadsStopsAtTheFirstComponentThatCannotStart) {
  TestSystem lSystem;
  lSystem.addComponent(new WaitingComponent("first")).init();  // a second init() is refused
  lSystem.addComponent(new WaitingComponent("second"));
  QNCThreadPool& lPool = lSystem.addPool("late", 1);
  EXPECT_THROW(lSystem.startThreads(), QNCInvalidEx);
  EXPECT_FALSE(lSystem.isInited(1));
  lPool.submit([] {});  // a pool that was never started still accepts work: it was not finished
  EXPECT_EQ(std::string::npos, log().find("Started Thread"));
}

// isInited is false for every number at or beyond the table size, before and after the start.
TEST_F(SystemLifecycleTest, StartThreadStartsOneComponentAndRefusesABadIndex) {
  TestSystem lSystem;
  EXPECT_FALSE(lSystem.isInited(0));
  lSystem.addComponent(new WaitingComponent("solo"));
  lSystem.addComponent(new WaitingComponent("other"));
  EXPECT_EQ("Vector out of bounds access", qntest::thrown<QNCInvalidEx>([&] { lSystem.startThread(2); }));
  EXPECT_FALSE(lSystem.isInited(0));
  lSystem.startThread(0);
  EXPECT_TRUE(lSystem.isInited(0));
  EXPECT_FALSE(lSystem.isInited(1));
  EXPECT_NE(std::string::npos, log().find("Started Thread: solo\n"));
  lSystem.startThread(1);
  EXPECT_TRUE(lSystem.isInited(1));
  EXPECT_FALSE(lSystem.isInited(2));
  EXPECT_FALSE(lSystem.isInited(~0u));
}

// A component that refuses the request with QNCInvalidEx must not keep the components after it
// or any pool from being told; otherwise waitForThreads would hang for good.
TEST_F(SystemLifecycleTest, MakeThreadsToExitGoesOnPastAComponentThatRefuses) {
  TestSystem lSystem;
  auto& lRefusing = lSystem.addComponent(new RefusingComponent<QNCInvalidEx>("refusing"));
  auto& lWaiting = lSystem.addComponent(new WaitingComponent("waiting"));
  QNCThreadPool& lFirst = lSystem.addPool("first", 1);
  QNCThreadPool& lSecond = lSystem.addPool("second", 1);
  lSystem.startThreads();

  lSystem.makeThreadsToExit();
  EXPECT_EQ(1, lRefusing.mRequests);
  EXPECT_TRUE(lWaiting.isExitRequested());
  EXPECT_THROW(lFirst.submit([] {}), QNCExitConditionEx);
  EXPECT_THROW(lSecond.submit([] {}), QNCExitConditionEx);
  lSystem.waitForThreads();  // returns: every thread was told

  // A never-started component throws QNCInvalidEx from the base requestExit: also passed over.
  TestSystem lUnstarted;
  lUnstarted.addComponent(new WaitingComponent("never"));
  QNCThreadPool& lPool = lUnstarted.addPool("pool", 1);
  lUnstarted.makeThreadsToExit();
  EXPECT_THROW(lPool.submit([] {}), QNCExitConditionEx);
}

TEST_F(SystemLifecycleTest, MakeThreadsToExitLetsOtherExceptionsThrough) {
  TestSystem lSystem;
  lSystem.addComponent(new RefusingComponent<QNCNotFoundEx>("odd"));
  lSystem.startThreads();
  EXPECT_THROW(lSystem.makeThreadsToExit(), QNCNotFoundEx);
  EXPECT_TRUE(lSystem.isSetForExit());
}

TEST_F(SystemLifecycleTest, ExitFlagNeverReturnsToFalse) {
  TestSystem lSystem;
  EXPECT_FALSE(lSystem.isSetForExit());
  lSystem.makeThreadsToExit();
  EXPECT_FALSE(lSystem.mFlagAtShutDownEvent);  // the event comes before the flag is set
  EXPECT_TRUE(lSystem.isSetForExit());
  lSystem.makeThreadsToExit();  // a second signal repeats every step
  lSystem.setForExit();
  EXPECT_EQ(2, lSystem.mShutDownEvents);
  EXPECT_TRUE(lSystem.mFlagAtShutDownEvent);
  EXPECT_TRUE(lSystem.isSetForExit());
}

TEST_F(SystemLifecycleTest, PreInitCreatesTheParsersAndAsksForTheDescriptors) {
  TestSystem lSystem;
  lSystem.preInit();
  EXPECT_EQ(QNOS_Linux, lSystem.getOs());
  EXPECT_FALSE(lSystem.getOsVariant().isEmpty());
  EXPECT_TRUE(lSystem.hasParsers());
  EXPECT_EQ(1, lSystem.mDescriptorCalls);
  const std::string lLog = log();
  expectInOrder(lLog, {"preInit", "Entered", "Creating Command Line Parser...", "Creating Config File Parser...",
                       "Setting the command line argument descriptor", "Left"});
  EXPECT_EQ("-T-", levelOf(lLog, "Creating Config File Parser..."));
}

TEST_F(SystemLifecycleTest, InitFindsTheHostNameAndAddress) {
  TestSystem lSystem;
  lSystem.init();
  char lHostName[256] = {0};
  ASSERT_EQ(0, gethostname(lHostName, sizeof lHostName - 1));
  EXPECT_STREQ(lHostName, lSystem.getHostName().get());
  ASSERT_FALSE(lSystem.getAddress().isNull());
  const std::string lAddress = lSystem.getAddress()->getStringForm();
  const std::string lNumber = std::to_string(lSystem.getAddress()->getNumericForm());
  const std::string lLog = log();
  expectInOrder(lLog, {std::string("HostName: ") + lHostName + "\n", "Setting IP Address...",
                       "The IP Address of the host in number form: " + lNumber + " \n",
                       "Setting the IP Address", "IpAddress: " + lAddress + "\n"});
  const std::pair<const char*, const char*> lLevels[] = {
      {"HostName: ", "-N-"},
      {"Setting IP Address...", "-T-"},
      {"The IP Address of the host in number form: ", "-I-"},
      {"IpAddress: ", "-N-"}};
  for (const auto& lrLevel : lLevels)
    EXPECT_EQ(lrLevel.second, levelOf(lLog, lrLevel.first)) << lrLevel.first;
}

// Death tests run without a logger, so the assertion line reaches standard error.
TEST(SystemLifecycleDeathTest, ReaderOrWriterNumberAtTheTableSizeEndsTheProcess) {
  TestSystem lSystem;
  lSystem.addReader();
  lSystem.addWriter();
  EXPECT_FALSE(lSystem.getReader(0).isNull());
  EXPECT_FALSE(lSystem.getWriter(0).isNull());
  EXPECT_EXIT(lSystem.getReader(1), ::testing::ExitedWithCode(1),
              "Assertion \\[ acReaderNo < this->mReaders.numberOfElements\\(\\) \\] failed");
  EXPECT_EXIT(lSystem.getWriter(1), ::testing::ExitedWithCode(1),
              "Assertion \\[ acWriterNo < this->mWriters.numberOfElements\\(\\) \\] failed");
}

}  // namespace
