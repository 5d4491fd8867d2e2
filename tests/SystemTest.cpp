// The system object within one process: the driver's free functions (the log path),
// starting and stopping the threads, the settings and the common command-line options.

#include <gtest/gtest.h>

#include <atomic>
#include <cstdlib>
#include <thread>

#include "LogSupport.h"
#include "MultiType.h"
#include "Mutex.h"
#include "NumericIdManager.h"
#include "SystemGlobals.h"
#include "TableSystem.h"

namespace {

using qntest::expectInOrder;

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

// --- Threads. A component refuses exit requests with the exception it is given.
template <class E>
qntest::ScriptedComponent* refusing(const char* apName, std::atomic<int>& arRequests) {
  auto* lpComponent = new qntest::ScriptedComponent([](qntest::ScriptedComponent&) {}, apName);
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
  auto& lWaiting = lSystem.addComponent(new qntest::ScriptedComponent({}, "beta"));
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
  lSystem.addComponent(new qntest::ScriptedComponent({}, "first")).init();  // a second init() is refused
  lSystem.addComponent(new qntest::ScriptedComponent({}, "second"));
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
            qntest::thrown<QNCInvalidEx>([&] { mSystem.returnNumericId(0); }));
  for (unsigned int lRefused : {1u, 4u}) EXPECT_THROW(mSystem.returnNumericId(lRefused), QNCInvalidEx);
  EXPECT_EQ(3u, lNext());
  EXPECT_EQ(1u, lNext());
  EXPECT_EQ(4u, lNext());
  lId = 77;
  EXPECT_EQ("No numeric identifier is free: all of 1..4 are in use",
            qntest::thrown<QNCNotFoundEx>([&] { mSystem.generateNumericId(lId); }));
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
  // preInit and processCommandLine as SysInit runs them, with argv[0] = "sensortest".
  void process(const std::vector<std::string>& acrArguments) {
    std::vector<std::string> lStorage{"sensortest"};
    lStorage.insert(lStorage.end(), acrArguments.begin(), acrArguments.end());
    std::vector<char*> lArgv;
    for (std::string& lrArgument : lStorage) lArgv.push_back(&lrArgument[0]);
    lArgv.push_back(nullptr);
    preInit();
    processCommandLine(static_cast<int>(lStorage.size()), lArgv.data());
  }
  int value(const char* apKey) {
    QNCPointer<QNCMultiType> lValue;
    getSetting(apKey, lValue);
    return std::string(apKey) == "Daemonize" ? static_cast<signed char>(*lValue)
                                             : static_cast<int>(static_cast<unsigned int>(*lValue));
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
  CommandLineSystem lSystem;
  lSystem.process({"-d", "16", "-I", "30"});
  EXPECT_EQ(16, lSystem.value("DebugLevel"));
  EXPECT_EQ(41, lSystem.value("HbTimeout"));
  EXPECT_EQ(1, lSystem.value("Daemonize"));
  EXPECT_EQ(30, lSystem.value("DBReopenInterval"));
  EXPECT_EQ(4u, lSystem.settingCount()) << "ConfigFile is written only for -c";
  CommandLineSystem lBare;
  lBare.process({});
  EXPECT_EQ(249, lBare.value("DebugLevel"));
  EXPECT_EQ(15, lBare.value("DBReopenInterval"));
  const struct {
    const char *mOption, *mValue, *mKey;
    int mExpected;
  } lCases[] = {
      {"-D", "true", "Daemonize", 1},      {"-D", "TRUE", "Daemonize", 0},
      {"-D", "1", "Daemonize", 0},         {"-I", "0", "DBReopenInterval", 0},
      {"-I", "-5", "DBReopenInterval", 0}, {"-I", "7min", "DBReopenInterval", 7},
      {"-d", "abc", "DebugLevel", 0},      {"-b", "45", "HbTimeout", 45},
  };
  for (const auto& lrCase : lCases) {
    CommandLineSystem lCaseSystem;
    lCaseSystem.process({lrCase.mOption, lrCase.mValue});
    EXPECT_EQ(lrCase.mExpected, lCaseSystem.value(lrCase.mKey)) << lrCase.mOption << " " << lrCase.mValue;
  }
  expectInOrder(
      log(), {"Command line : '-d 16 -I 30'", "Processed the command line successfully : -d 16 -I 30",
              "No arguments in command line", "The -I option is not specified, using default interval 15 min",
              "Zero/Invalid value specified for -I option. DB won't be reopened at fixed intervals"});
}

}  // namespace
