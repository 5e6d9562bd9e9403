#include <gtest/gtest.h>
#include <unistd.h>

#include <filesystem>
#include <functional>

#include "platform/sdk/SdkCache.h"
#include "tests/platform/RegistryFixture.h"

namespace {

namespace fs = std::filesystem;
using value::Dictionary;
using value::Value;

Dictionary sdk(const std::string& protocol) {
  return {{"QSExtension", Value::dictionary({{"QSExtensionProtocol", Value::string(protocol)},
                                             {"CleanTimeout", Value::integer(5)}})}};
}

Dictionary infoFor(Value point) {
  return {{"QFBundleShortVersionString", Value::string("2.0")},
          {"QSExtension", Value::dictionary({{"QSExtensionPointIdentifier", point},
                                             {"CleanTimeout", Value::integer(7)}})}};
}

class SdkCacheTest : public ::testing::Test {
 protected:
  // The protocol that the SDK of "p" gives a plug-in now; "" without one.
  std::string protocol() {
    Dictionary resolved = cache_.resolve(infoFor(Value::string("p")));
    const Value* found = resolved.find("QSExtension")->asDictionary()->find("QSExtensionProtocol");
    return found ? *found->asString() : "";
  }
  void writeSdk(const std::string& directory, const std::string& protocol) {
    root_.writePlist(directory + "/p.plist", Value::dictionary(sdk(protocol)));
  }

  RegistryFixture root_;
  sdk::SdkCache cache_{root_.root()};
  std::string sdks_ = root_ / "System/Library/SDKs";
};

// Each way an SDK comes, changes or goes is seen at the next refresh, from a root that has no
// SDK directory yet; a refresh with nothing changed keeps the generation and the dictionaries.
TEST_F(SdkCacheTest, EveryChangeOfTheSdkDirectoryCountsAtTheNextRefresh) {
  struct Step {
    const char* what;
    std::function<void()> change;
    std::string protocol;
  };
  const std::vector<Step> steps = {
      {"no SDK directory", [] {}, ""},
      {"the directory and a file made", [&] { writeSdk("System/Library/SDKs", "A"); }, "A"},
      {"the file rewritten in place", [&] { writeSdk("System/Library/SDKs", "B"); }, "B"},
      {"a file renamed over it",
       [&] {
         writeSdk("System/Library/SDKs/tmp", "C");
         fs::rename(sdks_ + "/tmp/p.plist", sdks_ + "/p.plist");
       },
       "C"},
      {"the file removed", [&] { fs::remove(sdks_ + "/p.plist"); }, ""},
      {"the file back", [&] { writeSdk("System/Library/SDKs", "D"); }, "D"},
      {"the whole directory removed", [&] { fs::remove_all(root_ / "System"); }, ""},
      {"made again", [&] { writeSdk("System/Library/SDKs", "E"); }, "E"},
      {"another directory renamed in its place",
       [&] {
         writeSdk("System/Library/SDKs.new", "F");
         fs::rename(sdks_, sdks_ + ".old");
         fs::rename(sdks_ + ".new", sdks_);
       },
       "F"},
      {"its unreadable file", [&] { fs::permissions(sdks_ + "/p.plist", fs::perms::none); },
       getuid() == 0 ? "F" : ""},
  };
  std::uint64_t generation = cache_.refresh();
  for (std::size_t i = 0; i < steps.size(); ++i) {
    SCOPED_TRACE(steps[i].what);
    steps[i].change();
    std::uint64_t next = cache_.refresh();
    EXPECT_EQ(next > generation, i > 0);
    generation = next;
    EXPECT_EQ(protocol(), steps[i].protocol);
    EXPECT_EQ(cache_.refresh(), generation);
    EXPECT_EQ(protocol(), steps[i].protocol);
  }
}

}  // namespace
