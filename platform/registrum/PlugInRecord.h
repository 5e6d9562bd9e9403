#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/codesign/BundleSignature.h"
#include "platform/codesign/TrustStore.h"
#include "platform/registrum/ApplicationRecord.h"
#include "platform/value/Value.h"

namespace registrum {

// The registry's record of one registered plug-in bundle, as it was when the record was read
// (a notice's records included). Immutable; shared by std::shared_ptr<const PlugInRecord> and
// safe to read from any thread. Two records describe the same plug-in when their UUIDs are
// equal.
class PlugInRecord {
 public:
  // Where valueForKey looks.
  enum class Scope {
    Attributes,        // the plug-in dictionary's "QSExtensionAttributes"
    PlugInDictionary,  // the plug-in dictionary (resolved "QSExtension")
    InfoDictionary,    // the raw Info.plist, as the bundle holds it
  };

  struct Fields {
    value::Uuid uuid;
    std::optional<std::string> bundlePath;
    std::shared_ptr<const ApplicationRecord> containingApplication;
    std::optional<std::string> plugInIdentifier;
    std::optional<std::string> originalIdentifier;
    std::optional<std::string> bundleIdentifier;
    std::optional<std::string> bundleVersion;
    std::optional<std::string> plugInVersion;
    std::optional<std::string> extensionPointIdentifier;
    // The extension point queries pre-select on, as stored with the row; nothing in a record
    // built by hand.
    std::optional<std::string> rulePoint;
    // The entitlements the registry honours: those the bundle declares when its signature is
    // trusted for its identifier, none otherwise (see signature).
    value::Dictionary entitlements;
    // What the bundle's Entitlements.plist declares, honoured or not.
    value::Dictionary declaredEntitlements;
    // The bundle's signature as verified when it was registered, and the trust store's
    // judgement of it when the record was read.
    struct Signature {
      codesign::BundleSignature::State state = codesign::BundleSignature::State::Unsigned;
      std::string signer;  // signed: the key id
      std::string note;    // tampered: what failed
      // Signed: the signed SHA-256 of the file "QFBundleExecutable" names; nothing when the
      // bundle names none or is not signed.
      std::optional<std::string> executableDigest;
      codesign::TrustStore::Outcome outcome = codesign::TrustStore::Outcome::Unsigned;
      std::string distrust;  // why the entitlements are not honoured; empty when they are
    };
    Signature signature;
    double registrationDate = 0;
    bool onSystemPartition = false;
    std::optional<std::string> dataContainerPath;
    value::Dictionary plugInDictionary;
    value::Dictionary infoDictionary;
    std::optional<std::string> localizedName;
    std::optional<std::string> localizedShortName;
    std::uint64_t sdkGeneration = 0;
  };

  explicit PlugInRecord(Fields fields) : fields_(std::move(fields)) {}

