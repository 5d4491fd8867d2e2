#pragma once
// QNCProcessInstanceManager: keeps a service to one running instance per PID file.
//
// The guard is an exclusive lock on the PID file, held by the running instance for its whole
// life and dropped by the operating system when that process ends, however it ends (SIGKILL
// included). The file's content is informative only: the first 4 bytes hold the process id of the
// last instance that marked itself running, in host byte order (little-endian on x86-64), no text,
// no line end. Bytes after the first 4 are never written or removed, an existing file is never
// truncated, and the file is never deleted: after an instance ends it still names that
// instance, and only the lock tells whether it runs.
//
// A file that does not exist is created empty with mode 0640 as given to open(); the process's
// umask applies on top of that (a daemon has umask 0, see QNCSystem::systemDaemonize).
//
// The lock is an open-file-description lock (Os.h): it belongs to the manager's own open of the
// file, so nothing else the process does with the same file -- getProcStatusFromPidFile() on the
// instance's own PID file, another open and close of it -- drops it, and a second manager in the
// same process on the same file sees it as held by another instance. The descriptor is opened
// close-on-exec, so a program the instance runs does not share the lock. A child made by fork()
// alone (no exec) does share it while it lives.
//
// Threads: the library uses a manager from the main thread only (command line, start-up,
// shut-down); one thread at a time per object. It holds no mutex: between processes the file lock
// is the only guard. Every operation logs "Entered" and "Left" at trace level.
//
// Operations reach each other through the virtual table, so an override of one step changes every
// operation built from it.

#include "Os.h"
#include "QNString.h"

class QNCProcessInstanceManager {
 public:
  // Remembers the path; nothing is opened yet (descriptor -1, state QNFLS_None), so the first
  // operation opens and examines the file.
  explicit QNCProcessInstanceManager(const QNCString& acrPidFilePath);

  // Closes the PID file descriptor when one is open. It does not unlock explicitly (closing the
  // manager's only open of the file releases its lock) and never removes the file. Never throws.
  virtual ~QNCProcessInstanceManager();

  // True when another process (or another open of the file in this process) holds the lock.
  // Opens and examines the file on first use (creating it empty if it is missing); later calls
  // answer from the remembered state without looking at the file again.
  // Throws QNCOpenFailedEx (file cannot be opened) or QNCFileLockFailedEx (lock state unreadable).
  virtual bool isAnInstanceRunning();

  // Takes the lock and writes this process's id into the first 4 bytes. Afterwards the lock is
  // held on a freshly opened descriptor and the state is QNFLS_Locked.
  // Throws QNCExistsEx "Cannot mark running.. found another instance" (10) when another instance
  // holds the lock; the file and that instance's lock are untouched.
  // Throws QNCFileLockFailedEx when another process takes the lock between the checks: the lock
  // is free for a moment while the file is reopened, so of instances started at the same moment
  // exactly one ends up running and the others fail with one of these two exceptions.
  // Also QNCOpenFailedEx, QNCWriteFailedEx, QNCCloseFailedEx from the file operations.
  // The file then holds the id of the instance that goes on running, also when many first starts
  // race to create it (creating never truncates, see openPidFile) and when a start that slipped
  // into the reopening gap wrote its id before losing the lock: the id is written again once the
  // final lock is held.
  virtual void markAsRunning();

  // Stops the instance recorded in the file: SIGTERM, then up to 10 attempts one second apart to
  // take the lock, which is free once that instance has ended. Blocks for at most about 10 s.
  // Logs "Instance with pid : %u is terminated successfully" or, when the instance outlives the
  // attempts, "Failed in terminating Instance with pid %u"; neither case throws. Afterwards the
  // state is QNFLS_Unlocked (the lock, if taken, is released again).
  // Logs "No instance running... cannot kill" and returns when no other process holds the lock.
  // Only a positive process id read in full that is not this process's own is ever signalled:
  // a locked file holding fewer than 4 bytes (an instance that has not written its id yet), an id
  // of 0 or below (kill() would address a process group or every process) or this process's own
  // id gets an error line naming the file and the value, and throws QNCTerminateFailedEx
  // "Failed to terminate running instance" (488) without signalling anybody. So does a kill()
  // that fails ("Failed to kill existing process"). In these cases the state stays
  // QNFLS_LockedByOther.
  virtual void killRunningInstance();

  // Releases the lock when this process holds it (state QNFLS_Locked); otherwise does nothing.
  // The descriptor stays open until the destructor.
  virtual void exitCleanup();

  // Returns normally when the process whose id is stored in the first 4 bytes of the given file
  // exists. Works on its own descriptor, closed before it returns or throws; the manager's fields
  // and its lock are untouched, also when the path is this manager's own PID file.
  // Throws QNCOpenFailedEx (file cannot be opened), QNCReadFailedEx (read failed),
  // QNCClibGetProcStatusFailedEx (no such process). A file holding fewer than 4 bytes names no
  // process: it is reported as process id 0, which never exists.
  virtual void getProcStatusFromPidFile(QNCString aPidFilePath);

  // --- The steps the operations above are built from. Each throws what its system call throws.

  // Opens the PID file read-write. When the file cannot be examined (it does not exist) it is
  // opened with O_CREAT and mode 0640, but never with O_TRUNC: between the check and the open
  // another instance starting at the same moment may have created the file and written its id,
  // and truncating would erase it while that instance runs on. On failure the descriptor is
  // unchanged.
  virtual void openPidFile();
  // Closes the descriptor and opens the file again read-write without creating it. The state is
  // not changed, but a lock held through the old descriptor is gone.
  virtual void reopenPidFile();
  // Closes the descriptor; it is -1 afterwards.
  virtual void closePidFile();
  // Sets the state to QNFLS_LockedByOther or QNFLS_Unlocked from the file's current lock.
  virtual void checkLockStatus();
  // Takes the lock without waiting; the state becomes QNFLS_Locked. Throws QNCFileLockFailedEx
  // when another holder has it, the state then unchanged.
  virtual void lock();
  // Releases the lock; the state becomes QNFLS_Unlocked.
  virtual void unlock();
  // Opens and examines the file unless a descriptor is open and the state is known.
  virtual void openAndCheckLockStatus();

 private:
  QNCProcessInstanceManager(const QNCProcessInstanceManager&) = delete;
  QNCProcessInstanceManager& operator=(const QNCProcessInstanceManager&) = delete;

  // The checks of killRunningInstance on the id read from the file; see there.
  bool _isSignallable(unsigned int aBytesRead, int aPid) const;

  QNCString mPidFilePath;
  int mPidFileFd;                 // -1 when closed
  QNEFileLockStatus mLockStatus;  // as last checked or set
};
