#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <string_view>

#include "platform/codesign/SigningKey.h"
#include "platform/os/Error.h"
#include "platform/value/Value.h"

namespace codesign {

// The signature of a bundle: the file "Signature.plist" at its root, which names its signer's
// public key and the SHA-256 of every other file of the bundle, and holds the Ed25519 signature
// of those digests. docs/platform.md ("Bundle signatures") gives the format, so that any tool can
// make one. Whether the signer is trusted is the trust store's question (TrustStore); this class
// tells whether the bundle is what its signer signed. Stateless; safe from any thread.
class BundleSignature {
 public:
  static constexpr std::string_view kFileName = "Signature.plist";
  // The first line of the signed text.
  static constexpr std::string_view kHeader = "annexa-bundle-signature-1\n";
  // A bundle larger than this cannot be signed, and verifies as tampered: one registration
  // must not hash without end.
  static constexpr std::size_t kMaxFiles = 4096;
  static constexpr std::uint64_t kMaxBytes = 256u << 20;

  // Digests (64 lower-case hexadecimal digits) by path relative to the bundle ('/' between
  // names, in byte order).
  using Digests = std::map<std::string, std::string>;

  enum class State {
    Unsigned,  // no signature file
    Signed,    // every file is as signed
    Tampered,  // a signature file that is malformed, does not verify, or does not match
  };
  struct Verification {
    State state = State::Unsigned;
    std::string signer;  // Signed: the signer's key id
    std::string reason;  // Tampered: what failed
    Digests files;       // Signed: the signed digests
  };

  // The digests of every regular file of the bundle at |bundle| except its own signature file,
  // each read without following a link. Fails with EINVAL, saying where, when the bundle holds a
  // symbolic link, a file that is neither regular nor a directory, a name with a line break, or
  // more than kMaxFiles files or kMaxBytes bytes; with the system's error when it cannot be read.
  static os::Result<Digests> digests(const std::string& bundle);
  // A signature file's contents.
  struct SignatureFile {
    SigningKey key;
    Digests files;
    value::Data signature;
  };
  // The contents of the signature file |file| (a property list as read). Fails with EINVAL,
  // saying why, when it is not a dictionary of format 1 with a 32-byte "PublicKey", "Files" of
  // string digests and "Signature" data. Nothing is verified here.
  static os::Result<SignatureFile> parse(const value::Value& file);

  // The text a signature covers: kHeader, then one line "<digest>  <path>\n" per file in order.
  static std::string message(const Digests& files);

  // Signs the bundle at |bundle| with |key| as it is now, writing its signature file. Every
  // bundle inside it (a directory named "*.appex" or "*.app") is signed first, innermost first,
  // so that the outer signature covers the inner ones.
  static os::Status sign(const std::string& bundle, const SigningKey& key);

  // What the bundle at |bundle| is: unsigned, signed (by whom), or tampered (why).
  static Verification verify(const std::string& bundle);

  static std::string_view stateName(State state);
};

}  // namespace codesign
