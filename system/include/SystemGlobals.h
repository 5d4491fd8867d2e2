#pragma once
// The start-up and shut-down driver: free functions that run the whole life of a process around
// the one system object the application registers.
//
//   int main(int argc, char** argv) {
//     setSystemObject(new MySystem);      // the driver owns it from now on
//     setLogFilePath("myservice.log");    // $QN_LOG_DIR/myservice.log, else /tmp/myservice.log
//     SystemMain(argc, argv);             // returns after an orderly shut-down
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
void SystemMain(int argc, char** argv);

// The status main should return once SystemMain has returned: 0, or 1 when the run failed
// because a thread component or pool thread ended by an exception (ThreadComponent.h,
// ThreadPool.h; the orderly exit then started by itself). Any thread, at any time.
int getRunExitStatus();
// True once the run has failed (the same fact as getRunExitStatus() != 0). One atomic load, no
// lock: cheap enough for a watchdog or a health check to poll from any thread.
bool hasRunFailed();
