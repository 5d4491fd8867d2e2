#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdio>
#include <string>
#include <vector>

#include "LogSupport.h"
#include "Logger.h"
#include "MultiType.h"
#include "QNException.h"
#include "System.h"
#include "TestSupport.h"
#include "Version.h"

namespace {

const QNSCommandLineArgumentDesc kCommonOptions[] = {
    {"-v", 0, "", ""}, {"-h", 0, "", ""}, {"-s", 0, "", ""}, {"-c", 1, "file", ""},
    {"-d", 1, "mask", ""}, {"-b", 1, "seconds", ""}, {"-D", 1, "bool", ""}, {"-I", 1, "minutes", ""},
};

// A system with the eight common options, run in-process. The instance operations are faked so
// that "-s" can be followed without a second process; each call prints a marker so that tests
// which end in exit() can tell from the captured output whether it was made.
class CommandLineTestSystem : public QNCSystem {
 public:
  explicit CommandLineTestSystem(bool aDescribeConfigAsFlag = false)
      : mDescribeConfigAsFlag(aDescribeConfigAsFlag) {
    mName = "sensortest";
    mVersion = QNCPointer<QNCVersion>(new (std::nothrow) QNCVersion("9.8.7"));
  }

  void setCommandLineArgumentDesc() override {
    for (QNSCommandLineArgumentDesc lDesc : kCommonOptions) {
      if (mDescribeConfigAsFlag && std::string(lDesc.mOption) == "-c") lDesc.mTakesValue = 0;
      mCommandLineArgumentDesc.append(lDesc);
    }
  }
  void parseConfigFile(QNCString&) override { throw QNCNotImplementedEx("none", 0); }
  void displayHelp() override { printf("HELP TEXT\n"); }

  bool isAnInstanceRunning() override {
    printf("[checked]");
    return mInstanceRunning;
  }
  void killRunningInstance() override { printf("[killed]"); }

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

  QNCMultiType& setting(const char* apKey) {
    QNCPointer<QNCMultiType> lValue;
    getSetting(apKey, lValue);
    return *lValue;
  }
  unsigned int number(const char* apKey) { return setting(apKey); }
  int flag(const char* apKey) { return static_cast<signed char>(setting(apKey)); }
  std::string text(const char* apKey) { return setting(apKey).getText().get(); }
  unsigned int settingCount() const { return mSettings.numberOfElements(); }

  bool mInstanceRunning = false;

 private:
  bool mDescribeConfigAsFlag;
};

// Logs to a file of its own, with a recognisable log mask and heartbeat, so the defaults can be
// told from constants.
class SystemCommandLineTest : public qntest::LoggedTest {
 protected:
  static constexpr unsigned int kMask = 249;
  static constexpr unsigned int kHeartbeat = 41;

  void SetUp() override {
    getLogCode(mSavedLogCode);
    getHbTimeout(mSavedHbTimeout);
    LoggedTest::SetUp();
    setLogCode(kMask);
    setHbTimeout(kHeartbeat);
  }
  void TearDown() override {
    LoggedTest::TearDown();
    setLogCode(mSavedLogCode);
    setHbTimeout(mSavedHbTimeout);
  }

  // In a death test's child: standard output joins standard error, which EXPECT_EXIT matches.
  static void outputToStderr() {
    fflush(stdout);
    dup2(STDERR_FILENO, STDOUT_FILENO);
  }

