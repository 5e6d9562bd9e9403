#include "axd/AXDatabase.h"

#include <unordered_set>

#include "Annexa/AXInternalConsistency.h"
#include "Annexa/AXProtocol.h"
#include "axd/AXDElectionFilter.h"
#include "axd/AXDNames.h"
#include "platform/notify/Notification.h"
#include "platform/os/Format.h"
#include "platform/os/Log.h"

namespace {

constexpr const char* kSource = "axd/AXDatabase";
// The line the registry consistency failure names, kept stable for whoever searches the logs.
constexpr int kContainingBundleLine = 168;

std::string text(const std::optional<std::string>& value) {
  return value.value_or("(null)");
}

}  // namespace

bool AXDatabase::initWithDatabase(const char* path) {
  auto workspace = registrum::Workspace::defaultWorkspace();
  if (!workspace.ok()) {
    os::Log::notice("unable to open the application registry: %@", {workspace.error().message});
    return false;
  }
  workspace_ = workspace.value();
  annotations_ = std::make_unique<AXDAnnotationStore>(path);
  os::Status observed = workspace_->addObserver(shared_from_this());
  if (!observed.ok()) {
    os::Log::notice("unable to observe the application registry: %@", {observed.error().message});
    return false;
  }
  return true;
}

void AXDatabase::noteSdkChanges() {
  std::uint64_t generation = workspace_->sdkGeneration();
  _sync.sync([&] {
    if (generation <= sdkGeneration_) return;
    sdkGeneration_ = generation;
    if (!cache_.empty())
      os::Log::notice("SDKs changed: dropping %d cached plug-ins", {cache_.size()});
    cache_.clear();
    resolved_.clear();
  });
}

std::shared_ptr<AXDPlugIn> AXDatabase::plugInForProxy(
    const std::shared_ptr<const registrum::PlugInRecord>& rgData) {
  return _sync.sync([&]() -> std::shared_ptr<AXDPlugIn> {
    auto cached = cache_.find(rgData->uuid());
    if (cached != cache_.end()) return cached->second;
    return createPlugInForProxy(rgData);
  });
}

std::shared_ptr<AXDPlugIn> AXDatabase::createPlugInForProxy(
    const std::shared_ptr<const registrum::PlugInRecord>& rgData) {
  AXAssert(_sync.isCurrent(), "createPlugInForProxy runs on the database queue", kSource);
  std::shared_ptr<AXDPlugIn> plugIn = AXDPlugIn::initWithRGData(rgData);
  if (!plugIn) return nullptr;
  if (plugIn->hasEntitlement(AXDNames::kAutoElectEntitlement)) autoElect(*plugIn);
  if (rgData->sdkGeneration() < sdkGeneration_) return plugIn;
  purgeCachesToLimit(cacheLimit_);
  cache_[*plugIn->uuid()] = plugIn;
  resolved_.clear();
  return plugIn;
}

void AXDatabase::purgeCachesToLimit(std::uint32_t limit) {
  if (cache_.size() <= limit) return;
  os::Log::notice("purging cache for %d > %d", {cache_.size(), limit});
  cache_.clear();
  resolved_.clear();
  workspace_->clearCaches();
}

std::shared_ptr<AXDPlugIn> AXDatabase::findPlugIn(const value::Uuid& uuid) {
  return _sync.sync([&]() -> std::shared_ptr<AXDPlugIn> {
    auto cached = cache_.find(uuid);
    if (cached != cache_.end()) return cached->second;
    auto rgData = workspace_->plugInForUuid(uuid);
    if (rgData.ok() && rgData.value()) return createPlugInForProxy(rgData.value());
    os::Log::notice("Registrum cannot find plug-in with UUID:%@", {uuid.string()});
    return nullptr;
  });
}

std::shared_ptr<AXDPlugIn> AXDatabase::findPlugInAtPath(const std::string& path) {
  auto rgData = workspace_->plugInAtPath(path);
  if (!rgData.ok() || !rgData.value()) {
    os::Log::notice("Registrum cannot find plug-in at path:%@", {path});
    return nullptr;
  }
  return findPlugIn(rgData.value()->uuid());
}

std::optional<AXDatabase::PlugIns> AXDatabase::plugInsWithinApplication(const std::string& path) {
  auto application = workspace_->applicationAtPath(path);
  if (!application.ok() || !application.value()) return std::nullopt;
  auto rgPlugIns = workspace_->plugInsWithinApplication(path);
  if (!rgPlugIns.ok() || rgPlugIns.value().empty()) return std::nullopt;
  PlugIns plugIns;
  for (const auto& rgData : rgPlugIns.value()) {
    if (auto plugIn = plugInForProxy(rgData)) plugIns.push_back(std::move(plugIn));
  }
  return plugIns;
}

std::shared_ptr<const AXDatabase::PlugIns> AXDatabase::findPlugIns(
    const std::optional<value::Dictionary>& rule) {
  auto candidates = (!rule || rule->empty()) ? workspace_->listPlugIns()
                                             : workspace_->query(*rule, electionFilter(*rule));
  if (!candidates.ok()) {
    os::Log::notice("Registrum query failed: %@", {candidates.error().message});
    return nullptr;
  }
  // One entry into _sync for the whole list, not one per candidate.
  return _sync.sync([&] { return resolve(std::move(candidates).value()); });
}

