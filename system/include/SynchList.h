#pragma once
// QNCSynchList (declared here; its contract is completed with its implementation).

class QNCSynchList {
 public:
  virtual ~QNCSynchList() = default;
};
