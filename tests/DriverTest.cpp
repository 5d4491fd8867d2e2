// The driver's free functions within one process: the log path, the log directory, the
// registration of the system object and the assertions that guard them.

#include <gtest/gtest.h>

#include <cstdlib>
#include <string>

#include "DeathTestSupport.h"
#include "QNString.h"
#include "System.h"
#include "SystemGlobals.h"
#include "programs/TestSystem.h"

namespace {

// Sets QN_LOG_DIR to apDir, or unsets it when apDir is null. Each test sets it before use.
void setDir(const char* apDir) {
  if (apDir != nullptr) {
    setenv("QN_LOG_DIR", apDir, 1);
  } else {
    unsetenv("QN_LOG_DIR");
  }
}

// The log path that setLogFilePath composes with QN_LOG_DIR set to apDir.
std::string composed(const char* apDir, const std::string& acrName) {
  setDir(apDir);
  setLogFilePath(acrName.c_str());
  QNCString lPath("stale");
  getLogFilePath(lPath);
  return lPath.get();
}

std::string logDir(const char* apDir) {
  setDir(apDir);
  QNCString lDir("stale");
  getLogDir(lDir);
  return lDir.get();
}

// The directory is read from the environment each time, never taken from the log path.
TEST(DriverTest, LogPathIsTheVariableOrTmpAndTheNameCutTo511Characters) {
  EXPECT_EQ("/var/log/app/svc.log", composed("/var/log/app", "svc.log"));
  EXPECT_EQ("/tmp/svc.log", composed(nullptr, "svc.log"));
  EXPECT_EQ("/svc.log", composed("", "svc.log"));
  EXPECT_EQ("/var/log/app//svc.log", composed("/var/log/app/", "svc.log")) << "no separator is removed";
  EXPECT_EQ("relative/svc.log", composed("relative", "svc.log"));
  // "/tmp/" and 506 characters: exactly 511, kept whole.
  const std::string lFits(506, 'f');
  EXPECT_EQ("/tmp/" + lFits, composed(nullptr, lFits));
  const std::string lLong(600, 'n');
  EXPECT_EQ(("/var/log/app/" + lLong).substr(0, 511), composed("/var/log/app", lLong));
  // A short path after a long one leaves nothing of the long one behind.
  EXPECT_EQ("/tmp/a", composed(nullptr, "a"));

  EXPECT_EQ("/tmp", logDir(nullptr));
  EXPECT_EQ("", logDir(""));
  EXPECT_EQ("/first/x.log", composed("/first", "x.log"));
  EXPECT_EQ("/second", logDir("/second"));
}

// A system object for the registration tests; it only counts its destruction.
class QNCRegisteredSystem : public QNCBareTestSystem {
 public:
  explicit QNCRegisteredSystem(int* apDestroyed) : mpDestroyed(apDestroyed) {}
  ~QNCRegisteredSystem() override { ++*mpDestroyed; }

 private:
  int* mpDestroyed;
};

// Run in a child process: the registration must not outlive the test.
TEST(DriverTest, SecondRegistrationReplacesTheFirstWithoutDeletingIt) {
  EXPECT_EXIT(
      {
        static int sDestroyed = 0;
        // Kept reachable: the replaced object is deliberately not deleted, and the leak checker
        // must not count it at exit.
        static QNCRegisteredSystem* spFirst = new QNCRegisteredSystem(&sDestroyed);
        setSystemObject(spFirst);
        auto* lpSecond = new QNCRegisteredSystem(&sDestroyed);
        setSystemObject(lpSecond);
        QNCSystem* lpSeen = nullptr;
        getSystemObject(lpSeen);
        exit(lpSeen == lpSecond && sDestroyed == 0 ? 0 : 2);
      },
      ::testing::ExitedWithCode(0), "");
}

// SystemMain itself is SysInit and SysExit: all three are guarded.
TEST(DriverTest, RegisteringNullOrRunningWithoutAnObjectIsAnAssertion) {
  EXPECT_EXIT(setSystemObject(nullptr), ::testing::ExitedWithCode(1),
              qntest::assertionFailure("0UL != apSystem"));
  char lName[] = "driver";
  char* lArgv[] = {lName, nullptr};
  EXPECT_EXIT(SysInit(1, lArgv), ::testing::ExitedWithCode(1), qntest::assertionFailure("0 != gspSystem"));
  EXPECT_EXIT(SysExit(), ::testing::ExitedWithCode(1), qntest::assertionFailure("0 != gspSystem"));
  EXPECT_EXIT(SystemMain(1, lArgv), ::testing::ExitedWithCode(1), qntest::assertionFailure("0 != gspSystem"));
}

}  // namespace
