#include "SensorStatistics.h"

void QNCSensorStatistics::add(const std::string& acrSensor, double aValue) {
  std::lock_guard<std::mutex> lGuard(mLock);
  QNSSensorSummary& lSummary = mSensors[acrSensor];
  if (lSummary.mCount == 0 || aValue < lSummary.mMin) lSummary.mMin = aValue;
  if (lSummary.mCount == 0 || aValue > lSummary.mMax) lSummary.mMax = aValue;
  lSummary.mSum += aValue;
  ++lSummary.mCount;
  ++mTotal;
}

std::map<std::string, QNSSensorSummary> QNCSensorStatistics::snapshot() const {
  std::lock_guard<std::mutex> lGuard(mLock);
  return mSensors;
}

unsigned long QNCSensorStatistics::total() const {
  std::lock_guard<std::mutex> lGuard(mLock);
  return mTotal;
}
