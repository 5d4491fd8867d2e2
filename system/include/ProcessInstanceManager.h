#pragma once
// QNCProcessInstanceManager (declared here; its contract is completed with its implementation).

class QNCProcessInstanceManager {
 public:
  virtual ~QNCProcessInstanceManager() = default;
};