std::shared_ptr<const AXDatabase::PlugIns> AXDatabase::resolve(registrum::PlugInList candidates) {
  for (const Resolved& earlier : resolved_) {
    if (earlier.candidates == candidates) return earlier.plugIns;
  }
  auto plugIns = std::make_shared<PlugIns>();
  plugIns->reserve(candidates.size());
  std::unordered_set<value::Uuid, value::UuidHash> seen(candidates.size());
  for (const auto& candidate : candidates) {
    if (!isQueryCandidate(*candidate)) continue;
    auto cached = cache_.find(candidate->uuid());
    auto plugIn = cached != cache_.end() ? cached->second : createPlugInForProxy(candidate);
    if (plugIn && seen.insert(*plugIn->uuid()).second) plugIns->push_back(std::move(plugIn));
  }
  if (resolved_.size() == kResolvedLists) resolved_.erase(resolved_.begin());
  resolved_.push_back({std::move(candidates), plugIns});
  return plugIns;
}

bool AXDatabase::isQueryCandidate(const registrum::PlugInRecord& candidate) {
  if (!candidate.bundlePath()) return false;
  const auto& application = candidate.containingApplication();
  if (!application) return true;
  if (!application->path().ends_with(".app")) {
    // A registry row another process corrupted must not stop the daemon for every client:
    // the record is left out and the failure logged as the internal inconsistency it is.
    os::Log::notice(
        "internal inconsistency in %@:%d: RG reported containingBundle is not an application "
        "(skipping plug-in at %@)",
        {kSource, kContainingBundleLine, *candidate.bundlePath()});
    return false;
  }
  return !application->isPlaceholder();
}

registrum::Workspace::Filter AXDatabase::electionFilter(const value::Dictionary& rule) {
  std::optional<AXDElectionFilter> elections = AXDElectionFilter::fromRule(rule);
  if (!elections) return nullptr;
  // One snapshot of the table for the whole query: the filter runs off _sync while elections
  // may be written on it, and the table is immutable once copied.
  value::Dictionary table = annotationTable();
  return [elections = std::move(*elections), table](const std::string& identifier,
                                                    const value::Dictionary& entitlements) {
    const value::Value* replaced = entitlements.find(AXDNames::kReplacePlugInEntitlement);
    const std::string& key = replaced && replaced->asString() ? *replaced->asString() : identifier;
    const value::Value* annotation = table.find(key);
    std::optional<value::Dictionary> found;
    if (annotation && annotation->asDictionary()) found = *annotation->asDictionary();
    return elections.accepts(AXDElectionFilter::electionText(found, entitlements));
  };
}

std::optional<AXError> AXDatabase::addPlugIn(const std::string& path) {
  auto registered = workspace_->registerPlugIn(path);
  if (registered.ok()) return std::nullopt;
  return AXMakeError(AXProtocol::kRegistryRefused, "Registrum failed to register the plug-in");
}

std::optional<AXError> AXDatabase::removePlugIn(const std::string& path) {
  os::Status removed = workspace_->unregisterPlugIn(path);
  if (removed.ok()) return std::nullopt;
  return AXMakeError(AXProtocol::kRegistryRefused, "Registrum failed to deregister the plug-in");
}

value::Dictionary AXDatabase::annotationTable() {
  return _sync.sync([&] { return annotations_->annotations(); });
}

std::optional<value::Dictionary> AXDatabase::annotationForPlugIn(const AXDPlugIn& plugIn) {
  return _sync.sync([&] { return annotations_->annotationForPlugIn(plugIn); });
}

std::optional<AXError> AXDatabase::setAnnotation(const std::optional<value::Dictionary>& annotation,
                                                 const AXDPlugIn& plugIn) {
  std::optional<AXError> failed =
      _sync.sync([&] { return annotations_->setAnnotation(annotation, plugIn); });
  if (!failed) postAnnotationChange();
  return failed;
}

void AXDatabase::autoElect(const AXDPlugIn& plugIn) {
  AXAssert(_sync.isCurrent(), "autoElect runs on the database queue", kSource);
  value::Dictionary annotation =
      annotations_->annotationForPlugIn(plugIn).value_or(value::Dictionary());
  const value::Value* election = annotation.find("election");
  if (election && election->integerValue().value_or(0) != 0) return;
  annotations_->setAnnotation(annotation.with("election", value::Value::integer(1)), plugIn);
}

void AXDatabase::pluginsDidInstall(const registrum::PlugInList& plugIns) {
  for (const auto& record : plugIns) {
    os::Log::notice(
        "INSTALLED:%@ %@(%@) %@ %@",
        {text(record->bundleIdentifier()), text(record->plugInIdentifier()),
         text(record->bundleVersion()), record->uuid().string(), text(record->bundlePath())});
  }
}

void AXDatabase::pluginsWillUninstall(const registrum::PlugInList& plugIns) {
  _sync.sync([&] {
    for (const auto& record : plugIns) {
      os::Log::notice(
          "UNINSTALLED:%@ %@(%@) %@ %@",
          {text(record->bundleIdentifier()), text(record->plugInIdentifier()),
           text(record->bundleVersion()), record->uuid().string(), text(record->bundlePath())});
      cache_.erase(record->uuid());
      resolved_.clear();
    }
  });
  if (auto delegate = delegate_.lock()) delegate->removedPlugIns(plugIns);
}

std::size_t AXDatabase::cachedCount() {
  return _sync.sync([&] { return cache_.size(); });
}

void AXDatabase::postAnnotationChange() {
  os::Status posted = notify::Notification::post(AXDNames::kAnnotationChangeNotification);
  if (!posted.ok()) {
    os::Log::notice("unable to post %@: %@",
                    {AXDNames::kAnnotationChangeNotification, posted.error().message});
  }
}
