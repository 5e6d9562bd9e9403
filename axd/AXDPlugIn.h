#pragma once

#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "Annexa/AXError.h"
#include "Annexa/AXPlugInCore.h"
#include "platform/registrum/PlugInRecord.h"
#include "platform/value/Dictionary.h"
#include "platform/value/EncodedDictionary.h"
#include "platform/value/Value.h"

class AXDZynClient;

// The daemon's plug-in record: an AXPlugInCore built from the application registry's record of
// an installed plug-in (its "rgproxy"), answering every manifest question through that record.
//
// Thread safety: as AXPlugInCore. A record is built by initWithRGData on one thread and then
// read from any queue; rgproxy is set once before the record is shared and never changes. The
// display-name caches are the base record's fields (guarded by its lock): two first readers may
// both fetch the same registry value and both store it, which is harmless.
class AXDPlugIn : public AXPlugInCore {
 public:
  // The record of registry record |rgData|, or null when it has no bundle location, the base
  // set-up rejects it (a missing identifier is logged), or diagnose finds it mis-configured
  // (logged as "ignoring mis-configured plug-in at <path>: <error description>"). A nil UUID
  // counts as missing and is replaced by a random one. "HubProtocolVersion" is taken when it
  // is a number (or boolean) between 0 and 2^32 - 1; otherwise, as when it is absent, the
  // version is 1 for a legacy manifest (Info.plist has "Annexa") and 2 for any other.
  static std::shared_ptr<AXDPlugIn> initWithRGData(
      std::shared_ptr<const registrum::PlugInRecord> rgData);

  // The registry record this record was built from; never null for a record made by
  // initWithRGData.
  const std::shared_ptr<const registrum::PlugInRecord>& rgproxy() const { return rgproxy_; }

  // What discovery asks of every candidate, read once when the record is built (the record
  // never changes afterwards), so a warm discovery neither locks nor copies per question.
  struct Facts {
    // The identifier as the rule language reads it: a string, always present in a record made
    // by initWithRGData.
    value::Value identifier;
    std::size_t identifierHash = 0;  // std::hash of its text
    // The manifest's "QSExtensionPointIdentifier", the key hosts discover by, or absent.
    std::optional<value::Value> extensionPoint;
    std::string version;  // "" when the plug-in declares none
    bool onSystemVolume = false;
    bool contained = false;  // lies in an application
    bool dedicated = false;  // AXPlugInCore::isDedicated
    std::int32_t lastModified = 0;
    // The entitlement "<vendor prefix>.developer.replace-plugin", or absent.
    std::optional<value::Value> replaces;
    // hostEntitlementDemand(), below.
    std::optional<std::string> hostEntitlementDemand;

    const std::string& identifierText() const { return *identifier.asString(); }
  };
  const Facts& facts() const { return facts_; }

  // ---- Lookups through the registry record -------------------------------------------------

  // The registry record's value for |key| in the raw Info.plist, of any type, or absent.
  std::optional<value::Value> infoKey(std::string_view key) const override;
  // The registry record's value for |key| in the plug-in dictionary, or absent.
  std::optional<value::Value> pluginKey(std::string_view key) const override;
  // The registry record's value for |key| in the attributes, or absent.
  std::optional<value::Value> attribute(std::string_view key) const override;
  // The registry record's Info.plist.
  std::optional<value::Dictionary> bundleInfoDictionary() const override;
  // The plug-in's manifest value for |key|: the attribute, else the plug-in dictionary's entry,
  // else Info.plist's (registrum::PlugInRecord::manifestValue); absent when none has it.
  std::optional<value::Value> manifestValue(std::string_view key) const;

  // The cached display name; when the cache is empty, the registry's value (for the containing
  // name, that of the containing application), stored in the cache and returned. Absent, and
  // the cache left empty, when the registry has none. The base setters fill the caches.
  std::optional<std::string> localizedName() const override;
  std::optional<std::string> localizedShortName() const override;
  std::optional<std::string> localizedContainingName() const override;

  // ---- Checks and forms ----------------------------------------------------------------------

  // The base checks, then "this plug-in has no sandbox data container" for a plug-in that is
  // not a data plug-in and has no data container, then "plug-ins outside containing apps must
  // be in /System" for a plug-in outside any application whose path does not begin with the
  // system volume "<root>/System/". Errors are of domain "Annexa", code 12; absent when none
  // fails.
  std::optional<AXError> diagnose() const override;

