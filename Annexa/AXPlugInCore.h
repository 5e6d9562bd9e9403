#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>

#include "Annexa/AXError.h"
#include "Annexa/AXFileURL.h"
#include "platform/value/Dictionary.h"
#include "platform/value/Uuid.h"
#include "platform/value/Value.h"

// The record of one plug-in: where its bundle lies, what its manifest says, who it is
// (identifier and UUID) and the facts the system attaches to it (entitlements, registration
// time, annotations, localized names, code identity). Two records are the same plug-in record
// exactly when their UUIDs are equal.
//
// Thread safety: a record is built on one thread and then shared (as std::shared_ptr). Every
// getter and setter is safe to call from any thread at any time: one mutex per record guards the
// fields, getters copy the value out (values and dictionaries are immutable, so that is O(1)),
// and a reader never sees a half-written value. Setters replace whole values and never change a
// dictionary in place, so a dictionary obtained from a getter stays valid and unchanged.
// Compound operations (setup*, setDictionaries, canonicalize, resolveSDK, updateFromForm) are
// not atomic as a whole: run them before the record is shared.
//
// Specialisation: the daemon's record answers every manifest question from the application
// registry. It overrides infoKey, pluginKey, attribute, bundleInfoDictionary, the three
// localized-name getters, originalIdentifier, entitlements, diagnose and
// normalizeInfoDictionary; every derived property and the form read through these virtual
// members. A specialisation that caches a registry value may use the base field as its cache:
// its getter returns the base getter's value when present, else fetches, stores it with the
// base setter and returns it.
//
// "Absent" is std::nullopt throughout.
class AXPlugInCore {
 public:
  // init: an empty record (every field absent, false or 0). It has no UUID, so comparing or
  // hashing it ends the program; use the factories below for records that are shared.
  AXPlugInCore() = default;
  virtual ~AXPlugInCore() = default;

  AXPlugInCore(const AXPlugInCore&) = delete;
  AXPlugInCore& operator=(const AXPlugInCore&) = delete;

  // ---- Construction --------------------------------------------------------------------------

  // A set-up record (setupWithName with these arguments), or null when set-up fails. On success,
  // when the record still has no plug-in dictionary (no bundleInfo was given), |info| becomes
  // the plug-in dictionary unchanged.
  static std::shared_ptr<AXPlugInCore> initWithName(std::optional<std::string> name,
                                                    std::optional<AXFileURL> url,
                                                    std::optional<value::Value> bundleInfo,
                                                    std::optional<value::Dictionary> info,
                                                    std::optional<value::Uuid> uuid);

  // Sets up identifier, url, manifest and uuid. Returns false when |url| is absent (silently),
  // when |name| is absent (logs "missing identifier in plug-in at <path>"), or when |bundleInfo|
  // is present but, after normalizeInfoDictionary, is not a dictionary whose "QSExtension" is a
  // dictionary (logs "malformed plug-in dictionary in plug-in <name> at <url>: <bundleInfo>").
  // A failed set-up may leave the record partly filled. An absent |uuid| gives a fresh random
  // one. |info| is not read here.
  bool setupWithName(std::optional<std::string> name, std::optional<AXFileURL> url,
                     std::optional<value::Value> bundleInfo, std::optional<value::Dictionary> info,
                     std::optional<value::Uuid> uuid);

  // A record rebuilt from a form (see setupWithForm), or null when that fails.
  static std::shared_ptr<AXPlugInCore> initWithForm(const value::Dictionary& form);

  // ---- Identity ------------------------------------------------------------------------------

  // True when both UUIDs are equal; nothing else is compared. Ends the program with the
  // assertion "self.uuid" when this record has no UUID.
  bool isEqual(const AXPlugInCore& other) const;
  // The UUID's hash. Ends the program with the assertion "self.uuid" when there is no UUID.
  std::size_t hash() const;

  // ---- Fields (getters copy out under the record's lock) -------------------------------------

  bool onSystemVolume() const;
  std::optional<value::Dictionary> plugInDictionary() const;
  std::optional<std::string> identifier() const;
  virtual std::optional<std::string> originalIdentifier() const;
  std::optional<AXFileURL> url() const;
  std::optional<AXFileURL> containingUrl() const;
  virtual std::optional<value::Dictionary> bundleInfoDictionary() const;
  virtual std::optional<value::Dictionary> entitlements() const;
  std::uint32_t hubProtocolVersion() const;
  virtual std::optional<std::string> localizedName() const;
  virtual std::optional<std::string> localizedShortName() const;
  virtual std::optional<std::string> localizedContainingName() const;
  std::optional<value::Dictionary> annotations() const;
  std::int32_t lastModified() const;
  std::optional<value::Uuid> uuid() const;
  std::optional<value::Data> cdhash() const;
  std::optional<std::string> requirement() const;

