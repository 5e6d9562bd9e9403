#include "platform/os/Format.h"

#include <cstdio>

namespace os {

void FormatArg::appendTo(std::string& out, char conversion) const {
  char number[32];
  switch (kind_) {
    case Kind::Text:
      out += text_;
      return;
    case Kind::Pointer:
      std::snprintf(number, sizeof number, "0x%llx", static_cast<unsigned long long>(bits_));
      break;
    case Kind::Signed:
    case Kind::Unsigned:
      if (conversion == 'x') {
        std::snprintf(number, sizeof number, "%llx", static_cast<unsigned long long>(bits_));
      } else if (kind_ == Kind::Signed && conversion != 'u') {
        std::snprintf(number, sizeof number, "%lld", static_cast<long long>(bits_));
      } else {
        std::snprintf(number, sizeof number, "%llu", static_cast<unsigned long long>(bits_));
      }
      break;
  }
  out += number;
}

std::string format(std::string_view fmt, std::initializer_list<FormatArg> args) {
  std::string out;
  out.reserve(fmt.size() + 32);
  auto next = args.begin();
  for (std::size_t i = 0; i < fmt.size(); ++i) {
    if (fmt[i] != '%' || i + 1 == fmt.size()) {
      out.push_back(fmt[i]);
      continue;
    }
    std::size_t j = i + 1;
    while (j < fmt.size() && (fmt[j] == 'l' || fmt[j] == 'z')) ++j;
    char conversion = j < fmt.size() ? fmt[j] : '\0';
    if (conversion == '%') {
      out.push_back('%');
    } else if (next != args.end()) {
      (next++)->appendTo(out, conversion);
    }
    i = j;
  }
  return out;
}

}  // namespace os
