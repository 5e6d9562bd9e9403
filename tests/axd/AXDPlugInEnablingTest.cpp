// Enabling a plug-in that has no data container: only reachable in-process, since the daemon
// builds no record for a launchable plug-in without one, but a record may outlive its container.

#include <gtest/gtest.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <vector>

#include "axd/AXDServer.h"
#include "platform/launcher/ServiceLauncher.h"
#include "platform/value/PropertyList.h"
#include "tests/axd/InProcessServer.h"
#include "tests/platform/TempDirectory.h"

namespace {

using value::Value;

TEST(AXDPlugInEnablingTest, APlugInWithoutDataContainerGetsNoHomeButIsEnabled) {
  auto server = InProcessServer::shared().built();
  ASSERT_TRUE(server);
  TempDirectory dir;
  std::string bundle = dir / "Data.app/PlugIns/enable.nohome.appex";
  std::filesystem::create_directories(bundle);
  std::ofstream(dir / "Data.app/Info.plist")
      << value::PropertyList::toXml(
             Value::dictionary({{"QFBundleIdentifier", Value::string("app.data")}}))
             .value();
  Value extension = Value::dictionary({{"QSExtensionPointIdentifier", Value::string("test.point")},
                                       {"QSExtensionProtocol", Value::string("#Data")}});
  std::ofstream(bundle + "/Info.plist")
      << value::PropertyList::toXml(
             Value::dictionary({{"QFBundleIdentifier", Value::string("enable.nohome")},
                                {"QFBundleShortVersionString", Value::string("1.0")},
                                {"QFBundleExecutable", Value::string("run")},
                                {"QSExtension", extension}}))
             .value();
  std::ofstream(bundle + "/run") << "#!/bin/sh\n";
  std::filesystem::permissions(bundle + "/run", std::filesystem::perms(0755));
  auto registered = server->workspace()->registerPlugIn(bundle, {.dataContainer = false});
  ASSERT_TRUE(registered.ok()) << registered.error().message;
  auto plugIn = server->findPlugIn(registered.value()->uuid());
  ASSERT_TRUE(plugIn);
  std::size_t since = InProcessServer::shared().logSize();

  EXPECT_FALSE(plugIn->enableForPid(getpid()));
  EXPECT_TRUE(InProcessServer::shared().waitForLog(
      "no data container for plug-in enable.nohome(1.0)", since));
  bool found = false;
  std::vector<launcher::ServiceLauncher::Service> services =
      launcher::ServiceLauncher::services().value();
  for (const auto& service : services) {
    if (service.bundleIdentifier != "enable.nohome") continue;
    found = true;
    const Value* zyn = service.description.find("ZynService");
    const Value* environment = zyn->asDictionary()->find("EnvironmentVariables");
    EXPECT_FALSE(environment->asDictionary()->find("HOME"));
    EXPECT_FALSE(environment->asDictionary()->find("TMPDIR"));
  }
  EXPECT_TRUE(found);
  launcher::ServiceLauncher::removeService("enable.nohome", "1.0");
}

}  // namespace
