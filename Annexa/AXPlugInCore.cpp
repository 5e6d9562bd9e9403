#include "Annexa/AXPlugInCore.h"

#include <limits>
#include <map>
#include <utility>

#include "Annexa/AXInternalConsistency.h"
#include "Annexa/AXUtilities.h"
#include "platform/os/Format.h"
#include "platform/os/Log.h"
#include "platform/sdk/SdkMerge.h"
#include "platform/sdk/SdkRegistry.h"

namespace {

constexpr std::string_view kSource = "Annexa/AXPlugInCore";
constexpr std::int64_t kMisconfiguredCode = 12;

// Field access under the record's lock. A replaced value is released after the lock is dropped.
template <typename T>
T readLocked(std::mutex& mutex, const T& field) {
  std::lock_guard lock(mutex);
  return field;
}

template <typename T>
void writeLocked(std::mutex& mutex, T& field, T value) {
  std::lock_guard lock(mutex);
  std::swap(field, value);
}

void logNotice(std::string_view format, std::initializer_list<os::FormatArg> arguments) {
  os::Log::write(5, os::format(format, arguments));
}

std::optional<value::Value> lookup(const std::optional<value::Dictionary>& dictionary,
                                   std::string_view key) {
  if (!dictionary) return std::nullopt;
  const value::Value* found = dictionary->find(key);
  if (!found) return std::nullopt;
  return *found;
}

std::optional<value::Dictionary> asDictionary(const std::optional<value::Value>& v) {
  if (!v || !v->asDictionary()) return std::nullopt;
  return *v->asDictionary();
}

std::optional<std::string> asString(const std::optional<value::Value>& v) {
  if (!v || !v->asString()) return std::nullopt;
  return *v->asString();
}

bool endsWith(std::string_view text, std::string_view suffix) {
  return text.size() >= suffix.size() && text.substr(text.size() - suffix.size()) == suffix;
}

AXError misconfigured(const char* format, std::initializer_list<os::FormatArg> arguments = {}) {
  return AXMakeErrorWithFormat(kMisconfiguredCode, format, arguments);
}

}  // namespace

// ---- Construction ------------------------------------------------------------------------------

std::shared_ptr<AXPlugInCore> AXPlugInCore::initWithName(std::optional<std::string> name,
                                                         std::optional<AXFileURL> url,
                                                         std::optional<value::Value> bundleInfo,
                                                         std::optional<value::Dictionary> info,
                                                         std::optional<value::Uuid> uuid) {
  auto record = std::make_shared<AXPlugInCore>();
  if (!record->setupAndAdoptInfo(std::move(name), std::move(url), std::move(bundleInfo),
                                 std::move(info), uuid)) {
    return nullptr;
  }
  return record;
}

bool AXPlugInCore::setupAndAdoptInfo(std::optional<std::string> name, std::optional<AXFileURL> url,
                                     std::optional<value::Value> bundleInfo,
                                     std::optional<value::Dictionary> info,
                                     std::optional<value::Uuid> uuid) {
  if (!setupWithName(std::move(name), std::move(url), std::move(bundleInfo), info, uuid)) {
    return false;
  }
  if (!plugInDictionary()) setPlugInDictionary(std::move(info));
  return true;
}

bool AXPlugInCore::setupWithName(std::optional<std::string> name, std::optional<AXFileURL> url,
                                 std::optional<value::Value> bundleInfo,
                                 std::optional<value::Dictionary> /*info*/,
                                 std::optional<value::Uuid> uuid) {
  if (!url) return false;
  if (!name) {
    logNotice("missing identifier in plug-in at %@", {url->path()});
    return false;
  }
  if (bundleInfo && !setDictionaries(normalizeInfoDictionary(*bundleInfo))) {
    logNotice("malformed plug-in dictionary in plug-in %@ at %@: %@",
              {*name, url->string(), bundleInfo->description()});
    return false;
  }
  setIdentifier(std::move(name));
  setUrl(std::move(url));
  setUuid(uuid ? *uuid : value::Uuid::random());
  return true;
}

std::shared_ptr<AXPlugInCore> AXPlugInCore::initWithForm(const value::Dictionary& form) {
  auto record = std::make_shared<AXPlugInCore>();
  if (!record->setupWithForm(form)) return nullptr;
  return record;
}

// ---- Identity ----------------------------------------------------------------------------------

bool AXPlugInCore::isEqual(const AXPlugInCore& other) const {
  std::optional<value::Uuid> mine = uuid();
  AXAssert(mine.has_value(), "self.uuid", kSource);
  return mine == other.uuid();
}

