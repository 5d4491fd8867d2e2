#pragma once
// QNCSystemInterface: the part of the system object that components may depend on without
// knowing the application's system class: the pooled buffers, numeric identifiers, the wake-up
// of a numbered conditional, and the path of the configuration file.
// The first five virtual operations of QNCSystem are declared here, in the same order.

#include "Pointer.h"
#include "QNString.h"

class QNCBuffer;

class QNCSystemInterface {
 public:
  virtual ~QNCSystemInterface();

  virtual void getBuffer(unsigned int aLength, QNCPointer<QNCBuffer>& arBuffer) = 0;
  virtual void reuseBuffer(QNCPointer<QNCBuffer>& arBuffer) = 0;
  virtual void clearBuffer(QNCPointer<QNCBuffer>& arBuffer) = 0;
  virtual void generateNumericId(unsigned int& arId) = 0;
  virtual void signal(unsigned int acConditionNo) = 0;

  // The configuration file path; empty unless the application set it.
  const QNCString& getConfFilePathStr() const { return mConfFilePath; }

 protected:
  QNCSystemInterface() = default;
  void setConfFilePathStr(const QNCString& acrPath) { mConfFilePath = acrPath; }

 private:
  QNCString mConfFilePath;
};
