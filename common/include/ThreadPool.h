#pragma once
// QNCThreadPool (declared here; its contract is completed with its implementation).

class QNCThreadPool {
 public:
  virtual ~QNCThreadPool() = default;
};
