#include "ProcessInstanceManager.h"

// For struct stat and the open flags only: every call goes through the service layer.
#include <fcntl.h>
#include <sys/stat.h>

#include "Assert.h"
#include "Clib.h"
#include "Logger.h"
#include "QNException.h"

namespace {
// No O_TRUNC: a file that open() creates is empty anyway, and one that appeared between the
// existence check and the open belongs to an instance that started at the same moment --
// truncating it would erase the id of the instance that goes on running.
// O_CLOEXEC: a program the instance starts must not inherit the descriptor, or it would share the
// lock and keep the instance marked running after the instance has ended.
constexpr int kCreateFlags = O_RDWR | O_CREAT | O_CLOEXEC;
constexpr int kCreateMode = 0640;
constexpr int kOpenFlags = O_RDWR | O_CLOEXEC;
constexpr int kSigTerm = 15;
constexpr unsigned int kPidBytes = 4;
constexpr unsigned int kKillAttempts = 10;
constexpr unsigned long kKillAttemptPauseMs = 1000;

static_assert(sizeof(int) == kPidBytes, "the PID file holds a 4-byte process id");
}  // namespace

QNCProcessInstanceManager::QNCProcessInstanceManager(const QNCString& acrPidFilePath)
    : mPidFilePath(acrPidFilePath), mPidFileFd(-1), mLockStatus(QNFLS_None) {
  QN_ENTERED();
  QN_LEFT();
}

QNCProcessInstanceManager::~QNCProcessInstanceManager() {
  QN_ENTERED();
  if (mPidFileFd > 0) ClibCloseQuietly(mPidFileFd);
  QN_LEFT();
}

bool QNCProcessInstanceManager::isAnInstanceRunning() {
  QN_ENTERED();
  QN_LOG_TRACE("Going to open PID file and check lock status");
  openAndCheckLockStatus();
  QN_ASSERT(QNFLS_None != this->mLockStatus);
  QN_LEFT();
  return mLockStatus == QNFLS_LockedByOther;
}

void QNCProcessInstanceManager::markAsRunning() {
  QN_ENTERED();
  QN_LOG_TRACE("Going to open PID file and check lock status");
  openAndCheckLockStatus();
  if (mLockStatus == QNFLS_LockedByOther) {
    QN_LOG_ERROR("Another instance is already running");
    throw QNCExistsEx("Cannot mark running.. found another instance", 10);
  }
  QN_LOG_TRACE("Locking the pid file");
  lock();
  const int lPid = ClibGetpid();
  QN_LOG_TRACE("Going to write running pid %d in the pid file", lPid);
  ClibWrite(mPidFileFd, &lPid, kPidBytes);
  // The lock taken above belongs to the descriptor that is closed now; the instance keeps the
  // one taken on the fresh descriptor below.
  QN_LOG_TRACE("Going to reopen the PID file again");
  reopenPidFile();
  QN_LOG_TRACE("Locking the PID file again");
  lock();
  // The lock was free while the file was reopened: a start that slipped into that gap may have
  // written its own id before it lost the lock to us. Only the holder writes from here on, so
  // writing ours again leaves the file naming the instance that keeps the lock.
  QN_LOG_TRACE("Writing running pid %d again under the kept lock", lPid);
  ClibWrite(mPidFileFd, &lPid, kPidBytes);
  QN_LEFT();
}

bool QNCProcessInstanceManager::_isSignallable(unsigned int aBytesRead, int aPid) const {
  if (aBytesRead < kPidBytes) {
    QN_LOG_ERROR("PID file %s holds %u of the %u bytes of a process id... cannot kill", mPidFilePath.get(),
                 aBytesRead, kPidBytes);
    return false;
  }
  if (!OsNamesOneProcess(aPid)) {
    QN_LOG_ERROR("PID file %s holds process id %d, which names no single process... cannot kill",
                 mPidFilePath.get(), aPid);
    return false;
  }
  if (aPid == ClibGetpid()) {
    QN_LOG_ERROR("PID file %s holds this process's own id %d... cannot kill", mPidFilePath.get(), aPid);
    return false;
  }
  return true;
}

