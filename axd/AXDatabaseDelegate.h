#pragma once

#include "platform/registrum/Observer.h"

// What the database tells its owner about plug-ins leaving the system.
class AXDatabaseDelegate {
 public:
  virtual ~AXDatabaseDelegate() = default;

  // |plugIns| are being uninstalled. Called on the registry's notice thread, after the database
  // has dropped them from its cache and released its queue, so the delegate may call back in.
  virtual void removedPlugIns(const registrum::PlugInList& plugIns) = 0;
};
