// Signed bundles through the real daemon: what a plug-in's entitlements are worth when an
// attacker registers a bundle of their own, when a signed bundle is changed after signing, and
// for a host inside a signed application. Keys are made for each test.

#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "Annexa/AXProtocol.h"
#include "axd/AXDNames.h"
#include "platform/codesign/BundleSignature.h"
#include "platform/codesign/SigningKey.h"
#include "platform/launcher/ServiceLauncher.h"
#include "tests/e2e/Bundles.h"
#include "tests/e2e/DaemonTest.h"

namespace {

using bundles::PlugInContents;
using codesign::BundleSignature;
using codesign::SigningKey;
using value::Dictionary;
using value::Value;

const std::string kReplace = AXDNames::kReplacePlugInEntitlement;
const std::string kAutoElect = AXDNames::kAutoElectEntitlement;

class SignatureTest : public DaemonTest {
 protected:
  void SetUp() override { ASSERT_TRUE(start()); }

  // A new key that the device trusts for identifiers beginning with one of |prefixes| (any
  // identifier when there are none).
  SigningKey trustedKey(const std::string& name, const std::vector<std::string>& prefixes = {}) {
    SigningKey key = SigningKey::generate().value();
    const auto& publicKey = key.publicKey();
    Dictionary trust{{"PublicKey", Value::data(value::Data(publicKey.begin(), publicKey.end()))}};
    if (!prefixes.empty()) {
      value::Array listed;
      for (const std::string& prefix : prefixes) listed.push_back(Value::string(prefix));
      trust = trust.with("IdentifierPrefixes", Value::array(listed));
    }
    bundles::writePlist(root() + "/etc/annexa/trust.d/" + name + ".plist",
                        Value::dictionary(trust));
    return key;
  }
  static void sign(const std::string& bundle, const SigningKey& key) {
    ASSERT_TRUE(BundleSignature::sign(bundle, key).ok()) << bundle;
  }
  void add(const std::vector<std::string>& paths) {
    ASSERT_EQ(send(AXProtocol::kAdd, paths), "ok");
  }
  // The form of |id| that a discovery returns; empty when none comes back.
  Dictionary formOf(const std::string& id) {
    for (const Value& form : match()) {
      const Dictionary& fields = *form.asDictionary();
      if (*fields.find("identifier") == Value::string(id)) return fields;
    }
    return {};
  }
  std::string annotate(const std::string& path, const Dictionary& annotation) {
    auto request = client().client().request(AXProtocol::kAnnotate);
    AXDaemonClient::set(request, {uuid(path)});
    request[AXProtocol::kAnnotations] = Value::dictionary(annotation);
    return client().outcome(request);
  }
  std::string ready(const std::string& path) { return send(AXProtocol::kReady, {uuid(path)}); }
};

// The attack: a bundle of the attacker's own claims to replace a vendor's plug-in and to be
// elected. Unsigned or signed by a key the device does not trust, it changes nothing; the
// vendor's own signed replacement still works.
TEST_F(SignatureTest, AnAttackersBundleCannotReplaceOrElectAnotherVendorsPlugIn) {
  SigningKey vendor = trustedKey("vendor", {"com.vendor."});
  std::string tool = bundles::plugIn(root(), "Vendor", {.id = "com.vendor.tool"});
  sign(root() + "/Vendor.app", vendor);
  add({tool});
  ASSERT_EQ(annotate(tool, {{"election", Value::integer(0)}}), "ok");
  const Dictionary claims{{kReplace, Value::string("com.vendor.tool")},
                          {kAutoElect, Value::boolean(true)}};
  std::string unsignedEvil =
      bundles::plugIn(root(), "Evil", {.id = "evil.tool", .entitlements = claims});
  std::string selfSigned =
      bundles::plugIn(root(), "Evil2", {.id = "evil.tool2", .entitlements = claims});
  sign(root() + "/Evil2.app", SigningKey::generate().value());
  // Trusted, but only for its own vendor's identifiers.
  std::string wrongPrefix =
      bundles::plugIn(root(), "Evil3", {.id = "evil.tool3", .entitlements = claims});
  sign(root() + "/Evil3.app", trustedKey("evil", {"evil.other."}));
  add({unsignedEvil, selfSigned, wrongPrefix});

  Dictionary form = formOf("com.vendor.tool");
  EXPECT_FALSE(form.find("overrider")) << Value::dictionary(form).description();
  EXPECT_EQ(*form.find("annotations"), Value::dictionary({{"election", Value::integer(0)}}));
  EXPECT_EQ(*formOf("evil.tool").find("entitlements"), Value::dictionary({}));
  EXPECT_EQ(record(selfSigned)->signature().distrust.substr(0, 7), "signer ");
  EXPECT_NE(record(wrongPrefix)->signature().distrust.find("may sign only"), std::string::npos);
  EXPECT_GE(logCount("has no entitlements: "), 3u);

  std::string successor = bundles::plugIn(
      root(), "Vendor",
      {.id = "com.vendor.tool2", .entitlements = {{kReplace, Value::string("com.vendor.tool")}}});
  sign(root() + "/Vendor.app", vendor);
  add({successor});
  EXPECT_EQ(*formOf("com.vendor.tool").find("overrider"), Value::string(uuid(successor).string()));
}

// Any file of a signed bundle changed after signing is caught when the bundle is registered:
// the plug-in stays discoverable, without its entitlements.
TEST_F(SignatureTest, AChangeToAnyFileOfASignedBundleIsCaughtAtRegistration) {
  SigningKey key = trustedKey("vendor");
  const Dictionary granted{{"vendor.feature", Value::boolean(true)}};
  const struct {
    const char* id;
    const char* file;
  } changes[] = {{"t.none", nullptr},
                 {"t.info", "Info.plist"},
                 {"t.entitlements", "Entitlements.plist"},
                 {"t.executable", "true"},
                 {"t.resource", "Resources/strings.txt"}};
  for (const auto& change : changes) {
    std::string bundle =
        bundles::writePlugIn(root() + "/System/Library/PlugIns/" + change.id + ".appex",
                             {.id = change.id, .entitlements = granted, .executable = "/bin/true"});
    bundles::writeFile(bundle + "/Resources/strings.txt", "hello");
    sign(bundle, key);
    if (change.file) std::ofstream(bundle + "/" + change.file, std::ios::app) << "\n";
    add({bundle});
    auto registered = record(bundle);
    ASSERT_TRUE(registered) << change.id;
    bool tampered = change.file != nullptr;
    EXPECT_EQ(registered->signature().state,
              tampered ? BundleSignature::State::Tampered : BundleSignature::State::Signed)
        << change.id;
    EXPECT_EQ(*formOf(change.id).find("entitlements"),
              Value::dictionary(tampered ? Dictionary() : granted))
        << change.id;
  }
}

// The trust store is read again when it changes: a key trusted after its bundles were registered
// counts at the next discovery, and one removed stops counting.
TEST_F(SignatureTest, AKeyTrustedOrDistrustedLaterCountsAtTheNextDiscovery) {
  SigningKey key = SigningKey::generate().value();
  const Dictionary granted{{"vendor.feature", Value::boolean(true)}};
  std::string bundle =
      bundles::plugIn(root(), "Late", {.id = "late.tool", .entitlements = granted});
  sign(root() + "/Late.app", key);
  add({bundle});
  EXPECT_EQ(*formOf("late.tool").find("entitlements"), Value::dictionary({}));
  const auto& publicKey = key.publicKey();
  std::string trustFile = root() + "/etc/annexa/trust.d/late.plist";
  bundles::writePlist(
      trustFile,
      Value::dictionary(
          {{"PublicKey", Value::data(value::Data(publicKey.begin(), publicKey.end()))}}));
  EXPECT_EQ(*formOf("late.tool").find("entitlements"), Value::dictionary(granted));
  std::filesystem::remove(trustFile);
  EXPECT_EQ(*formOf("late.tool").find("entitlements"), Value::dictionary({}));
}

// An executable swapped after registration is refused when a host asks for the plug-in, and a
// file swapped after that is not what the launcher starts.
TEST_F(SignatureTest, ASwappedExecutableIsRefusedAtReadyAndAtStart) {
  SigningKey key = trustedKey("vendor");
  std::string bundle =
      bundles::plugIn(root(), "Tools", {.id = "swap.tool", .executable = "/bin/true"});
  sign(root() + "/Tools.app", key);
  add({bundle});
  ASSERT_EQ(ready(bundle), "ok");

  std::filesystem::copy_file("/bin/false", bundle + "/true",
                             std::filesystem::copy_options::overwrite_existing);
  auto started = launcher::ServiceLauncher::start("swap.tool", "1.0");
  EXPECT_FALSE(started.ok());
  EXPECT_EQ(started.ok() ? 0 : started.error().errnum, EPERM);
  EXPECT_EQ(ready(bundle), "11: the executable of plug-in swap.tool does not match its signature");
  EXPECT_EQ(logCount("is not the one its bundle signed"), 1u);
}

// A host program inside a signed application has the entitlements of the application's signed
// Entitlements.plist; the same program in an unsigned copy has not.
TEST_F(SignatureTest, AHostInASignedApplicationHasItsBundlesEntitlements) {
  SigningKey key = trustedKey("hosts", {"host."});
  add({bundles::plugIn(
      root(), "Shop",
      {.id = "guarded.tool",
       .extension = {{"QSExtensionHostEntitlement", Value::string("shop.host")}}})});
  const Dictionary entitlements{{"shop.host", Value::boolean(true)}};
  std::vector<std::string> hosts;
  for (const char* name : {"Signed", "Unsigned"}) {
    std::string app = root() + "/" + name + ".app";
    hosts.push_back(bundles::hostApplication(app, AXCTL_EXECUTABLE));
    bundles::writePlist(app + "/Entitlements.plist", Value::dictionary(entitlements));
  }
  sign(root() + "/Signed.app", key);
  Subprocess::Outcome signedHost = Subprocess::run(hosts[0], {"match"});
  EXPECT_NE(signedHost.out.find("guarded.tool"), std::string::npos) << signedHost.err;
  Subprocess::Outcome unsignedHost = Subprocess::run(hosts[1], {"match"});
  EXPECT_EQ(unsignedHost.out.find("guarded.tool"), std::string::npos) << unsignedHost.out;
}

}  // namespace
