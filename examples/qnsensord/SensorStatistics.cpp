#include "SensorStatistics.h"

bool QNCSensorStatistics::add(const std::string& acrSensor, double aValue) {
  std::lock_guard<std::mutex> lGuard(mLock);
  auto lEntry = mSensors.find(acrSensor);
  if (lEntry == mSensors.end()) {
    if (mSensors.size() >= kMaxSensors) return false;
    lEntry = mSensors.emplace(acrSensor, QNSSensorSummary()).first;
  }
  QNSSensorSummary& lSummary = lEntry->second;
  if (lSummary.mCount == 0 || aValue < lSummary.mMin) lSummary.mMin = aValue;
  if (lSummary.mCount == 0 || aValue > lSummary.mMax) lSummary.mMax = aValue;
  lSummary.mSum += aValue;
  ++lSummary.mCount;
  ++mTotal;
  return true;
}

std::map<std::string, QNSSensorSummary> QNCSensorStatistics::snapshot() const {
  std::lock_guard<std::mutex> lGuard(mLock);
  return mSensors;
}

unsigned long QNCSensorStatistics::total() const {
  std::lock_guard<std::mutex> lGuard(mLock);
  return mTotal;
}
