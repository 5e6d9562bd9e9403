#pragma once

#include <cstdint>
#include <initializer_list>
#include <string>
#include <string_view>
#include <type_traits>

namespace os {

// One argument of format(): an integer, a text or an already described object.
class FormatArg {
 public:
  template <typename I,
            std::enable_if_t<std::is_integral_v<I> && !std::is_same_v<I, bool>, int> = 0>
  FormatArg(I i)
      : kind_(std::is_signed_v<I> ? Kind::Signed : Kind::Unsigned),
        bits_(static_cast<std::uint64_t>(i)) {}
  FormatArg(bool b) : kind_(Kind::Text), text_(b ? "true" : "false") {}
  FormatArg(const char* text) : kind_(Kind::Text), text_(text ? text : "(null)") {}
  FormatArg(std::string_view text) : kind_(Kind::Text), text_(text) {}
  FormatArg(const std::string& text) : kind_(Kind::Text), text_(text) {}
  FormatArg(const void* pointer)
      : kind_(Kind::Pointer), bits_(reinterpret_cast<std::uintptr_t>(pointer)) {}

  // Appends the argument as the conversion |conversion| ('@', 'd', 'u', 's', 'x', 'p') asks.
  void appendTo(std::string& out, char conversion) const;

 private:
  enum class Kind { Signed, Unsigned, Text, Pointer };
  Kind kind_;
  std::uint64_t bits_ = 0;
  std::string_view text_;
};

// Formats a message in the daemon's log and error style: %@ (description), %d, %u, %s, %lx, %p,
// with optional length modifiers (l, ll, z) ignored, and %% for a percent sign. Each
// placeholder takes the next argument; missing arguments print as nothing, surplus ones are
// ignored. Never fails.
std::string format(std::string_view fmt, std::initializer_list<FormatArg> args);

}  // namespace os
