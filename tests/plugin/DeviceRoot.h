#pragma once

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>
#include <string>

#include "tests/platform/ScopedEnvironment.h"
#include "tests/platform/TempDirectory.h"

// A test on a fresh device root of its own (ANNEXA_ROOT), so the sandbox key and every file
// the test makes are gone afterwards.
class DeviceRootTest : public ::testing::Test {
 protected:
  void SetUp() override {
    ASSERT_FALSE(root_.path().empty());
    environment_.set("ANNEXA_ROOT", root_.path());
  }

  // Creates the directory |relative| (and its parents) under the root; returns its path.
  std::string directory(const std::string& relative) const {
    std::filesystem::create_directories(root_ / relative);
    return root_ / relative;
  }

  // The canonical form of |path|.
  static std::string canonical(const std::string& path) {
    return std::filesystem::canonical(path).string();
  }

  TempDirectory root_;
  ScopedEnvironment environment_;
};
