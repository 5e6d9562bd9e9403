#include "Annexa/AXFileURL.h"

#include <cctype>

namespace {

bool keepsItsForm(unsigned char c) {
  return std::isalnum(c) || c == '/' || c == '-' || c == '.' || c == '_' || c == '~' || c == '+' ||
         c == ',' || c == '=' || c == '@' || c == ':' || c == '!' || c == '$' || c == '&' ||
         c == '\'' || c == '(' || c == ')' || c == '*' || c == ';';
}

int hexValue(char c) {
  if (c >= '0' && c <= '9') return c - '0';
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  return -1;
}

std::optional<std::string> percentDecode(std::string_view text) {
  std::string out;
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (text[i] != '%') {
      out.push_back(text[i]);
      continue;
    }
    if (i + 2 >= text.size()) return std::nullopt;
    int high = hexValue(text[i + 1]);
    int low = hexValue(text[i + 2]);
    if (high < 0 || low < 0) return std::nullopt;
    out.push_back(static_cast<char>(high << 4 | low));
    i += 2;
  }
  return out;
}

}  // namespace

std::optional<AXFileURL> AXFileURL::fromString(std::string_view text) {
  constexpr std::string_view kScheme = "file://";
  if (text.substr(0, kScheme.size()) != kScheme) return std::nullopt;
  text.remove_prefix(kScheme.size());
  if (text.substr(0, 9) == "localhost") text.remove_prefix(9);
  if (text.empty() || text.front() != '/') return std::nullopt;
  auto path = percentDecode(text);
  if (!path) return std::nullopt;
  return AXFileURL(std::move(*path));
}

std::string AXFileURL::string() const {
  static const char kDigits[] = "0123456789ABCDEF";
  std::string text = "file://";
  for (unsigned char c : path_) {
    if (keepsItsForm(c)) {
      text.push_back(static_cast<char>(c));
    } else {
      text.push_back('%');
      text.push_back(kDigits[c >> 4]);
      text.push_back(kDigits[c & 0x0f]);
    }
  }
  return text;
}
