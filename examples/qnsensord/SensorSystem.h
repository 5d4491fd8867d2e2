#pragma once
// The system object of qnsensord, the example sensor service.

#include "System.h"

class QNCSensorSystem : public QNCSystem {
 public:
  QNCSensorSystem();

  void setCommandLineArgumentDesc() override;
  void parseConfigFile(QNCString& arConfFilePath) override;
  void displayHelp() override;
  // One sampler thread and the pool that processes its samples (SensorThreads.cpp).
  void createThreads() override;
};
