#pragma once

#include <latch>
#include <memory>

#include "axd/AXDServer.h"

// Parks a server's service queue: the work it submits waits until release(), so that whatever
// is submitted meanwhile queues up behind it in order. Destruction releases a queue still
// parked, so a failed test never leaves it stuck. Use from one thread.
class ServiceGate {
 public:
  explicit ServiceGate(AXDServer& server);
  ~ServiceGate() { release(); }
  ServiceGate(const ServiceGate&) = delete;
  ServiceGate& operator=(const ServiceGate&) = delete;

  // Lets the parked work end and the queue go on; later calls do nothing.
  void release();

 private:
  // Shared with the parked work, which may still be waking up when the gate is gone.
  std::shared_ptr<std::latch> open_ = std::make_shared<std::latch>(1);
  bool released_ = false;
};
