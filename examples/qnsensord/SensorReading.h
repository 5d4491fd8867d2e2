#pragma once
// QNCSensorReadingItem: one reading on its way from a channel worker to the consumer through the
// system object's list of readings. It carries what the answer needs: the channel and connection
// it came from, its sequence text, and either the parsed reading and its identifier or the
// reason it was refused. Immutable once enlisted.

#include <string>

#include "Queueable.h"
#include "SensorWire.h"

class QNCSensorReadingItem : public QNCQueueable {
 public:
  unsigned int mChannel = 0;
  unsigned long mGeneration = 0;
  bool mAccepted = false;
  QNSSensorReading mReading;
  std::string mSequenceText;
  unsigned int mId = 0;  // when accepted
  std::string mReason;   // when refused
};