void QNCProcessInstanceManager::killRunningInstance() {
  QN_ENTERED();
  QN_LOG_TRACE("Going to open PID file and check lock status");
  openAndCheckLockStatus();
  if (mLockStatus != QNFLS_LockedByOther) {
    QN_LOG_ERROR("No instance running... cannot kill");
    QN_LEFT();
    return;
  }
  QN_LOG_TRACE("Going to read pid in the pid file");
  int lPid = 0;
  // One read suffices: a regular file returns every byte it has up to the count asked for.
  const unsigned int lRead = ClibRead(mPidFileFd, &lPid, kPidBytes);
  if (!_isSignallable(lRead, lPid)) {
    throw QNCTerminateFailedEx("Failed to terminate running instance", 488);
  }
  QN_LOG_INFO("Attempting to kill running instance (pid = %u)", static_cast<unsigned int>(lPid));
  if (OsKill(lPid, kSigTerm) < 0) {
    QN_LOG_ERROR("Failed to kill existing process");
    throw QNCTerminateFailedEx("Failed to terminate running instance", 488);
  }
  QN_LOG_TRACE("Trying to lock PID file to verify termination...");
  bool lTerminated = false;
  // The operating system frees the lock when the instance ends; poll for that, giving it about
  // ten seconds to shut down in order.
  for (unsigned int lAttempt = 0; lAttempt < kKillAttempts && !lTerminated; ++lAttempt) {
    try {
      lock();
      lTerminated = true;
    } catch (QNCFileLockFailedEx&) {
      QN_LOG_TRACE("Sleep for 1 second...");
      ClibSleepMS(kKillAttemptPauseMs);
    }
  }
  if (lTerminated) {
    QN_LOG_INFO("Instance with pid : %u is terminated successfully", static_cast<unsigned int>(lPid));
  } else {
    QN_LOG_INFO("Failed in terminating Instance with pid %u", static_cast<unsigned int>(lPid));
  }
  unlock();
  QN_LEFT();
}

void QNCProcessInstanceManager::exitCleanup() {
  QN_ENTERED();
  if (mLockStatus == QNFLS_Locked) {
    QN_LOG_TRACE("Going to unlock");
    unlock();
  }
  QN_LEFT();
}

void QNCProcessInstanceManager::getProcStatusFromPidFile(QNCString aPidFilePath) {
  QN_ENTERED();
  QN_LOG_TRACE("Geting to open the pid file %s", aPidFilePath.get());
  // A descriptor of its own: closing it cannot drop the instance lock, which belongs to the
  // manager's open of the file, not to the process.
  const int lFd = ClibOpen(aPidFilePath.get(), O_RDONLY | O_CLOEXEC, 0);
  int lPid = 0;
  try {
    if (ClibRead(lFd, &lPid, kPidBytes) < kPidBytes) lPid = 0;  // a short file names no process
  } catch (QNCReadFailedEx&) {
    ClibCloseQuietly(lFd);
    QN_LOG_TRACE("Couldn't read from the pid file");
    throw;
  }
  QN_LOG_NOTICE("Pid got from the file is %d", lPid);
  try {
    ClibGetProcStatus(lPid);
  } catch (QNCClibGetProcStatusFailedEx&) {
    QN_LOG_TRACE("Failed in getting the process status");
    ClibCloseQuietly(lFd);
    throw;
  }
  ClibCloseQuietly(lFd);
  QN_LEFT();
}

void QNCProcessInstanceManager::openPidFile() {
  QN_ENTERED();
  bool lCreate = false;
  struct stat lStat;
  QN_LOG_TRACE("Going to stat the PID file");
  try {
    ClibStat(mPidFilePath.get(), &lStat);
  } catch (QNCClibStatFailedEx&) {
    QN_LOG_TRACE("PID file does not exist, need to create");
    lCreate = true;
  }
  QN_LOG_TRACE("Going to open the PID file");
  mPidFileFd = lCreate ? ClibOpen(mPidFilePath.get(), kCreateFlags, kCreateMode)
                       : ClibOpen(mPidFilePath.get(), kOpenFlags, 0);
  QN_LEFT();
}

void QNCProcessInstanceManager::reopenPidFile() {
  QN_ENTERED();
  QN_LOG_TRACE("Going to close the PID file");
  closePidFile();
  QN_LOG_TRACE("Going to open the PID file without creating again");
  mPidFileFd = ClibOpen(mPidFilePath.get(), kOpenFlags, 0);
  QN_LEFT();
}

void QNCProcessInstanceManager::closePidFile() {
  QN_ENTERED();
  QN_LOG_TRACE("Going to close the PID file");
  ClibClose(mPidFileFd);
  mPidFileFd = -1;
  QN_LEFT();
}

void QNCProcessInstanceManager::checkLockStatus() {
  QN_ENTERED();
  QN_LOG_TRACE("Going to check the PID file lock status");
  OsFileLockStatus(mPidFileFd, mLockStatus);
  QN_LEFT();
}

void QNCProcessInstanceManager::lock() {
  QN_ENTERED();
  QN_LOG_TRACE("Going to lock the PID file");
  OsLockFile(mPidFileFd);
  mLockStatus = QNFLS_Locked;
  QN_LEFT();
}

void QNCProcessInstanceManager::unlock() {
  QN_ENTERED();
  QN_LOG_TRACE("Going to unlock the PID file");
  OsUnlockFile(mPidFileFd);
  mLockStatus = QNFLS_Unlocked;
  QN_LEFT();
}

void QNCProcessInstanceManager::openAndCheckLockStatus() {
  QN_ENTERED();
  if (mPidFileFd > 0 && mLockStatus != QNFLS_None) {
    QN_LEFT();
    return;
  }
  QN_LOG_TRACE("Opening the pid file");
  openPidFile();
  QN_LOG_TRACE("Checking lock status of pid file");
  checkLockStatus();
  QN_LEFT();
}
