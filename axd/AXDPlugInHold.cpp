#include "axd/AXDPlugInHold.h"

#include "platform/os/OpenWork.h"

namespace {

AXDPlugInHold::Blocked blockedSet(const std::vector<std::shared_ptr<AXDPlugIn>>& plugIns) {
  return AXDPlugInHold::Blocked(plugIns.begin(), plugIns.end());
}

}  // namespace

AXDPlugInHold::AXDPlugInHold(const std::vector<std::shared_ptr<AXDPlugIn>>& plugIns,
                             std::vector<std::string> paths,
                             const std::shared_ptr<AXDZynClient>& client)
    : uuid_(value::Uuid::random()),
      blocked_(blockedSet(plugIns)),
      paths_(std::move(paths)),
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
  if (blocked_.contains(probe)) return true;
  const std::string& location = plugIn.path();
  for (const std::string& held : paths_) {
    // "/Apps/A.app" covers "/Apps/A.app/PlugIns/x.appex", not "/Apps/A.application".
    bool under = location.size() > held.size() && location[held.size()] == '/';
    if (location.starts_with(held) && (location.size() == held.size() || under)) return true;
  }
  return false;
}

bool AXDPlugInHold::isHeldBy(const AXDZynClient& client) const {
  return client_.lock().get() == &client;
}