  void setOnSystemVolume(bool onSystemVolume);
  void setPlugInDictionary(std::optional<value::Dictionary> plugInDictionary);
  void setIdentifier(std::optional<std::string> identifier);
  void setOriginalIdentifier(std::optional<std::string> originalIdentifier);
  void setUrl(std::optional<AXFileURL> url);
  void setContainingUrl(std::optional<AXFileURL> containingUrl);
  void setBundleInfoDictionary(std::optional<value::Dictionary> bundleInfoDictionary);
  void setEntitlements(std::optional<value::Dictionary> entitlements);
  void setHubProtocolVersion(std::uint32_t hubProtocolVersion);
  void setLocalizedName(std::optional<std::string> localizedName);
  void setLocalizedShortName(std::optional<std::string> localizedShortName);
  void setLocalizedContainingName(std::optional<std::string> localizedContainingName);
  void setLastModified(std::int32_t lastModified);
  void setUuid(std::optional<value::Uuid> uuid);
  void setCdhash(std::optional<value::Data> cdhash);
  void setRequirement(std::optional<std::string> requirement);

  // ---- Annotations ---------------------------------------------------------------------------

  // Replaces annotations by a copy in which |key| maps to |value| (removed when |value| is
  // absent). When the record has no annotations they stay absent: set a first dictionary with
  // setAnnotations.
  void setAnnotation(std::string key, std::optional<value::Value> value);
  // Replaces the whole dictionary.
  void setAnnotations(std::optional<value::Dictionary> annotations);

  // ---- Key lookup (virtual: a specialisation answers from its own store) ---------------------

  // The value of |key| in the bundle information dictionary, or absent.
  virtual std::optional<value::Value> infoKey(std::string_view key) const;
  // The value of |key| in the plug-in dictionary, or absent.
  virtual std::optional<value::Value> pluginKey(std::string_view key) const;
  // The value of |key| in the attributes dictionary, or absent.
  virtual std::optional<value::Value> attribute(std::string_view key) const;

  // ---- Derived properties (computed on each call through the lookups above) ------------------

  // The path of url; empty when the record has no url.
  std::string path() const;
  // The path of containingUrl, or absent.
  std::optional<std::string> containingPath() const;
  // pluginKey "QSExtensionAttributes" when it is a dictionary; absent otherwise.
  std::optional<value::Dictionary> attributes() const;
  // attribute "QSExtensionVersion" as text (a number as its decimal text, sdk::versionText);
  // absent when it is missing or of another type.
  std::optional<std::string> version() const;
  // pluginKey "QSExtensionProtocol" (string or array); "QSObject" for an app extension that has
  // none; else absent.
  std::optional<value::Value> protocolSpec() const;
  // pluginKey "PrincipalClass", of any type; "QSObject" for an app extension that has none;
  // else absent.
  std::optional<value::Value> principalSpec() const;
  // pluginKey "QSExtensionPointIdentifier", of any type (resolveSDK rejects a non-string).
  std::optional<value::Value> sdkSpec() const;
  // pluginKey "EmbeddedProtocol", else protocolSpec.
  std::optional<value::Value> embeddedProtocolSpec() const;
  // Always absent.
  std::optional<std::string> embeddedCodePath() const;
  // The path ends with ".appex" (case-sensitive).
  bool isAppExtension() const;
  // Always false: the "Multiple" key is obsolete.
  bool isMultiplexed() const;
  // pluginKey "EmbeddedCode" is present, whatever its value.
  bool isHybrid() const;
  // pluginKey "Dedicated" is a boolean or number that is not false/0; absent is false.
  bool isDedicated() const;
  // protocolSpec is the string "#Data".
  bool isData() const;
  // False when the bundle information dictionary has "QSExtension", else true when it has the
  // legacy key "Annexa". With neither (or with no bundle information dictionary) the program
  // ends with the internal inconsistency "unknown plug-in configuration style".
  bool oldStyle() const;
  // lastModified seconds after 1970-01-01 00:00 UTC.
  value::Date timestamp() const;

  // ---- Manifest handling ---------------------------------------------------------------------

  // Stores |dictionary| as the bundle information dictionary and its "QSExtension" value as the
  // plug-in dictionary. Returns false, storing nothing, when |dictionary| is not a dictionary;
  // returns false, keeping the stored bundle information dictionary and the old plug-in
  // dictionary, when its "QSExtension" is not a dictionary. Logs the obsolete "Multiple" key.
  bool setDictionaries(const value::Value& dictionary);

  // A hook to rewrite a manifest before it is stored. The base returns |dictionary| unchanged.
  virtual value::Value normalizeInfoDictionary(const value::Value& dictionary) const;

  // Fills defaults into the plug-in dictionary: an attributes dictionary always, and a
  // "QSExtensionVersion" attribute taken from infoKey "QFBundleShortVersionString" (when it is a
  // string), else "1". Reads through the virtual attribute and infoKey.
  void canonicalize();

