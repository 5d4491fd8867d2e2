// A system class that lacks a member an operation needs still ends by the pointer's assertion
// (status 1), but an error line names the member and where to set it first: without it, the
// newcomer sees only "Assertion [ 0 != mPointer ] failed" at Pointer.h. (A missing instance
// manager or version at start-up: the Consumer.newcomer test.)

#include "Buffer.h"
#include "Mutex.h"
#include "System.h"

namespace {

// Sets none of the members the application must provide.
class BareSystem : public QNCSystem {
 public:
  void setCommandLineArgumentDesc() override {}
  void parseConfigFile(QNCString&) override {}
  void displayHelp() override {}
  void dropExitLock() { mExitLock = QNCPointer<QNCMutex>(); }
};

void expectNamedBeforeAssertion(void (*apCall)(BareSystem&), const char* apMember) {
  BareSystem lSystem;
  EXPECT_EXIT(apCall(lSystem), ::testing::ExitedWithCode(1),
              std::string("-E- .*QNCSystem::") + apMember +
                  " is not set: [^\n]*\n.*-H- .*Assertion \\[ 0 != mPointer \\] failed");
}

TEST(SystemNewcomerTest, MissingMemberIsNamedAtErrorLevelBeforeTheAssertion) {
  static QNCPointer<QNCBuffer> lsBuffer;
  expectNamedBeforeAssertion([](BareSystem& arSystem) { arSystem.getBuffer(64, lsBuffer); },
                             "mBufferManager");
  expectNamedBeforeAssertion([](BareSystem& arSystem) { arSystem.reuseBuffer(lsBuffer); }, "mBufferManager");
  expectNamedBeforeAssertion([](BareSystem& arSystem) { arSystem.killRunningInstance(); },
                             "mProcessInstanceManager");
  expectNamedBeforeAssertion(
      [](BareSystem& arSystem) {
        arSystem.dropExitLock();
        arSystem.setForExit();
      },
      "mExitLock");
}

}  // namespace