  // A resource the plug-in shares with its hosts: its name in "Shared" ("." for the bundle) and
  // the canonical path its read-extension token names.
  struct SharedResource {
    std::string name;
    std::string path;
  };
  // The plug-in's shared resources: those of "Shared" (a string or an array of strings; other
  // elements are skipped), or of ["."], the whole bundle, for an app extension. "." names the
  // bundle, anything else a path inside it. Resolved afresh by each call: only building a
  // discovery form asks, once per boot key. A resource that does not resolve, or resolves
  // outside the bundle, is left out and logged as "failed to make extension for <target> in
  // plug-in at <path>: <strerror>". Nothing when the plug-in is not an app extension and has no
  // "Shared".
  std::optional<std::vector<SharedResource>> sharedResources() const;

  // |form| with "extensions" set to a read-extension token for each shared resource, by name,
  // signed with |key|, the boot key read once for the whole request (empty without a key), even
  // when that dictionary is empty. Unchanged when the plug-in shares nothing.
  value::Dictionary augmentForm(const value::Dictionary& form,
                                const std::optional<std::string>& key) const;
  // The boot key that seals a discovery's tokens, shared: a discovery hands every record the
  // same object, so a record tells its kept form is current by one pointer comparison. Null
  // when there is no key.
  using SealingKey = std::shared_ptr<const std::string>;
  // augmentForm(exportForm(), key) encoded, with the place of "annotations" left open for the
  // annotation of the request (value::EncodedDictionary), kept for the last |key| it was asked
  // with: a record never changes once initWithRGData has built it, and a token depends only on
  // the key and the path, so discovery neither builds the same form, seals the same tokens nor
  // encodes the same bytes for every request. Safe from any thread.
  std::shared_ptr<const value::EncodedDictionary> discoveryForm(const SealingKey& key) const;

  // ---- Entitlements and annotations ----------------------------------------------------------

  // The plug-in's entitlement |name|, or absent.
  std::optional<value::Value> valueForEntitlement(std::string_view name) const;
  // True when the entitlement is present and not false: a boolean is itself, a number is true
  // unless 0, any other value is true.
  bool hasEntitlement(std::string_view name) const;
  // The key of the plug-in's annotations: the entitlement "<vendor prefix>.developer.replace-
  // plugin" when it is a string, else the identifier (always present in a record made by
  // initWithRGData).
  const std::string& annotationKey() const;

  // ---- Matching rules (AXDPlugInMatching.cpp) -------------------------------------------------

  // True when the plug-in satisfies every entry of |rule|, tried in key order and stopping at
  // the first that fails; an absent or empty rule is satisfied by every plug-in.
  bool match(const std::optional<value::Dictionary>& rule) const;
  // One entry: the plug-in value named by |key| against |pattern|. Keys: "ENTITLEMENT:<name>",
  // "QSExtensionIdentifier", "<vendor prefix>.uuid", "QSUserElection" (the election with bits 8
  // to 15 cleared, in decimal; 0 without one), "QSExtensionContainingApp" (never matches
  // without a containing application), else the manifestValue of that name.
  // Patterns: true (present and not the boolean false), false (absent or the boolean false), a
  // dictionary (matchDictionary), a string or an array of strings (matchValuePatterns against a
  // string value, or against any string element of an array value). Anything else: false.
  bool matchKey(const std::string& key, const value::Value& pattern) const;
  // |value| against a string pattern or any string of an array pattern; false for other kinds.
  bool matchValuePatterns(const std::string& value, const value::Value& patterns) const;
  // |value| against one string pattern by its operator: "?UT-CONFORMS:", "?UT-IS:" (type
  // conformance), any other "?" (never; logged as "unrecognized match operator:<pattern>"),
  // "<>", "<=", ">=", "=", "<", ">" (numeric-aware comparison), or plain equality.
  bool matchValuePattern(const std::string& value, const std::string& pattern) const;
  // The activation-rule evaluator's answer for |value| as the rule and |pattern| as the host's
  // items.
  bool matchDictionary(const value::Value& value, const value::Dictionary& pattern) const;

  // ---- Access policy (AXDPlugInPolicy.cpp) ---------------------------------------------------

