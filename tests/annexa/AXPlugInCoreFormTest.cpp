#include <gtest/gtest.h>

#include "Annexa/AXPlugInCore.h"
#include "LogCapture.h"
#include "PlugInFixtures.h"
#include "platform/value/PlistBridge.h"

namespace {

using namespace fixtures;
using value::Value;

// A canonicalised record with every field that export always writes.
std::shared_ptr<AXPlugInCore> plainRecord() {
  value::Value info = D({{"QFBundleShortVersionString", S("2.1")},
                         {"QFBundleInfoPlistURL", S("file:///Apps/Host.app/Info.plist")},
                         {"QSExtension", D({{"QSExtensionProtocol", S("P")}})}});
  auto r = record(kAppexPath, info);
  r->canonicalize();
  r->setOriginalIdentifier("com.example.original");
  r->setHubProtocolVersion(2);
  r->setLastModified(-1234);
  return r;
}

TEST(AXPlugInCoreForm, RoundTripKeepsEveryField) {
  auto r = plainRecord();
  r->setOnSystemVolume(true);
  r->setHubProtocolVersion(4000000000u);
  r->setContainingUrl(AXFileURL("/Apps/Host.app"));
  r->setAnnotations(value::Dictionary{{"election", I(1)}});
  r->setEntitlements(value::Dictionary{{"e", S("v")}});
  r->setLocalizedName("Tool");
  r->setLocalizedContainingName("Host");
  value::Dictionary form =
      r->exportForm().with("hash", Value::data({1, 2, 3})).with("requirement", S("req"));

  // Through the property-list form too: unsigned integers come back as Int there.
  for (const value::Dictionary& candidate :
       {form, *value::PlistBridge::toPlist(Value::dictionary(form))->asDictionary()}) {
    auto back = AXPlugInCore::initWithForm(candidate);
    ASSERT_TRUE(back);
    EXPECT_TRUE(*back == *r);
    EXPECT_EQ(back->hubProtocolVersion(), 4000000000u);
    // The plug-in dictionary comes from the manifest in "bundleInfo", as it was before
    // canonicalisation: the defaulted version stays behind in "info".
    EXPECT_EQ(Value::dictionary(*back->plugInDictionary()), D({{"QSExtensionProtocol", S("P")}}));
    EXPECT_FALSE(back->version());
    EXPECT_EQ(back->cdhash(), (value::Data{1, 2, 3}));
    EXPECT_EQ(back->requirement(), "req");
    // Every exported field came back: the form of the copy is the form of the original.
    back->canonicalize();
    EXPECT_EQ(back->exportForm(), r->exportForm());
  }
}

TEST(AXPlugInCoreForm, MissingOrWrongValuesTakeTheirDefaults) {
  value::Dictionary form = plainRecord()
                               ->exportForm()
                               .without("hubProtocolVersion")
                               .without("systemResident")
                               .without("lastmodified");
  auto back = AXPlugInCore::initWithForm(form);
  ASSERT_TRUE(back);
  EXPECT_EQ(back->hubProtocolVersion(), 1u);
  EXPECT_FALSE(back->onSystemVolume());
  EXPECT_EQ(back->lastModified(), 0);

  auto wrong = AXPlugInCore::initWithForm(form.with("hubProtocolVersion", I(-1))
                                              .with("lastmodified", I(1ll << 40))
                                              .with("systemResident", S("yes"))
                                              .with("annotations", A({}))
                                              .with("original-identifier", I(3)));
  ASSERT_TRUE(wrong);
  EXPECT_EQ(wrong->hubProtocolVersion(), 1u);
  EXPECT_EQ(wrong->lastModified(), 0);
  EXPECT_FALSE(wrong->onSystemVolume());
  EXPECT_FALSE(wrong->annotations());
  EXPECT_FALSE(wrong->originalIdentifier());

  // A UUID that does not parse gives a new record; lower-case text parses.
  for (const Value& uuid : {S("not-a-uuid"), I(5)}) {
    auto fresh = AXPlugInCore::initWithForm(form.with("uuid", uuid));
    ASSERT_TRUE(fresh && fresh->uuid());
    EXPECT_NE(*fresh->uuid(), *back->uuid());
  }
  auto lowerCase =
      AXPlugInCore::initWithForm(form.with("uuid", S("0a0b0c0d-0e0f-4011-8213-141516171819")));
  EXPECT_EQ(lowerCase->uuid()->string(), "0A0B0C0D-0E0F-4011-8213-141516171819");
}

// Set-up from a form fails, and logs, exactly as set-up from a name does: both share one path.
TEST(AXPlugInCoreForm, SetupFailuresAreTheBaseSetupFailures) {
  value::Dictionary form = plainRecord()->exportForm();
  {
    LogCapture log;
    EXPECT_EQ(AXPlugInCore::initWithForm(form.without("path")), nullptr);
    EXPECT_EQ(log.text(), "");
  }
  {
    LogCapture log;
    EXPECT_EQ(AXPlugInCore::initWithForm(form.without("identifier")), nullptr);
    EXPECT_NE(log.text().find("missing identifier in plug-in at /Apps/Host.app/PlugIns/Tool.appex"),
              std::string::npos);
  }
  for (const Value& bundleInfo : {S("x"), D({{"QSExtension", S("x")}})}) {
    LogCapture log;
    EXPECT_EQ(AXPlugInCore::initWithForm(form.with("bundleInfo", bundleInfo)), nullptr);
    EXPECT_NE(log.text().find("malformed plug-in dictionary in plug-in com.example.tool at "
                              "file:///Apps/Host.app/PlugIns/Tool.appex: " +
                              bundleInfo.description()),
              std::string::npos)
        << log.text();
  }
}

}  // namespace
