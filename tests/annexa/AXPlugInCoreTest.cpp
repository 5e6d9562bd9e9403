#include <gtest/gtest.h>

#include <atomic>
#include <thread>
#include <unordered_set>
#include <vector>

#include "Annexa/AXPlugInCore.h"
#include "LogCapture.h"
#include "PlugInFixtures.h"

namespace {

using namespace fixtures;
using value::Value;

TEST(AXPlugInCoreSetup, RecordsWithoutUuidGetFreshOnes) {
  auto a = AXPlugInCore::initWithName("com.example.tool", AXFileURL(kAppexPath), std::nullopt,
                                      std::nullopt, std::nullopt);
  auto b = AXPlugInCore::initWithName("com.example.tool", AXFileURL(kAppexPath), std::nullopt,
                                      std::nullopt, std::nullopt);
  ASSERT_TRUE(a && b);
  ASSERT_TRUE(a->uuid() && b->uuid());
  EXPECT_NE(*a->uuid(), *b->uuid());
  EXPECT_FALSE(*a == *b);
  EXPECT_TRUE(*a == *a);
}

TEST(AXPlugInCoreSetup, InfoIsTheFallbackPlugInDictionary) {
  value::Dictionary info{{"QSExtensionProtocol", S("P")}};
  auto bare = AXPlugInCore::initWithName("com.example.tool", AXFileURL(kAppexPath), std::nullopt,
                                         info, std::nullopt);
  ASSERT_TRUE(bare);
  EXPECT_EQ(bare->plugInDictionary(), info);
  EXPECT_FALSE(bare->bundleInfoDictionary());

  value::Value fromBundle = D({{"QSExtensionProtocol", S("Q")}});
  auto full = AXPlugInCore::initWithName("com.example.tool", AXFileURL(kAppexPath),
                                         manifest(fromBundle), info, std::nullopt);
  ASSERT_TRUE(full);
  EXPECT_EQ(full->plugInDictionary(), *fromBundle.asDictionary());
}

// A specialisation that rewrites manifests, to show that set-up goes through the hook.
class WrappingRecord : public AXPlugInCore {
 public:
  value::Value normalizeInfoDictionary(const value::Value& dictionary) const override {
    return manifest(dictionary);
  }
};

TEST(AXPlugInCoreSetup, SetupStoresTheNormalizedManifest) {
  WrappingRecord wrapped;
  value::Value plugIn = D({{"QSExtensionProtocol", S("P")}});
  ASSERT_TRUE(
      wrapped.setupWithName("id", AXFileURL(kBundlePath), plugIn, std::nullopt, std::nullopt));
  EXPECT_EQ(wrapped.plugInDictionary(), *plugIn.asDictionary());
}

TEST(AXPlugInCoreIdentity, EqualUuidsAreEqualRecordsWhateverElseDiffers) {
  value::Uuid id = value::Uuid::random();
  auto a = AXPlugInCore::initWithName("one", AXFileURL(kAppexPath), std::nullopt, std::nullopt, id);
  auto b =
      AXPlugInCore::initWithName("two", AXFileURL(kBundlePath), std::nullopt, std::nullopt, id);
  ASSERT_TRUE(a && b);
  EXPECT_TRUE(*a == *b);
  EXPECT_EQ(AXPlugInCoreHash()(*a), AXPlugInCoreHash()(*b));
  std::unordered_set<std::shared_ptr<const AXPlugInCore>, AXPlugInCoreHash, AXPlugInCoreEqual> set{
      a, b};
  EXPECT_EQ(set.size(), 1u);

  AXPlugInCore unset;
  EXPECT_FALSE(a->isEqual(unset));
}

TEST(AXPlugInCoreIdentityDeathTest, RecordWithoutUuidEndsTheProgram) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  AXPlugInCore unset;
  auto other = record(kAppexPath, manifest(D({})));
  EXPECT_DEATH(unset.hash(), "assertion failed in Annexa/AXPlugInCore: self.uuid");
  EXPECT_DEATH(unset.isEqual(*other), "assertion failed in Annexa/AXPlugInCore: self.uuid");
}

TEST(AXPlugInCoreDerived, AppExtensionIsDecidedByTheCaseSensitiveSuffix) {
  auto withPath = [](const char* path) {
    AXPlugInCore r;
    r.setUrl(AXFileURL(path));
    return r.isAppExtension();
  };
  EXPECT_TRUE(withPath(kAppexPath));
  EXPECT_FALSE(withPath("/Apps/Tool.APPEX"));
  EXPECT_FALSE(withPath(kBundlePath));
  EXPECT_FALSE(AXPlugInCore().isAppExtension());
}

