#include <gtest/gtest.h>
#include <sys/stat.h>

#include "Annexa/AXBundle.h"
#include "tests/platform/TempDirectory.h"

namespace {

std::string infoPlist(const std::string& entries) {
  return R"(<?xml version="1.0" encoding="UTF-8"?>
<!DOCTYPE plist PUBLIC "-//Apple//DTD PLIST 1.0//EN" "http://www.apple.com/DTDs/PropertyList-1.0.dtd">
<plist version="1.0"><dict>)" +
         entries + "</dict></plist>\n";
}

// A device with Host.app (executable "host"), Empty.app (no Info.plist) and Bare.app (an
// Info.plist without an executable).
class AXBundleTest : public ::testing::Test {
 protected:
  void SetUp() override {
    for (const char* dir : {"Host.app", "Empty.app", "Bare.app"}) {
      mkdir((root_ / dir).c_str(), 0755);
    }
    root_.write("Host.app/Info.plist",
                infoPlist("<key>QFBundleIdentifier</key><string>com.example.host</string>"
                          "<key>QFBundleExecutable</key><string>host</string>"));
    root_.write("Host.app/host", "#!/bin/sh\n");
    root_.write("Bare.app/Info.plist",
                infoPlist("<key>QFBundleIdentifier</key><integer>7</integer>"));
  }

  TempDirectory root_;
};

TEST_F(AXBundleTest, AnExecutableOrTheBundleDirectoryItselfLeadsToTheBundle) {
  auto bundle = AXBundle::initWithExecutablePath(root_ / "Host.app/host");
  EXPECT_EQ(bundle->path(), root_ / "Host.app");
  EXPECT_EQ(bundle->executablePath(), root_ / "Host.app/host");
  EXPECT_EQ(bundle->bundleIdentifier(), "com.example.host");
  EXPECT_EQ(AXBundle::initWithExecutablePath(root_ / "Host.app")->path(), root_ / "Host.app");
  EXPECT_FALSE(AXBundle::initWithExecutablePath("/bin/sh")->path());

  // The information is read again at every call.
  root_.write("Host.app/Info.plist",
              infoPlist("<key>QFBundleIdentifier</key><string>com.example.renamed</string>"));
  EXPECT_EQ(bundle->bundleIdentifier(), "com.example.renamed");
}

TEST_F(AXBundleTest, MissingPiecesAreAbsentNotErrors) {
  auto bare = AXBundle::initWithPath(root_ / "Bare.app");
  EXPECT_EQ(bare->executablePath(), root_ / "Bare.app");
  EXPECT_FALSE(bare->bundleIdentifier());
  EXPECT_TRUE(bare->infoDictionary());

  auto empty = AXBundle::initWithPath(root_ / "Empty.app");
  EXPECT_FALSE(empty->infoDictionary());
  EXPECT_FALSE(empty->bundleIdentifier());

  auto nowhere = AXBundle::initWithPath(root_ / "Missing.app");
  EXPECT_FALSE(nowhere->path());
  EXPECT_FALSE(nowhere->executablePath());
  EXPECT_FALSE(nowhere->plugInsPath());
  EXPECT_FALSE(nowhere->url());
}

}  // namespace
