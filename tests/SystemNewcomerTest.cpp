// A system class that lacks a member an operation needs still ends by the pointer's assertion
// (status 1), but an error line names the member and where to set it first: without it, the
// newcomer sees only "Assertion [ 0 != mPointer ] failed" at Pointer.h.

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

struct MissingMemberCase {
  const char* mOperation;
  const char* mMember;
  void (*mCall)(BareSystem&);
};

QNCPointer<QNCBuffer> gsBuffer;

const MissingMemberCase kCases[] = {
    {"getBuffer", "mBufferManager", [](BareSystem& arSystem) { arSystem.getBuffer(64, gsBuffer); }},
    {"reuseBuffer", "mBufferManager", [](BareSystem& arSystem) { arSystem.reuseBuffer(gsBuffer); }},
    {"clearBuffer", "mBufferManager", [](BareSystem& arSystem) { arSystem.clearBuffer(gsBuffer); }},
    {"markAsRunning", "mProcessInstanceManager", [](BareSystem& arSystem) { arSystem.markAsRunning(); }},
    {"isAnInstanceRunning", "mProcessInstanceManager",
     [](BareSystem& arSystem) { arSystem.isAnInstanceRunning(); }},
    {"killRunningInstance", "mProcessInstanceManager",
     [](BareSystem& arSystem) { arSystem.killRunningInstance(); }},
    {"exitInstanceManagement", "mProcessInstanceManager",
     [](BareSystem& arSystem) { arSystem.exitInstanceManagement(); }},
    {"displayVersionAndExit", "mVersion", [](BareSystem& arSystem) { arSystem.displayVersionAndExit(); }},
    {"setForExit", "mExitLock",
     [](BareSystem& arSystem) {
       arSystem.dropExitLock();
       arSystem.setForExit();
     }},
    {"isSetForExit", "mExitLock",
     [](BareSystem& arSystem) {
       arSystem.dropExitLock();
       arSystem.isSetForExit();
     }},
};

TEST(SystemNewcomerTest, MissingMemberIsNamedAtErrorLevelBeforeTheAssertion) {
  for (const MissingMemberCase& lrCase : kCases) {
    SCOPED_TRACE(lrCase.mOperation);
    BareSystem lSystem;
    EXPECT_EXIT(lrCase.mCall(lSystem), ::testing::ExitedWithCode(1),
                std::string("-E- .*QNCSystem::") + lrCase.mMember +
                    " is not set: [^\n]*\n.*-H- .*Assertion \\[ 0 != mPointer \\] failed");
  }
}

}  // namespace
