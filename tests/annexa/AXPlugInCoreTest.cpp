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

TEST(AXPlugInCoreIdentity, RecordsAreEqualExactlyWhenTheirUuidsAre) {
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

  // Records set up without a UUID get a fresh one each.
  auto fresh = AXPlugInCore::initWithName("one", AXFileURL(kAppexPath), std::nullopt, std::nullopt,
                                          std::nullopt);
  auto other = AXPlugInCore::initWithName("one", AXFileURL(kAppexPath), std::nullopt, std::nullopt,
                                          std::nullopt);
  ASSERT_TRUE(fresh && other && fresh->uuid());
  EXPECT_FALSE(*fresh == *other);

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

TEST(AXPlugInCoreDerived, OnlyAppExtensionsDefaultToQSObject) {
  auto appex = record(kAppexPath, manifest(D({})));
  EXPECT_TRUE(appex->isAppExtension());
  EXPECT_EQ(appex->protocolSpec(), S("QSObject"));
  EXPECT_EQ(appex->principalSpec(), S("QSObject"));
  EXPECT_EQ(appex->embeddedProtocolSpec(), S("QSObject"));

  // The suffix is case-sensitive.
  for (const char* path : {kBundlePath, "/Apps/Tool.APPEX"}) {
    auto other = record(path, manifest(D({})));
    EXPECT_FALSE(other->isAppExtension()) << path;
    EXPECT_FALSE(other->protocolSpec()) << path;
    EXPECT_FALSE(other->principalSpec()) << path;
    EXPECT_FALSE(other->embeddedProtocolSpec()) << path;
  }
  EXPECT_FALSE(AXPlugInCore().isAppExtension());

  auto explicitSpecs = record(kAppexPath, manifest(D({{"QSExtensionProtocol", A({S("P")})},
                                                      {"EmbeddedProtocol", S("E")},
                                                      {"PrincipalClass", S("Main")}})));
  EXPECT_EQ(explicitSpecs->protocolSpec(), A({S("P")}));
  EXPECT_EQ(explicitSpecs->principalSpec(), S("Main"));
  EXPECT_EQ(explicitSpecs->embeddedProtocolSpec(), S("E"));
}

TEST(AXPlugInCoreDerived, DataDedicatedAndOldStyleFlags) {
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
  EXPECT_FALSE(dedicated(I(0)));
  EXPECT_FALSE(dedicated(S("yes")));

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

TEST(AXPlugInCoreAnnotations, ASetChangesOneEntryOfAnnotationsThatExist) {
  auto r = record(kBundlePath, manifest(D({})));
  r->setAnnotation("election", I(2));
  EXPECT_FALSE(r->annotations());

  r->setAnnotations(value::Dictionary{{"election", I(1)}, {"extension", D({})}});
  r->setAnnotation("election", I(2));
  EXPECT_EQ(r->annotations(), (value::Dictionary{{"election", I(2)}, {"extension", D({})}}));
  r->setAnnotation("extension", std::nullopt);
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
