#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <string>

#include "Clib.h"
#include "Os.h"
#include "QNException.h"
#include "TestSupport.h"

namespace {

// The status a fresh open of the file sees. Open-file-description locks conflict between opens
// even within one process, so this is what another process would see; a per-process lock would
// read as free here.
QNEFileLockStatus statusSeenByAnotherOpen(const std::string& acrPath) {
  const int lFd = ClibOpen(acrPath.c_str(), O_RDONLY, 0);
  QNEFileLockStatus lStatus = QNFLS_None;
  OsFileLockStatus(lFd, lStatus);
  ClibClose(lFd);
  return lStatus;
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

// A child takes the lock and holds it until it is killed (or for at most 30 s, so that a parent
// whose lock attempt wrongly waited would still come back, late enough to fail the check).
TEST_F(OsFileLockTest, LockHeldByAnotherProcessRefusesAtOnceGoesWithItAndSurvivesOtherCloses) {
  int lReady[2];
  ASSERT_EQ(0, pipe(lReady));
  const pid_t lChild = fork();
  if (lChild == 0) {
    alarm(30);
    char lByte = 'L';
    try {
      OsLockFile(ClibOpen(mPath.c_str(), O_RDWR, 0));
    } catch (QNCException&) {
      lByte = 'F';
    }
    ClibWrite(lReady[1], &lByte, 1);
    for (;;) pause();
  }
  close(lReady[1]);
  char lByte = 0;
  ASSERT_EQ(1u, ClibRead(lReady[0], &lByte, 1));
  close(lReady[0]);
  ASSERT_EQ('L', lByte);

  const int lFd = ClibOpen(mPath.c_str(), O_RDWR, 0);
  QNEFileLockStatus lStatus = QNFLS_None;
  OsFileLockStatus(lFd, lStatus);
  EXPECT_EQ(QNFLS_LockedByOther, lStatus);
  const auto lStart = std::chrono::steady_clock::now();
  const std::string lRefusal = qntest::thrown<QNCFileLockFailedEx>([&] { OsLockFile(lFd); }, true);
  EXPECT_LT(std::chrono::steady_clock::now() - lStart, std::chrono::seconds(10)) << "the lock attempt waited";
  EXPECT_EQ("fcntl(F_OFD_SETLK) fd " + std::to_string(lFd) + " '" + mPath +
                "' (locked by another process): Resource temporarily unavailable (code " +
                std::to_string(EAGAIN) + ")",
            lRefusal);

  kill(lChild, SIGKILL);
  ASSERT_EQ(128 + SIGKILL, qntest::waitExit(lChild));
  OsFileLockStatus(lFd, lStatus);
  EXPECT_EQ(QNFLS_Unlocked, lStatus);
  EXPECT_NO_THROW(OsLockFile(lFd));

  // Classic fcntl record locks belong to the process and go as soon as it closes any descriptor
  // of the file; the instance lock must survive, say, a second open that reads the file and
  // closes it, and go only when it is unlocked.
  ClibClose(ClibOpen(mPath.c_str(), O_RDONLY, 0));
  EXPECT_EQ(QNFLS_LockedByOther, statusSeenByAnotherOpen(mPath));
  OsUnlockFile(lFd);
  EXPECT_EQ(QNFLS_Unlocked, statusSeenByAnotherOpen(mPath));
  ClibClose(lFd);
}

TEST_F(OsFileLockTest, UnusableDescriptorsAreNamedInTheFailure) {
  const int lReadOnly = ClibOpen(mPath.c_str(), O_RDONLY, 0);
  // An exclusive lock needs a descriptor open for writing.
  EXPECT_EQ("fcntl(F_OFD_SETLK) fd " + std::to_string(lReadOnly) + " '" + mPath +
                "': Bad file descriptor (code " + std::to_string(EBADF) + ")",
            qntest::thrown<QNCFileLockFailedEx>([&] { OsLockFile(lReadOnly); }, true));
  ClibClose(lReadOnly);
  QNEFileLockStatus lStatus = QNFLS_None;
  EXPECT_THROW(OsFileLockStatus(lReadOnly, lStatus), QNCFileLockFailedEx);
  EXPECT_EQ(QNFLS_None, lStatus);
}

}  // namespace
