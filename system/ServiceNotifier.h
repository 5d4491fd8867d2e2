#pragma once
// QNCServiceNotifier: the service manager's side of a running service, without libsystemd. Each
// state is one datagram to the AF_UNIX socket named by NOTIFY_SOCKET (a path, or "@name" in the
// abstract namespace), in the text form of sd_notify(3):
//   "STATUS=Starting"                        when SystemMain begins
//   "READY=1\nSTATUS=Running"                when SysInit has returned (after createStartUpEvent)
//   "STOPPING=1\nSTATUS=Stopping"            when the exit request arrives (the three signals; an
//                                            exit the application asked for itself is reported
//                                            when its threads have ended)
//   "STATUS=Stopped"                         at the end of SysExit
//   "WATCHDOG=1"                             every half WATCHDOG_USEC while the process is healthy,
//                                            when WATCHDOG_USEC is set and WATCHDOG_PID is unset
//                                            or this process
// Nothing is sent, and no thread is started, when NOTIFY_SOCKET is unset. A datagram that cannot
// be sent is logged as a warning (the watchdog's only once) and start-up goes on: a service
// manager that does not hear READY=1 times the start out itself.
//
// Healthy (isHealthy): the exit request has not come and no thread component or pool thread has
// ended by an exception (hasRunFailed, SystemGlobals.h; a component that restarts its work after
// a failure does not fail the run). It is the one test the watchdog makes, so a further condition
// of health belongs there. Once it fails the pings stop for good, and a
// service manager that still waits for the process ends it at the watchdog's time-out.
//
// The watchdog pings from a thread of its own, which startWatchdog() creates and stopWatchdog()
// joins; it reads the system object, so SysExit stops it before the object is destroyed. All
// other calls are made by the driver: the main thread, and the signal dispatcher thread for
// notifyStopping. mLock guards the watchdog's state.

#include <condition_variable>
#include <mutex>
#include <thread>

class QNCSystem;

class QNCServiceNotifier {
 public:
  static QNCServiceNotifier& instance();

  // Sends apState as one datagram; nothing when NOTIFY_SOCKET is unset. Never throws.
  void send(const char* apState);
  // Sends "STOPPING=1" the first time only. Never throws.
  void notifyStopping();
  // Starts the watchdog thread when WATCHDOG_USEC asks for one (an invalid value is a warning,
  // and no pings). Main thread, after start-up.
  void startWatchdog(QNCSystem* apSystem);
  // Ends and joins the watchdog thread, if any. Blocks for at most the time of one ping.
  void stopWatchdog();

  // The watchdog's test of the process's health.
  static bool isHealthy(const QNCSystem& acrSystem);

 private:
  QNCServiceNotifier() = default;
  void _runWatchdog(QNCSystem* apSystem, long long aIntervalUs);

  std::mutex mLock;  // guards mStop and mStoppingSent
  bool mStop = false;
  bool mStoppingSent = false;
  std::condition_variable mWake;  // a stop request
  std::thread mWatchdog;          // main thread only
};
