#pragma once

#include <gtest/gtest.h>

#include <cstddef>
#include <initializer_list>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "tests/e2e/RawClient.h"
#include "tests/e2e/Subprocess.h"
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
  DaemonProcess& daemon() { return *daemon_; }

  // Expects the daemon still to run and to answer a fresh client's bulk request.
  void expectServing();
  // A raw connection to the daemon's socket; null, with a failure recorded, when it fails.
  std::unique_ptr<RawClient> connectRaw();
  // Runs axctl with |arguments| on the daemon's device root.
  Subprocess::Outcome axctl(const std::vector<std::string>& arguments);

  // "client <pid of this process>": how the daemon's log names this test's connections.
  static std::string thisClient();
  // How often |text| occurs in the daemon's log.
  std::size_t logCount(std::string_view text);
  // True when one line of the daemon's log holds every one of |parts|.
  bool logHasLineWith(std::initializer_list<std::string_view> parts);

 private:
  std::unique_ptr<DaemonProcess> daemon_;
  std::string serviceName_;
};
