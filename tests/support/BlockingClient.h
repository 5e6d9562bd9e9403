#pragma once

#include <chrono>
#include <cstdint>
#include <future>
#include <optional>
#include <string>

#include "Annexa/AXDaemonClient.h"

// The real client library with calls that wait for their reply, for tests. Waits are bounded by
// a generous timeout so that a daemon that never answers fails the test instead of hanging it.
// Safe to use from one test thread at a time.
class BlockingClient {
 public:
  // Long enough for a loaded machine under sanitizers; only a broken daemon ever reaches it.
  static constexpr std::chrono::seconds kReplyTimeout{30};

  // Connects to |serviceName|, or to the daemon's default service when it is null.
  explicit BlockingClient(const char* serviceName = nullptr) : client_(serviceName) {}

  AXDaemonClient& client() { return client_; }

  // Sends |request| and returns at once; the future holds the reply or the service's error.
  std::future<zyn::ReplyOrError> start(const AXDaemonClient::Request& request);
  // The reply of |pending|; nothing when it did not come within kReplyTimeout.
  static std::optional<zyn::ReplyOrError> await(std::future<zyn::ReplyOrError>& pending);

  // The outcome of |request| in one line: "ok" for an empty success reply, "ok {...}" for a
  // success with fields, "CODE: MESSAGE" (or "CODE") for a failure, "service error: ..." when
  // the connection failed, "no reply" on timeout.
  std::string outcome(const AXDaemonClient::Request& request);
  // The outcome of a bulk request with |flags|.
  std::string bulk(std::uint64_t flags);

  // |reply| described as outcome() does.
  static std::string describe(const std::optional<zyn::ReplyOrError>& reply);

 private:
  AXDaemonClient client_;
};
