#pragma once

#include <chrono>
#include <memory>
#include <string>
#include <unordered_set>
#include <vector>

#include "axd/AXDPlugIn.h"
#include "platform/value/Uuid.h"

class AXDZynClient;

// A hold: a set of plug-ins kept from discovery and from being made ready while the client that
// placed it works on them, and the bundle paths it was placed on. An installer replaces what it
// holds, so whatever is registered at or under a held path while the hold lasts is held too, new
// UUIDs included. Identified by its token, a fresh random UUID. While it exists it takes one
// count of the process's open-work counter. Immutable after construction; safe to read from any
// thread.
class AXDPlugInHold {
 public:
  using Blocked =
      std::unordered_set<std::shared_ptr<const AXPlugInCore>, AXPlugInCoreHash, AXPlugInCoreEqual>;

  // A hold on |plugIns| (duplicates collapse) and on the canonical bundle paths |paths|, for
  // |client|, held weakly.
  AXDPlugInHold(const std::vector<std::shared_ptr<AXDPlugIn>>& plugIns,
                std::vector<std::string> paths, const std::shared_ptr<AXDZynClient>& client);
  ~AXDPlugInHold();
  AXDPlugInHold(const AXDPlugInHold&) = delete;
  AXDPlugInHold& operator=(const AXDPlugInHold&) = delete;

  const value::Uuid& uuid() const { return uuid_; }
  const Blocked& blocked() const { return blocked_; }
  const std::vector<std::string>& paths() const { return paths_; }
  // The client that placed the hold; null once that client object is gone.
  std::shared_ptr<AXDZynClient> client() const { return client_.lock(); }
  std::chrono::system_clock::time_point created() const { return created_; }

  // True when the hold covers a record with |plugIn|'s UUID, or |plugIn| lies at or under one of
  // its paths.
  bool blocks(const AXDPlugIn& plugIn) const;
  // True when |client| is the client that placed the hold (and still exists).
  bool isHeldBy(const AXDZynClient& client) const;

  bool isEqual(const AXDPlugInHold& other) const { return uuid_ == other.uuid_; }
  std::size_t hash() const { return value::UuidHash()(uuid_); }

 private:
  const value::Uuid uuid_;
  const Blocked blocked_;
  const std::vector<std::string> paths_;
  const std::weak_ptr<AXDZynClient> client_;
  const std::chrono::system_clock::time_point created_;
};
