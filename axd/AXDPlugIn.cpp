#include "axd/AXDPlugIn.h"

#include <cmath>
#include <cstring>
#include <limits>
#include <map>

#include "Annexa/AXFileURL.h"
#include "axd/AXDNames.h"
#include "platform/os/Format.h"
#include "platform/os/Log.h"
#include "platform/os/Paths.h"
#include "platform/sandbox/Sandbox.h"

namespace {

using Scope = registrum::PlugInRecord::Scope;

constexpr std::int64_t kMisconfiguredCode = 12;

// Whole seconds since 1970, the fraction dropped; clamped to the field's 32 bits.
std::int32_t wholeSeconds(double seconds) {
  if (std::isnan(seconds)) return 0;
  double whole = std::trunc(seconds);
  if (whole <= std::numeric_limits<std::int32_t>::min()) {
    return std::numeric_limits<std::int32_t>::min();
  }
  if (whole >= std::numeric_limits<std::int32_t>::max()) {
    return std::numeric_limits<std::int32_t>::max();
  }
  return static_cast<std::int32_t>(whole);
}

// A number or boolean that fits an unsigned 32-bit field; absent otherwise.
std::optional<std::uint32_t> unsigned32(const std::optional<value::Value>& v) {
  if (!v || !(v->isNumber() || v->type() == value::Type::Bool)) return std::nullopt;
  std::optional<std::int64_t> number = v->integerValue();
  if (!number || *number < 0 || *number > std::numeric_limits<std::uint32_t>::max()) {
    return std::nullopt;
  }
  return static_cast<std::uint32_t>(*number);
}

bool startsWith(std::string_view text, std::string_view prefix) {
  return text.substr(0, prefix.size()) == prefix;
}

// The path of |url| with |component| appended.
std::string appendingPathComponent(const AXFileURL& url, const std::string& component) {
  std::string path = url.path();
  if (path.empty() || path.back() != '/') path.push_back('/');
  return path + component;
}

}  // namespace

// ---- Construction ------------------------------------------------------------------------------

std::shared_ptr<AXDPlugIn> AXDPlugIn::initWithRGData(
    std::shared_ptr<const registrum::PlugInRecord> rgData) {
  if (!rgData || !rgData->bundlePath()) return nullptr;
  AXFileURL url(*rgData->bundlePath());
  std::optional<value::Uuid> uuid;
  if (rgData->uuid() != value::Uuid()) uuid = rgData->uuid();
  std::shared_ptr<AXDPlugIn> record(new AXDPlugIn());
  if (!record->setupAndAdoptInfo(rgData->plugInIdentifier(), url, std::nullopt,
                                 rgData->plugInDictionary(), uuid)) {
    return nullptr;
  }
  record->rgproxy_ = rgData;
  record->setEntitlements(rgData->entitlements());
  record->setOriginalIdentifier(rgData->originalIdentifier());
  record->setLastModified(wholeSeconds(rgData->registrationDate()));
  record->setOnSystemVolume(rgData->onSystemPartition());
  std::uint32_t legacyDefault = record->infoKey("Annexa") ? 1 : 2;
  record->setHubProtocolVersion(
      unsigned32(record->pluginKey("HubProtocolVersion")).value_or(legacyDefault));
  if (const auto& application = rgData->containingApplication()) {
    record->setContainingUrl(AXFileURL(application->path()));
  }
  if (std::optional<AXError> error = record->diagnose()) {
    os::Log::notice("ignoring mis-configured plug-in at %@: %@",
                    {url.path(), error->description()});
    return nullptr;
  }
  const registrum::PlugInRecord::Fields::Signature& signature = rgData->signature();
  if (!rgData->declaredEntitlements().empty() && !signature.distrust.empty()) {
    os::Log::notice("plug-in at %@ has no entitlements: %@", {url.path(), signature.distrust});
  }
  record->readFacts();
  if (record->hostEntitlementDemand() == std::string()) {
    os::Log::notice("plug-in at %@ demands a malformed host entitlement %@: no host may use it",
                    {url.path(), record->pluginKey("QSExtensionHostEntitlement")->description()});
  }
  return record;
}

// ---- Lookups -----------------------------------------------------------------------------------