  // Merges the extension point's SDK dictionary under the manifest, then canonicalises. A
  // non-string extension point is logged ("invalid SDK key:<value>") and leaves the record as it
  // was; an unregistered one keeps the manifest. Ends the program with the internal
  // inconsistency "cannot resolve SDK without materialized Info.plist" when the record has no
  // bundle information dictionary.
  void resolveSDK();

  // The SDK dictionary registered for the extension point |name|, or absent (logged as
  // "plug-in sdk \"<name>\" not registered").
  static std::optional<value::Dictionary> readSDKDictionary(std::string_view name);

  // The manifest side |into| completed by the SDK side |sdk| at every depth: the manifest wins,
  // except "CleanTimeout" (the SDK wins) and "Shared" (the union); dictionaries on both sides
  // merge key by key. Neither input changes.
  static value::Dictionary mergeDictionary(const value::Dictionary& sdk,
                                           const value::Dictionary& into);
  // True only for "CleanTimeout".
  static bool sdkOverridesKey(std::string_view key);
  // The union of both lists without duplicates; a single string counts as a one-element list.
  static value::Value mergeSharedResources(const value::Value& sdk, const value::Value& into);

  // Absent for a well-formed plug-in, else the first failing check's error (domain "Annexa",
  // code 12). Never changes the record. A specialisation runs these checks first, then its own.
  virtual std::optional<AXError> diagnose() const;

  // ---- Form ----------------------------------------------------------------------------------

  // The record's form ("export:"), as property-list values: "hubProtocolVersion" (unsigned),
  // "path", "systemResident" (boolean), "identifier", "original-identifier", "version",
  // "bundleInfo" (without "QFBundleInfoPlistURL"), "info", "uuid" (36 upper-case characters),
  // "lastmodified" (signed), "annotations" (empty when the record has none); then
  // "entitlements", "containingPath", "localizedContainingDisplayName", "localizedDisplayName"
  // and "localizedShortName" when present. Never fails: a value among the first eleven that the
  // record lacks (e.g. "original-identifier", "version" or "bundleInfo") is left out rather
  // than written empty, so the reader sees "absent" as it would for the optional keys.
  value::Dictionary exportForm() const;

  // Sets the record up from |form|: base set-up from "identifier", "path" (as a file URL),
  // "bundleInfo", "info" and "uuid" (a missing or unparsable text gives a fresh UUID), then the
  // remaining fields. A key holding the wrong type, or a number outside the field's range,
  // reads as absent: "hubProtocolVersion" then defaults to 1, "lastmodified" to 0,
  // "systemResident" to false. Returns false exactly when the base set-up fails.
  bool setupWithForm(const value::Dictionary& form);

  // Replaces annotations by the form's "annotations" dictionary, absent when it has none.
  void updateFromForm(const value::Dictionary& form);

 protected:
  // The steps of initWithName on this (freshly made) record, for specialisations' factories:
  // setupWithName, then |info| as the plug-in dictionary when there is none. Returns false when
  // set-up fails.
  bool setupAndAdoptInfo(std::optional<std::string> name, std::optional<AXFileURL> url,
                         std::optional<value::Value> bundleInfo,
                         std::optional<value::Dictionary> info, std::optional<value::Uuid> uuid);

 private:
  mutable std::mutex mutex_;
  bool onSystemVolume_ = false;
  std::optional<value::Dictionary> plugInDictionary_;
  std::optional<std::string> identifier_;
  std::optional<std::string> originalIdentifier_;
  std::optional<AXFileURL> url_;
  std::optional<AXFileURL> containingUrl_;
  std::optional<value::Dictionary> bundleInfoDictionary_;
  std::optional<value::Dictionary> entitlements_;
  std::uint32_t hubProtocolVersion_ = 0;
  std::optional<std::string> localizedName_;
  std::optional<std::string> localizedShortName_;
  std::optional<std::string> localizedContainingName_;
  std::optional<value::Dictionary> annotations_;
  std::int32_t lastModified_ = 0;
  std::optional<value::Uuid> uuid_;
  std::optional<value::Data> cdhash_;
  std::optional<std::string> requirement_;
};

// Records compare by UUID alone (see AXPlugInCore::isEqual).
inline bool operator==(const AXPlugInCore& a, const AXPlugInCore& b) {
  return a.isEqual(b);
}

// Hash and equality for unordered containers of records or of shared records.
struct AXPlugInCoreHash {
  std::size_t operator()(const AXPlugInCore& record) const { return record.hash(); }
  std::size_t operator()(const std::shared_ptr<const AXPlugInCore>& record) const {
    return record->hash();
  }
};

struct AXPlugInCoreEqual {
  bool operator()(const std::shared_ptr<const AXPlugInCore>& a,
                  const std::shared_ptr<const AXPlugInCore>& b) const {
    return a->isEqual(*b);
  }
};
