// The system object within one process: the driver's free functions (the log path), the
// threads (a thread component, a thread pool, the system starting and stopping them, and what
// happens when one of them dies), the settings and the common command-line options; then the
// readers of outside text under them: the configuration file parser, the command-line parser
// and the decoding of setting values. The fuzz targets (fuzz/) hold those to their properties
// over stored inputs in every build; these cases pin the exact results and messages.

#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <future>
#include <iterator>
#include <sstream>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include "CommandLineParser.h"
#include "KeyValueFormatParser.h"
#include "LogSupport.h"
#include "MultiType.h"
#include "Mutex.h"
#include "NumericIdManager.h"
#include "RunStatus.h"
#include "SystemGlobals.h"
#include "TableSystem.h"
#include "ThreadComponent.h"
#include "ThreadPool.h"

namespace {

using qntest::expectInOrder;
using qntest::thrown;

// The log path setLogFilePath composes with QN_LOG_DIR set to apDir (unset when null), and the
// log directory then reported. The directory is read from the environment each time.
std::string composed(const char* apDir, const std::string& acrName) {
  apDir != nullptr ? setenv("QN_LOG_DIR", apDir, 1) : unsetenv("QN_LOG_DIR");
  setLogFilePath(acrName.c_str());
  QNCString lPath("stale"), lDir("stale");
  getLogFilePath(lPath);
  getLogDir(lDir);
  return std::string(lPath.get()) + "|" + lDir.get();
}

TEST(DriverTest, LogPathIsTheVariableOrTmpAndTheNameCutTo511Characters) {
  const std::string lFits(506, 'f'), lLong(600, 'n');
  EXPECT_EQ("/var/log/app/svc.log|/var/log/app", composed("/var/log/app", "svc.log"));
  EXPECT_EQ("/tmp/svc.log|/tmp", composed(nullptr, "svc.log"));
  EXPECT_EQ("/svc.log|", composed("", "svc.log"));
  EXPECT_EQ("/var/log/app//svc.log|/var/log/app/", composed("/var/log/app/", "svc.log"));
  EXPECT_EQ("relative/svc.log|relative", composed("relative", "svc.log"));
  EXPECT_EQ("/tmp/" + lFits + "|/tmp", composed(nullptr, lFits));  // exactly 511: kept whole
  EXPECT_EQ(("/var/log/app/" + lLong).substr(0, 511) + "|/var/log/app", composed("/var/log/app", lLong));
  EXPECT_EQ("/tmp/a|/tmp", composed(nullptr, "a"));  // nothing of the long one is left behind
  unsetenv("QN_LOG_DIR");
}

// --- A thread component and a thread pool on their own.
constexpr unsigned int kHour = 3600u * 1000u;

using qntest::ScriptedComponent;

// A body in a long wait ends at once on the exit request, made during the wait, before it (a wait
// that only listens for notifications would sleep the whole period instead of seeing the request
// already given), or by destroying the started, never-joined component: the base destructor wakes
// and joins the thread (a joinable std::thread destroyed would reach std::terminate).
std::atomic<bool> gsWoken{false};

TEST(ThreadComponentTest, ExitRequestEndsALongWaitMadeDuringOrBeforeItOrByTheDestructor) {
  for (const char* lWay : {"during", "before", "destructor"}) {
    const bool lBefore = lWay[0] == 'b', lByDestructor = lWay[0] == 'd';
    std::promise<void> lStarted, lGate;
    std::shared_future<void> lGateOpen = lGate.get_future().share();
    gsWoken = false;
    auto* lpComponent = new ScriptedComponent(
        [&](ScriptedComponent& arSelf) {
          // Copied first: once started, the destructor way may free this closure at any time.
          const bool lWaitForGate = lBefore;
          const std::shared_future<void> lGateToWaitFor = lGateOpen;
          lStarted.set_value();
          if (lWaitForGate) lGateToWaitFor.wait();
          gsWoken = arSelf.waitForExitRequest(kHour);
        },
        "scripted", !lByDestructor);
    lpComponent->init();
    lStarted.get_future().wait();
    if (!lByDestructor) lpComponent->requestExit();
    lGate.set_value();
    if (!lByDestructor) lpComponent->waitForExit();  // an hour, unless the request ended the wait
    delete lpComponent;
    EXPECT_TRUE(gsWoken) << lWay;
  }
}

// A request before init() is refused; init() runs once; joins and requests after the end are
// no-ops. Fault pinned: the owner joins (holding the join lock) while the body waits for its own
// exit; the body blocked on that lock and the join never finished.
TEST(ThreadComponentTest, LifecycleStatesAndRepeatedCalls) {
  std::atomic<int> lSeen{0};
  ScriptedComponent lComponent([&](ScriptedComponent& arSelf) {
    lSeen += arSelf.isExitRequested() ? 100 : 1;
    lSeen += arSelf.waitForExitRequest(1) ? 100 : 1;
    lSeen += thrown<QNCInvalidEx>([&] { arSelf.waitForExit(); }) == "(nothing thrown)" ? 100 : 1;
  });
  EXPECT_EQ("Thread 'scripted' was never started", thrown<QNCInvalidEx>([&] { lComponent.requestExit(); }));
  lComponent.waitForExit();  // never started: returns at once
  lComponent.init();
  EXPECT_THROW(lComponent.init(), QNCInvalidEx);
  lComponent.waitForExit();
  EXPECT_EQ(3, lSeen.load());
  EXPECT_FALSE(lComponent.isExitRequested());
  lComponent.waitForExit();            // already joined: returns at once
  EXPECT_TRUE(lComponent.isInited());  // started once, stays so after the end
  lComponent.requestExit();            // the thread has ended: no effect, no failure
}

// Tasks submitted before init() wait for the workers; every task runs exactly once on workers
// that take from one queue at the same time.
TEST(ThreadPoolTest, EveryTaskRunsExactlyOnce) {
  std::vector<std::atomic<int>> lRuns(2000);
  QNCThreadPool lPool("counters", 3);
  for (unsigned int lIndex = 0; lIndex < lRuns.size(); ++lIndex) {
    if (lIndex == 2) lPool.init();
    lPool.submit([&lRuns, lIndex] { ++lRuns[lIndex]; });
  }
  lPool.finish();
  lPool.waitForThreads();
  for (unsigned int lIndex = 0; lIndex < lRuns.size(); ++lIndex) ASSERT_EQ(1, lRuns[lIndex].load()) << lIndex;
}

// finish() while every worker is busy (both inside a task at once: the workers run together),
// called directly or by the destructor of a pool that was never finished: what was queued before
// still runs, a later submission is refused, and the workers end (destroying joinable threads
// would terminate the process).
TEST(ThreadPoolTest, FinishWhileTasksRunDrainsTheQueueAndRefusesLaterTasks) {
  for (const bool lByDestructor : {false, true}) {
    std::promise<void> lGate;
    std::shared_future<void> lGateOpen = lGate.get_future().share();
    std::atomic<int> lBusy{0}, lDone{0};
    {
      QNCThreadPool lPool("drain", 2);
      lPool.init();
      for (int lIndex = 0; lIndex < 2; ++lIndex) {
        lPool.submit([&] {
          ++lBusy;
          lGateOpen.wait();
          ++lDone;
        });
      }
      for (int lIndex = 0; lIndex < 5; ++lIndex) lPool.submit([&] { ++lDone; });
      EXPECT_TRUE(qntest::eventually([&] { return lBusy.load() == 2; })) << "the workers do not run together";
      if (!lByDestructor) {
        lPool.finish();
        EXPECT_EQ("ThreadPool 'drain' is finished: task refused",
                  thrown<QNCExitConditionEx>([&] { lPool.submit([] {}); }));
      }
      lGate.set_value();
    }
    EXPECT_EQ(7, lDone) << lByDestructor;
  }
}

// Fault pinned: the owner joins (holding the join lock) while a task asks to wait for the pool
// too; the task blocked on that lock and the join never finished.
TEST(ThreadPoolTest, MisuseIsRefusedWithClearErrors) {
  EXPECT_EQ("ThreadPool 'none' needs at least one thread",
            thrown<QNCInvalidEx>([] { QNCThreadPool lEmpty("none", 0); }));
  std::atomic<int> lRefused{0};
  QNCThreadPool lPool("self", 1);
  EXPECT_THROW(lPool.submit(QNCThreadPool::QNTTask()), QNCInvalidEx);
  lPool.waitForThreads();  // never started: returns at once
  lPool.init();
  EXPECT_THROW(lPool.init(), QNCInvalidEx);
  lPool.submit(
      [&] { lRefused += thrown<QNCInvalidEx>([&] { lPool.waitForThreads(); }) != "(nothing thrown)"; });
  lPool.finish();
  lPool.finish();  // idempotent
  lPool.waitForThreads();
  lPool.waitForThreads();  // already joined
  EXPECT_EQ(1, lRefused);
}

// --- Threads that die. The cases run in file order: the restart case first, while the run has
// not failed yet.
qntest::TableSystem* gspSystem = nullptr;
std::atomic<int> gsExitRequests{0};
void requestExit() {
  ++gsExitRequests;
  gspSystem->makeThreadsToExit();
}

class ThreadFailureTest : public qntest::LoggedTest {
 protected:
  void SetUp() override {
    LoggedTest::SetUp();
    gspSystem = &mSystem;
    QNSetExitRequest(requestExit);
  }
  void TearDown() override {
    QNSetExitRequest(nullptr);
    LoggedTest::TearDown();
  }
  qntest::TableSystem mSystem;
};

// Two failures, each restarted by the override: the third run serves until the exit request; the
// run has not failed and nobody asked for an exit.
TEST_F(ThreadFailureTest, OverrideRestartsTheWork) {
  ScriptedComponent* lpComponent = &mSystem.addComponent(new ScriptedComponent(
      [](ScriptedComponent& arSelf) {
        if (arSelf.mRuns.load() <= 2) throw std::runtime_error("sensor bus gone");
        while (!arSelf.waitForExitRequest(1000)) {
        }
      },
      "Restarter"));
  lpComponent->mRestart = true;
  mSystem.startThreads();
  while (lpComponent->mRuns.load() < 3) std::this_thread::yield();
  mSystem.makeThreadsToExit();
  mSystem.waitForThreads();
  EXPECT_EQ(3, lpComponent->mRuns.load());
  EXPECT_FALSE(hasRunFailed());
  EXPECT_EQ(0, getRunExitStatus());
  EXPECT_EQ(0, gsExitRequests.load());  // the first failure case of the file
  EXPECT_EQ(2u, qntest::countOf(log(), "Thread 'Restarter' restarts its work"));
}

// A component that dies, beside one that only ends on request and a pool: the dead one's error
// line names it and the exception, the run is failed (status 1), and the exit request it started
// ends the others, so waitForThreads returns. Before: the others ran on and the status stayed 0.
TEST_F(ThreadFailureTest, FailingPoolTaskFailsTheRun) {
  const int lBefore = gsExitRequests.load();
  const std::vector<std::pair<std::function<void()>, std::string>> lCases = {
      {[] { throw QNCInvalidEx("sensor lost", 6); }, "sensor lost"},
      {[] { throw std::runtime_error("report lost"); }, "report lost"},
      {[] { throw 42; }, "unknown exception"}};
  QNCThreadPool lPool("Failing", 1);
  std::atomic<int> lLaterTasks{0};
  lPool.init();
  for (const auto& lrCase : lCases) lPool.submit(lrCase.first);
  lPool.submit([&lLaterTasks] { ++lLaterTasks; });
  lPool.finish();
  lPool.waitForThreads();
  EXPECT_EQ(1, lLaterTasks.load());
  EXPECT_EQ(lBefore + 3, gsExitRequests.load());
  const std::string lLog = log();
  for (const auto& lrCase : lCases)
    EXPECT_EQ("-E-", qntest::levelOf(lLog, "ThreadPool 'Failing': task failed: " + lrCase.second)) << lLog;
}

// --- The system starting and stopping its threads. A component refuses exit requests with the
// exception it is given.
template <class E>
ScriptedComponent* refusing(const char* apName, std::atomic<int>& arRequests) {
  auto* lpComponent = new ScriptedComponent([](ScriptedComponent&) {}, apName);
  lpComponent->mRefuse = [&arRequests] {
    ++arRequests;
    throw E("cannot take the request", 6);
  };
  return lpComponent;
}

class ThreadsSystem : public qntest::TableSystem {
 public:
  ~ThreadsSystem() override {
    // The threads must be gone before the tables that own them.
    try {
      makeThreadsToExit();
    } catch (const QNCException&) {
    }
    waitForThreads();
  }
  void createShutDownEvent() override {
    ++mShutDownEvents;
    mFlagAtShutDownEvent = isSetForExit();
  }
  int mShutDownEvents = 0;
  bool mFlagAtShutDownEvent = true;
};

class SystemTest : public qntest::LoggedTest {};

// A component that refuses the exit request with QNCInvalidEx (as one never started does) must
// not keep the components after it or any pool from being told, or waitForThreads would hang.
TEST_F(SystemTest, StartsAndWaitsInOrderAndTellsEveryThreadPastOneThatRefuses) {
  std::atomic<int> lRequests{0};  // outlives the system, whose destructor asks again
  ThreadsSystem lSystem;
  lSystem.addComponent(refusing<QNCInvalidEx>("alpha", lRequests));
  auto& lWaiting = lSystem.addComponent(new ScriptedComponent({}, "beta"));
  QNCThreadPool& lWorkers = lSystem.addPool("workers", 2);
  QNCThreadPool& lSpare = lSystem.addPool("spare", 1);
  EXPECT_FALSE(lSystem.isInited(0));
  lSystem.startThreads();
  EXPECT_TRUE(lSystem.isInited(0) && lSystem.isInited(1));
  EXPECT_FALSE(lSystem.isInited(2));
  lSystem.makeThreadsToExit();
  EXPECT_EQ(1, lRequests.load());
  EXPECT_TRUE(lWaiting.isExitRequested());
  EXPECT_THROW(lWorkers.submit([] {}), QNCExitConditionEx);
  EXPECT_THROW(lSpare.submit([] {}), QNCExitConditionEx);
  lSystem.waitForThreads();  // returns: every thread was told
  expectInOrder(
      log(),
      {"Started Thread: alpha\n", "Started Thread: beta\n", "Started Threads in Thread Pool: workers\n",
       "Started Threads in Thread Pool: spare\n", "Waiting for 'alpha' thread to exit\n",
       "Waiting for 'beta' thread to exit\n", "Waiting for threads in 'workers' ThreadPool to exit\n",
       "Waiting for threads in 'spare' ThreadPool to exit\n"});
}

// Nothing is caught in startThreads: the component that cannot start ends it, and neither the
// components after it nor the pools are started: the service never runs without one of its threads.
TEST_F(SystemTest, StartThreadsStopsAtTheFirstComponentThatCannotStart) {
  ThreadsSystem lSystem;
  lSystem.addComponent(new ScriptedComponent({}, "first")).init();  // a second init() is refused
  lSystem.addComponent(new ScriptedComponent({}, "second"));
  QNCThreadPool& lPool = lSystem.addPool("late", 1);
  EXPECT_THROW(lSystem.startThreads(), QNCInvalidEx);
  EXPECT_FALSE(lSystem.isInited(1));
  lPool.submit([] {});  // a pool that was never started still accepts work: it was not finished
  EXPECT_EQ(std::string::npos, log().find("Started Thread"));
}

// Only QNCInvalidEx is passed over: another refusal reaches the caller, the flag already set; the
// shut-down event comes before the flag is set, and the flag never returns to false.
TEST_F(SystemTest, ExitFlagIsSetFirstAndNeverReturnsToFalse) {
  std::atomic<int> lRequests{0};  // outlives the system, whose destructor asks again
  ThreadsSystem lSystem;
  lSystem.addComponent(refusing<QNCNotFoundEx>("odd", lRequests));
  lSystem.startThreads();
  EXPECT_FALSE(lSystem.isSetForExit());
  EXPECT_THROW(lSystem.makeThreadsToExit(), QNCNotFoundEx);
  EXPECT_FALSE(lSystem.mFlagAtShutDownEvent);
  EXPECT_TRUE(lSystem.isSetForExit());
  EXPECT_THROW(lSystem.makeThreadsToExit(), QNCNotFoundEx);  // a second signal repeats every step
  lSystem.setForExit();
  EXPECT_EQ(2, lSystem.mShutDownEvents);
  EXPECT_TRUE(lSystem.isSetForExit());
}

// --- Settings. applySettings changes the process-wide log mask and heartbeat: restored after.
class SettingsSystem : public qntest::TableSystem {
 public:
  // Records the request instead of leaving the test process.
  void systemDaemonize(QNCString acDir, QNCString acIn, QNCString acOut, QNCString acErr) override {
    mDaemonizeCalls.push_back(std::string(acDir.get()) + "|" + acIn.get() + "|" + acOut.get() + "|" +
                              acErr.get());
  }
  void useIdentifierBound(unsigned int aBound) {
    mNumericIdManager = QNCPointer<QNCNumericIdManager>(new (std::nothrow) QNCNumericIdManager(aBound));
    mNidCreationLock = QNCPointer<QNCMutex>(new (std::nothrow) QNCMutex);
  }
  void add(const char* apKey, QNCMultiType* apValue) { addSetting(apKey, QNCPointer<QNCMultiType>(apValue)); }
  void addAll(QNCMultiType* apDebugLevel, QNCMultiType* apHbTimeout, QNCMultiType* apDaemonize) {
    if (apDebugLevel != nullptr) add("DebugLevel", apDebugLevel);
    if (apHbTimeout != nullptr) add("HbTimeout", apHbTimeout);
    if (apDaemonize != nullptr) add("Daemonize", apDaemonize);
  }
  std::vector<std::string> mDaemonizeCalls;
};

unsigned int current(void (*apGet)(unsigned int&)) {
  unsigned int lValue = 0;
  apGet(lValue);
  return lValue;
}

class SettingsTest : public ::testing::Test {
 protected:
  void TearDown() override {
    setLogCode(mSavedLogCode);
    setHbTimeout(mSavedHbTimeout);
  }

