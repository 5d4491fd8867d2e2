// The driver's free functions within one process: the log path, the log directory, the
// registration of the system object and the assertions that guard them.

#include <gtest/gtest.h>

#include <cstdlib>
#include <string>

#include "DeathTestSupport.h"
#include "QNString.h"
#include "System.h"
#include "SystemGlobals.h"

namespace {

class DriverTest : public ::testing::Test {
 protected:
  void SetUp() override {
    const char* lpDir = getenv("QN_LOG_DIR");
    mHadDir = lpDir != nullptr;
    if (mHadDir) mSavedDir = lpDir;
    // Death tests here must start from the process's initial globals, not a copy of this one's.
    GTEST_FLAG_SET(death_test_style, "threadsafe");
  }
  void TearDown() override {
    if (mHadDir) {
      setenv("QN_LOG_DIR", mSavedDir.c_str(), 1);
    } else {
      unsetenv("QN_LOG_DIR");
    }
  }

  // The log path that setLogFilePath composes with QN_LOG_DIR set to apDir (unset when null).
  static std::string composed(const char* apDir, const std::string& acrName) {
    if (apDir != nullptr) {
      setenv("QN_LOG_DIR", apDir, 1);
    } else {
      unsetenv("QN_LOG_DIR");
    }
    setLogFilePath(acrName.c_str());
    QNCString lPath("stale");
    getLogFilePath(lPath);
    return lPath.get();
  }

  static std::string logDir(const char* apDir) {
    if (apDir != nullptr) {
      setenv("QN_LOG_DIR", apDir, 1);
    } else {
      unsetenv("QN_LOG_DIR");
    }
    QNCString lDir("stale");
    getLogDir(lDir);
    return lDir.get();
  }

  bool mHadDir = false;
  std::string mSavedDir;
};

TEST_F(DriverTest, LogPathIsTheDirectoryAndTheName) {
  EXPECT_EQ("/var/log/app/svc.log", composed("/var/log/app", "svc.log"));
  EXPECT_EQ("/tmp/svc.log", composed(nullptr, "svc.log"));
  EXPECT_EQ("/svc.log", composed("", "svc.log"));
  EXPECT_EQ("/var/log/app//svc.log", composed("/var/log/app/", "svc.log")) << "no separator is removed";
  EXPECT_EQ("relative/svc.log", composed("relative", "svc.log"));
}

TEST_F(DriverTest, LogPathIsCutTo511Characters) {
  // "/tmp/" and 506 characters: exactly 511, kept whole.
  const std::string lFits(506, 'f');
  EXPECT_EQ("/tmp/" + lFits, composed(nullptr, lFits));
  const std::string lLong(600, 'n');
  const std::string lPath = composed("/var/log/app", lLong);
  EXPECT_EQ(511u, lPath.size());
  EXPECT_EQ(("/var/log/app/" + lLong).substr(0, 511), lPath);
  // A short path after a long one leaves nothing of the long one behind.
  EXPECT_EQ("/tmp/a", composed(nullptr, "a"));
}

TEST_F(DriverTest, LogDirIsTheVariableEvenWhenEmptyElseTmp) {
  EXPECT_EQ("/tmp", logDir(nullptr));
  EXPECT_EQ("/var/log/app", logDir("/var/log/app"));
  EXPECT_EQ("", logDir(""));
}

TEST_F(DriverTest, LogDirDoesNotLookAtTheLogPath) {
  EXPECT_EQ("/first/x.log", composed("/first", "x.log"));
  EXPECT_EQ("/second", logDir("/second"));
  EXPECT_EQ("/tmp", logDir(nullptr));
}

TEST_F(DriverTest, LogPathIsEmptyBeforeItIsSet) {
  EXPECT_EXIT(
      {
        QNCString lPath("stale");
        getLogFilePath(lPath);
        exit(lPath.isEmpty() ? 0 : 2);
      },
      ::testing::ExitedWithCode(0), "");
}

// A system object for the registration tests; it only counts its destruction.
class QNCRegisteredSystem : public QNCSystem {
 public:
  explicit QNCRegisteredSystem(int* apDestroyed) : mpDestroyed(apDestroyed) {}
  ~QNCRegisteredSystem() override { ++*mpDestroyed; }
  void setCommandLineArgumentDesc() override {}
  void parseConfigFile(QNCString&) override {}
  void displayHelp() override {}

 private:
  int* mpDestroyed;
};

TEST_F(DriverTest, SecondRegistrationReplacesTheFirstWithoutDeletingIt) {
  EXPECT_EXIT(
      {
        static int sDestroyed = 0;
        static QNCRegisteredSystem* spFirst = new QNCRegisteredSystem(&sDestroyed);
        QNCSystem* lpSeen = spFirst;
        getSystemObject(lpSeen);
        if (lpSeen != nullptr) exit(2);
        setSystemObject(spFirst);
        getSystemObject(lpSeen);
        if (lpSeen != spFirst) exit(3);
        auto* lpSecond = new QNCRegisteredSystem(&sDestroyed);
        setSystemObject(lpSecond);
        getSystemObject(lpSeen);
        if (lpSeen != lpSecond) exit(4);
        exit(sDestroyed == 0 ? 0 : 5);
      },
      ::testing::ExitedWithCode(0), "");
}

TEST_F(DriverTest, RegisteringNullIsAnAssertion) {
  EXPECT_EXIT(setSystemObject(nullptr), ::testing::ExitedWithCode(1), qntest::assertionFailure("0UL != apSystem"));
}

TEST_F(DriverTest, StartOrEndWithoutRegisteredObjectIsAnAssertion) {
  char lName[] = "driver";
  char* lArgv[] = {lName, nullptr};
  EXPECT_EXIT(SysInit(1, lArgv), ::testing::ExitedWithCode(1), qntest::assertionFailure("0 != gspSystem"));
  EXPECT_EXIT(SysExit(), ::testing::ExitedWithCode(1), qntest::assertionFailure("0 != gspSystem"));
  EXPECT_EXIT(SystemMain(1, lArgv), ::testing::ExitedWithCode(1), qntest::assertionFailure("0 != gspSystem"));
}

}  // namespace