TEST(AXPlugInCoreDerived, AppExtensionsDefaultToQSObject) {
  auto appex = record(kAppexPath, manifest(D({})));
  EXPECT_EQ(appex->protocolSpec(), S("QSObject"));
  EXPECT_EQ(appex->principalSpec(), S("QSObject"));
  EXPECT_EQ(appex->embeddedProtocolSpec(), S("QSObject"));

  auto bundle = record(kBundlePath, manifest(D({})));
  EXPECT_FALSE(bundle->protocolSpec());
  EXPECT_FALSE(bundle->principalSpec());
  EXPECT_FALSE(bundle->embeddedProtocolSpec());

  auto explicitSpecs = record(kAppexPath, manifest(D({{"QSExtensionProtocol", A({S("P")})},
                                                      {"EmbeddedProtocol", S("E")},
                                                      {"PrincipalClass", S("Main")}})));
  EXPECT_EQ(explicitSpecs->protocolSpec(), A({S("P")}));
  EXPECT_EQ(explicitSpecs->principalSpec(), S("Main"));
  EXPECT_EQ(explicitSpecs->embeddedProtocolSpec(), S("E"));
}

TEST(AXPlugInCoreDerived, DataAndDedicatedFlags) {
  auto protocol = [](Value spec) {
    return record(kBundlePath, manifest(D({{"QSExtensionProtocol", spec}})))->isData();
  };
  EXPECT_TRUE(protocol(S("#Data")));
  EXPECT_FALSE(protocol(S("Data")));
  EXPECT_FALSE(protocol(A({S("#Data")})));
  EXPECT_FALSE(record(kAppexPath, manifest(D({})))->isData());

  auto dedicated = [](std::optional<Value> flag) {
    value::Dictionary plugIn;
    if (flag) plugIn = plugIn.with("Dedicated", *flag);
    return record(kBundlePath, manifest(Value::dictionary(plugIn)))->isDedicated();
  };
  EXPECT_FALSE(dedicated(std::nullopt));
  EXPECT_TRUE(dedicated(B(true)));
  EXPECT_TRUE(dedicated(I(1)));
  EXPECT_FALSE(dedicated(B(false)));
  EXPECT_FALSE(dedicated(I(0)));
  EXPECT_FALSE(dedicated(S("yes")));
}

TEST(AXPlugInCoreDerived, OldStyleFollowsTheManifestKeys) {
  EXPECT_FALSE(record(kBundlePath, manifest(D({})))->oldStyle());
  AXPlugInCore legacy;
  legacy.setBundleInfoDictionary(value::Dictionary{{"Annexa", B(true)}});
  EXPECT_TRUE(legacy.oldStyle());
}

TEST(AXPlugInCoreDerivedDeathTest, OldStyleWithoutEitherKeyEndsTheProgram) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  AXPlugInCore neither;
  neither.setBundleInfoDictionary(value::Dictionary{{"Other", B(true)}});
  EXPECT_DEATH(neither.oldStyle(),
               "internal inconsistency in Annexa/AXPlugInCore: unknown plug-in configuration "
               "style");
}

TEST(AXPlugInCoreAnnotations, ChangeReplacesTheWholeDictionary) {
  auto r = record(kBundlePath, manifest(D({})));
  r->setAnnotation("election", I(2));
  EXPECT_FALSE(r->annotations());

  r->setAnnotations(value::Dictionary{{"election", I(1)}});
  value::Dictionary before = *r->annotations();
  r->setAnnotation("election", I(2));
  EXPECT_EQ(r->annotations(), (value::Dictionary{{"election", I(2)}}));
  EXPECT_EQ(before, (value::Dictionary{{"election", I(1)}}));
  r->setAnnotation("election", std::nullopt);
  EXPECT_EQ(r->annotations(), value::Dictionary());
}

// One writer changes annotations and names while readers check that every value they see is
// one that a writer stored whole. Run under the sanitizers, this also checks the locking.
TEST(AXPlugInCoreConcurrency, ReadersSeeWholeValuesWhileAWriterWrites) {
  auto r = record(kBundlePath, manifest(D({})));
  r->setAnnotations(value::Dictionary{{"n", I(0)}, {"tag", S("0")}});
  r->setLocalizedName("even");
  constexpr int kWrites = 20000;
  std::atomic<bool> done{false};
  std::atomic<int> torn{0};

  std::thread writer([&] {
    for (int i = 1; i <= kWrites; ++i) {
      if (i % 3 == 0) {
        r->setAnnotations(value::Dictionary{{"n", I(i)}, {"tag", S(std::to_string(i))}});
      } else {
        r->setAnnotation("n", I(i));
        r->setAnnotation("tag", S(std::to_string(i)));
      }
      r->setLocalizedName(i % 2 ? "odd name that is longer" : "even");
    }
    done = true;
  });
  std::vector<std::thread> readers;
  for (int t = 0; t < 2; ++t) {
    readers.emplace_back([&] {
      while (!done) {
        std::optional<value::Dictionary> seen = r->annotations();
        if (!seen || seen->size() != 2 || !seen->find("n")->asInt()) ++torn;
        std::optional<std::string> name = r->localizedName();
        if (name != "even" && name != "odd name that is longer") ++torn;
      }
    });
  }
  writer.join();
  for (auto& reader : readers) reader.join();
  EXPECT_EQ(torn, 0);
  EXPECT_EQ(r->annotations(),
            (value::Dictionary{{"n", I(kWrites)}, {"tag", S(std::to_string(kWrites))}}));
}

}  // namespace
