#pragma once

#include <gtest/gtest.h>

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/registrum/Workspace.h"
#include "tests/e2e/RawClient.h"
#include "tests/e2e/Subprocess.h"
#include "tests/support/BlockingClient.h"
#include "tests/support/DaemonProcess.h"

// A test that runs the real axd (AXD_EXECUTABLE) on a fresh device root with its log captured, and
// talks to it with the client library, raw sockets and axctl (AXCTL_EXECUTABLE). The root is this
// process's ANNEXA_ROOT while the daemon runs.
class DaemonTest : public ::testing::Test {
 protected:
  // Starts axd with |arguments| and |environment| set over this process's, listening on
  // |serviceName| (the default service when empty); a daemon this test started before is stopped
  // first. False, with the reason recorded as a test failure, when the daemon does not come up.
  bool start(const std::vector<std::string>& arguments = {}, const std::string& serviceName = "",
             const std::map<std::string, std::string>& environment = {});
  // Stops the daemon and starts it again on the same root; false, with the reason recorded as a
  // test failure, when it does not come up.
  bool restart();
  DaemonProcess& daemon() { return *daemon_; }
  // The daemon's device root with its symbolic links resolved, as the registry names paths.
  const std::string& root() const { return root_; }
  // This program's connection through the client library, made at first use after start() and
  // grant().
  BlockingClient& client();
  // Grants this program |entitlements| in the entitlement table, and reconnects client(), since
  // the daemon reads them when a client connects.
  void grant(const value::Dictionary& entitlements);

  // Expects the daemon still to run and to answer a fresh client's bulk request.
  void expectServing();
  // A raw connection to the daemon's socket; null, with a failure recorded, when it fails.
  std::unique_ptr<RawClient> connectRaw();
  // Runs axctl with |arguments| on the daemon's device root.
  Subprocess::Outcome axctl(const std::vector<std::string>& arguments);

  // The outcome of client()'s request |type| for |paths| or |uuids|, as BlockingClient::outcome()
  // puts it.
  std::string send(const char* type, const std::vector<std::string>& paths);
  std::string send(const char* type, const std::vector<value::Uuid>& uuids);
  // The registry's record of the plug-in at |path|; null when it has none.
  std::shared_ptr<const registrum::PlugInRecord> record(const std::string& path);
  // Its UUID; a nil one, with a failure recorded, when there is no record.
  value::Uuid uuid(const std::string& path);
  // The fields of the reply to |request| from |client|, success or failure; empty, with a
  // failure recorded, when none came.
  static value::Dictionary reply(BlockingClient& client, const AXDaemonClient::Request& request);
  // The forms that a match with |rules| and |flags| returns to client(); a failed match is
  // recorded and gives none.
  value::Array match(const std::optional<value::Value>& rules = std::nullopt,
                     std::uint64_t flags = 0);
  // The identifiers of those forms, sorted.
  std::vector<std::string> matchIds(const std::optional<value::Value>& rules = std::nullopt,
                                    std::uint64_t flags = 0);

  // "client <pid of this process>": how the daemon's log names this test's connections.
  static std::string thisClient();
  // How often |text| occurs in the daemon's log.
  std::size_t logCount(std::string_view text);

 private:
  std::unique_ptr<BlockingClient> client_;
  std::unique_ptr<DaemonProcess> daemon_;
  std::string serviceName_;
  std::string root_;
};
