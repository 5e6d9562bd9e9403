#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace value {

// A 16-byte universally unique identifier. Immutable value type; safe to share between threads.
class Uuid {
 public:
  using Bytes = std::array<std::uint8_t, 16>;

  // The nil UUID (all zero bytes).
  Uuid() : bytes_{} {}
  explicit Uuid(const Bytes& bytes) : bytes_(bytes) {}

  // A fresh random (version 4) UUID from the kernel's random source.
  static Uuid random();

  // Parses the 36-character form (either letter case). Returns nothing for any other text.
  static std::optional<Uuid> parse(std::string_view text);

  const Bytes& bytes() const { return bytes_; }

  // The 36-character form in upper-case hexadecimal with hyphens.
  std::string string() const;

  bool operator==(const Uuid& other) const = default;
  auto operator<=>(const Uuid& other) const = default;

 private:
  Bytes bytes_;
};

struct UuidHash {
  std::size_t operator()(const Uuid& uuid) const;
};

}  // namespace value
