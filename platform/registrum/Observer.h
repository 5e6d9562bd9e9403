#pragma once

#include <memory>
#include <vector>

#include "platform/registrum/PlugInRecord.h"

namespace registrum {

using PlugInList = std::vector<std::shared_ptr<const PlugInRecord>>;

// Receives the registry's install and uninstall notices (Workspace::addObserver). Both calls
// arrive on the workspace's own notice thread, one at a time, in the order the changes were
// committed, whichever process made them. An implementation may call back into the Workspace.
class Observer {
 public:
  virtual ~Observer() = default;

  // |plugIns| were registered (or re-registered, or their application finished installing);
  // the records are as they were right after that change. Never empty.
  virtual void pluginsDidInstall(const PlugInList& plugIns) = 0;

  // |plugIns| were removed; the records are the full records as they were just before the
  // removal. Never empty. By the time this is called they are already gone from the registry.
  virtual void pluginsWillUninstall(const PlugInList& plugIns) = 0;
};

}  // namespace registrum
