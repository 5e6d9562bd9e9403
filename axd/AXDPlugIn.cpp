#include "axd/AXDPlugIn.h"

#include <cmath>
#include <cstring>
#include <limits>
#include <map>

#include "Annexa/AXFileURL.h"
#include "Annexa/AXSandboxExtension.h"
#include "platform/os/Format.h"
#include "platform/os/Log.h"
#include "platform/os/Paths.h"

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

value::Dictionary AXDPlugIn::augmentForm(const value::Dictionary& form) const {
  std::optional<value::Value> shared = pluginKey("Shared");
  // An app extension shares its whole bundle, whatever "Shared" lists.
  if (isAppExtension()) shared = value::Value::array({value::Value::string(".")});
  if (!shared) return form;
  return form.with("extensions", value::Value::dictionary(issueResourceExtensions(*shared)));
}

namespace {

// A "Shared" entry such as "../.." would hand hosts the files around the bundle. Paths that do
// not resolve are left to the issuing, which reports their own error.
bool staysInsideBundle(const AXFileURL& target, const AXFileURL& bundle) {
  os::Result<std::string> inside = os::Paths::canonical(target.path());
  os::Result<std::string> root = os::Paths::canonical(bundle.path());
  if (!inside.ok() || !root.ok()) return true;
  return inside.value() == root.value() || inside.value().rfind(root.value() + "/", 0) == 0;
}

}  // namespace

value::Dictionary AXDPlugIn::issueResourceExtensions(const value::Value& resources) const {
  value::Array list;
  if (resources.asString()) list.push_back(resources);
  if (const value::Array* array = resources.asArray()) list = *array;
  std::optional<AXFileURL> bundle = url();
  std::map<std::string, value::Value> extensions;
  if (!bundle) return value::Dictionary();
  for (const value::Value& element : list) {
    const std::string* name = element.asString();
    if (!name) continue;
    AXFileURL target = *name == "." ? *bundle : AXFileURL(appendingPathComponent(*bundle, *name));
    os::Result<std::string> token = staysInsideBundle(target, *bundle)
                                        ? AXSandboxIssueReadExtension(target)
                                        : os::Result<std::string>(os::Error{EACCES, "outside"});
    if (token.ok()) {
      extensions[*name] = value::Value::string(token.value());
      continue;
    }
    os::Log::notice("failed to make extension for %@ in plug-in at %@: %s",
                    {target.path(), path(), std::strerror(token.error().errnum)});
  }
  return value::Dictionary(std::move(extensions));
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

std::string AXDPlugIn::annotationKey() const {
  std::optional<value::Value> replaced =
      valueForEntitlement(std::string(AXD_VENDOR_PREFIX) + ".developer.replace-plugin");
  if (replaced && replaced->asString()) return *replaced->asString();
  return identifier().value_or(std::string());
}

value::Dictionary AXDPlugIn::prunedInfoDictionaryFor(const value::Dictionary& dictionary) {
  std::map<std::string, value::Value> kept;
  for (const auto& [key, entry] : dictionary) {
    if (!startsWith(key, "DT")) kept.emplace(key, entry);
  }
  return value::Dictionary(std::move(kept));
}
