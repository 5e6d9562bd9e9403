#include "platform/launcher/ServiceName.h"

#include <cstdio>

namespace launcher {

namespace {

bool needsEscape(char c, bool leading) {
  return c == '%' || c == '/' || c == '\0' || (leading && c == '.');
}

int hexDigit(char c) {
  if (c >= '0' && c <= '9') return c - '0';
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  return -1;
}

}  // namespace

std::string ServiceName::escape(std::string_view text) {
  std::string out;
  out.reserve(text.size());
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (!needsEscape(text[i], i == 0)) {
      out += text[i];
      continue;
    }
    char code[4];
    std::snprintf(code, sizeof code, "%%%02X", static_cast<unsigned char>(text[i]));
    out += code;
  }
  return out;
}

std::optional<std::string> ServiceName::unescape(std::string_view component) {
  std::string out;
  for (std::size_t i = 0; i < component.size(); ++i) {
    if (component[i] != '%') {
      out += component[i];
      continue;
    }
    if (i + 2 >= component.size()) return std::nullopt;
    int high = hexDigit(component[i + 1]), low = hexDigit(component[i + 2]);
    if (high < 0 || low < 0) return std::nullopt;
    out += static_cast<char>(high * 16 + low);
    i += 2;
  }
  // Only the one spelling escape() makes names a service, so that removal finds what listing
  // reports.
  if (out.empty() || escape(out) != component) return std::nullopt;
  return out;
}

}  // namespace launcher
