#include "SensorSampler.h"

#include "Logger.h"
#include "QNException.h"
#include "ThreadPool.h"

namespace {
constexpr unsigned int kSamplePeriodMs = 1000;
constexpr unsigned int kSamplesPerHeartbeat = 3;

// The example has no hardware: a reading in tenths of a degree that drifts between 20.0 and
// 24.9 so that consecutive samples differ.
unsigned int readSensor(unsigned int aSampleNo) { return 200 + (aSampleNo * 7) % 50; }
}  // namespace

QNCSensorSampler::QNCSensorSampler(const QNCString& acrName, const QNCPointer<QNCThreadPool>& acrPool)
    : QNCThreadComponent(acrName), mPool(acrPool) {}

void QNCSensorSampler::run() {
  unsigned int lSampleNo = 0;
  while (!waitForExitRequest(kSamplePeriodMs)) {
    ++lSampleNo;
    const unsigned int lReading = readSensor(lSampleNo);
    try {
      mPool->submit([lSampleNo, lReading] {
        QN_LOG_INFO("Sample %u processed: %u.%u C", lSampleNo, lReading / 10, lReading % 10);
      });
    } catch (const QNCExitConditionEx&) {
      // The pool was finished before this thread heard of the exit: nothing more to hand on.
      QN_LOG_INFO("Sample pool closed after %u samples", lSampleNo - 1);
      return;
    }
    if (lSampleNo % kSamplesPerHeartbeat == 0) {
      QN_LOG_NOTICE("Heartbeat: '%s' alive, %u samples taken", getName().get(), lSampleNo);
    }
  }
  QN_LOG_INFO("'%s' asked to exit after %u samples", getName().get(), lSampleNo);
}
