#pragma once

#include <cstdint>
#include <vector>

// The two frames of one bulk round trip, byte for byte as the client library and the daemon
// write them: the request of AXDaemonClient::bulkPlugins and the daemon's reply to it. The raw
// baseline moves exactly these bytes, so both sides of a ratio pay for the same sizes.
// Stateless; safe from any thread.
class BulkFrames {
 public:
  // The request frame of bulkPlugins(|flags|), carrying message id |id|.
  static std::vector<std::uint8_t> request(std::uint64_t flags, std::uint64_t id);
  // The reply frame to the request with message id |id|: an empty dictionary.
  static std::vector<std::uint8_t> reply(std::uint64_t id);
};
