#include "tools/axsign/Axsign.h"

#include <filesystem>
#include <iostream>
#include <nlohmann/json.hpp>

#include "platform/codesign/BundleSignature.h"
#include "platform/codesign/SigningKey.h"
#include "platform/codesign/TrustStore.h"
#include "platform/os/AtomicFile.h"
#include "platform/os/Paths.h"
#include "platform/registrum/RecordFields.h"
#include "platform/value/PropertyList.h"

using codesign::BundleSignature;
using codesign::SigningKey;
using codesign::TrustStore;
using nlohmann::ordered_json;

namespace {

int failed(const std::string& what) {
  std::cerr << "axsign: " << what << "\n";
  return 1;
}

// The identifier the registry gives the bundle: a plug-in's "QSExtensionIdentifier", else
// "QFBundleIdentifier"; empty when Info.plist has neither.
std::string identifierOf(const std::string& bundle) {
  os::Result<value::Value> info = value::PropertyList::readFile(bundle + "/Info.plist");
  const value::Dictionary* fields = info.ok() ? info.value().asDictionary() : nullptr;
  if (!fields) return {};
  registrum::PlugInRecord::Fields record;
  record.infoDictionary = *fields;
  const value::Value* plugIn = fields->find("QSExtension");
  if (plugIn && plugIn->asDictionary()) record.plugInDictionary = *plugIn->asDictionary();
  registrum::RecordFields::derive(record);
  return record.plugInIdentifier.value_or("");
}

os::Status writeTrustFile(const SigningKey& key, const std::string& path,
                          const std::vector<std::string>& prefixes) {
  const SigningKey::PublicKey& publicKey = key.publicKey();
  std::map<std::string, value::Value> fields{
      {"PublicKey", value::Value::data(value::Data(publicKey.begin(), publicKey.end()))}};
  if (!prefixes.empty()) {
    value::Array listed;
    for (const std::string& prefix : prefixes) listed.push_back(value::Value::string(prefix));
    fields["IdentifierPrefixes"] = value::Value::array(std::move(listed));
  }
  auto xml = value::PropertyList::toXml(value::Value::dictionary(value::Dictionary(fields)));
  if (!xml.ok()) return xml.error();
  std::string directory = std::filesystem::path(path).parent_path();
  os::Status made = os::Paths::ensureDirectory(directory.empty() ? "." : directory, 0755);
  if (!made.ok()) return made;
  // Only files that no one but their owner may write count in a trust store.
  return os::AtomicFile::replace(path, xml.value(), os::AtomicFile::Durability::Durable, 0644);
}

}  // namespace

int Axsign::keygen(const std::string& keyFile, const std::string& trustFile,
                   const std::vector<std::string>& prefixes) {
  os::Result<SigningKey> key = SigningKey::generate();
  if (!key.ok()) return failed(key.error().message);
  os::Status written = key.value().writePrivate(keyFile);
  if (!written.ok()) return failed(written.error().message);
  if (!trustFile.empty()) {
    os::Status trusted = writeTrustFile(key.value(), trustFile, prefixes);
    if (!trusted.ok()) return failed(trustFile + ": " + trusted.error().message);
  }
  if (json_) {
    std::cout << ordered_json{{"key", keyFile}, {"keyid", key.value().keyId()}}.dump(2) << "\n";
  } else {
    std::cout << key.value().keyId() << "\n";
  }
  return 0;
}

int Axsign::sign(const std::string& keyFile, const std::vector<std::string>& bundles) {
  os::Result<SigningKey> key = SigningKey::readPrivate(keyFile);
  if (!key.ok()) return failed(key.error().message);
  ordered_json json = ordered_json::array();
  for (const std::string& bundle : bundles) {
    os::Status signedBundle = BundleSignature::sign(bundle, key.value());
    if (!signedBundle.ok()) return failed(bundle + ": " + signedBundle.error().message);
    json.push_back({{"bundle", bundle}, {"signer", key.value().keyId()}});
    if (!json_) std::cout << bundle << ": signed by " << key.value().keyId() << "\n";
  }
  if (json_) std::cout << json.dump(2) << "\n";
  return 0;
}

int Axsign::verify(const std::vector<std::string>& bundles) {
  os::Result<TrustStore> store = TrustStore::load();
  if (!store.ok()) return failed(store.error().message);
  ordered_json json = ordered_json::array();
  int status = 0;
  for (const std::string& bundle : bundles) {
    std::string identifier = identifierOf(bundle);
    TrustStore::Judgement judged = store.value().judge(BundleSignature::verify(bundle), identifier);
    std::string_view outcome = TrustStore::outcomeName(judged.outcome);
    if (judged.outcome != TrustStore::Outcome::Trusted) status = 1;
    json.push_back({{"bundle", bundle},
                    {"identifier", identifier},
                    {"outcome", outcome},
                    {"signer", judged.signer},
                    {"reason", judged.reason}});
    if (json_) continue;
    std::cout << bundle << ": " << outcome;
    if (!judged.signer.empty()) std::cout << " (signer " << judged.signer << ")";
    if (!judged.reason.empty()) std::cout << ": " << judged.reason;
    std::cout << "\n";
  }
  if (json_) std::cout << json.dump(2) << "\n";
  return status;
}
