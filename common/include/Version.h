#pragma once
// QNCVersion: the application's version text, as printed by "-v". Immutable after construction.

#include "QNString.h"

class QNCVersion {
 public:
  explicit QNCVersion(const char* apVersion) : mVersion(apVersion) {}
  virtual ~QNCVersion() = default;

  const char* getVersion() const { return mVersion.get(); }

 private:
  QNCString mVersion;
};