  // Why |client| may not use the plug-in, or nothing when it may. Checked in order, the first
  // refusal wins: the client's restriction entitlement "<vendor prefix>.developer.annexa.
  // allowedplugins" must, when present, be a dictionary ("invalid host restriction
  // entitlement") that the plug-in matches ("the host's plug-in entitlement does not allow this
  // plug-in"); the client must have the entitlement that the plug-in's
  // "QSExtensionHostEntitlement" names, when it names one ("the host does not have the
  // \"<name>\" entitlement"). A "QSExtensionHostEntitlement" that is present but no string, or
  // empty, refuses every host ("the plug-in's host entitlement demand is malformed"; the record
  // logged it when it was built).
  std::optional<std::string> allowForClient(const AXDZynClient& client) const;
  // What "QSExtensionHostEntitlement" demands of a host: nothing when it is absent, else the
  // entitlement it names; the empty string when it is present but no string or empty, which no
  // host can meet.
  const std::optional<std::string>& hostEntitlementDemand() const {
    return facts_.hostEntitlementDemand;
  }
  // The consent services granted to the plug-in's containing application, read afresh from the
  // consent store. Empty for a plug-in outside any application, and, after a log line, when the
  // application cannot be opened or the store cannot answer for it.
  std::set<std::string> allowedPCXServices() const;

  // ---- Enabling for a host (AXDPlugInEnabling.cpp) -------------------------------------------

  // Registers the plug-in with the service launcher as an external service of host process
  // |pid|, named by its identifier and version (which every record has), under a description
  // built afresh: the environment (the data container's "HOME",
  // "QFFIXED_USER_HOME" and "TMPDIR", the daemon's "AXTEST_SDK", then the manifest's
  // "ZynService" "EnvironmentVariables"), the sandbox profile, and the manifest's "ZynService".
  // The data container and its "tmp" are made (mode 0700) when missing, so HOME and TMPDIR are
  // usable from the plug-in's first instruction. An error of code 4 when the bundle has no
  // executable or its container cannot be made (nothing registered), or the launcher refuses
  // (logged with its error number). A plug-in whose signed bundle names its executable is refused
  // with code 11 when the executable is no longer the file signed (checkExecutable), and the
  // launcher is told the signed digest, so that it starts only that file.
  std::optional<AXError> enableForPid(pid_t pid) const;
  // An error of code 11 (logged) when the file at |path| is not the executable the bundle's
  // signature names, whose SHA-256 is |signedDigest|: swapped since the bundle was registered.
  // Nothing when it is.
  std::optional<AXError> checkExecutable(const std::string& path,
                                         const std::string& signedDigest) const;
  // The busy answer, {"ExtensionBundleIdentifier": <bundle identifier, else the plug-in
  // identifier>}, when a process of the plug-in's bundle runs; nothing when none does.
  std::optional<value::Dictionary> checkBusy() const;
  // The sandbox profile the plug-in runs under: "plugin", "keyboard", "network-filter" or
  // "glanced", by its extension point.
  std::string sandboxProfile() const;

  // A new dictionary with the entries of |dictionary| whose keys do not begin with "DT".
  static value::Dictionary prunedInfoDictionaryFor(const value::Dictionary& dictionary);

 private:
  AXDPlugIn() = default;

  // Fills the base display-name field through |setter| with |fetched| when it holds a value.
  // Filling a cache does not change what the record describes, so it is allowed on a const
  // record (every record is created non-const by initWithRGData).
  std::optional<std::string> fillCache(void (AXPlugInCore::*setter)(std::optional<std::string>),
                                       std::optional<std::string> fetched) const;
  std::optional<value::Value> lookup(std::string_view key,
                                     registrum::PlugInRecord::Scope scope) const;

  // Fills facts_ from the record as built; the last step of initWithRGData.
  void readFacts();

  std::shared_ptr<const registrum::PlugInRecord> rgproxy_;
  Facts facts_;
  mutable std::mutex discoveryFormMutex_;
  // The last discovery form and the key it was made with; guarded by discoveryFormMutex_.
  struct DiscoveryForm {
    SealingKey key;
    std::shared_ptr<const value::EncodedDictionary> form;
  };
  mutable std::optional<DiscoveryForm> discoveryForm_;
};
