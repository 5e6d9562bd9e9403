#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>

#include "Annexa/AXDaemonClient.h"

// One request through the client library, waited for on the calling thread as a host calling the
// daemon synchronously would. The reply is judged by the handler, on the client's reply queue,
// and a future wakes the caller with one futex call, as a blocking read would. Safe from any
// thread; a client's replies queue one behind the other, so calls on one client wait in turn.
class SyncRoundTrip {
 public:
  // A bulk request with |flags|: true when the daemon answered with success.
  static bool bulk(AXDaemonClient& client, std::uint64_t flags);

  // A match request with |rule| (none: the request carries no rule) and |flags|: the number of
  // plug-in forms the daemon returned, or nothing when the reply was an error or had no list.
  static std::optional<std::size_t> match(AXDaemonClient& client,
                                          const std::optional<value::Dictionary>& rule,
                                          std::uint64_t flags);
};
