#pragma once

#include <sys/types.h>

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "Annexa/AXBundle.h"
#include "platform/codesign/Task.h"
#include "platform/value/Value.h"
#include "platform/zyn/Connection.h"

class AXDServer;

// The daemon's record of one connected client process: its pid, executable bundle and code
// signing identity. It receives every event of its connection (on the connection's own serial
// delivery), turns each request into a Transaction for the service queue, and stops accepting
// work when the connection dies. The connection owns the client; so does each of its queued
// transactions. The bundle and task are written by set-up, before the connection is resumed, and
// only read afterwards; requestCount is touched only on the service queue.
class AXDZynClient : public std::enable_shared_from_this<AXDZynClient> {
 public:
  // Schedules the set-up of a new connection (setUpConnection()) on a set-up thread of |server|
  // and returns at once, so the thread that reads every connection never waits for it.
  static void initWithConnection(std::shared_ptr<zyn::Connection> connection,
                                 std::shared_ptr<AXDServer> server);
  // Makes the client for a new connection, reading its executable, bundle and entitlements, then
  // resumes the connection. Null, and the connection closed, when the peer no longer runs the
  // program it ran at accept: its entitlements would be another program's.
  static std::shared_ptr<AXDZynClient> setUpConnection(std::shared_ptr<zyn::Connection> connection,
                                                       std::shared_ptr<AXDServer> server);

  // The peer's process id, asked of the connection at each use; 0 once the connection is gone.
  pid_t pid() const;

  // The value of the client's entitlement |key|, or nothing.
  std::optional<value::Value> entitlementValueForKey(std::string_view key) const;
  // True when the entitlement is present and not false (a number equal to zero is false).
  bool hasEntitlement(std::string_view key) const;

  // The connection's termination-imminent event: a debug line; the client keeps working.
  void dying();
  // The connection-invalid event: the client stops accepting work and its holds are released.
  void dead();

  std::string description() const;

  std::shared_ptr<zyn::Connection> connection() const { return connection_.lock(); }
  const std::shared_ptr<AXDServer>& server() const { return server_; }
  // The bundle of the client's executable; null when the executable could not be found.
  const std::shared_ptr<AXBundle>& bundle() const { return bundle_; }
  bool acceptWork() const { return acceptWork_.load(); }
  const codesign::Task* task() const { return _task.get(); }
  std::uint32_t requestCount() const { return requestCount_; }

 private:
  AXDZynClient(std::shared_ptr<zyn::Connection> connection, std::shared_ptr<AXDServer> server);

  // False when the connection was refused (setUpConnection()).
  bool setUp(const std::shared_ptr<zyn::Connection>& connection);
  // True when the entitlements were read for the program the peer ran at accept, or none were
  // (the process is gone, and the connection will end).
  bool runsProgramOfTask(const zyn::Connection& connection) const;
  void handleEvent(const zyn::Event& event);
  void handleMessage(const zyn::Message& message);

  std::atomic<bool> acceptWork_{true};
  std::weak_ptr<zyn::Connection> connection_;
  std::shared_ptr<AXDServer> server_;
  std::shared_ptr<AXBundle> bundle_;
  std::unique_ptr<codesign::Task> _task;
  std::uint32_t requestCount_ = 0;
};
