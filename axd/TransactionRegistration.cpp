// The registration family of request handlers: add, remove and bulk.

#include "Annexa/AXProtocol.h"
#include "axd/Transaction.h"
#include "platform/os/Format.h"
#include "platform/os/Log.h"

void Transaction::bulkPlugIns() {
  std::uint64_t flags = integerField(AXProtocol::kFlags);
  os::Log::write(5, os::format("bulk options 0x%lx not supported", {flags}));
  done();
}
