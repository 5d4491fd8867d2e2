#pragma once
// QNCSynchQueue (declared here; its contract is completed with its implementation).

class QNCSynchQueue {
 public:
  virtual ~QNCSynchQueue() = default;
};
