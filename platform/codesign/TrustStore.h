#pragma once

#include <optional>
#include <string>
#include <vector>

#include "platform/codesign/BundleSignature.h"
#include "platform/os/Error.h"
#include "platform/value/Value.h"

namespace codesign {

// The signing keys a device root trusts: every "<root>/etc/annexa/trust.d/*.plist" that counts
// (TrustedDirectory: a regular file that only root or the daemon's user can have written), each a
// dictionary with "PublicKey" (the key's 32 bytes) and optionally "IdentifierPrefixes" (strings:
// the key vouches only for bundles whose identifier begins with one of them, as written; without
// the key it vouches for any). A malformed file is skipped with a log line. Immutable once
// loaded; safe to read from several threads at once.
class TrustStore {
 public:
  struct Key {
    std::string source;  // the file, for log lines
    std::string keyId;   // SigningKey::keyIdOf its public key
    std::optional<std::vector<std::string>> prefixes;
  };

  // The trust store of the device root |root| (the current one when empty), files in name
  // order. A missing directory trusts no key. Fails with the system's error number only when the
  // directory exists and cannot be listed.
  static os::Result<TrustStore> load(const std::string& root = "");
  // "<root>/etc/annexa/trust.d" (the current root when |root| is empty).
  static std::string directory(const std::string& root = "");
  // The key that the trust file |source| holding |file| describes. Fails with EINVAL, saying
  // why, when |file| is not of the shape above.
  static os::Result<Key> keyFrom(const std::string& source, const value::Value& file);

  // Why the signer |keyId| does not vouch for a bundle with |identifier|: "signer <id> is not
  // trusted", or "signer <id> may sign only <prefixes>"; nothing when some trusted key with that
  // id vouches for it.
  std::optional<std::string> refusal(const std::string& keyId, const std::string& identifier) const;

  // What a bundle's signature is worth here.
  enum class Outcome { Trusted, Unsigned, Tampered, UntrustedSigner };
  struct Judgement {
    Outcome outcome = Outcome::Unsigned;
    std::string signer;  // the signer's key id, when the bundle is signed
    std::string reason;  // why it is not trusted: the tampering, or the refusal
  };
  // |verification| of a bundle with |identifier|, judged: a signed bundle is trusted when some
  // key vouches for its signer and identifier (refusal()), and from an untrusted signer
  // otherwise.
  Judgement judge(const BundleSignature::Verification& verification,
                  const std::string& identifier) const;
  // "trusted", "unsigned", "tampered" or "untrusted signer".
  static std::string_view outcomeName(Outcome outcome);

  const std::vector<Key>& keys() const { return keys_; }

 private:
  std::vector<Key> keys_;
};

}  // namespace codesign