  CommandLineTestSystem mSystem;
  unsigned int mSavedLogCode = 0;
  unsigned int mSavedHbTimeout = 0;
};

TEST_F(SystemCommandLineTest, NoArgumentsGiveTheDefaults) {
  mSystem.process({});
  EXPECT_EQ(kMask, mSystem.number("DebugLevel"));
  EXPECT_EQ(kHeartbeat, mSystem.number("HbTimeout"));
  EXPECT_EQ(1, mSystem.flag("Daemonize"));
  EXPECT_EQ(15u, mSystem.number("DBReopenInterval"));
  EXPECT_EQ(4u, mSystem.settingCount()) << "ConfigFile is written only for -c";
  const std::string lLog = log();
  EXPECT_NE(std::string::npos, lLog.find("No arguments in command line"));
  EXPECT_NE(std::string::npos, lLog.find("No command line argument passed"));
  EXPECT_NE(std::string::npos, lLog.find("The -I option is not specified, using default interval 15 min"));
}

TEST_F(SystemCommandLineTest, GivenValuesReplaceOnlyTheirOwnDefaults) {
  mSystem.process({"-d", "16", "-I", "30"});
  EXPECT_EQ(16u, mSystem.number("DebugLevel"));
  EXPECT_EQ(kHeartbeat, mSystem.number("HbTimeout"));
  EXPECT_EQ(1, mSystem.flag("Daemonize"));
  EXPECT_EQ(30u, mSystem.number("DBReopenInterval"));
  // Logged while the mask still is kMask: applySettings, not the handler, changes it.
  const std::string lLog = log();
  EXPECT_NE(std::string::npos, lLog.find("Command line : '-d 16 -I 30'"));
  EXPECT_NE(std::string::npos, lLog.find("Processed the command line successfully : -d 16 -I 30"));
}

TEST_F(SystemCommandLineTest, ConfigFileOptionWritesOnlyConfigFile) {
  mSystem.process({"-c", "/etc/sensor.conf", "-d", "16"});
  EXPECT_EQ("/etc/sensor.conf", mSystem.text("ConfigFile"));
  EXPECT_EQ(1u, mSystem.settingCount());
  EXPECT_NE(std::string::npos, log().find("Found and handled -c option, not processing others"));
}

TEST_F(SystemCommandLineTest, DaemonizeIsOneOnlyForExactlyTrue) {
  const std::vector<std::pair<const char*, int>> lCases = {{"true", 1}, {"TRUE", 0}, {"1", 0}, {"false", 0}};
  for (const auto& lrCase : lCases) {
    CommandLineTestSystem lSystem;
    lSystem.process({"-D", lrCase.first});
    EXPECT_EQ(lrCase.second, lSystem.flag("Daemonize")) << lrCase.first;
  }
}

TEST_F(SystemCommandLineTest, NumbersAreReadLikeAtoi) {
  for (const char* lpBad : {"0", "-5", "abc"}) {
    CommandLineTestSystem lSystem;
    lSystem.process({"-I", lpBad});
    EXPECT_EQ(0u, lSystem.number("DBReopenInterval")) << lpBad;
  }
  EXPECT_NE(std::string::npos,
            log().find("Zero/Invalid value specified for -I option. DB won't be reopened at fixed intervals"));
  mSystem.process({"-d", "abc", "-b", "45", "-I", "7min"});
  EXPECT_EQ(0u, mSystem.number("DebugLevel"));
  EXPECT_EQ(45u, mSystem.number("HbTimeout"));
  EXPECT_EQ(7u, mSystem.number("DBReopenInterval"));
}

TEST_F(SystemCommandLineTest, BadCommandLineIsRefusedBeforeAnySettingIsWritten) {
  for (const std::vector<std::string>& lrArguments :
       std::vector<std::vector<std::string>>{{"-x"}, {"-d"}, {"-v", "now"}}) {
    CommandLineTestSystem lSystem;
    EXPECT_THROW(lSystem.process(lrArguments), QNCInvalidEx) << lrArguments[0];
    EXPECT_EQ(0u, lSystem.settingCount());
  }
}

TEST_F(SystemCommandLineTest, VersionAndHelpEndTheProcessWithStatusZero) {
  EXPECT_EXIT(
      {
        outputToStderr();
        mSystem.process({"-v", "-h"});
      },
      ::testing::ExitedWithCode(0), "^sensortest v9\\.8\\.7$");
  // Only the help: no "[checked]", -h ends the process before -s looks for an instance.
  EXPECT_EXIT(
      {
        outputToStderr();
        mSystem.process({"-h", "-s"});
      },
      ::testing::ExitedWithCode(0), "^HELP TEXT\n$");
}

TEST_F(SystemCommandLineTest, ShutdownStopsTheRunningInstanceAndLeavesWithParentExit) {
  mSystem.mInstanceRunning = true;
  testing::internal::CaptureStdout();
  try {
    mSystem.process({"-s"});
    ADD_FAILURE() << "-s returned";
  } catch (const QNCParentExitEx& acrException) {
    EXPECT_STREQ("Done.. time to exit", acrException.what());
    EXPECT_EQ(19u, acrException.getCode());
  }
  EXPECT_EQ("[checked][killed]sensortest shutdown successfully.\n", testing::internal::GetCapturedStdout());
  EXPECT_EQ(0u, mSystem.settingCount());
}

TEST_F(SystemCommandLineTest, ShutdownWithNothingRunningKillsNothing) {
  testing::internal::CaptureStdout();
  try {
    mSystem.process({"-s"});
    ADD_FAILURE() << "-s returned";
  } catch (const QNCParentExitEx& acrException) {
    EXPECT_STREQ("Done (nothing).. time to exit", acrException.what());
  }
  EXPECT_EQ("[checked]", testing::internal::GetCapturedStdout());
  EXPECT_NE(std::string::npos, log().find("No instance running.. cannot kill"));
}

TEST(SystemCommandLineDeathTest, ConfigFileDescribedWithoutValueIsAnAssertion) {
  CommandLineTestSystem lSystem(true);
  EXPECT_EXIT(lSystem.process({"-c"}), ::testing::ExitedWithCode(1), "Assertion \\[ __null != lpArg \\] failed");
}

}  // namespace
