#pragma once

#include <gtest/gtest.h>

#include <chrono>
#include <cstddef>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "axd/AXDServer.h"
#include "tests/platform/TempDirectory.h"

// The one AXDServer of this test program (a process can build only one), listening on a device
// root of its own. Every line the server logs goes to standard error (AXD_LOG=stderr), which is
// captured in a file under the root so that tests can read it back. A gtest environment: SetUp()
// builds the server before the first test; the server is never destroyed. Register exactly one
// in main(). The log readers are safe from any thread.
class InProcessServer : public ::testing::Environment {
 public:
  static constexpr const char* kServiceName = "axd.test";
  // Generous: only a server that never gets there waits this long.
  static constexpr std::chrono::seconds kLogTimeout{30};

  InProcessServer();
  // The environment registered in main().
  static InProcessServer& shared();

  void SetUp() override;
  // Shows the captured log on the original standard error when a test failed.
  void TearDown() override;

  // What initForService() returned; null when it failed (recorded as a failure).
  const std::shared_ptr<AXDServer>& built() const { return built_; }
  const std::string& root() const { return root_.path(); }

  // The size of the log so far: an offset for the readers below.
  std::size_t logSize() const;
  // The messages logged after offset |since|, one per line, without the "ident[pid]: " prefix.
  std::vector<std::string> logLines(std::size_t since) const;
  // True when the log shows |text| after offset |since| within |timeout|.
  bool waitForLog(std::string_view text, std::size_t since,
                  std::chrono::milliseconds timeout = kLogTimeout) const;

 private:
  std::string logText() const;

  TempDirectory root_;
  std::string logPath_;
  int savedStderr_ = -1;
  std::shared_ptr<AXDServer> built_;
};
