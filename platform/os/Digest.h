#pragma once

#include <array>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>

#include "platform/os/Error.h"

namespace os {

// Message digests and HMAC from libcrypto. Bytes are passed as string_view (any bytes, NULs
// included). Stateless; safe to call from any thread. libcrypto fails at these only when it
// cannot allocate memory, which ends the process with std::bad_alloc like any failed
// allocation.
class Digest {
 public:
  using Sha1 = std::array<std::uint8_t, 20>;
  using Sha256 = std::array<std::uint8_t, 32>;

  static Sha1 sha1(std::string_view bytes);
  static Sha256 sha256(std::string_view bytes);
  static Sha256 hmacSha256(std::string_view key, std::string_view bytes);

  // The SHA-256 of the file's whole contents as 64 lower-case hexadecimal digits. Fails with
  // the system's error number when the file cannot be opened or read.
  static Result<std::string> sha256File(const std::string& path);
  // The same for an open descriptor, read from offset 0 with pread: the descriptor's own
  // offset does not move. The caller keeps ownership of |fd|.
  static Result<std::string> sha256File(int fd);

  // |bytes| as lower-case hexadecimal digits, two per byte.
  static std::string hex(std::span<const std::uint8_t> bytes);
};

}  // namespace os
