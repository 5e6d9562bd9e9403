#include "platform/sandbox/ExtensionToken.h"

#include <openssl/crypto.h>

#include <cerrno>
#include <optional>
#include <vector>

#include "platform/os/Digest.h"
#include "platform/os/Text.h"
#include "platform/sandbox/Hex.h"

namespace sandbox {

namespace {

constexpr std::string_view kVersion = "v1";

os::Error malformed() {
  return os::Error{EINVAL, "extension token: malformed"};
}

}  // namespace

std::string ExtensionToken::seal(std::string_view key) const {
  std::string text = std::string(kVersion) + ";" + extensionClass_ + ";" + Hex::encode(path_);
  os::Digest::Sha256 mac = os::Digest::hmacSha256(key, text);
  return text + ";" + os::Digest::hex(mac);
}

os::Result<ExtensionToken> ExtensionToken::open(std::string_view text, std::string_view key) {
  std::vector<std::string_view> fields = os::split(text, ';');
  if (fields.size() != 4 || fields[0] != kVersion || fields[1].empty()) return malformed();
  std::optional<std::string> path = Hex::decode(fields[2]);
  std::optional<std::string> mac = Hex::decode(fields[3]);
  if (!path || path->empty() || path->find('\0') != std::string::npos) return malformed();
  if (!mac || mac->size() != sizeof(os::Digest::Sha256)) return malformed();
  std::string_view signedText = text.substr(0, text.rfind(';'));
  os::Digest::Sha256 expected = os::Digest::hmacSha256(key, signedText);
  if (CRYPTO_memcmp(expected.data(), mac->data(), expected.size()) != 0) {
    return os::Error{EPERM, "extension token: signature does not verify"};
  }
  return ExtensionToken(std::string(fields[1]), std::move(*path));
}

}  // namespace sandbox
