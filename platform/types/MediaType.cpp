#include "platform/types/MediaType.h"

#include <algorithm>

namespace types {

namespace {

constexpr std::size_t kMaxNameLength = 127;

bool isNameCharacter(char c) {
  return (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9') ||
         std::string_view("!#$&-^_.+").find(c) != std::string_view::npos;
}

bool isName(std::string_view name) {
  return !name.empty() && name.size() <= kMaxNameLength &&
         std::all_of(name.begin(), name.end(), isNameCharacter);
}

std::string lowered(std::string_view text) {
  std::string result(text);
  for (char& c : result) {
    if (c >= 'A' && c <= 'Z') c = static_cast<char>(c - 'A' + 'a');
  }
  return result;
}

// |text| in lower case split at its first '/'; nothing without one.
std::optional<std::string> splittable(std::string_view text, std::size_t& slash) {
  std::string type = lowered(text);
  slash = type.find('/');
  if (slash == std::string::npos) return std::nullopt;
  return type;
}

}  // namespace

std::optional<std::string> MediaType::concrete(std::string_view text) {
  std::size_t slash = 0;
  std::optional<std::string> type = splittable(text, slash);
  if (!type) return std::nullopt;
  std::string_view view(*type);
  if (!isName(view.substr(0, slash)) || !isName(view.substr(slash + 1))) return std::nullopt;
  return type;
}

std::optional<std::string> MediaType::wildcard(std::string_view text) {
  std::size_t slash = 0;
  std::optional<std::string> type = splittable(text, slash);
  if (!type) return std::nullopt;
  std::string_view view(*type);
  if (!isName(view.substr(0, slash)) || view.substr(slash + 1) != "*") return std::nullopt;
  return type;
}

std::string_view MediaType::major(std::string_view type) {
  return type.substr(0, type.find('/'));
}

}  // namespace types
