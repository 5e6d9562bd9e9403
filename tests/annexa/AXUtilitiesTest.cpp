#include <gtest/gtest.h>

#include "Annexa/AXFileURL.h"
#include "Annexa/AXUtilities.h"

namespace {

TEST(CompareVersionString, DigitRunsCompareAsNumbersAndOtherCharactersByCode) {
  EXPECT_EQ(compareVersionString("1.9", "1.10"), std::strong_ordering::less);
  EXPECT_EQ(compareVersionString("1.02", "1.2"), std::strong_ordering::equal);
  EXPECT_EQ(compareVersionString("3.1", "3.1"), std::strong_ordering::equal);
  EXPECT_EQ(compareVersionString("1.100000000000000000000", "1.99999999999999999999"),
            std::strong_ordering::greater);
  EXPECT_EQ(compareVersionString("A", "a"), std::strong_ordering::less);
  EXPECT_EQ(compareVersionString("1.0-beta", "1.0.1"), std::strong_ordering::less);
  // A version that is a prefix of another is the lower one.
  EXPECT_EQ(compareVersionString("2", "2.0"), std::strong_ordering::less);
  EXPECT_EQ(compareVersionString("", "0"), std::strong_ordering::less);
  EXPECT_EQ(compareVersionString("", ""), std::strong_ordering::equal);
}

TEST(AXFileURL, PathsRoundTripThroughTheirText) {
  for (std::string path : {"/Apps/Host.app", "/a b/c%d/é#?", "/"}) {
    AXFileURL url(path);
    auto parsed = AXFileURL::fromString(url.string());
    ASSERT_TRUE(parsed) << url.string();
    EXPECT_EQ(parsed->path(), path);
  }
  EXPECT_EQ(AXFileURL("/Apps/Host.app").string(), "file:///Apps/Host.app");
  EXPECT_EQ(AXFileURL("/a b").string(), "file:///a%20b");
  EXPECT_EQ(AXFileURL::fromString("file://localhost/x")->path(), "/x");
}

TEST(AXFileURL, RefusesWhatIsNoFileURL) {
  EXPECT_FALSE(AXFileURL::fromString("http://host/x"));
  EXPECT_FALSE(AXFileURL::fromString("file://host/x"));
  EXPECT_FALSE(AXFileURL::fromString("file:///x%2"));
  EXPECT_FALSE(AXFileURL::fromString("file:///x%zz"));
  EXPECT_FALSE(AXFileURL::fromString("/plain/path"));
}

}  // namespace