std::size_t AXPlugInCore::hash() const {
  std::optional<value::Uuid> mine = uuid();
  AXAssert(mine.has_value(), "self.uuid", kSource);
  return value::UuidHash()(*mine);
}

// ---- Fields ------------------------------------------------------------------------------------

bool AXPlugInCore::onSystemVolume() const {
  return readLocked(mutex_, onSystemVolume_);
}
std::optional<value::Dictionary> AXPlugInCore::plugInDictionary() const {
  return readLocked(mutex_, plugInDictionary_);
}
std::optional<std::string> AXPlugInCore::identifier() const {
  return readLocked(mutex_, identifier_);
}
std::optional<std::string> AXPlugInCore::originalIdentifier() const {
  return readLocked(mutex_, originalIdentifier_);
}
std::optional<AXFileURL> AXPlugInCore::url() const {
  return readLocked(mutex_, url_);
}
std::optional<AXFileURL> AXPlugInCore::containingUrl() const {
  return readLocked(mutex_, containingUrl_);
}
std::optional<value::Dictionary> AXPlugInCore::bundleInfoDictionary() const {
  return readLocked(mutex_, bundleInfoDictionary_);
}
std::optional<value::Dictionary> AXPlugInCore::entitlements() const {
  return readLocked(mutex_, entitlements_);
}
std::uint32_t AXPlugInCore::hubProtocolVersion() const {
  return readLocked(mutex_, hubProtocolVersion_);
}
std::optional<std::string> AXPlugInCore::localizedName() const {
  return readLocked(mutex_, localizedName_);
}
std::optional<std::string> AXPlugInCore::localizedShortName() const {
  return readLocked(mutex_, localizedShortName_);
}
std::optional<std::string> AXPlugInCore::localizedContainingName() const {
  return readLocked(mutex_, localizedContainingName_);
}
std::optional<value::Dictionary> AXPlugInCore::annotations() const {
  return readLocked(mutex_, annotations_);
}
std::int32_t AXPlugInCore::lastModified() const {
  return readLocked(mutex_, lastModified_);
}
std::optional<value::Uuid> AXPlugInCore::uuid() const {
  return readLocked(mutex_, uuid_);
}
std::optional<value::Data> AXPlugInCore::cdhash() const {
  return readLocked(mutex_, cdhash_);
}
std::optional<std::string> AXPlugInCore::requirement() const {
  return readLocked(mutex_, requirement_);
}

void AXPlugInCore::setOnSystemVolume(bool v) {
  writeLocked(mutex_, onSystemVolume_, v);
}
void AXPlugInCore::setPlugInDictionary(std::optional<value::Dictionary> v) {
  writeLocked(mutex_, plugInDictionary_, std::move(v));
}
void AXPlugInCore::setIdentifier(std::optional<std::string> v) {
  writeLocked(mutex_, identifier_, std::move(v));
}
void AXPlugInCore::setOriginalIdentifier(std::optional<std::string> v) {
  writeLocked(mutex_, originalIdentifier_, std::move(v));
}
void AXPlugInCore::setUrl(std::optional<AXFileURL> v) {
  writeLocked(mutex_, url_, std::move(v));
}
void AXPlugInCore::setContainingUrl(std::optional<AXFileURL> v) {
  writeLocked(mutex_, containingUrl_, std::move(v));
}
void AXPlugInCore::setBundleInfoDictionary(std::optional<value::Dictionary> v) {
  writeLocked(mutex_, bundleInfoDictionary_, std::move(v));
}
void AXPlugInCore::setEntitlements(std::optional<value::Dictionary> v) {
  writeLocked(mutex_, entitlements_, std::move(v));
}
void AXPlugInCore::setHubProtocolVersion(std::uint32_t v) {
  writeLocked(mutex_, hubProtocolVersion_, v);
}
void AXPlugInCore::setLocalizedName(std::optional<std::string> v) {
  writeLocked(mutex_, localizedName_, std::move(v));
}
void AXPlugInCore::setLocalizedShortName(std::optional<std::string> v) {
  writeLocked(mutex_, localizedShortName_, std::move(v));
}
void AXPlugInCore::setLocalizedContainingName(std::optional<std::string> v) {
  writeLocked(mutex_, localizedContainingName_, std::move(v));
}
void AXPlugInCore::setLastModified(std::int32_t v) {
  writeLocked(mutex_, lastModified_, v);
}
void AXPlugInCore::setUuid(std::optional<value::Uuid> v) {
  writeLocked(mutex_, uuid_, v);
}
void AXPlugInCore::setCdhash(std::optional<value::Data> v) {
  writeLocked(mutex_, cdhash_, std::move(v));
}
void AXPlugInCore::setRequirement(std::optional<std::string> v) {
  writeLocked(mutex_, requirement_, std::move(v));
}

