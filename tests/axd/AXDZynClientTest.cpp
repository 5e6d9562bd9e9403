// A client record made for a connection of this very process, so that the entitlement table can
// name the test program.

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <asio/local/connect_pair.hpp>
#include <fstream>

#include "axd/AXDPlugInSignature.h"
#include "axd/AXDZynClient.h"
#include "platform/os/Paths.h"
#include "platform/os/Process.h"
#include "platform/zyn/Runtime.h"
#include "tests/axd/InProcessServer.h"

namespace {

std::string selfPath() {
  char path[4096];
  ssize_t n = readlink("/proc/self/exe", path, sizeof path);
  return std::string(path, n > 0 ? static_cast<std::size_t>(n) : 0);
}

void writeEntitlementTable() {
  std::string dir = InProcessServer::root() + "/etc/annexa/entitlements.d";
  ASSERT_TRUE(os::Paths::ensureDirectory(dir, 0755).ok());
  std::ofstream(dir + "/tests.plist") << R"(<?xml version="1.0" encoding="UTF-8"?>
<plist version="1.0"><dict>
<key>Executable</key><string>)" + selfPath() +
                                             R"(</string>
<key>Entitlements</key><dict>
  <key>t.false</key><false/>
  <key>t.zero</key><integer>0</integer>
  <key>t.true</key><true/>
  <key>t.one</key><integer>1</integer>
  <key>t.string</key><string>yes</string>
  <key>t.array</key><array/>
</dict></dict></plist>
)";
}

std::shared_ptr<AXDZynClient> clientOfThisProcess() {
  asio::local::stream_protocol::socket ours(zyn::Runtime::shared().context());
  asio::local::stream_protocol::socket theirs(zyn::Runtime::shared().context());
  asio::local::connect_pair(ours, theirs);
  zyn::PeerCredentials self{getpid(), getuid(), getgid(), os::Process::openPidfd(getpid()).value()};
  auto connection = zyn::Connection::accepted(std::move(ours), self, "test.axd");
  static std::vector<asio::local::stream_protocol::socket> keptOpen;
  keptOpen.push_back(std::move(theirs));
  return AXDZynClient::initWithConnection(connection, InProcessServer::server());
}

TEST(AXDZynClientTest, EntitlementsComeFromTheTableAndFalseLikeValuesDoNotCount) {
  writeEntitlementTable();
  auto client = clientOfThisProcess();
  EXPECT_EQ(client->pid(), getpid());
  EXPECT_EQ(client->entitlementValueForKey("t.string"), value::Value::string("yes"));
  for (const char* key : {"t.false", "t.zero", "t.absent"}) {
    EXPECT_FALSE(client->hasEntitlement(key)) << key;
  }
  for (const char* key : {"t.true", "t.one", "t.string", "t.array"}) {
    EXPECT_TRUE(client->hasEntitlement(key)) << key;
  }
  EXPECT_FALSE(client->bundle() && client->bundle()->path()) << "the test program is no bundle";
  EXPECT_NE(client->description().find("pid=" + std::to_string(getpid())), std::string::npos);
}

TEST(AXDPlugInSignatureTest, EverySignatureIsNew) {
  AXDPlugInSignature first(AXFileURL("/Apps/Host.app/PlugIns/Tool.appex"));
  AXDPlugInSignature second(AXFileURL("/Apps/Host.app/PlugIns/Tool.appex"));
  EXPECT_NE(first.cdhash(), second.cdhash());
  EXPECT_EQ(first.requirement(), "dummy requirement");
  EXPECT_EQ(second.requirement(), "dummy requirement");
}

}  // namespace
