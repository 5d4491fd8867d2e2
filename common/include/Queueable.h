#pragma once
// QNCQueueable: the base of every object handed between threads through the system's queues and
// lists. Held through QNCPointer<QNCQueueable>; the last holder destroys it through the virtual
// destructor.

class QNCQueueable {
 public:
  virtual ~QNCQueueable() = default;

 protected:
  QNCQueueable() = default;
};