// ---- Annotations -------------------------------------------------------------------------------

void AXPlugInCore::setAnnotation(std::string key, std::optional<value::Value> v) {
  // Read, change and store under one lock so that concurrent changes of different keys all land.
  std::optional<value::Dictionary> replaced;
  std::lock_guard lock(mutex_);
  if (!annotations_) return;
  replaced = dictionaryChanging(*annotations_, std::move(key), std::move(v));
  std::swap(annotations_, replaced);
}

void AXPlugInCore::setAnnotations(std::optional<value::Dictionary> v) {
  writeLocked(mutex_, annotations_, std::move(v));
}

// ---- Key lookup --------------------------------------------------------------------------------

std::optional<value::Value> AXPlugInCore::infoKey(std::string_view key) const {
  return lookup(bundleInfoDictionary(), key);
}

std::optional<value::Value> AXPlugInCore::pluginKey(std::string_view key) const {
  return lookup(plugInDictionary(), key);
}

std::optional<value::Value> AXPlugInCore::attribute(std::string_view key) const {
  return lookup(attributes(), key);
}

// ---- Derived properties ------------------------------------------------------------------------

std::string AXPlugInCore::path() const {
  std::optional<AXFileURL> u = url();
  return u ? u->path() : std::string();
}

std::optional<std::string> AXPlugInCore::containingPath() const {
  std::optional<AXFileURL> u = containingUrl();
  if (!u) return std::nullopt;
  return u->path();
}

std::optional<value::Dictionary> AXPlugInCore::attributes() const {
  return asDictionary(pluginKey("QSExtensionAttributes"));
}

std::optional<std::string> AXPlugInCore::version() const {
  std::optional<value::Value> declared = attribute("QSExtensionVersion");
  if (!declared) return std::nullopt;
  return sdk::versionText(*declared);
}

std::optional<value::Value> AXPlugInCore::protocolSpec() const {
  std::optional<value::Value> spec = pluginKey("QSExtensionProtocol");
  if (!spec && isAppExtension()) return value::Value::string("QSObject");
  return spec;
}

std::optional<value::Value> AXPlugInCore::principalSpec() const {
  std::optional<value::Value> spec = pluginKey("PrincipalClass");
  if (!spec && isAppExtension()) return value::Value::string("QSObject");
  return spec;
}

std::optional<value::Value> AXPlugInCore::sdkSpec() const {
  return pluginKey("QSExtensionPointIdentifier");
}

std::optional<value::Value> AXPlugInCore::embeddedProtocolSpec() const {
  std::optional<value::Value> spec = pluginKey("EmbeddedProtocol");
  return spec ? spec : protocolSpec();
}

std::optional<std::string> AXPlugInCore::embeddedCodePath() const {
  return std::nullopt;
}

bool AXPlugInCore::isAppExtension() const {
  return endsWith(path(), ".appex");
}

bool AXPlugInCore::isMultiplexed() const {
  return false;
}

bool AXPlugInCore::isHybrid() const {
  return pluginKey("EmbeddedCode").has_value();
}

bool AXPlugInCore::isDedicated() const {
  std::optional<value::Value> dedicated = pluginKey("Dedicated");
  if (!dedicated) return false;
  std::optional<std::int64_t> number = dedicated->integerValue();
  return number && *number != 0;
}

bool AXPlugInCore::isData() const {
  return protocolSpec() == value::Value::string("#Data");
}

bool AXPlugInCore::oldStyle() const {
  if (infoKey("QSExtension")) return false;
  if (infoKey("Annexa")) return true;
  AXInternalInconsistencyFailure("unknown plug-in configuration style", kSource);
}

value::Date AXPlugInCore::timestamp() const {
  return value::Date{static_cast<double>(lastModified())};
}

// ---- Manifest handling -------------------------------------------------------------------------

