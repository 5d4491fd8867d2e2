#pragma once
// QNCDaemonStart: tells the command that started a daemon how the daemon's start-up ended, so
// that its exit status can be trusted by a shell script or a service manager.
//
// The channel is a pipe opened by systemDaemonize before its first fork, and only when SystemMain
// armed it (a program that calls systemDaemonize or SysInit by itself gets the plain behaviour).
//  - The starting process keeps the read end. Its standard error is moved aside (to /dev/null)
//    before it logs "Time for parent process to quit", so that a successful start prints nothing;
//    waitForDaemonStart() puts it back.
//  - The intermediate process closes both ends and does not wait.
//  - The daemon keeps both ends until start-up ends: while it runs, its descriptor 2 is the write
//    end, so the lines the logger echoes to standard error before the log exists (errors,
//    warnings, a log that cannot be opened, a failed assertion) reach the starting command. It
//    keeps the read end too, so that a starting command that has gone makes its writes fail with
//    EAGAIN once the pipe is full, never with SIGPIPE. When start-up ends, descriptor 2 is again
//    the file systemDaemonize opened there, and both ends are closed.
//  - Its last word is a NUL, then "ready" or the text of the exception that ended start-up, then
//    a NUL. End of file before it means the daemon died (an assertion, a signal).
//
// All calls on the main thread during start-up (no other thread exists when the state changes
// around the forks); no lock.

class QNCDaemonStart {
 public:
  // SystemMain: a daemonizing step in this run reports to its starting command.
  static void arm();

  // systemDaemonize, before the first fork: opens the channel when armed. Throws QNCOsException.
  static void openChannel();
  // In the parent after each fork; aStarting is true after the first. Never throws.
  static void enterParent(bool aStarting);
  // The descriptors the daemon must not close while it closes every other one (-1 when none).
  static void getKeptDescriptors(int& arFirst, int& arSecond);
  // In the daemon, once 0, 1 and 2 are open on their files: descriptor 2 becomes the channel.
  static void enterDaemon();

  // In the daemon, when SysInit has returned, or with the text of the exception that ended it.
  // Nothing happens in a process without a channel. Never throws.
  static void reportReady();
  static void reportFailure(const char* apText);

  // See waitForDaemonStart() in SystemGlobals.h.
  static int waitForStart();
};