std::optional<value::Value> AXDPlugIn::lookup(std::string_view key, Scope scope) const {
  if (!rgproxy_) return std::nullopt;
  return rgproxy_->valueForKey(key, scope);
}

std::optional<value::Value> AXDPlugIn::infoKey(std::string_view key) const {
  return lookup(key, Scope::InfoDictionary);
}

std::optional<value::Value> AXDPlugIn::pluginKey(std::string_view key) const {
  return lookup(key, Scope::PlugInDictionary);
}

std::optional<value::Value> AXDPlugIn::attribute(std::string_view key) const {
  return lookup(key, Scope::Attributes);
}

std::optional<value::Value> AXDPlugIn::manifestValue(std::string_view key) const {
  if (!rgproxy_) return std::nullopt;
  return rgproxy_->manifestValue(key);
}

std::optional<value::Dictionary> AXDPlugIn::bundleInfoDictionary() const {
  if (!rgproxy_) return std::nullopt;
  return rgproxy_->infoDictionary();
}

// ---- Display-name caches -----------------------------------------------------------------------

std::optional<std::string> AXDPlugIn::fillCache(
    void (AXPlugInCore::*setter)(std::optional<std::string>),
    std::optional<std::string> fetched) const {
  if (fetched) (const_cast<AXDPlugIn*>(this)->*setter)(fetched);
  return fetched;
}

std::optional<std::string> AXDPlugIn::localizedName() const {
  if (std::optional<std::string> cached = AXPlugInCore::localizedName()) return cached;
  if (!rgproxy_) return std::nullopt;
  return fillCache(&AXPlugInCore::setLocalizedName, rgproxy_->localizedName());
}

std::optional<std::string> AXDPlugIn::localizedShortName() const {
  if (std::optional<std::string> cached = AXPlugInCore::localizedShortName()) return cached;
  if (!rgproxy_) return std::nullopt;
  return fillCache(&AXPlugInCore::setLocalizedShortName, rgproxy_->localizedShortName());
}

std::optional<std::string> AXDPlugIn::localizedContainingName() const {
  if (std::optional<std::string> cached = AXPlugInCore::localizedContainingName()) return cached;
  if (!rgproxy_ || !rgproxy_->containingApplication()) return std::nullopt;
  return fillCache(&AXPlugInCore::setLocalizedContainingName,
                   rgproxy_->containingApplication()->localizedName());
}

// ---- Checks and forms --------------------------------------------------------------------------

std::optional<AXError> AXDPlugIn::diagnose() const {
  if (std::optional<AXError> base = AXPlugInCore::diagnose()) return base;
  if (!isData() && !(rgproxy_ && rgproxy_->dataContainerPath())) {
    return AXMakeError(kMisconfiguredCode, "this plug-in has no sandbox data container");
  }
  // The system volume is "<root>/System/"; with the default root that is exactly "/System/".
  if (!containingUrl() && !startsWith(path(), os::Paths::underRoot("System") + "/")) {
    return AXMakeError(kMisconfiguredCode, "plug-ins outside containing apps must be in /System");
  }
  return std::nullopt;
}

namespace {

// The canonical path of resource |name| of the bundle at |bundle| (canonical itself), or the
// error number that keeps it from being shared: a "Shared" entry such as "../.." would hand
// hosts the files around the bundle.
os::Result<std::string> resolveResource(const std::string& bundle, const std::string& name) {
  if (name == ".") return bundle;
  os::Result<std::string> target = os::Paths::canonical(bundle + "/" + name);
  if (!target.ok()) return target;
  if (target.value() == bundle || target.value().starts_with(bundle + "/")) return target;
  return os::Error{EACCES, target.value() + " is outside the bundle"};
}

}  // namespace