bool AXPlugInCore::setDictionaries(const value::Value& dictionary) {
  const value::Dictionary* info = dictionary.asDictionary();
  if (!info) return false;
  setBundleInfoDictionary(*info);
  const value::Value* extension = info->find("QSExtension");
  if (!extension || !extension->asDictionary()) return false;
  setPlugInDictionary(*extension->asDictionary());
  if (extension->asDictionary()->find("Multiple")) {
    logNotice("multiplexed plug-ins (%@ key) obsolete and ignored", {"Multiple"});
  }
  return true;
}

value::Value AXPlugInCore::normalizeInfoDictionary(const value::Value& dictionary) const {
  return dictionary;
}

void AXPlugInCore::canonicalize() {
  value::Dictionary current = attributes().value_or(value::Dictionary());
  value::Dictionary plugIn = plugInDictionary().value_or(value::Dictionary());
  setPlugInDictionary(plugIn.with("QSExtensionAttributes", value::Value::dictionary(current)));
  if (attribute("QSExtensionVersion")) return;
  std::optional<std::string> bundleVersion = asString(infoKey("QFBundleShortVersionString"));
  value::Dictionary completed =
      current.with("QSExtensionVersion", value::Value::string(bundleVersion.value_or("1")));
  setPlugInDictionary(plugIn.with("QSExtensionAttributes", value::Value::dictionary(completed)));
}

void AXPlugInCore::resolveSDK() {
  std::optional<value::Dictionary> info = bundleInfoDictionary();
  if (!info) {
    AXInternalInconsistencyFailure("cannot resolve SDK without materialized Info.plist", kSource);
  }
  if (std::optional<value::Value> spec = sdkSpec()) {
    const std::string* name = spec->asString();
    if (!name) {
      logNotice("invalid SDK key:%@", {spec->description()});
      return;
    }
    if (std::optional<value::Dictionary> sdk = readSDKDictionary(*name)) {
      setDictionaries(value::Value::dictionary(mergeDictionary(*sdk, *info)));
    }
  }
  canonicalize();
}

std::optional<value::Dictionary> AXPlugInCore::readSDKDictionary(std::string_view name) {
  std::optional<value::Dictionary> sdk = sdk::SdkRegistry::shared().lookup(name);
  if (!sdk) logNotice("plug-in sdk \"%@\" not registered", {name});
  return sdk;
}

value::Dictionary AXPlugInCore::mergeDictionary(const value::Dictionary& sdkSide,
                                                const value::Dictionary& into) {
  return sdk::mergeDictionary(sdkSide, into);
}

bool AXPlugInCore::sdkOverridesKey(std::string_view key) {
  return sdk::sdkOverridesKey(key);
}

value::Value AXPlugInCore::mergeSharedResources(const value::Value& sdkSide,
                                                const value::Value& into) {
  return sdk::mergeSharedResources(sdkSide, into);
}

std::optional<AXError> AXPlugInCore::diagnose() const {
  if (!identifier()) {
    return misconfigured(
        "missing identifier (no QSExtensionIdentifier, nor even QFBundleIdentifier)");
  }
  if (!protocolSpec()) {
    return misconfigured("missing \"%@\" key in Info.plist or SDK", {"QSExtensionProtocol"});
  }
  if (!attributes()) {
    return misconfigured("missing \"%@\" key in Info.plist or SDK", {"QSExtensionAttributes"});
  }
  if (isAppExtension() && principalSpec() != value::Value::string("QSObject")) {
    return misconfigured("Application Extensions may not use the \"%@\" key", {"PrincipalClass"});
  }
  if (pluginKey("PassProxy")) {
    return misconfigured("the \"%@\" key is not supported on this platform", {"PassProxy"});
  }
  if (isHybrid()) return misconfigured("hybrid plug-ins are not supported on this platform");
  return std::nullopt;
}

// ---- Form --------------------------------------------------------------------------------------

