#include <gtest/gtest.h>

#include <cstdio>
#include <string>
#include <vector>

#include "LogSupport.h"
#include "MultiType.h"
#include "QNException.h"
#include "System.h"
#include "TestSupport.h"
#include "Version.h"

namespace {

const QNSCommandLineArgumentDesc kCommonOptions[] = {
    {"-v", 0, "", ""},     {"-h", 0, "", ""},        {"-s", 0, "", ""},     {"-c", 1, "file", ""},
    {"-d", 1, "mask", ""}, {"-b", 1, "seconds", ""}, {"-D", 1, "bool", ""}, {"-I", 1, "minutes", ""},
};

// A system with the eight common options, run in-process. The instance operations are faked so
// that "-s" can be followed without a second process; each call prints a marker so that a test
// can tell from the captured output whether it was made.
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
  void displayHelp() override {}

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
  unsigned int settingCount() const { return mSettings.numberOfElements(); }

  bool mInstanceRunning = false;

 private:
  bool mDescribeConfigAsFlag;
};

// Logs to a file of its own, with a recognisable log mask and heartbeat, so the defaults can be
// told from constants. Nothing here applies the settings, so the two values stay the test's own.
class SystemCommandLineTest : public qntest::LoggedTest {
 protected:
  static constexpr unsigned int kMask = 249;
  static constexpr unsigned int kHeartbeat = 41;

  void SetUp() override {
    LoggedTest::SetUp();
    setLogCode(kMask);
    setHbTimeout(kHeartbeat);
  }

  CommandLineTestSystem mSystem;
};

// An option given replaces only its own setting; the others take the logger's mask and heartbeat,
// daemonizing and the 15-minute interval. The command line is logged while the mask still is
// kMask: applySettings, not the handler, changes it.
TEST_F(SystemCommandLineTest, GivenValuesReplaceOnlyTheirOwnDefaults) {
  mSystem.process({"-d", "16", "-I", "30"});
  EXPECT_EQ(16u, mSystem.number("DebugLevel"));
  EXPECT_EQ(kHeartbeat, mSystem.number("HbTimeout"));
  EXPECT_EQ(1, mSystem.flag("Daemonize"));
  EXPECT_EQ(30u, mSystem.number("DBReopenInterval"));
  EXPECT_EQ(4u, mSystem.settingCount()) << "ConfigFile is written only for -c";
  CommandLineTestSystem lBare;
  lBare.process({});
  EXPECT_EQ(kMask, lBare.number("DebugLevel"));
  EXPECT_EQ(15u, lBare.number("DBReopenInterval"));
  qntest::expectInOrder(
      log(), {"Command line : '-d 16 -I 30'", "Processed the command line successfully : -d 16 -I 30",
              "No arguments in command line", "No command line argument passed",
              "The -I option is not specified, using default interval 15 min"});
}

// Numbers are read like atoi (a bad one is 0, a trailing word ignored) and Daemonize is 1 only for
// exactly "true".
TEST_F(SystemCommandLineTest, ValuesAreReadLikeAtoiAndDaemonizeOnlyForExactlyTrue) {
  const struct {
    const char* mOption;
    const char* mValue;
    const char* mKey;
    int mExpected;
  } lCases[] = {
      {"-D", "true", "Daemonize", 1},       {"-D", "TRUE", "Daemonize", 0},
      {"-D", "1", "Daemonize", 0},          {"-D", "false", "Daemonize", 0},
      {"-I", "0", "DBReopenInterval", 0},   {"-I", "-5", "DBReopenInterval", 0},
      {"-I", "abc", "DBReopenInterval", 0}, {"-I", "7min", "DBReopenInterval", 7},
      {"-d", "abc", "DebugLevel", 0},       {"-b", "45", "HbTimeout", 45},
  };
  for (const auto& lrCase : lCases) {
    CommandLineTestSystem lSystem;
    lSystem.process({lrCase.mOption, lrCase.mValue});
    const bool lIsFlag = std::string(lrCase.mKey) == "Daemonize";
    EXPECT_EQ(lrCase.mExpected,
              lIsFlag ? lSystem.flag(lrCase.mKey) : static_cast<int>(lSystem.number(lrCase.mKey)))
        << lrCase.mOption << " " << lrCase.mValue;
  }
  EXPECT_NE(
      std::string::npos,
      log().find("Zero/Invalid value specified for -I option. DB won't be reopened at fixed intervals"));
}

// -s stops a running instance, or says that there is none; either way the process leaves through
// QNCParentExitEx before any setting is written.
TEST_F(SystemCommandLineTest, ShutdownStopsTheRunningInstanceAndLeavesWithParentExit) {
  for (const bool lRunning : {true, false}) {
    CommandLineTestSystem lSystem;
    lSystem.mInstanceRunning = lRunning;
    testing::internal::CaptureStdout();
    const std::string lThrown = qntest::thrown<QNCParentExitEx>([&] { lSystem.process({"-s"}); }, true);
    EXPECT_EQ(lRunning ? "Done.. time to exit (code 19)" : "Done (nothing).. time to exit (code 19)",
              lThrown);
    EXPECT_EQ(lRunning ? "[checked][killed]sensortest shutdown successfully.\n" : "[checked]",
              testing::internal::GetCapturedStdout());
    EXPECT_EQ(0u, lSystem.settingCount());
  }
  EXPECT_NE(std::string::npos, log().find("No instance running.. cannot kill"));
}

TEST(SystemCommandLineDeathTest, ConfigFileDescribedWithoutValueIsAnAssertion) {
  CommandLineTestSystem lSystem(true);
  EXPECT_EXIT(lSystem.process({"-c"}), ::testing::ExitedWithCode(1),
              "Assertion \\[ __null != lpArg \\] failed");
}

}  // namespace
