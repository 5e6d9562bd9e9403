#include <gtest/gtest.h>

#include <filesystem>

#include "Annexa/AXPlugInCore.h"
#include "LogCapture.h"
#include "PlugInFixtures.h"
#include "platform/value/PropertyList.h"
#include "tests/platform/ScopedEnvironment.h"
#include "tests/platform/TempDirectory.h"

namespace {

using namespace fixtures;
using value::Value;

value::Value attributesOf(const AXPlugInCore& r) {
  return Value::dictionary(r.attributes().value_or(value::Dictionary()));
}

TEST(AXPlugInCoreDictionaries, StoreWhatIsWellFormedAndLogMultiple) {
  AXPlugInCore r;
  EXPECT_FALSE(r.setDictionaries(S("x")));
  EXPECT_FALSE(r.bundleInfoDictionary());

  value::Dictionary old{{"QSExtensionProtocol", S("P")}};
  r.setPlugInDictionary(old);
  value::Value badExtension = D({{"QSExtension", A({})}});
  EXPECT_FALSE(r.setDictionaries(badExtension));
  EXPECT_EQ(r.bundleInfoDictionary(), *badExtension.asDictionary());
  EXPECT_EQ(r.plugInDictionary(), old);

  LogCapture log;
  EXPECT_TRUE(r.setDictionaries(manifest(D({{"Multiple", B(true)}}))));
  EXPECT_NE(log.text().find("multiplexed plug-ins (Multiple key) obsolete and ignored\n"),
            std::string::npos)
      << log.text();
  EXPECT_EQ(r.plugInDictionary(), (value::Dictionary{{"Multiple", B(true)}}));
}

// A record whose bundle information carries |bundleVersion| and whose plug-in dictionary is
// |plugIn|, canonicalised.
std::shared_ptr<AXPlugInCore> canonical(value::Value plugIn,
                                        std::optional<value::Value> bundleVersion) {
  value::Dictionary info = *manifest(std::move(plugIn)).asDictionary();
  if (bundleVersion) info = info.with("QFBundleShortVersionString", *bundleVersion);
  auto r = record(kBundlePath, Value::dictionary(info));
  r->canonicalize();
  return r;
}

TEST(AXPlugInCoreCanonicalize, VersionDefaultsToTheBundleVersionThenOne) {
  auto attributes = [](std::initializer_list<value::Dictionary::Entry> entries) {
    return D({{"QSExtensionAttributes", D(entries)}});
  };
  EXPECT_EQ(canonical(attributes({{"a", I(1)}}), S("2.1"))->version(), "2.1");
  EXPECT_EQ(canonical(attributes({}), std::nullopt)->version(), "1");
  EXPECT_EQ(canonical(attributes({}), I(2))->version(), "1");
  EXPECT_EQ(canonical(attributes({{"QSExtensionVersion", S("3")}}), S("2.1"))->version(), "3");
  EXPECT_EQ(attributesOf(*canonical(attributes({{"a", I(1)}}), S("2.1"))),
            D({{"a", I(1)}, {"QSExtensionVersion", S("2.1")}}));
}

TEST(AXPlugInCoreCanonicalize, MissingOrBadAttributesBecomeADictionary) {
  EXPECT_EQ(attributesOf(*canonical(D({}), std::nullopt)), D({{"QSExtensionVersion", S("1")}}));
  auto r = canonical(D({{"QSExtensionAttributes", S("bad")}, {"Other", I(4)}}), std::nullopt);
  EXPECT_EQ(attributesOf(*r), D({{"QSExtensionVersion", S("1")}}));
  EXPECT_EQ(r->pluginKey("Other"), I(4));
}

// A specialisation whose attribute lookup already knows a version, as the daemon's registry does.
class RegistryBackedRecord : public AXPlugInCore {
 public:
  std::optional<value::Value> attribute(std::string_view key) const override {
    if (key == "QSExtensionVersion") return S("9");
    return AXPlugInCore::attribute(key);
  }
};

TEST(AXPlugInCoreCanonicalize, ReadsThroughTheRecordsOwnLookups) {
  RegistryBackedRecord r;
  ASSERT_TRUE(
      r.setupWithName("id", AXFileURL(kBundlePath), manifest(D({})), std::nullopt, std::nullopt));
  r.canonicalize();
  EXPECT_EQ(attributesOf(r), D({}));
}

// A device root holding the SDK dictionary of the extension point "com.example.point".
class AXPlugInCoreSdk : public ::testing::Test {
 protected:
  void SetUp() override {
    environment_.set("ANNEXA_ROOT", root_.path());
    std::filesystem::create_directories(root_ / "System/Library/SDKs");
    value::Value sdk = manifest(D({{"QSExtensionAttributes", D({{"a", I(1)}, {"b", I(2)}})},
                                   {"CleanTimeout", I(5)},
                                   {"QSExtensionProtocol", S("SdkProtocol")}}));
    root_.write("System/Library/SDKs/com.example.point.plist",
                value::PropertyList::toXml(sdk).value());
  }

