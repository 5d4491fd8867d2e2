#include <gtest/gtest.h>

#include <atomic>
#include <string>
#include <thread>
#include <vector>

#include "Logger.h"
#include "MultiType.h"
#include "Mutex.h"
#include "NumericIdManager.h"
#include "QNException.h"
#include "System.h"
#include "TestSupport.h"
#include "programs/TestSystem.h"

namespace {

class SettingsTestSystem : public QNCBareTestSystem {
 public:
  // Records the request instead of leaving the test process.
  void systemDaemonize(QNCString acDir, QNCString acStdIn, QNCString acStdOut, QNCString acStdErr) override {
    mDaemonizeCalls.push_back(std::string(acDir.get()) + "|" + acStdIn.get() + "|" + acStdOut.get() + "|" +
                              acStdErr.get());
  }

  // What init() creates for identifiers, with a bound small enough to run out in a test.
  void useIdentifierBound(unsigned int aBound) {
    mNumericIdManager = QNCPointer<QNCNumericIdManager>(new (std::nothrow) QNCNumericIdManager(aBound));
    mNidCreationLock = QNCPointer<QNCMutex>(new (std::nothrow) QNCMutex);
  }

  void add(const char* apKey, QNCMultiType* apValue) { addSetting(apKey, QNCPointer<QNCMultiType>(apValue)); }

  std::vector<std::string> mDaemonizeCalls;
};

// applySettings changes the process-wide log mask and heartbeat: put them back after each test.
class SystemSettingsTest : public ::testing::Test {
 protected:
  void SetUp() override {
    getLogCode(mSavedLogCode);
    getHbTimeout(mSavedHbTimeout);
  }
  void TearDown() override {
    setLogCode(mSavedLogCode);
    setHbTimeout(mSavedHbTimeout);
  }

