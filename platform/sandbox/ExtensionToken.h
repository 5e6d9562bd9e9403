#pragma once

#include <string>
#include <string_view>

#include "platform/os/Error.h"

namespace sandbox {

// A sandbox extension as text: "v1;<class>;<path as lower-case hex>;<HMAC-SHA256 as lower-case
// hex>", where the HMAC is taken under the per-boot key over everything before the last ';'
// (version, class and path). The path is hex-encoded so that any byte, ';' included, survives.
// Immutable value type.
class ExtensionToken {
 public:
  ExtensionToken(std::string extensionClass, std::string path)
      : extensionClass_(std::move(extensionClass)), path_(std::move(path)) {}

  const std::string& extensionClass() const { return extensionClass_; }
  const std::string& path() const { return path_; }

  // The token text, signed with |key|. The class must be non-empty and free of ';'
  // (Sandbox::issueFileExtension checks that).
  std::string seal(std::string_view key) const;

  // The extension |text| describes when its HMAC verifies under |key|. Fails with EINVAL when
  // the text is not a well-formed token of this version, EPERM when it is well formed but its
  // HMAC does not match (forged, altered, or signed under another boot's or root's key).
  static os::Result<ExtensionToken> open(std::string_view text, std::string_view key);

 private:
  std::string extensionClass_;
  std::string path_;
};

}  // namespace sandbox
