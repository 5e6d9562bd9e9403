// An integrator's journey through the real daemon: an SDK installed after its plug-ins, changed
// and removed, each counting at the next discovery, across a restart too.

#include <filesystem>
#include <string>
#include <vector>

#include "Annexa/AXProtocol.h"
#include "tests/e2e/Bundles.h"
#include "tests/e2e/DaemonTest.h"

namespace {

using value::Dictionary;
using value::Value;
using Ids = std::vector<std::string>;

class SdkJourneyTest : public DaemonTest {
 protected:
  // Installs the SDK of "test.point" with |extension| as its plug-in dictionary.
  void writeSdk(const Dictionary& extension) {
    bundles::writePlist(sdkFile(),
                        Value::dictionary({{"QSExtension", Value::dictionary(extension)}}));
  }
  std::string sdkFile() const { return root() + "/System/Library/SDKs/test.point.plist"; }
};

TEST_F(SdkJourneyTest, AnSdkAddedChangedOrRemovedCountsAtTheNextDiscovery) {
  ASSERT_TRUE(start());
  std::string one = bundles::plugIn(root() + "/Applications", "Kit", {.id = "sdk.one"});
  std::string two = bundles::plugIn(root() + "/Applications", "Kit", {.id = "sdk.two"});
  ASSERT_EQ(send(AXProtocol::kAdd, {one, two}), "ok");
  const Ids both{"sdk.one", "sdk.two"};
  const Value mint = Value::dictionary({{"Flavor", Value::string("mint")}});
  const Dictionary guarded{{"QSExtensionHostEntitlement", Value::string("sdk.host")}};
  EXPECT_EQ(matchIds(), both);  // the daemon now holds both records

  // The SDK now demands a host entitlement: only a host that has it sees the plug-ins. A bulk
  // request in between reads no record and leaves the change to the discovery after it.
  writeSdk(guarded);
  EXPECT_EQ(client().bulk(0), "ok");
  EXPECT_EQ(matchIds(), Ids{});
  grant({{"sdk.host", Value::boolean(true)}});
  EXPECT_EQ(matchIds(), both);

  // The SDK gives its plug-ins an attribute that a rule matches on.
  EXPECT_EQ(matchIds(mint), Ids{});
  writeSdk(guarded.with("QSExtensionAttributes", mint));
  EXPECT_EQ(matchIds(mint), both);
  Subprocess::Outcome shown = Subprocess::run(RGCTL_EXECUTABLE, {"--root", root(), "show", one});
  EXPECT_NE(shown.out.find("\"Flavor\":\"mint\""), std::string::npos) << shown.out << shown.err;

  // Without the SDK the plug-ins' own manifests count again.
  std::filesystem::remove(sdkFile());
  EXPECT_EQ(matchIds(mint), Ids{});
  grant({});
  EXPECT_EQ(matchIds(), both);

  // A restarted daemon merges the SDK as it is then, not as it was at registration.
  writeSdk(guarded);
  ASSERT_TRUE(restart());
  EXPECT_EQ(matchIds(), Ids{});
  std::filesystem::remove(sdkFile());
  EXPECT_EQ(matchIds(), both);
}

}  // namespace
