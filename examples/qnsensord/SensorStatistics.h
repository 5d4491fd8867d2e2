#pragma once
// QNCSensorStatistics: running statistics per sensor (count, minimum, maximum, mean) for at most
// kMaxSensors sensors: a peer that invents names cannot make the table, nor the statistics logged
// at shut-down, grow without bound.
// Threads: any thread; one lock guards the table. snapshot() copies it for reporting.

#include <map>
#include <mutex>
#include <string>

struct QNSSensorSummary {
  unsigned long mCount = 0;
  double mMin = 0.0;
  double mMax = 0.0;
  double mSum = 0.0;
  double mean() const { return mCount == 0 ? 0.0 : mSum / static_cast<double>(mCount); }
};

class QNCSensorStatistics {
 public:
  static constexpr unsigned int kMaxSensors = 1024;

  // Adds a value of a sensor already tracked, or of a new one while fewer than kMaxSensors are
  // tracked; returns false (and adds nothing) for a new sensor when the table is full.
  bool add(const std::string& acrSensor, double aValue);
  std::map<std::string, QNSSensorSummary> snapshot() const;
  unsigned long total() const;

 private:
  mutable std::mutex mLock;  // guards mSensors and mTotal
  std::map<std::string, QNSSensorSummary> mSensors;
  unsigned long mTotal = 0;
};
