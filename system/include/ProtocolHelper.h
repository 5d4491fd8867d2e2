#pragma once
// QNCProtocolHelper (declared here; its contract is completed with its implementation).

class QNCProtocolHelper {
 public:
  virtual ~QNCProtocolHelper() = default;
};
