#include <gtest/gtest.h>

#include <string>

#include "platform/value/Utf8.h"

namespace {

using value::Utf8;

// Plain ASCII is checked a word at a time, so a byte that breaks the text must be found
// wherever it stands: in a first word, in a last word that overlaps the one before, or in a
// text shorter than a word.
TEST(Utf8Test, AByteAnywhereInTheTextCounts) {
  for (std::size_t size = 1; size <= 24; ++size) {
    EXPECT_TRUE(Utf8::valid(std::string(size, 'a'))) << size;
    for (std::size_t at = 0; at < size; ++at) {
      std::string text(size, 'a');
      text[at] = '\xFF';
      EXPECT_FALSE(Utf8::valid(text)) << size << " at " << at;
      text.replace(at, 1, "\xC3\xA9");
      EXPECT_TRUE(Utf8::valid(text)) << size << " at " << at;
      EXPECT_FALSE(Utf8::valid(text.substr(0, at + 1))) << size << " cut at " << at;
    }
  }
}

}  // namespace
