// The plug-in record's decisions that need the running server: the election its rules read and
// the access policy toward a real client.

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <string>

#include "axd/AXDNames.h"
#include "platform/os/Paths.h"
#include "platform/value/PropertyList.h"
#include "tests/axd/InProcessServer.h"
#include "tests/axd/SelfClient.h"
#include "tests/plugin/RegistryRecords.h"

namespace {

using namespace records;
using registrum::PlugInRecord;
using value::Dictionary;
using value::Value;

class AXDPlugInPolicyTest : public ::testing::Test {
 protected:
  void SetUp() override {
    server_ = InProcessServer::shared().built();
    ASSERT_TRUE(server_);
  }
  void TearDown() override { std::filesystem::remove(grantFile()); }

  static std::string root() { return InProcessServer::shared().root(); }
  // Sorts before the other tests' table files, so its grants win while it exists.
  static std::string grantFile() { return root() + "/etc/annexa/entitlements.d/0-policy.plist"; }

  static void writePlist(const std::string& path, const Value& plist) {
    std::filesystem::create_directories(std::filesystem::path(path).parent_path());
    std::ofstream(path, std::ios::trunc) << value::PropertyList::toXml(plist).value();
    std::filesystem::permissions(path, std::filesystem::perms(0644));
  }

  // A plug-in |identifier| in an application under the root, demanding the host entitlement
  // |demanded| when given.
  static std::shared_ptr<AXDPlugIn> record(const std::string& identifier,
                                           std::optional<Value> demanded = std::nullopt) {
    std::string appPath = root() + "/Apps/Policy.app";
    PlugInRecord::Fields fields = plugIn(appPath + "/PlugIns/Tool.appex");
    fields.containingApplication = application(appPath);
    fields.plugInIdentifier = identifier;
    if (demanded) {
      fields.plugInDictionary =
          fields.plugInDictionary.with("QSExtensionHostEntitlement", *demanded);
    }
    auto built = build(std::move(fields));
    EXPECT_TRUE(built);
    return built;
  }

  // The reason a client of this program granted |entitlements| is refused |plugIn|; "" when
  // allowed.
  static std::string refusal(const Dictionary& entitlements, const AXDPlugIn& plugIn) {
    writePlist(grantFile(), Value::dictionary({
                                {"Executable", S(os::Paths::canonical("/proc/self/exe").value())},
                                {"Entitlements", Value::dictionary(entitlements)},
                            }));
    SelfClient self;
    if (!self.client() || !self.client()->task()) return "no client";
    return plugIn.allowForClient(*self.client()).value_or("");
  }

  std::shared_ptr<AXDServer> server_;
};

TEST_F(AXDPlugInPolicyTest, TheFirstRefusalWins) {
  const std::string restricted = "the host's plug-in entitlement does not allow this plug-in";
  const std::string invalid = "invalid host restriction entitlement";
  const std::string noX = "the host does not have the \"x\" entitlement";
  const Value onlyABC = D({{"QSExtensionIdentifier", S("a.b.c")}});
  const std::string& allowedPlugIns = AXDNames::kAllowedPlugInsEntitlement;
  const struct {
    Dictionary entitlements;
    std::string identifier;
    std::optional<Value> demanded;
    std::string expected;
  } cases[] = {
      {{{allowedPlugIns, onlyABC}}, "a.b.c", std::nullopt, ""},
      {{{allowedPlugIns, onlyABC}}, "a.b.cd", std::nullopt, restricted},
      {{{allowedPlugIns, onlyABC}}, "a.b.d", S("x"), restricted},
      {{{allowedPlugIns, onlyABC}}, "a.b.c", S("x"), noX},
      {{{allowedPlugIns, A({onlyABC})}}, "a.b.c", std::nullopt, invalid},
      {{{allowedPlugIns, D({})}}, "a.b.e", std::nullopt, ""},
      {{}, "a.b.f", std::nullopt, ""},
      // The client's entitlement counts unless it is false or zero.
      {{{"x", Value::boolean(false)}}, "a.b.g", S("x"), noX},
      {{{"x", Value::integer(0)}}, "a.b.g", S("x"), noX},
      {{{"x", Value::boolean(true)}}, "a.b.g", S("x"), ""},
      {{{"x", Value::real(0.5)}}, "a.b.g", S("x"), ""},
      {{{"x", S("")}}, "a.b.g", S("x"), ""},
      // A demand that names nothing cannot be met by any host.
      {{}, "a.b.h", Value::boolean(true), "the plug-in's host entitlement demand is malformed"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(Value::dictionary(c.entitlements).description() + " " + c.identifier);
    EXPECT_EQ(refusal(c.entitlements, *record(c.identifier, c.demanded)), c.expected);
  }
}

}  // namespace
