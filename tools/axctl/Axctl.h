#pragma once

#include <csignal>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "Annexa/AXDaemonClient.h"

// The command-line client's requests: each sends one request through AXDaemonClient, waits for
// its reply, prints it (a table or JSON) and returns the exit status: 0 for a success, 1 for a
// failure (the code and message are printed on standard error). launch sends two requests and
// then starts the plug-in in this process.
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
  // Places the hold, prints its token, and keeps the connection (and with it the hold) until
  // SIGINT or SIGTERM; blockEndingSignals() must have run before the client was made.
  int hold(const std::vector<std::string>& paths, std::uint64_t flags);
  static void blockEndingSignals();
  int release(const value::Uuid& token);
  // Discovers the plug-in |uuid| (its form), makes it ready for this process, starts it and
  // prints its pid ({"pid": N} with --json). With |wait|, waits for it and returns its exit
  // status, or 128 plus the signal that ended it; SIGINT and SIGQUIT are then left to the child,
  // as a shell does for a foreground command. Without, returns 0 once it is started. Any failure
  // is printed on standard error as "axctl: ..." and returns 1.
  int launch(const value::Uuid& uuid, bool wait);

 private:
  static sigset_t endingSignals();
  using Send = std::function<void(AXDaemonClient&, AXDaemonClient::ReplyHandler)>;
  using Print = std::function<void(const value::Dictionary& reply)>;

  // Sends through |send|, waits for the reply, and prints it with |print| on success.
  int call(const Send& send, const Print& print);
  // Sends through |send| and waits for the reply. Returns its fields on success; on a failure
  // prints it on standard error (and, when |json|, the reply on standard output) and returns
  // nothing.
  std::optional<value::Dictionary> request(const Send& send, bool json);
  // The form of the plug-in |uuid| as discovery gives it, or nothing (reason printed).
  std::optional<value::Dictionary> discover(const value::Uuid& uuid);
  // The forms of a discovery reply, or nothing when the reply carries none (version 2).
  std::optional<value::Value> matchesIn(const value::Dictionary& reply) const;
  void printMatches(const value::Dictionary& reply);
  void printField(const value::Dictionary& reply, const char* key);

  Options options_;
  AXDaemonClient client_;
};