namespace {

void putIfPresent(std::map<std::string, value::Value>& form, const char* key,
                  const std::optional<std::string>& text) {
  if (text) form[key] = value::Value::string(*text);
}

void putIfPresent(std::map<std::string, value::Value>& form, const char* key,
                  const std::optional<value::Dictionary>& dictionary) {
  if (dictionary) form[key] = value::Value::dictionary(*dictionary);
}

std::optional<std::string> stringAt(const value::Dictionary& form, std::string_view key) {
  const value::Value* found = form.find(key);
  if (!found || !found->asString()) return std::nullopt;
  return *found->asString();
}

std::optional<value::Dictionary> dictionaryAt(const value::Dictionary& form, std::string_view key) {
  const value::Value* found = form.find(key);
  if (!found || !found->asDictionary()) return std::nullopt;
  return *found->asDictionary();
}

// A number or boolean within [low, high]; absent for other types and out-of-range numbers.
std::optional<std::int64_t> integerAt(const value::Dictionary& form, std::string_view key,
                                      std::int64_t low, std::int64_t high) {
  const value::Value* found = form.find(key);
  if (!found || !(found->isNumber() || found->type() == value::Type::Bool)) return std::nullopt;
  std::optional<std::int64_t> number = found->integerValue();
  if (found->asUInt() && *found->asUInt() > static_cast<std::uint64_t>(high)) return std::nullopt;
  if (!number || *number < low || *number > high) return std::nullopt;
  return number;
}

std::optional<AXFileURL> fileURLAt(const value::Dictionary& form, std::string_view key) {
  std::optional<std::string> path = stringAt(form, key);
  if (!path) return std::nullopt;
  return AXFileURL(std::move(*path));
}

std::optional<value::Value> valueAt(const value::Dictionary& form, std::string_view key) {
  const value::Value* found = form.find(key);
  if (!found) return std::nullopt;
  return *found;
}

}  // namespace

value::Dictionary AXPlugInCore::exportForm() const {
  std::map<std::string, value::Value> form;
  form["hubProtocolVersion"] = value::Value::unsignedInteger(hubProtocolVersion());
  if (url()) form["path"] = value::Value::string(path());
  form["systemResident"] = value::Value::boolean(onSystemVolume());
  putIfPresent(form, "identifier", identifier());
  putIfPresent(form, "original-identifier", originalIdentifier());
  putIfPresent(form, "version", version());
  if (std::optional<value::Dictionary> info = bundleInfoDictionary()) {
    form["bundleInfo"] = value::Value::dictionary(info->without("QFBundleInfoPlistURL"));
  }
  putIfPresent(form, "info", plugInDictionary());
  if (std::optional<value::Uuid> id = uuid()) form["uuid"] = value::Value::string(id->string());
  form["lastmodified"] = value::Value::integer(lastModified());
  form["annotations"] = value::Value::dictionary(annotations().value_or(value::Dictionary()));
  putIfPresent(form, "entitlements", entitlements());
  putIfPresent(form, "containingPath", containingPath());
  putIfPresent(form, "localizedContainingDisplayName", localizedContainingName());
  putIfPresent(form, "localizedDisplayName", localizedName());
  putIfPresent(form, "localizedShortName", localizedShortName());
  return value::Dictionary(std::move(form));
}

bool AXPlugInCore::setupWithForm(const value::Dictionary& form) {
  std::optional<value::Uuid> id;
  if (std::optional<std::string> text = stringAt(form, "uuid")) id = value::Uuid::parse(*text);
  if (!setupWithName(stringAt(form, "identifier"), fileURLAt(form, "path"),
                     valueAt(form, "bundleInfo"), dictionaryAt(form, "info"), id)) {
    return false;
  }
  setHubProtocolVersion(static_cast<std::uint32_t>(
      integerAt(form, "hubProtocolVersion", 0, std::numeric_limits<std::uint32_t>::max())
          .value_or(1)));
  setOriginalIdentifier(stringAt(form, "original-identifier"));
  const value::Value* hash = form.find("hash");
  setCdhash(hash && hash->asData() ? std::optional<value::Data>(*hash->asData()) : std::nullopt);
  setRequirement(stringAt(form, "requirement"));
  setLastModified(static_cast<std::int32_t>(integerAt(form, "lastmodified",
                                                      std::numeric_limits<std::int32_t>::min(),
                                                      std::numeric_limits<std::int32_t>::max())
                                                .value_or(0)));
  setEntitlements(dictionaryAt(form, "entitlements"));
  if (std::optional<AXFileURL> containing = fileURLAt(form, "containingPath")) {
    setContainingUrl(std::move(containing));
  }
  setOnSystemVolume(integerAt(form, "systemResident", std::numeric_limits<std::int64_t>::min(),
                              std::numeric_limits<std::int64_t>::max())
                        .value_or(0) != 0);
  updateFromForm(form);
  setLocalizedName(stringAt(form, "localizedDisplayName"));
  setLocalizedShortName(stringAt(form, "localizedShortName"));
  setLocalizedContainingName(stringAt(form, "localizedContainingDisplayName"));
  return true;
}

void AXPlugInCore::updateFromForm(const value::Dictionary& form) {
  setAnnotations(dictionaryAt(form, "annotations"));
}