std::optional<std::vector<AXDPlugIn::SharedResource>> AXDPlugIn::sharedResources() const {
  std::optional<value::Value> listed = pluginKey("Shared");
  // An app extension shares its whole bundle, whatever "Shared" lists.
  if (isAppExtension()) listed = value::Value::array({value::Value::string(".")});
  if (!listed) return std::nullopt;
  value::Array names;
  if (listed->asString()) names.push_back(*listed);
  if (const value::Array* array = listed->asArray()) names = *array;
  os::Result<std::string> bundle = os::Paths::canonical(path());
  std::vector<SharedResource> shared;
  for (const value::Value& element : names) {
    const std::string* name = element.asString();
    if (!name) continue;
    os::Result<std::string> resolved =
        bundle.ok() ? resolveResource(bundle.value(), *name) : bundle;
    if (resolved.ok()) {
      shared.push_back({*name, resolved.value()});
      continue;
    }
    std::string target = *name == "." ? path() : appendingPathComponent(AXFileURL(path()), *name);
    os::Log::notice("failed to make extension for %@ in plug-in at %@: %s",
                    {target, path(), std::strerror(resolved.error().errnum)});
  }
  return shared;
}

value::Dictionary AXDPlugIn::augmentForm(const value::Dictionary& form,
                                         const std::optional<std::string>& key) const {
  std::optional<std::vector<SharedResource>> shared = sharedResources();
  if (!shared) return form;
  std::map<std::string, value::Value> extensions;
  for (const SharedResource& resource : key ? *shared : std::vector<SharedResource>()) {
    extensions[resource.name] =
        value::Value::string(sandbox::Sandbox::sealReadExtension(resource.path, *key));
  }
  return form.with("extensions",
                   value::Value::dictionary(value::Dictionary(std::move(extensions))));
}

std::shared_ptr<const value::EncodedDictionary> AXDPlugIn::discoveryForm(
    const SealingKey& key) const {
  std::lock_guard lock(discoveryFormMutex_);
  if (discoveryForm_ && discoveryForm_->key == key) return discoveryForm_->form;
  if (discoveryForm_ && discoveryForm_->key && key && *discoveryForm_->key == *key) {
    discoveryForm_->key = key;
    return discoveryForm_->form;
  }
  std::optional<std::string> text = key ? std::optional(*key) : std::nullopt;
  discoveryForm_ = DiscoveryForm{key, std::make_shared<const value::EncodedDictionary>(
                                          augmentForm(exportForm(), text), "annotations")};
  return discoveryForm_->form;
}

// ---- Entitlements and annotations --------------------------------------------------------------

std::optional<value::Value> AXDPlugIn::valueForEntitlement(std::string_view name) const {
  std::optional<value::Dictionary> all = entitlements();
  if (!all) return std::nullopt;
  const value::Value* found = all->find(name);
  if (!found) return std::nullopt;
  return *found;
}

bool AXDPlugIn::hasEntitlement(std::string_view name) const {
  std::optional<value::Value> entitlement = valueForEntitlement(name);
  if (!entitlement) return false;
  if (std::optional<bool> flag = entitlement->asBool()) return *flag;
  if (std::optional<double> real = entitlement->asReal()) return *real != 0;
  if (entitlement->isNumber()) return entitlement->integerValue() != 0;
  return true;
}

void AXDPlugIn::readFacts() {
  facts_.identifier = value::Value::string(identifier().value_or(std::string()));
  facts_.identifierHash = std::hash<std::string_view>()(facts_.identifierText());
  facts_.extensionPoint = manifestValue("QSExtensionPointIdentifier");
  facts_.version = version().value_or(std::string());
  facts_.onSystemVolume = onSystemVolume();
  facts_.contained = containingUrl().has_value();
  facts_.dedicated = isDedicated();
  facts_.lastModified = lastModified();
  facts_.replaces = valueForEntitlement(AXDNames::kReplacePlugInEntitlement);
  if (std::optional<value::Value> demand = pluginKey("QSExtensionHostEntitlement")) {
    const std::string* name = demand->asString();
    facts_.hostEntitlementDemand = name ? *name : std::string();
  }
}

const std::string& AXDPlugIn::annotationKey() const {
  const std::string* replaced = facts_.replaces ? facts_.replaces->asString() : nullptr;
  return replaced ? *replaced : facts_.identifierText();
}

value::Dictionary AXDPlugIn::prunedInfoDictionaryFor(const value::Dictionary& dictionary) {
  std::map<std::string, value::Value> kept;
  for (const auto& [key, entry] : dictionary) {
    if (!startsWith(key, "DT")) kept.emplace(key, entry);
  }
  return value::Dictionary(std::move(kept));
}
