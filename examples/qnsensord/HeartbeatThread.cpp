#include "HeartbeatThread.h"

#include "Logger.h"
#include "QNException.h"
#include "SensorStatistics.h"
#include "SensorSystem.h"

QNCHeartbeatThread::QNCHeartbeatThread(QNCSensorSystem& arSystem, const QNCSensorStatistics& acrStatistics,
                                       unsigned int aPeriod)
    : QNCThreadComponent("Heartbeat"),
      mSystem(arSystem),
      mStatistics(acrStatistics),
      mPeriod(aPeriod < 1 ? 1 : aPeriod) {}

void QNCHeartbeatThread::run() {
  try {
    for (unsigned int lSeconds = 1;; ++lSeconds) {
      mSystem.waitAndCheckExit(1);
      if (lSeconds % mPeriod == 0) QN_LOG_NOTICE("Heartbeat: %lu readings answered", mStatistics.total());
    }
  } catch (const QNCHaltEx&) {
    // waitAndCheckExit: the process is marked for exit, and this thread's work is done.
  }
}
