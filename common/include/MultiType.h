#pragma once
// QNCMultiType (declared here; its contract is completed with its implementation).

class QNCMultiType {
 public:
  virtual ~QNCMultiType() = default;
};
