#pragma once
// QNCNumericIdManager (declared here; its contract is completed with its implementation).

class QNCNumericIdManager {
 public:
  virtual ~QNCNumericIdManager() = default;
};