  // Assigned at the first registration of the bundle's path; kept while that path stays
  // registered, re-registrations included.
  const value::Uuid& uuid() const { return fields_.uuid; }
  // The extension point the registry pre-selects the plug-in by: the bundle's own manifest
  // value "QSExtensionPointIdentifier", before SDK merging; nothing when it declares none (such
  // a plug-in is a candidate for every point).
  const std::optional<std::string>& rulePoint() const { return fields_.rulePoint; }
  // The bundle location: canonical path of the bundle directory. Always present for records
  // the registry makes; nothing only in records built by hand (tests, fakes).
  const std::optional<std::string>& bundlePath() const { return fields_.bundlePath; }
  // The nearest enclosing ".app" bundle's record; null for a plug-in outside any application.
  const std::shared_ptr<const ApplicationRecord>& containingApplication() const {
    return fields_.containingApplication;
  }
  // The plug-in dictionary's "QSExtensionIdentifier" when it is a string, else Info.plist's
  // "QFBundleIdentifier" when it is a string; nothing when neither is.
  const std::optional<std::string>& plugInIdentifier() const { return fields_.plugInIdentifier; }
  // The identifier the bundle declared when registered. This registry never renames a
  // plug-in, so it equals plugInIdentifier().
  const std::optional<std::string>& originalIdentifier() const {
    return fields_.originalIdentifier;
  }
  // Info.plist's "QFBundleIdentifier" when it is a string; nothing otherwise.
  const std::optional<std::string>& bundleIdentifier() const { return fields_.bundleIdentifier; }
  // Info.plist's "QFBundleShortVersionString" when it is a string; nothing otherwise.
  const std::optional<std::string>& bundleVersion() const { return fields_.bundleVersion; }
  // The plug-in's version: its attribute "QSExtensionVersion" as text (sdk::versionText), which
  // every registered plug-in has; nothing only in records built by hand.
  const std::optional<std::string>& plugInVersion() const { return fields_.plugInVersion; }
  // The plug-in dictionary's "QSExtensionPointIdentifier" when it is a string; nothing
  // otherwise.
  const std::optional<std::string>& extensionPointIdentifier() const {
    return fields_.extensionPointIdentifier;
  }
  // The entitlements honoured: the dictionary of the bundle's Entitlements.plist when its
  // signature is trusted for the plug-in's identifier (signature()), else empty.
  const value::Dictionary& entitlements() const { return fields_.entitlements; }
  // The bundle's Entitlements.plist as declared; empty when the bundle has none.
  const value::Dictionary& declaredEntitlements() const { return fields_.declaredEntitlements; }
  const Fields::Signature& signature() const { return fields_.signature; }
  // When the bundle was last registered, in seconds since 1970-01-01 00:00 UTC.
  double registrationDate() const { return fields_.registrationDate; }
  // True when the bundle lies on the system volume, under "<root>/System/".
  bool onSystemPartition() const { return fields_.onSystemPartition; }
  // The plug-in's data container "<root>/var/containers/<UUID>"; nothing for a plug-in
  // registered without one.
  const std::optional<std::string>& dataContainerPath() const { return fields_.dataContainerPath; }
  // Info.plist's "QSExtension" resolved against its extension point's SDK dictionary as it was
  // when the record was read, with the attributes and version defaults filled
  // (sdk::SdkCache::resolve).
  const value::Dictionary& plugInDictionary() const { return fields_.plugInDictionary; }
  // The bundle's Info.plist as read, before SDK resolution.
  const value::Dictionary& infoDictionary() const { return fields_.infoDictionary; }
  // Info.plist's "QFBundleDisplayName", else "QFBundleName" (strings only); nothing when
  // neither is present.
  const std::optional<std::string>& localizedName() const { return fields_.localizedName; }
  // Info.plist's "QFBundleName", else "QFBundleDisplayName" (strings only); nothing when
  // neither is present.
  const std::optional<std::string>& localizedShortName() const {
    return fields_.localizedShortName;
  }

  // The generation of the SDKs and trusted keys (Workspace::sdkGeneration) when the record was
  // read: its plug-in dictionary and honoured entitlements reflect that generation or a later
  // one. 0 in the records of notices
  // and in records built by hand.
  std::uint64_t sdkGeneration() const { return fields_.sdkGeneration; }

  // The value under |key| in |scope|, of any type; nothing when the key is absent (or, for
  // Attributes, when the plug-in dictionary has no attributes dictionary).
  std::optional<value::Value> valueForKey(std::string_view key, Scope scope) const;
  // The plug-in's manifest value for |key|, the one lookup that rules, exclusions, restriction
  // entitlements and the registry's pre-selection share: the attribute, else the plug-in
  // dictionary's entry, else Info.plist's; nothing when none has the key.
  std::optional<value::Value> manifestValue(std::string_view key) const;

  const Fields& fields() const { return fields_; }

 private:
  const Fields fields_;
};

}  // namespace registrum
