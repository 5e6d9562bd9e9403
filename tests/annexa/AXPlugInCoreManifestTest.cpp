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

// Set-up failures on malformed manifests are tested with the form; here, what a failure keeps.
TEST(AXPlugInCoreDictionaries, AMalformedExtensionKeepsTheBundleInformationAndLogsMultiple) {
  AXPlugInCore r;
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

TEST(AXPlugInCoreCanonicalize, TheVersionDefaultsToTheBundleVersionThenOne) {
  auto attributes = [](std::initializer_list<value::Dictionary::Entry> entries) {
    return D({{"QSExtensionAttributes", D(entries)}});
  };
  EXPECT_EQ(attributesOf(*canonical(attributes({{"a", I(1)}}), S("2.1"))),
            D({{"a", I(1)}, {"QSExtensionVersion", S("2.1")}}));
  EXPECT_EQ(canonical(attributes({}), I(2))->version(), "1");
  EXPECT_EQ(canonical(attributes({{"QSExtensionVersion", S("3")}}), S("2.1"))->version(), "3");
  // Missing or malformed attributes become a dictionary; the rest of the plug-in dictionary stays.
  EXPECT_EQ(attributesOf(*canonical(D({}), std::nullopt)), D({{"QSExtensionVersion", S("1")}}));
  auto r = canonical(D({{"QSExtensionAttributes", S("bad")}, {"Other", I(4)}}), std::nullopt);
  EXPECT_EQ(attributesOf(*r), D({{"QSExtensionVersion", S("1")}}));
  EXPECT_EQ(r->pluginKey("Other"), I(4));
}

// A device root holding the SDK dictionary of the extension point "com.example.point".
class AXPlugInCoreSdk : public ::testing::Test {
 protected:
  void SetUp() override {
    environment_.set("ANNEXA_ROOT", root_.path());
    std::filesystem::create_directories(root_ / "System/Library/SDKs");
    value::Value sdk = manifest(D({{"QSExtensionAttributes", D({{"a", I(1)}, {"b", I(2)}})},
                                   {"QSExtensionProtocol", S("SdkProtocol")}}));
    root_.write("System/Library/SDKs/com.example.point.plist",
                value::PropertyList::toXml(sdk).value());
  }

  TempDirectory root_;
  ScopedEnvironment environment_;
};

// How keys merge is the SDK registry's; here, what the record does with the result.
TEST_F(AXPlugInCoreSdk, ResolveMergesTheSdkAndCanonicalisesOnlyThePlugInDictionary) {
  auto r = record(kBundlePath, manifest(D({{"QSExtensionPointIdentifier", S("com.example.point")},
                                           {"QSExtensionAttributes", D({{"a", I(9)}})}})));
  r->resolveSDK();
  EXPECT_EQ(attributesOf(*r), D({{"a", I(9)}, {"b", I(2)}, {"QSExtensionVersion", S("1")}}));
  EXPECT_EQ(r->protocolSpec(), S("SdkProtocol"));
  value::Value stored = *r->infoKey("QSExtension");
  EXPECT_EQ(*stored.asDictionary()->find("QSExtensionAttributes"), D({{"a", I(9)}, {"b", I(2)}}));
}

TEST_F(AXPlugInCoreSdk, AnUnusableExtensionPointIsLogged) {
  value::Value unknown = D({{"QSExtensionPointIdentifier", S("com.example.none")}});
  auto unregistered = record(kBundlePath, manifest(unknown));
  auto wrong = record(kBundlePath, manifest(D({{"QSExtensionPointIdentifier", I(7)}})));
  auto plain = record(kBundlePath, manifest(D({})));
  LogCapture log;
  for (const auto& r : {unregistered, wrong, plain}) r->resolveSDK();
  EXPECT_NE(log.text().find("plug-in sdk \"com.example.none\" not registered\n"), std::string::npos)
      << log.text();
  EXPECT_NE(log.text().find("invalid SDK key:7\n"), std::string::npos) << log.text();
  // Without a registered SDK the manifest is still canonicalised; a non-string name stops first.
  EXPECT_EQ(unregistered->version(), "1");
  EXPECT_EQ(unregistered->infoKey("QSExtension"), unknown);
  EXPECT_EQ(plain->version(), "1");
  EXPECT_FALSE(wrong->attributes());
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
      {kBundlePath, D({}), "missing \"QSExtensionProtocol\" key in Info.plist or SDK"},
      {kBundlePath, D({{"QSExtensionProtocol", S("P")}}),
       "missing \"QSExtensionAttributes\" key in Info.plist or SDK"},
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
