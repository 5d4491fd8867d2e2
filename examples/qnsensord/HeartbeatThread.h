#pragma once
// QNCHeartbeatThread: logs a heartbeat line at notice level every HbTimeout seconds (the setting,
// at least one second) with the number of readings answered so far, so a running qnsensord is
// visible in its log. It sleeps with waitAndCheckExit, one second at a time, and ends within a
// second of the process being marked for exit.

#include "ThreadComponent.h"

class QNCSensorStatistics;
class QNCSensorSystem;

class QNCHeartbeatThread : public QNCThreadComponent {
 public:
  QNCHeartbeatThread(QNCSensorSystem& arSystem, const QNCSensorStatistics& acrStatistics,
                     unsigned int aPeriod);

 protected:
  void run() override;

 private:
  QNCSensorSystem& mSystem;
  const QNCSensorStatistics& mStatistics;
  const unsigned int mPeriod;  // seconds between heartbeats
};
