#include "axd/AXDPlugInHold.h"

#include "platform/os/OpenWork.h"

namespace {

AXDPlugInHold::Blocked blockedSet(const std::vector<std::shared_ptr<AXDPlugIn>>& plugIns) {
  return AXDPlugInHold::Blocked(plugIns.begin(), plugIns.end());
}

}  // namespace

AXDPlugInHold::AXDPlugInHold(const std::vector<std::shared_ptr<AXDPlugIn>>& plugIns,
                             const std::shared_ptr<AXDZynClient>& client)
    : uuid_(value::Uuid::random()),
      blocked_(blockedSet(plugIns)),
      client_(client),
      created_(std::chrono::system_clock::now()) {
  os::OpenWork::take();
}

AXDPlugInHold::~AXDPlugInHold() {
  os::OpenWork::giveBack();
}

bool AXDPlugInHold::blocks(const AXDPlugIn& plugIn) const {
  // A non-owning alias: the set compares by UUID, so any record with the same UUID is found.
  std::shared_ptr<const AXPlugInCore> probe(std::shared_ptr<const AXPlugInCore>(), &plugIn);
  return blocked_.contains(probe);
}

bool AXDPlugInHold::isHeldBy(const AXDZynClient& client) const {
  return client_.lock().get() == &client;
}
