#pragma once
// QNCBufferManager (declared here; its contract is completed with its implementation).

class QNCBufferManager {
 public:
  virtual ~QNCBufferManager() = default;
};
