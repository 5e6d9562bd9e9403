#pragma once

#include <cstddef>
#include <string>
#include <vector>

#include "platform/os/Error.h"

// Many installed plug-ins on one device root, for benchmarks that need a registry of some size.
// Plug-in i has the identifier identifier(i) and the extension point kExtensionPoint, and lies
// in an application "<root>/Applications/Bench<k>.app" together with the plug-ins next to it.
// Stateless; safe from any thread.
class PlugInPopulation {
 public:
  static constexpr const char* kExtensionPoint = "bench.point";

  // "bench.plugin.<index>", zero-padded so that path order is index order.
  static std::string identifier(std::size_t index);

  // Writes the bundles of |count| plug-ins into applications of |perApplication| plug-ins each
  // (the last one takes the rest) under |root|; returns the applications' paths. EINVAL when
  // |perApplication| is 0; otherwise fails with the first file that cannot be written.
  static os::Result<std::vector<std::string>> write(const std::string& root, std::size_t count,
                                                    std::size_t perApplication);

  // Installs each of |applications| with its plug-ins (each with the data container the daemon
  // requires) in the registry of |root|, one transaction each. Fails with the first refused
  // installation; the applications before it stay installed.
  static os::Status install(const std::string& root, const std::vector<std::string>& applications);
};
