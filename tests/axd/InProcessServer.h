#pragma once

#include <chrono>
#include <memory>
#include <string>

#include "axd/AXDServer.h"

// The process's one AXDServer, on a temporary device root, listening on "test.axd" at verbosity
// 2, with the system log copied into a file (the process's standard error).
class InProcessServer {
 public:
  // Call once, before any test runs and before anything logs.
  static void setUp();

  static const std::shared_ptr<AXDServer>& server();
  static const std::string& root();
  static std::string socketPath();
  static std::string log();
  // Waits until |text| occurs at least |count| times in the log.
  static bool waitForLog(const std::string& text, std::size_t count = 1,
                         std::chrono::milliseconds timeout = std::chrono::seconds(10));
  static std::size_t occurrences(const std::string& text);
};
