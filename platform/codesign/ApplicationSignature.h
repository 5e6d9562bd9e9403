#pragma once

#include <optional>
#include <string>

#include "platform/value/Dictionary.h"

namespace codesign {

// The entitlements that a signed application bundle grants the programs inside it: a host whose
// executable lies in an application bundle ("*.app", the nearest enclosing one) gets the
// dictionary of that bundle's Entitlements.plist when the bundle verifies (BundleSignature), the
// device root's trust store vouches for its signer and its "QFBundleIdentifier", and the running
// image is the executable file the signature names. Verifications are kept per bundle while no
// file of it changes (by path, device, inode, size and times), so a host that connects again
// costs a walk of its bundle's metadata, not a reading of its files. Safe from any thread.
class ApplicationSignature {
 public:
  // The entitlements for the executable at |path|, whose running image is open on |imageFd|;
  // nothing when it lies in no application bundle or the bundle grants none (a signature that
  // does not count is logged).
  static std::optional<value::Dictionary> entitlementsFor(const std::string& path, int imageFd);
};

}  // namespace codesign
