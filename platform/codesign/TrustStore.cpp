#include "platform/codesign/TrustStore.h"

#include <cerrno>

#include "platform/codesign/SigningKey.h"
#include "platform/codesign/TrustedDirectory.h"
#include "platform/os/Paths.h"

namespace codesign {

namespace {

constexpr const char* kWhat = "trust store";
constexpr const char* kDirectory = "etc/annexa/trust.d";

bool vouches(const TrustStore::Key& key, const std::string& identifier) {
  if (!key.prefixes) return true;
  for (const std::string& prefix : *key.prefixes) {
    if (identifier.starts_with(prefix)) return true;
  }
  return false;
}

std::string listed(const std::vector<std::string>& prefixes) {
  std::string text;
  for (const std::string& prefix : prefixes) text += (text.empty() ? "\"" : ", \"") + prefix + "\"";
  return text.empty() ? "nothing" : text;
}

}  // namespace

os::Result<TrustStore> TrustStore::load(const std::string& root) {
  auto keys = TrustedDirectory::parseEach<Key>(directory(root), kWhat, &TrustStore::keyFrom);
  if (!keys.ok()) return keys.error();
  TrustStore store;
  store.keys_ = std::move(keys).value();
  return store;
}

std::string TrustStore::directory(const std::string& root) {
  if (root.empty()) return os::Paths::underRoot(kDirectory);
  return (root == "/" ? std::string() : root) + "/" + kDirectory;
}

os::Result<TrustStore::Key> TrustStore::keyFrom(const std::string& source,
                                                const value::Value& file) {
  const value::Dictionary* fields = file.asDictionary();
  if (!fields) return os::Error{EINVAL, "not a dictionary"};
  const value::Value* publicKey = fields->find("PublicKey");
  if (!publicKey || !publicKey->asData() ||
      publicKey->asData()->size() != SigningKey::PublicKey().size()) {
    return os::Error{EINVAL, "\"PublicKey\" is missing or not 32 bytes of data"};
  }
  Key key{source, SigningKey::keyIdOf(*publicKey->asData()), std::nullopt};
  if (const value::Value* prefixes = fields->find("IdentifierPrefixes")) {
    const value::Array* list = prefixes->asArray();
    if (!list) return os::Error{EINVAL, "\"IdentifierPrefixes\" is not an array"};
    key.prefixes.emplace();
    for (const value::Value& prefix : *list) {
      if (!prefix.asString()) return os::Error{EINVAL, "\"IdentifierPrefixes\" holds a non-string"};
      key.prefixes->push_back(*prefix.asString());
    }
  }
  return key;
}

std::optional<std::string> TrustStore::refusal(const std::string& keyId,
                                               const std::string& identifier) const {
  std::vector<std::string> allowed;
  bool known = false;
  for (const Key& key : keys_) {
    if (key.keyId != keyId) continue;
    if (vouches(key, identifier)) return std::nullopt;
    known = true;
    allowed.insert(allowed.end(), key.prefixes->begin(), key.prefixes->end());
  }
  std::string signer = "signer " + keyId.substr(0, 16);
  if (!known) return signer + " is not trusted";
  return signer + " may sign only " + listed(allowed);
}

TrustStore::Judgement TrustStore::judge(const BundleSignature::Verification& verification,
                                        const std::string& identifier) const {
  switch (verification.state) {
    case BundleSignature::State::Unsigned:
      return {Outcome::Unsigned, {}, "the bundle is not signed"};
    case BundleSignature::State::Tampered:
      return {Outcome::Tampered, {}, verification.reason};
    case BundleSignature::State::Signed:
      break;
  }
  std::optional<std::string> refused = refusal(verification.signer, identifier);
  if (refused) return {Outcome::UntrustedSigner, verification.signer, *refused};
  return {Outcome::Trusted, verification.signer, {}};
}

std::string_view TrustStore::outcomeName(Outcome outcome) {
  switch (outcome) {
    case Outcome::Trusted:
      return "trusted";
    case Outcome::Unsigned:
      return "unsigned";
    case Outcome::Tampered:
      return "tampered";
    case Outcome::UntrustedSigner:
      return "untrusted signer";
  }
  return "unsigned";
}

}  // namespace codesign
