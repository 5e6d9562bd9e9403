// A client's entitlements, read through the device root's real entitlement table.

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <string>

#include "axd/AXDZynClient.h"
#include "platform/os/Paths.h"
#include "platform/os/Process.h"
#include "platform/zyn/Runtime.h"
#include "tests/axd/InProcessServer.h"
#include "tests/axd/SelfClient.h"

namespace {

using value::Value;

// A table file granting this test program the entitlements in |dictionary| (plist XML).
void grantThisProgram(const std::string& dictionary) {
  const std::string directory = InProcessServer::shared().root() + "/etc/annexa/entitlements.d";
  std::filesystem::create_directories(directory);
  const std::string file = directory + "/axd_tests.plist";
  std::ofstream(file) << "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">"
                      << "<dict><key>Executable</key><string>"
                      << os::Paths::canonical("/proc/self/exe").value()
                      << "</string><key>Entitlements</key>" << dictionary << "</dict></plist>\n";
  chmod(file.c_str(), 0644);
}

TEST(AXDZynClientTest, AnEntitlementCountsUnlessItIsAbsentFalseOrZero) {
  ASSERT_TRUE(InProcessServer::shared().built());
  grantThisProgram(
      "<dict>"
      "<key>test.false</key><false/>"
      "<key>test.zero</key><integer>0</integer>"
      "<key>test.zero.real</key><real>0.0</real>"
      "<key>test.true</key><true/>"
      "<key>test.one</key><integer>1</integer>"
      "<key>test.half</key><real>0.5</real>"
      "<key>test.string</key><string>yes</string>"
      "<key>test.empty.string</key><string></string>"
      "<key>test.array</key><array/>"
      "<key>test.dictionary</key><dict/>"
      "</dict>");
  SelfClient self;
  const auto& client = self.client();
  ASSERT_TRUE(client);
  ASSERT_TRUE(client->task()) << "no code-signing identity for this process";

  for (const char* key : {"test.false", "test.zero", "test.zero.real", "test.absent"}) {
    EXPECT_FALSE(client->hasEntitlement(key)) << key;
  }
  for (const char* key : {"test.true", "test.one", "test.half", "test.string", "test.empty.string",
                          "test.array", "test.dictionary"}) {
    EXPECT_TRUE(client->hasEntitlement(key)) << key;
  }
  EXPECT_EQ(client->entitlementValueForKey("test.string"), Value::string("yes"));
  EXPECT_EQ(client->entitlementValueForKey("test.false"), Value::boolean(false));
  EXPECT_FALSE(client->entitlementValueForKey("test.absent"));
}

TEST(AXDZynClientTest, AClientKnowsItsPeer) {
  ASSERT_TRUE(InProcessServer::shared().built());
  SelfClient self;
  const auto& client = self.client();
  ASSERT_TRUE(client);
  EXPECT_EQ(client->pid(), getpid());
  EXPECT_TRUE(client->acceptWork());
  EXPECT_FALSE(client->bundle() && client->bundle()->path()) << "the test program is no bundle";
  EXPECT_NE(client->description().find(" pid=" + std::to_string(getpid()) + " con="),
            std::string::npos)
      << client->description();
}

}  // namespace