  SettingsTestSystem mSystem;
  unsigned int mSavedLogCode = 0;
  unsigned int mSavedHbTimeout = 0;
};

// The store hands out the stored value itself; a second value for a key is refused and the first
// stays; a missing key leaves the caller's pointer alone.
TEST_F(SystemSettingsTest, SettingsAreSharedByReferenceAndKeyedOnce) {
  QNCPointer<QNCMultiType> lOriginal(new (std::nothrow) QNCMultiType(15u));
  mSystem.addSetting("DBReopenInterval", lOriginal);
  QNCPointer<QNCMultiType> lFirst;
  mSystem.getSetting("DBReopenInterval", lFirst);
  EXPECT_EQ(lOriginal.get(), lFirst.get());
  lFirst->set(30u);
  QNCPointer<QNCMultiType> lSecond;
  mSystem.getSetting("DBReopenInterval", lSecond);
  EXPECT_EQ(30u, static_cast<unsigned int>(*lSecond));

  EXPECT_EQ("Element already exists in map.. can't insert", qntest::thrown<QNCExistsEx>([&] {
              mSystem.add("DBReopenInterval", new (std::nothrow) QNCMultiType(5u));
            }));
  mSystem.getSetting("DBReopenInterval", lSecond);
  EXPECT_EQ(30u, static_cast<unsigned int>(*lSecond));

  QNCPointer<QNCMultiType> lValue(new (std::nothrow) QNCMultiType("kept"));
  EXPECT_EQ("No element for the key exists in map",
            qntest::thrown<QNCNotFoundEx>([&] { mSystem.getSetting("ConfigFile", lValue); }));
  EXPECT_STREQ("kept", lValue->getText().get());
}

TEST_F(SystemSettingsTest, ApplySettingsSetsLoggerAndDaemonizesOnlyForOne) {
  mSystem.add("DebugLevel", new (std::nothrow) QNCMultiType(121u));
  mSystem.add("HbTimeout", new (std::nothrow) QNCMultiType(45u));
  mSystem.add("Daemonize", new (std::nothrow) QNCMultiType(static_cast<signed char>(1)));
  mSystem.applySettings();
  unsigned int lValue = 0;
  getLogCode(lValue);
  EXPECT_EQ(121u, lValue);
  getHbTimeout(lValue);
  EXPECT_EQ(45u, lValue);
  ASSERT_EQ(1u, mSystem.mDaemonizeCalls.size());
  EXPECT_EQ("/|/dev/null|/dev/null|/dev/null", mSystem.mDaemonizeCalls[0]);

  for (signed char lOther : {0, 2, -1}) {
    SettingsTestSystem lSystem;
    lSystem.add("DebugLevel", new (std::nothrow) QNCMultiType(255u));
    lSystem.add("HbTimeout", new (std::nothrow) QNCMultiType(30u));
    lSystem.add("Daemonize", new (std::nothrow) QNCMultiType(lOther));
    lSystem.applySettings();
    EXPECT_TRUE(lSystem.mDaemonizeCalls.empty()) << static_cast<int>(lOther);
  }
}

// With -c the file must supply the three keys; a missing one ends start-up after the earlier
// ones were applied. A value of the wrong kind is an exception, not a value.
TEST_F(SystemSettingsTest, ApplySettingsStopsAtTheFirstMissingOrWrongKey) {
  setHbTimeout(30);
  mSystem.add("DebugLevel", new (std::nothrow) QNCMultiType(249u));
  mSystem.add("Daemonize", new (std::nothrow) QNCMultiType(static_cast<signed char>(1)));
  EXPECT_THROW(mSystem.applySettings(), QNCNotFoundEx);
  unsigned int lValue = 0;
  getLogCode(lValue);
  EXPECT_EQ(249u, lValue);
  getHbTimeout(lValue);
  EXPECT_EQ(30u, lValue);
  EXPECT_TRUE(mSystem.mDaemonizeCalls.empty());

  SettingsTestSystem lWrongKind;
  lWrongKind.add("DebugLevel", new (std::nothrow) QNCMultiType("16"));
  lWrongKind.add("HbTimeout", new (std::nothrow) QNCMultiType(30u));
  lWrongKind.add("Daemonize", new (std::nothrow) QNCMultiType(1u));
  EXPECT_THROW(lWrongKind.applySettings(), QNCInvalidEx);
}

// Each thread marks the identifiers it holds in a shared table; a second holder of the same
// identifier finds the mark already set. Returns make the identifiers circulate, so reuse is
// exercised under contention, and the small bound keeps them within a few dozen values.
TEST_F(SystemSettingsTest, ConcurrentThreadsNeverHoldTheSameIdentifier) {
  constexpr unsigned int kThreads = 4;
  constexpr unsigned int kHeldPerThread = 8;
  constexpr unsigned int kBound = kThreads * kHeldPerThread;
  mSystem.useIdentifierBound(kBound);
  std::vector<std::atomic<bool>> lHeld(kBound + 1);
  std::atomic<unsigned int> lCollisions{0};
  std::atomic<unsigned int> lOutOfRange{0};
  std::vector<std::thread> lThreads;
  for (unsigned int lThread = 0; lThread < kThreads; ++lThread) {
    lThreads.emplace_back([&] {
      std::vector<unsigned int> lMine;
      for (unsigned int lRound = 0; lRound < 2000; ++lRound) {
        unsigned int lId = 0;
        mSystem.generateNumericId(lId);
        if (lId == 0 || lId > kBound) {
          ++lOutOfRange;
          continue;
        }
        if (lHeld[lId].exchange(true)) ++lCollisions;
        lMine.push_back(lId);
        if (lMine.size() == kHeldPerThread) {
          for (unsigned int lReturned : lMine) {
            lHeld[lReturned].store(false);
            mSystem.returnNumericId(lReturned);
          }
          lMine.clear();
        }
      }
    });
  }
  for (std::thread& lrThread : lThreads) lrThread.join();
  EXPECT_EQ(0u, lCollisions.load());
  EXPECT_EQ(0u, lOutOfRange.load());
}

// init() creates the identifier manager, starting at 1. If a refusal left mNidCreationLock held,
// the next call would block for ever (the test then fails on its time-out); a returned
// identifier is handed out again.
TEST_F(SystemSettingsTest, IdentifiersStartAtOneAndRefusalsLeaveTheLockFree) {
  unsigned int lId = 0;
  mSystem.init();
  mSystem.generateNumericId(lId);
  EXPECT_EQ(1u, lId);
  mSystem.useIdentifierBound(2);
  mSystem.generateNumericId(lId);
  mSystem.generateNumericId(lId);
  EXPECT_THROW(mSystem.generateNumericId(lId), QNCNotFoundEx);
  EXPECT_THROW(mSystem.returnNumericId(7), QNCInvalidEx);
  mSystem.returnNumericId(1);
  mSystem.generateNumericId(lId);
  EXPECT_EQ(1u, lId);
}

}  // namespace
