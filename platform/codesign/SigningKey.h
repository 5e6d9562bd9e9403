#pragma once

#include <array>
#include <cstdint>
#include <memory>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/os/Error.h"

typedef struct evp_pkey_st EVP_PKEY;

namespace codesign {

// An Ed25519 key as bundles are signed and verified with it: a vendor's private key (which signs)
// or a public key (which verifies), through libcrypto. A key is named by its key id, the
// SHA-256 of its 32 public-key bytes in lower-case hexadecimal. Immutable; safe to use from
// several threads at once.
class SigningKey {
 public:
  using PublicKey = std::array<std::uint8_t, 32>;
  using Signature = std::array<std::uint8_t, 64>;

  // A new private key from the system's random source.
  static os::Result<SigningKey> generate();
  // The private key in the PEM file at |path| (PKCS #8, as write() makes it and as
  // `openssl genpkey -algorithm ed25519` does). Fails with EINVAL when the file holds no
  // Ed25519 private key.
  static os::Result<SigningKey> readPrivate(const std::string& path);
  // The public key of 32 raw bytes: it verifies only.
  static os::Result<SigningKey> fromPublic(std::span<const std::uint8_t> bytes);

  // Writes the private key as PEM to a new file at |path|, mode 0600, never over an existing
  // file or through a link. Fails with EINVAL for a public key.
  os::Status writePrivate(const std::string& path) const;

  const PublicKey& publicKey() const { return publicKey_; }
  std::string keyId() const { return keyIdOf(publicKey_); }
  static std::string keyIdOf(std::span<const std::uint8_t> publicKey);

  // The signature of |message|; fails with EINVAL for a public key.
  os::Result<Signature> sign(std::string_view message) const;
  // True when |signature| is this key's signature of |message|.
  bool verify(std::string_view message, std::span<const std::uint8_t> signature) const;

 private:
  SigningKey(std::shared_ptr<EVP_PKEY> key, bool isPrivate);

  std::shared_ptr<EVP_PKEY> key_;
  bool private_ = false;
  PublicKey publicKey_{};
};

}  // namespace codesign
