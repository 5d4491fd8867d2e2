#pragma once
// The start-up and shut-down driver: free functions that run the whole life of a process around
// the one system object the application registers.
//
//   int main(int argc, char** argv) {
//     try {
//       setSystemObject(new MySystem);    // the driver owns it from now on
//       setLogFilePath("myservice.log");  // $QN_LOG_DIR/myservice.log, else /tmp/myservice.log
//       SystemMain(argc, argv);           // returns after an orderly shut-down
//     } catch (const QNCParentExitEx&) {
//       return waitForDaemonStart();      // 0 once the daemon runs; 1 and its reason otherwise
//     }
//     return getRunExitStatus();          // 1 when a thread died and ended the run
//   }
//
// SystemMain enables every log level, runs SysInit (the lifecycle operations of QNCSystem in
// their fixed order, then handlers for SIGINT, SIGTERM and SIGHUP), then SysExit (waits for every
// thread, releases the instance mark, destroys the system object, closes the log).
// Exceptions are not caught here: they leave SystemMain, SysExit does not run, and the
// application's main ends the process (QNCParentExitEx: the parent side of daemonizing or "-s",
// status 0).
//
// The three signal handlers run on the signal dispatcher thread (SignalHandler.h), never in
// asynchronous signal context, so they may take the exit lock. A signal that arrives while
// SysExit destroys the object finds no object: the pointer is cleared, under the same lock the
// handlers take, before the destruction begins. After SysExit the handlers do nothing.
// getSystemObject takes no lock: any thread may call it, also while an exit request is handled.
//
// Main thread only, except for the handlers and getSystemObject.

class QNCString;
class QNCSystem;

// Registers the system object; the driver deletes it in SysExit. Asserts 0UL != apSystem.
void setSystemObject(QNCSystem* apSystem);
void getSystemObject(QNCSystem*& arpSystem);

// "$QN_LOG_DIR/<name>" when QN_LOG_DIR is set (also when empty), else "/tmp/<name>"; cut to 511
// characters. The directory is neither checked nor created.
void setLogFilePath(char const* apFileName);
void getLogFilePath(QNCString& arPath);
// QN_LOG_DIR when set (also when empty), else "/tmp".
void getLogDir(QNCString& arDir);

void SysInit(int argc, char** argv);
void SysExit();
// Besides the above, SystemMain
//  - tells the command that started a daemon how the daemon's start-up ended (waitForDaemonStart),
//    catching whatever SysInit throws in the daemon only to report it, and throwing it on
//    unchanged;
//  - speaks the systemd notification protocol when NOTIFY_SOCKET is set: STATUS lines, READY=1
//    once SysInit has returned, STOPPING=1 at the exit request, and WATCHDOG=1 pings when
//    WATCHDOG_USEC asks for them (ServiceNotifier.h says when the process counts as healthy).
// The tolerated "Config file parsing not implemented." line goes to the log only, never to the
// terminal: it is not a failure.
void SystemMain(int argc, char** argv);

// For the application's catch of QNCParentExitEx; returns the exit status of that process.
//  - In the command that started a daemon: waits until the daemon holds its PID file and SysInit
//    has returned in it (0), or until it reports the exception that ended its start-up, or ends
//    without a word (1, after printing on standard error the daemon's error and warning lines of
//    before its log was open, then "Daemon start-up failed: <reason>"). The wait is bounded:
//    QN_START_TIMEOUT seconds (1 to 3600), 30 when unset; after it, 1 and "Daemon start-up not
//    confirmed: ..." (the daemon is left running). A successful start prints nothing.
//  - In the intermediate process of daemonizing, after "-s", and wherever systemDaemonize did not
//    run under SystemMain: 0 at once.
// Standard error, moved aside in the parents while they left start-up (so that their halt lines
// stay off the terminal), is put back first; a parent that never calls this keeps it on /dev/null.
int waitForDaemonStart();
// The status main should return once SystemMain has returned: 0, or 1 when the run failed
// because a thread component or pool thread ended by an exception (ThreadComponent.h,
// ThreadPool.h; the orderly exit then started by itself). Any thread, at any time.
int getRunExitStatus();
// True once the run has failed (the same fact as getRunExitStatus() != 0). One atomic load, no
// lock: cheap enough for a watchdog or a health check to poll from any thread.
bool hasRunFailed();
