// Opens arbitrary text as a sandbox extension token with sandbox::ExtensionToken::open; a token it
// accepts seals again to one that opens to the same class and path. The input is also sealed as
// a token ("<class>;<path>") that must open back, so the checks past the HMAC are reached too.
// Seeds: fuzz/corpus/token/.

#include <cstdint>
#include <cstdlib>
#include <string>
#include <string_view>

#include "platform/sandbox/ExtensionToken.h"

namespace {

constexpr std::string_view kKey = "0123456789abcdef0123456789abcdef";

void checkReopens(const sandbox::ExtensionToken& token) {
  auto again = sandbox::ExtensionToken::open(token.seal(kKey), kKey);
  if (!again.ok() || again.value().extensionClass() != token.extensionClass() ||
      again.value().path() != token.path()) {
    std::abort();
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  std::string_view text(reinterpret_cast<const char*>(data), size);
  auto token = sandbox::ExtensionToken::open(text, kKey);
  if (token.ok()) checkReopens(token.value());
  std::size_t split = text.find(';');
  if (split == 0 || split == std::string_view::npos || split + 1 == text.size()) return 0;
  std::string path(text.substr(split + 1));
  if (path.find('\0') != std::string::npos) return 0;
  checkReopens(sandbox::ExtensionToken(std::string(text.substr(0, split)), path));
  return 0;
}
