#include <gtest/gtest.h>

#include <atomic>
#include <thread>
#include <vector>

#include "Annexa/AXPlugInCore.h"
#include "PlugInFixtures.h"

namespace {

using namespace fixtures;
using value::Value;

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