  TempDirectory root_;
  ScopedEnvironment environment_;
};

TEST_F(AXPlugInCoreSdk, ResolveMergesTheSdkUnderTheManifest) {
  auto r = record(kBundlePath, manifest(D({{"QSExtensionPointIdentifier", S("com.example.point")},
                                           {"QSExtensionAttributes", D({{"a", I(9)}})},
                                           {"CleanTimeout", I(7)}})));
  r->resolveSDK();
  EXPECT_EQ(attributesOf(*r), D({{"a", I(9)}, {"b", I(2)}, {"QSExtensionVersion", S("1")}}));
  EXPECT_EQ(r->pluginKey("CleanTimeout"), I(5));
  EXPECT_EQ(r->protocolSpec(), S("SdkProtocol"));
  // The merged manifest replaces the bundle information too; only the plug-in dictionary is
  // canonicalised.
  value::Value storedValue = *r->infoKey("QSExtension");
  const value::Dictionary* stored = storedValue.asDictionary();
  EXPECT_EQ(*stored->find("CleanTimeout"), I(5));
  EXPECT_FALSE(stored->find("QSExtensionAttributes")->asDictionary()->find("QSExtensionVersion"));
}

TEST_F(AXPlugInCoreSdk, UnregisteredSdkIsLoggedAndTheManifestCanonicalised) {
  value::Value plugIn = D({{"QSExtensionPointIdentifier", S("com.example.none")}});
  auto r = record(kBundlePath, manifest(plugIn));
  LogCapture log;
  r->resolveSDK();
  EXPECT_NE(log.text().find("plug-in sdk \"com.example.none\" not registered\n"), std::string::npos)
      << log.text();
  EXPECT_EQ(Value::dictionary(*r->plugInDictionary()),
            D({{"QSExtensionPointIdentifier", S("com.example.none")},
               {"QSExtensionAttributes", D({{"QSExtensionVersion", S("1")}})}}));
  EXPECT_EQ(r->infoKey("QSExtension"), plugIn);
}

TEST_F(AXPlugInCoreSdk, NonStringExtensionPointStopsBeforeCanonicalising) {
  auto r = record(kBundlePath, manifest(D({{"QSExtensionPointIdentifier", I(7)}})));
  LogCapture log;
  r->resolveSDK();
  EXPECT_NE(log.text().find("invalid SDK key:7\n"), std::string::npos) << log.text();
  EXPECT_FALSE(r->attributes());
}

TEST_F(AXPlugInCoreSdk, WithoutExtensionPointOnlyCanonicalises) {
  auto r = record(kBundlePath, manifest(D({})));
  r->resolveSDK();
  EXPECT_EQ(r->version(), "1");
  EXPECT_EQ(AXPlugInCore::readSDKDictionary("com.example.point")
                ->find("QSExtension")
                ->asDictionary()
                ->find("CleanTimeout")
                ->asInt(),
            5);
}

TEST(AXPlugInCoreSdkDeathTest, ResolveWithoutBundleInformationEndsTheProgram) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  auto r = AXPlugInCore::initWithName("id", AXFileURL(kBundlePath), std::nullopt, std::nullopt,
                                      std::nullopt);
  EXPECT_DEATH(r->resolveSDK(),
               "internal inconsistency in Annexa/AXPlugInCore: cannot resolve SDK without "
               "materialized Info.plist");
}

// One diagnosis case: where the plug-in lies, its plug-in dictionary, and the message expected
// (empty for none).
struct DiagnoseCase {
  const char* path;
  value::Value plugIn;
  std::string message;
};

TEST(AXPlugInCoreDiagnose, EveryCheckInOrder) {
  value::Value attributes = D({{"QSExtensionVersion", S("1")}});
  const std::vector<DiagnoseCase> cases = {
      {kBundlePath, D({{"QSExtensionProtocol", S("P")}, {"QSExtensionAttributes", attributes}}),
       ""},
      {kAppexPath, D({{"QSExtensionAttributes", attributes}}), ""},
      {kAppexPath, D({{"QSExtensionAttributes", attributes}, {"PrincipalClass", S("QSObject")}}),
       ""},
      {kBundlePath, D({}), "missing \"QSExtensionProtocol\" key in Info.plist or SDK"},
      {kBundlePath, D({{"QSExtensionProtocol", S("P")}}),
       "missing \"QSExtensionAttributes\" key in Info.plist or SDK"},
      {kAppexPath, D({}), "missing \"QSExtensionAttributes\" key in Info.plist or SDK"},
      {kAppexPath, D({{"QSExtensionAttributes", attributes}, {"PrincipalClass", S("Main")}}),
       "Application Extensions may not use the \"PrincipalClass\" key"},
      {kBundlePath,
       D({{"QSExtensionProtocol", S("P")},
          {"QSExtensionAttributes", attributes},
          {"PassProxy", B(true)},
          {"EmbeddedCode", B(true)}}),
       "the \"PassProxy\" key is not supported on this platform"},
      {kBundlePath,
       D({{"QSExtensionProtocol", S("P")},
          {"QSExtensionAttributes", attributes},
          {"EmbeddedCode", B(false)}}),
       "hybrid plug-ins are not supported on this platform"},
  };
  for (const DiagnoseCase& c : cases) {
    auto r = record(c.path, manifest(c.plugIn));
    ASSERT_TRUE(r);
    std::optional<AXError> error = r->diagnose();
    SCOPED_TRACE(c.plugIn.description());
    if (c.message.empty()) {
      EXPECT_FALSE(error) << error->description();
      continue;
    }
    ASSERT_TRUE(error);
    EXPECT_EQ(error->domain(), "Annexa");
    EXPECT_EQ(error->code(), 12);
    EXPECT_EQ(error->localizedDescription(), c.message);
  }

  AXPlugInCore anonymous;
  anonymous.setUrl(AXFileURL(kBundlePath));
  EXPECT_EQ(anonymous.diagnose()->localizedDescription(),
            "missing identifier (no QSExtensionIdentifier, nor even QFBundleIdentifier)");
}

}  // namespace
