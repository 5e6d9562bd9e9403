#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "platform/zyn/SyncQueue.h"

// The daemon's view of the installed plug-ins: the cache of plug-in records over the application
// registry and the user's annotations. The server is a subclass. cacheLimit is set once at
// start-up, before any request; everything that touches the cache runs on _sync.
class AXDatabase {
 public:
  virtual ~AXDatabase() = default;
  AXDatabase(const AXDatabase&) = delete;
  AXDatabase& operator=(const AXDatabase&) = delete;

  std::uint32_t cacheLimit() const { return cacheLimit_; }
  void setCacheLimit(std::uint32_t limit) { cacheLimit_ = limit; }

  // The annotation file named on the command line; nothing for the default location.
  const std::optional<std::string>& databasePath() const { return databasePath_; }

 protected:
  AXDatabase() : _sync("AXDatabase") {}

  // Sets up the database part with the annotation file |path| (null: the default file).
  // Returns false when the database cannot be set up.
  bool initWithDatabase(const char* path);

  zyn::SyncQueue _sync;

 private:
  std::uint32_t cacheLimit_ = 0;
  std::optional<std::string> databasePath_;
};
