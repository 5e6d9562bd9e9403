#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "Annexa/AXDaemonClient.h"

// The command-line client's requests: each sends one request through AXDaemonClient, waits for
// its reply, prints it (a table or JSON) and returns the exit status: 0 for a success, 1 for a
// failure (the code and message are printed on standard error).
class Axctl {
 public:
  struct Options {
    std::optional<std::string> serviceName;
    std::optional<std::int64_t> protocolVersion;
    bool json = false;
  };

  explicit Axctl(const Options& options);

  int add(const std::vector<std::string>& paths);
  int remove(const std::vector<std::string>& paths);
  int bulk(std::uint64_t flags);
  int match(const std::optional<value::Dictionary>& rule, std::uint64_t flags);
  int ready(const std::vector<value::Uuid>& uuids, std::uint64_t flags);
  int access(const std::vector<value::Uuid>& uuids, std::uint64_t flags);
  int annotate(const std::vector<value::Uuid>& uuids, const value::Dictionary& annotations);
  int hold(const std::vector<std::string>& paths, std::uint64_t flags);
  int release(const value::Uuid& token);

 private:
  using Send = std::function<void(AXDaemonClient&, AXDaemonClient::ReplyHandler)>;
  using Print = std::function<void(const value::Dictionary& reply)>;

  // Sends through |send|, waits for the reply, and prints it with |print| on success.
  int call(const Send& send, const Print& print);
  void printMatches(const value::Dictionary& reply);
  void printField(const value::Dictionary& reply, const char* key);

  Options options_;
  AXDaemonClient client_;
};
