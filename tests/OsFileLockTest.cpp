#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <string>

#include "Clib.h"
#include "Os.h"
#include "QNException.h"
#include "TestSupport.h"

namespace {

// What a forked probe found when it tried the lock through an open of its own.
enum ProbeResult { kProbeLockedByOther = 10, kProbeTookLock = 20, kProbeBroken = 30 };

// Forks a process that opens the file anew, asks for its status and tries to lock it.
int probeFromAnotherProcess(const std::string& acrPath) {
  const pid_t lPid = fork();
  if (lPid == 0) {
    int lResult = kProbeBroken;
    try {
      const int lFd = ClibOpen(acrPath.c_str(), O_RDWR, 0);
      QNEFileLockStatus lStatus = QNFLS_None;
      OsFileLockStatus(lFd, lStatus);
      try {
        OsLockFile(lFd);
        if (lStatus == QNFLS_Unlocked) lResult = kProbeTookLock;
      } catch (QNCFileLockFailedEx&) {
        if (lStatus == QNFLS_LockedByOther) lResult = kProbeLockedByOther;
      }
    } catch (QNCException&) {
    }
    _exit(lResult);
  }
  return qntest::waitExit(lPid);
}

class OsFileLockTest : public ::testing::Test {
 protected:
  void SetUp() override {
    mPath = mDir.file("instance.pid");
    qntest::writeFile(mPath, "1234");
  }

  qntest::TempDir mDir;
  std::string mPath;
};

// A child takes the lock and holds it until told to end (or for at most 30 s, so that a parent
// whose lock attempt wrongly waited would still come back, late enough to fail the check).
TEST_F(OsFileLockTest, LockHeldByAnotherProcessRefusesAtOnceAndGoesWithIt) {
  int lReady[2];
  int lGo[2];
  ASSERT_EQ(0, pipe(lReady));
  ASSERT_EQ(0, pipe(lGo));
  const pid_t lChild = fork();
  if (lChild == 0) {
    alarm(30);
    close(lGo[1]);
    char lByte = 'L';
    try {
      OsLockFile(ClibOpen(mPath.c_str(), O_RDWR, 0));
    } catch (QNCException&) {
      lByte = 'F';
    }
    ClibWrite(lReady[1], &lByte, 1);
    ClibRead(lGo[0], &lByte, 1);  // end of file once the parent closes its end
    _exit(0);
  }
  close(lReady[1]);
  close(lGo[0]);
  char lByte = 0;
  ASSERT_EQ(1u, ClibRead(lReady[0], &lByte, 1));
  ASSERT_EQ('L', lByte);

  const int lFd = ClibOpen(mPath.c_str(), O_RDWR, 0);
  QNEFileLockStatus lStatus = QNFLS_None;
  OsFileLockStatus(lFd, lStatus);
  EXPECT_EQ(QNFLS_LockedByOther, lStatus);
  const auto lStart = std::chrono::steady_clock::now();
  try {
    OsLockFile(lFd);
    ADD_FAILURE() << "took a lock another process holds";
  } catch (QNCFileLockFailedEx& arFailure) {
    EXPECT_EQ(static_cast<unsigned int>(EAGAIN), arFailure.getCode());
    EXPECT_NE(std::string::npos, std::string(arFailure.what()).find(mPath)) << arFailure.what();
    EXPECT_NE(std::string::npos, std::string(arFailure.what()).find("locked by another process"));
  }
  EXPECT_LT(std::chrono::steady_clock::now() - lStart, std::chrono::seconds(10)) << "the lock attempt waited";

  close(lGo[1]);
  ASSERT_EQ(0, qntest::waitExit(lChild));
  OsFileLockStatus(lFd, lStatus);
  EXPECT_EQ(QNFLS_Unlocked, lStatus);
  EXPECT_NO_THROW(OsLockFile(lFd));
  EXPECT_EQ(kProbeLockedByOther, probeFromAnotherProcess(mPath));
  OsUnlockFile(lFd);
  EXPECT_EQ(kProbeTookLock, probeFromAnotherProcess(mPath));
  ClibClose(lFd);
  close(lReady[0]);
}

// Classic fcntl record locks belong to the process and go as soon as it closes any descriptor of
// the file; the instance lock must survive, say, a second open that reads the file and closes it.
TEST_F(OsFileLockTest, ClosingAnotherDescriptorOfTheFileKeepsTheLock) {
  const int lLocked = ClibOpen(mPath.c_str(), O_RDWR, 0);
  OsLockFile(lLocked);
  const int lOther = ClibOpen(mPath.c_str(), O_RDONLY, 0);
  ClibClose(lOther);
  EXPECT_EQ(kProbeLockedByOther, probeFromAnotherProcess(mPath));
  ClibClose(lLocked);  // closing the locking open itself ends the lock
  EXPECT_EQ(kProbeTookLock, probeFromAnotherProcess(mPath));
}

TEST_F(OsFileLockTest, UnusableDescriptorsAreNamedInTheFailure) {
  const int lReadOnly = ClibOpen(mPath.c_str(), O_RDONLY, 0);
  try {
    OsLockFile(lReadOnly);  // an exclusive lock needs a descriptor open for writing
    ADD_FAILURE() << "locked a read-only descriptor";
  } catch (QNCFileLockFailedEx& arFailure) {
    EXPECT_EQ(static_cast<unsigned int>(EBADF), arFailure.getCode());
    EXPECT_EQ("fcntl(F_OFD_SETLK) fd " + std::to_string(lReadOnly) + " '" + mPath + "': Bad file descriptor",
              std::string(arFailure.what()));
  }
  ClibClose(lReadOnly);
  QNEFileLockStatus lStatus = QNFLS_None;
  EXPECT_THROW(OsFileLockStatus(lReadOnly, lStatus), QNCFileLockFailedEx);
  EXPECT_EQ(QNFLS_None, lStatus);
}

}  // namespace
