#pragma once
// QNCThreadComponent (declared here; its contract is completed with its implementation).

class QNCThreadComponent {
 public:
  virtual ~QNCThreadComponent() = default;
};
