#include "tests/axd/ServiceGate.h"

ServiceGate::ServiceGate(AXDServer& server) {
  server.submitWork([open = open_] { open->wait(); });
}

void ServiceGate::release() {
  if (released_) return;
  released_ = true;
  open_->count_down();
}
