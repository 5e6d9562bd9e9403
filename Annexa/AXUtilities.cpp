#include "Annexa/AXUtilities.h"

#include <cctype>

value::Dictionary dictionaryChanging(const value::Dictionary& dictionary, std::string key,
                                     std::optional<value::Value> to) {
  if (!to) return dictionary.without(key);
  return dictionary.with(std::move(key), std::move(*to));
}

namespace {

bool isDigit(char c) {
  return c >= '0' && c <= '9';
}

// The run of digits starting at |i| without its leading zeros; advances |i| past the run.
std::string_view digitRun(std::string_view s, std::size_t& i) {
  std::size_t start = i;
  while (i < s.size() && isDigit(s[i])) ++i;
  std::string_view run = s.substr(start, i - start);
  while (run.size() > 1 && run.front() == '0') run.remove_prefix(1);
  return run;
}

}  // namespace

std::strong_ordering compareVersionString(std::string_view a, std::string_view b) {
  std::size_t i = 0;
  std::size_t j = 0;
  while (i < a.size() && j < b.size()) {
    if (isDigit(a[i]) && isDigit(b[j])) {
      std::string_view x = digitRun(a, i);
      std::string_view y = digitRun(b, j);
      // Without leading zeros, the longer run is the larger number; equal lengths compare as text.
      if (x.size() != y.size()) return x.size() <=> y.size();
      if (auto order = x.compare(y) <=> 0; order != 0) return order;
      continue;
    }
    auto ca = static_cast<unsigned char>(a[i++]);
    auto cb = static_cast<unsigned char>(b[j++]);
    if (ca != cb) return ca <=> cb;
  }
  return (a.size() - i) <=> (b.size() - j);
}
