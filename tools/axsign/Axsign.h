#pragma once

#include <string>
#include <vector>

// The commands of axsign: make a signing key, sign bundles with it, verify bundles against the
// device root's trust store. Each returns the process's exit status and prints its result on
// standard output (JSON with `json`), errors on standard error.
class Axsign {
 public:
  explicit Axsign(bool json) : json_(json) {}

  // Writes a new private key to |keyFile| (never over a file) and, when |trustFile| is not
  // empty, the trust-store file of its public key limited to |prefixes| (none: any identifier).
  // Prints the key id. 0, or 1 when a file cannot be written.
  int keygen(const std::string& keyFile, const std::string& trustFile,
             const std::vector<std::string>& prefixes);
  // Signs each bundle with the key in |keyFile|, inner bundles first. 0, or 1 at the first
  // bundle that cannot be signed.
  int sign(const std::string& keyFile, const std::vector<std::string>& bundles);
  // Verifies each bundle and tells whether the device root's trust store vouches for its
  // signer: "trusted", "untrusted signer", "unsigned" or "tampered". 0 when every bundle is
  // trusted, 1 otherwise.
  int verify(const std::vector<std::string>& bundles);

 private:
  bool json_;
};
