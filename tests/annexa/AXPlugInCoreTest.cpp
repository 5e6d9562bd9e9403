#include <gtest/gtest.h>

#include <atomic>
#include <thread>
#include <vector>

#include "Annexa/AXPlugInCore.h"
#include "PlugInFixtures.h"

namespace {

using namespace fixtures;
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