  SettingsSystem mSystem;
  const unsigned int mSavedLogCode = current(getLogCode), mSavedHbTimeout = current(getHbTimeout);
};

// Daemonize 1 (and nothing else) daemonizes. With -c the file must supply the three keys; a
// missing one ends start-up after the earlier ones were applied. A value of the wrong kind is an
// exception, not a value.
TEST_F(SettingsTest, ApplySettingsSetsTheLoggerDaemonizesOnlyForOneAndStopsAtABadKey) {
  mSystem.addAll(new QNCMultiType(121u), new QNCMultiType(45u),
                 new QNCMultiType(static_cast<signed char>(1)));
  mSystem.applySettings();
  EXPECT_EQ(121u, current(getLogCode));
  EXPECT_EQ(45u, current(getHbTimeout));
  EXPECT_EQ(std::vector<std::string>{"/|/dev/null|/dev/null|/dev/null"}, mSystem.mDaemonizeCalls);
  for (signed char lOther : {0, 2, -1}) {
    SettingsSystem lSystem;
    lSystem.addAll(new QNCMultiType(255u), new QNCMultiType(30u), new QNCMultiType(lOther));
    lSystem.applySettings();
    EXPECT_TRUE(lSystem.mDaemonizeCalls.empty()) << static_cast<int>(lOther);
  }
  SettingsSystem lMissing, lWrongKind;
  lMissing.addAll(new QNCMultiType(249u), nullptr, new QNCMultiType(static_cast<signed char>(1)));
  EXPECT_THROW(lMissing.applySettings(), QNCNotFoundEx);
  EXPECT_EQ(249u, current(getLogCode));
  EXPECT_EQ(30u, current(getHbTimeout));
  EXPECT_TRUE(lMissing.mDaemonizeCalls.empty());
  lWrongKind.addAll(new QNCMultiType("16"), new QNCMultiType(30u), new QNCMultiType(1u));
  EXPECT_THROW(lWrongKind.applySettings(), QNCInvalidEx);
}

// Each thread marks the identifier it holds in a shared table, then returns it; a second holder of
// the same identifier finds the mark already set. The small bound makes identifiers circulate.
TEST_F(SettingsTest, ConcurrentThreadsNeverHoldTheSameIdentifier) {
  constexpr unsigned int kBound = 8;
  mSystem.useIdentifierBound(kBound);
  std::vector<std::atomic<bool>> lHeld(kBound + 1);
  std::atomic<unsigned int> lFaults{0};
  std::vector<std::thread> lThreads;
  for (unsigned int lThread = 0; lThread < 4; ++lThread) {
    lThreads.emplace_back([&] {
      for (unsigned int lRound = 0; lRound < 4000; ++lRound) {
        unsigned int lId = 0;
        mSystem.generateNumericId(lId);
        ASSERT_TRUE(lId != 0 && lId <= kBound);
        lFaults += lHeld[lId].exchange(true);
        std::this_thread::yield();
        lHeld[lId].store(false);
        mSystem.returnNumericId(lId);
      }
    });
  }
  for (std::thread& lrThread : lThreads) lrThread.join();
  EXPECT_EQ(0u, lFaults.load());
}

// Identifiers start at 1 and returned ones come back first; one never issued, or returned twice,
// is refused (a double return would hand it to two users), and so is a request past the bound.
// A refusal that left mNidCreationLock held would block the next call for ever.
TEST_F(SettingsTest, IdentifiersAreReusedAndRefusalsLeaveTheLockFree) {
  mSystem.useIdentifierBound(4);
  unsigned int lId = 0;
  auto lNext = [&] {
    mSystem.generateNumericId(lId);
    return lId;
  };
  for (unsigned int lExpected = 1; lExpected <= 3; ++lExpected) EXPECT_EQ(lExpected, lNext());
  mSystem.returnNumericId(3);
  mSystem.returnNumericId(1);
  EXPECT_EQ("Numeric identifier 0 is not in use, cannot return it",
            thrown<QNCInvalidEx>([&] { mSystem.returnNumericId(0); }));
  for (unsigned int lRefused : {1u, 4u}) EXPECT_THROW(mSystem.returnNumericId(lRefused), QNCInvalidEx);
  EXPECT_EQ(3u, lNext());
  EXPECT_EQ(1u, lNext());
  EXPECT_EQ(4u, lNext());
  lId = 77;
  EXPECT_EQ("No numeric identifier is free: all of 1..4 are in use",
            thrown<QNCNotFoundEx>([&] { mSystem.generateNumericId(lId); }));
  EXPECT_EQ(77u, lId);
  mSystem.returnNumericId(2);
  EXPECT_EQ(2u, lNext());
}

// --- The common command-line options, run in-process ("-s" is followed by QnsensordTest, with a
// real instance to stop).
const QNSCommandLineArgumentDesc kCommonOptions[] = {
    {"-v", 0, "", ""},     {"-h", 0, "", ""},        {"-s", 0, "", ""},     {"-c", 1, "file", ""},
    {"-d", 1, "mask", ""}, {"-b", 1, "seconds", ""}, {"-D", 1, "bool", ""}, {"-I", 1, "minutes", ""},
};

class CommandLineSystem : public qntest::TableSystem {
 public:
  CommandLineSystem() { mName = "sensortest"; }
  void setCommandLineArgumentDesc() override {
    for (const QNSCommandLineArgumentDesc& lrDesc : kCommonOptions) mCommandLineArgumentDesc.append(lrDesc);
  }
  // preInit and processCommandLine as SysInit runs them, with argv[0] = "sensortest" and then the
  // words of acrLine; returns the settings "DebugLevel HbTimeout Daemonize DBReopenInterval".
  std::string process(const std::string& acrLine) {
    std::istringstream lWords("sensortest " + acrLine);
    std::vector<std::string> lArguments{std::istream_iterator<std::string>(lWords), {}};
    std::vector<char*> lArgv;
    for (std::string& lrArgument : lArguments) lArgv.push_back(&lrArgument[0]);
    lArgv.push_back(nullptr);
    preInit();
    processCommandLine(static_cast<int>(lArguments.size()), lArgv.data());
    std::string lValues;
    for (const std::string lKey : {"DebugLevel", "HbTimeout", "Daemonize", "DBReopenInterval"}) {
      QNCPointer<QNCMultiType> lValue;
      getSetting(lKey.c_str(), lValue);
      lValues += (lValues.empty() ? "" : " ") +
                 std::to_string(lKey == "Daemonize" ? static_cast<signed char>(*lValue)
                                                    : static_cast<int>(static_cast<unsigned int>(*lValue)));
    }
    return lValues;
  }
  unsigned int settingCount() const { return mSettings.numberOfElements(); }
};

// Logs to a file of its own, with a recognisable log mask and heartbeat, so the defaults can be
// told from constants. Nothing here applies the settings.
class CommandLineTest : public qntest::LoggedTest {
 protected:
  void SetUp() override {
    LoggedTest::SetUp();
    setLogCode(249);
    setHbTimeout(41);
  }
};

// An option given replaces only its own setting; the others take the logger's mask and heartbeat,
// daemonizing and the 15-minute interval. Numbers are read like atoi (a bad one is 0, a trailing
// word ignored) and Daemonize is 1 only for exactly "true".
TEST_F(CommandLineTest, GivenValuesReplaceOnlyTheirOwnDefaultsReadLikeAtoi) {
  const std::pair<const char*, const char*> lCases[] = {
      {"-d 16 -I 30", "16 41 1 30"}, {"", "249 41 1 15"},       {"-D true", "249 41 1 15"},
      {"-D TRUE", "249 41 0 15"},    {"-D 1", "249 41 0 15"},   {"-I 0", "249 41 1 0"},
      {"-I -5", "249 41 1 0"},       {"-I 7min", "249 41 1 7"}, {"-d abc", "0 41 1 15"},
      {"-b 45", "249 45 1 15"},
  };
  for (const auto& lrCase : lCases) {
    CommandLineSystem lSystem;
    EXPECT_EQ(lrCase.second, lSystem.process(lrCase.first)) << lrCase.first;
    EXPECT_EQ(4u, lSystem.settingCount()) << "ConfigFile is written only for -c";
  }
  expectInOrder(
      log(), {"Command line : '-d 16 -I 30'", "Processed the command line successfully : -d 16 -I 30",
              "No arguments in command line", "The -I option is not specified, using default interval 15 min",
              "Zero/Invalid value specified for -I option. DB won't be reopened at fixed intervals"});
}

// --- The readers of outside text.
class KeyValueFormatParserTest : public ::testing::Test {
 protected:
  std::string write(const std::string& acrText) {
    const std::string lPath = mDir.file("f" + std::to_string(mFiles++) + ".conf");
    qntest::writeFile(lPath, acrText);
    return lPath;
  }
  qntest::TempDir mDir;
  int mFiles = 0;
};

TEST_F(KeyValueFormatParserTest, ReadsKeysValuesAndLinesSkippingCommentsAndBlanks) {
  const std::string lPath = write(
      "# the sensor service\n\n   ; another comment\n  Port   =   4711  \n"
      "\tName\t=\tfront door\t\r\nQuery = a=b=c\nEmpty =\nlast=1");
  QNCKeyValueFormatParser lParser(QNCString(lPath.c_str()), QNCString(""), false, false);
  lParser.parse();
  QNCVector<QNCString> lKeys;
  lParser.getKeys(lKeys);
  std::string lJoined;
  for (unsigned int lIndex = 0; lIndex < lKeys.numberOfElements(); ++lIndex)
    lJoined += std::string(lKeys[lIndex].get()) + "=" + lParser.getValue(lKeys[lIndex]).get() + ":" +
               std::to_string(lParser.getLine(lKeys[lIndex])) + ";";
  EXPECT_EQ("Port=4711:4;Name=front door:5;Query=a=b=c:6;Empty=:7;last=1:8;", lJoined);
  EXPECT_FALSE(lParser.hasKey("name"));  // exact comparison by default
  EXPECT_NE(std::string::npos, thrown<QNCNotFoundEx>([&] { lParser.getValue("colour"); }).find("'colour'"));
  // Other comment markers, keys without regard to case, a later duplicate replacing the value.
  QNCKeyValueFormatParser lOther(
      QNCString(write("// note\n# not a comment = yes\nHOST = x\nhost = y\n").c_str()), QNCString("/"), true,
      true);
  lOther.parse();
  EXPECT_STREQ("yes", lOther.getValue("# not a comment").get());
  EXPECT_STREQ("y", lOther.getValue("Host").get());
  EXPECT_EQ(4u, lOther.getLine("host"));
}

TEST_F(KeyValueFormatParserTest, BadFilesAreRefusedNamingFileAndLine) {
  const struct {
    std::string mText;
    bool mFold;
    std::string mMessage;
  } lCases[] = {
      {"a = 1\n\njust words\n", false, ":3: expected 'key = value'"},
      {"  = 5\n", false, ":1: expected 'key = value'"},
      {std::string("a = 1\nb = x\0y\n", 14), false, ":2: expected 'key = value'"},
      {"a = 1\nb = 2\nA = 3\na = 4\n", false, ":4: key 'a' already set on line 1"},
      {"a = 1\nb = 2\nA = 3\na = 4\n", true, ":3: key 'A' already set on line 1"},
  };
  for (const auto& lrCase : lCases) {
    const std::string lPath = write(lrCase.mText);
    QNCKeyValueFormatParser lParser(QNCString(""), QNCString(""), lrCase.mFold, false);
    EXPECT_EQ(lPath + lrCase.mMessage,
              thrown<QNCException>([&] { lParser.parse(QNCString(lPath.c_str())); }));
  }
  // getUnsigned is held to an independent decimal reading by the KeyValueFormatParser fuzz target.
}

// A file that cannot be opened, read or parsed leaves what was read before; a good one replaces it.
TEST_F(KeyValueFormatParserTest, OnlyASuccessfulParseReplacesThePreviousContents) {
  const std::string lGood = write("a = 1\n");
  QNCKeyValueFormatParser lParser(QNCString(lGood.c_str()), QNCString(""), false, false);
  lParser.parse();
  const std::string lMissing = mDir.file("missing.conf");
  EXPECT_NE(std::string::npos, thrown<QNCOpenFailedEx>([&] {
                                 lParser.parse(QNCString(lMissing.c_str()));
                               }).find("'" + lMissing + "'"));
  EXPECT_NE(std::string::npos, thrown<QNCReadFailedEx>([&] {
                                 lParser.parse(QNCString(mDir.path().c_str()));  // opens, cannot be read
                               }).find("'" + mDir.path() + "'"));
  EXPECT_THROW(lParser.parse(QNCString(write("b = 2\nbroken\n").c_str())), QNCInvalidEx);
  EXPECT_STREQ("1", lParser.getValue("a").get());
  EXPECT_FALSE(lParser.hasKey("b"));
  EXPECT_EQ(lGood, lParser.getFilePath().get());
  const std::string lSecond = write("b = 2\n");
  lParser.parse(QNCString(lSecond.c_str()));
  EXPECT_FALSE(lParser.hasKey("a"));
  EXPECT_EQ(lSecond, lParser.getFilePath().get());
}

// The eight common options plus one of the application's own ("-n", with a value), and one whose
// descriptor fills its whole array (no NUL: matching must stay inside the array).
class CommandLineParserTest : public ::testing::Test {
 protected:
  CommandLineParserTest() {
    for (const char* lpOption : {"-v", "-h", "-s", "-abcdefghijklmno"}) add(lpOption, 0);
    for (const char* lpOption : {"-c", "-d", "-b", "-D", "-I", "-n"}) add(lpOption, 1);
  }
  void add(const char* apOption, unsigned int aTakesValue) {
    QNSCommandLineArgumentDesc lDesc = {};
    memcpy(lDesc.mOption, apOption, std::min(strlen(apOption), sizeof lDesc.mOption));
    lDesc.mTakesValue = aTakesValue;
    mDesc.append(lDesc);
  }
  // "" when run() accepts the line, else the message of its QNCInvalidEx.
  std::string parse(const char* apLine) {
    mParser.setCommandLine(apLine);
    mParser.setArgumentDesc(mDesc);
    const std::string lMessage = thrown<QNCInvalidEx>([&] { mParser.run(); });
    return lMessage == "(nothing thrown)" ? "" : lMessage;
  }
  QNCVector<QNSCommandLineArgumentDesc> mDesc;
  QNCCommandLineParser mParser;
};

// QnsensordTest pins the usage errors for an unknown option, a missing value and a flag given one;
// the command-line fuzz target holds every value found to the word after its option.
TEST_F(CommandLineParserTest, ValuesFlagsAndRefusalsNamingTheOffendingWord) {
  ASSERT_EQ("", parse("  -d 16\t-v   -I -5 -c /etc/qn.conf -abcdefghijklmno"));
  const std::pair<const char*, const char*> lRefusals[] = {
      {"-d16", "Unknown option '-d16'"},
      {"-abcdefghijklmnop", "Unknown option '-abcdefghijklmnop'"},
      {"start -v", "Unexpected argument 'start'"},
      {"-d 16 17", "Unexpected argument '17'"},
      {"-s -s", "Option '-s' given more than once"},
  };
  for (const auto& lrRefusal : lRefusals) {
    EXPECT_EQ(lrRefusal.second, parse(lrRefusal.first));
    EXPECT_EQ(QNCLPS_Failed, mParser.getState());
  }
  // A failed run keeps nothing of an earlier successful one: a handler would act on options that
  // are not on the current line.
  QNCPointer<QNCCommandLineArgument> lArgument;
  EXPECT_EQ("Option '-d' is not on the command line",
            thrown<QNCNotFoundEx>([&] { mParser.getArgument("-d", lArgument); }));
  EXPECT_TRUE(lArgument.isNull());
}

// Conversions and decoding never produce a value the setting does not hold or the text does not
// say; the old value stays.
TEST(MultiTypeTest, WrongKindsAndBadTextsAreRefusedWithClearMessages) {
  const QNCMultiType lText("/etc/qn.conf"), lFlag(static_cast<signed char>(1)), lNumber(16u);
  EXPECT_EQ("Setting value holds text, not an unsigned integer",
            thrown<QNCInvalidEx>([&] { (void)static_cast<unsigned int>(lText); }));
  EXPECT_EQ("Setting value holds a signed byte, not an unsigned integer",
            thrown<QNCInvalidEx>([&] { (void)static_cast<unsigned int>(lFlag); }));
  EXPECT_EQ("Setting value holds an unsigned integer, not a signed byte",
            thrown<QNCInvalidEx>([&] { (void)static_cast<signed char>(lNumber); }));
  EXPECT_EQ("Setting value holds an unsigned integer, not text",
            thrown<QNCInvalidEx>([&] { (void)lNumber.getText(); }));
  QNCMultiType lValue(42u), lByte(static_cast<signed char>(3));
  EXPECT_EQ("' 12' is not an unsigned integer", thrown<QNCInvalidEx>([&] { lValue.decode(" 12"); }));
  EXPECT_EQ("'128' is not a signed byte", thrown<QNCInvalidEx>([&] { lByte.decode("128"); }));
  EXPECT_EQ(42u, static_cast<unsigned int>(lValue));
  EXPECT_EQ(3, static_cast<signed char>(lByte));
}

}  // namespace
