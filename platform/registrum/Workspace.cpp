#include "platform/registrum/Workspace.h"

#include <sys/stat.h>

#include <cerrno>
#include <chrono>
#include <cstring>
#include <filesystem>
#include <map>
#include <set>

#include "platform/os/Log.h"
#include "platform/os/Paths.h"
#include "platform/registrum/BundleReader.h"
#include "platform/registrum/ChangeWatcher.h"
#include "platform/registrum/RecordFields.h"
#include "platform/registrum/Store.h"

namespace registrum {

struct Workspace::PendingFiles {
  std::vector<std::string> created;  // removed when the change fails
  std::vector<std::string> retired;  // removed when the change commits
};

namespace {

constexpr int kLogWarning = 4;

double now() {
  return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
}

void removeAll(const std::vector<std::string>& paths) {
  for (const std::string& path : paths) {
    std::error_code error;
    std::filesystem::remove_all(path, error);
    if (error) {
      os::Log::write(kLogWarning, "registry: cannot remove " + path + ": " + error.message());
    }
  }
}

// A rule entry's value when it is a plain string: equality with the text, never an operator.
std::optional<std::string> plainString(const value::Dictionary& rule, std::string_view key) {
  std::optional<std::string> text = RecordFields::string(rule, key);
  if (!text || text->empty()) return text;
  char first = text->front();
  if (first == '?' || first == '<' || first == '>') return std::nullopt;
  if (first == '=') return text->substr(1);
  return text;
}

// Whether reading a bundle failed for a reason of the bundle (it is left out of its application)
// rather than of the system (the install fails, to be tried again).
bool isBundleFault(int errnum) {
  switch (errnum) {
    case ENOENT:
    case ENOTDIR:
    case EINVAL:
    case EFBIG:
    case EACCES:
    case EPERM:
    case ELOOP:
    case ENAMETOOLONG:
      return true;
    default:
      return false;
  }
}

bool endsWith(std::string_view text, std::string_view suffix) {
  return text.size() > suffix.size() && text.substr(text.size() - suffix.size()) == suffix;
}

// What verifying the bundle's signature finds now, with the signed digest of its executable.
PlugInRecord::Fields::Signature signatureOf(const PlugInBundle& bundle) {
  codesign::BundleSignature::Verification verified = codesign::BundleSignature::verify(bundle.path);
  PlugInRecord::Fields::Signature signature;
  signature.state = verified.state;
  signature.signer = verified.signer;
  signature.note = verified.reason;
  if (std::optional<std::string> executable =
          RecordFields::string(bundle.info, "QFBundleExecutable")) {
    auto digest = verified.files.find(*executable);
    if (digest != verified.files.end()) signature.executableDigest = digest->second;
  }
  return signature;
}

}  // namespace

os::Result<std::shared_ptr<Workspace>> Workspace::defaultWorkspace() {
  static std::mutex mutex;
  static std::map<std::string, std::weak_ptr<Workspace>> workspaces;
  std::string root = os::Paths::root();
  std::lock_guard lock(mutex);
  if (std::shared_ptr<Workspace> existing = workspaces[root].lock()) return existing;
  os::Result<std::shared_ptr<Workspace>> opened = open(root);
  if (opened.ok()) workspaces[root] = opened.value();
  return opened;
}

os::Result<std::shared_ptr<Workspace>> Workspace::open(const std::string& root) {
  std::string databaseDirectory = root + "/var/db";
  os::Status directory = os::Paths::ensureDirectory(databaseDirectory, 0700);
  if (!directory.ok()) return directory.error();
  os::Result<std::string> canonicalRoot = os::Paths::canonical(root);
  if (!canonicalRoot.ok()) return canonicalRoot.error();
  std::string rootPath = canonicalRoot.value() == "/" ? "" : canonicalRoot.value();
  auto sources = std::make_shared<Sources>(rootPath.empty() ? "/" : rootPath);
  os::Result<std::unique_ptr<Store>> store =
      Store::open(rootPath + "/var/db/registrum.sqlite", sources, {rootPath + "/var/containers"});
  if (!store.ok()) return store.error();
  // The registry lists what the user installed: no one else's to read. SQLite gives its journal
  // files the database file's mode.
  for (const char* suffix : {"", "-wal", "-shm"}) {
    std::string file = rootPath + "/var/db/registrum.sqlite" + suffix;
    if (chmod(file.c_str(), 0600) != 0 && errno != ENOENT) {
      os::Log::write(kLogWarning,
                     "registry: cannot make " + file + " private: " + std::strerror(errno));
    }
  }
  std::shared_ptr<Workspace> workspace(
      new Workspace(rootPath, std::move(sources), std::move(store.value())));
  workspace->reclaimContainers();
  return workspace;
}

Workspace::Workspace(std::string root, std::shared_ptr<Sources> sources,
                     std::unique_ptr<Store> store)
    : root_(std::move(root)), sources_(std::move(sources)), store_(std::move(store)) {}

Workspace::~Workspace() = default;

os::Status Workspace::addObserver(const std::shared_ptr<Observer>& observer) {
  std::lock_guard lock(watcherMutex_);
  if (!watcher_) {
    os::Result<std::unique_ptr<ChangeWatcher>> started =
        ChangeWatcher::start(databasePath(), notifyFile(), sources_);
    if (!started.ok()) return started.error();
    watcher_ = std::move(started.value());
  }
  os::Result<std::int64_t> sequence = [&] {
    std::lock_guard storeLock(storeMutex_);
    return store_->lastSequence();
  }();
  if (!sequence.ok()) return sequence.error();
  watcher_->add(observer, sequence.value());
  return os::success();
}

void Workspace::removeObserver(const Observer* observer) {
  std::lock_guard lock(watcherMutex_);
  if (watcher_) watcher_->remove(observer);
}

std::uint64_t Workspace::sdkGeneration() const {
  return sources_->refresh();
}

os::Result<std::shared_ptr<const PlugInRecord>> Workspace::plugInForUuid(
    const value::Uuid& uuid) const {
  std::lock_guard lock(storeMutex_);
  return store_->plugInByUuid(uuid);
}

os::Result<std::shared_ptr<const PlugInRecord>> Workspace::plugInAtPath(
    const std::string& path) const {
  std::string key = lookupKey(path);
  std::lock_guard lock(storeMutex_);
  return store_->plugInByPath(key);
}

os::Result<std::shared_ptr<const ApplicationRecord>> Workspace::applicationAtPath(
    const std::string& path) const {
  std::string key = lookupKey(path);
  std::lock_guard lock(storeMutex_);
  return store_->application(key);
}

os::Result<PlugInList> Workspace::plugInsWithinApplication(const std::string& path) const {
  std::string key = lookupKey(path);
  std::lock_guard lock(storeMutex_);
  return store_->plugInsOfApplication(key);
}

os::Result<std::vector<std::shared_ptr<const ApplicationRecord>>> Workspace::listApplications()
    const {
  std::lock_guard lock(storeMutex_);
  return store_->applications();
}

os::Result<PlugInList> Workspace::listPlugIns() const {
  std::lock_guard lock(storeMutex_);
  return store_->plugIns(Store::Selection{});
}

os::Result<std::vector<Store::PlugInKey>> Workspace::listDamagedPlugIns() const {
  std::lock_guard lock(storeMutex_);
  return store_->damagedPlugIns();
}

os::Result<PlugInList> Workspace::query(const value::Dictionary& rule, const Filter& filter) const {
  Store::Selection selection{plainString(rule, "QSExtensionIdentifier"),
                             plainString(rule, "QSExtensionPointIdentifier"), true};
  os::Result<PlugInList> candidates = [&] {
    std::lock_guard lock(storeMutex_);
    return store_->plugIns(selection);
  }();
  if (!candidates.ok() || !filter) return candidates;
  PlugInList kept;
  for (const auto& record : candidates.value()) {
    if (filter(record->plugInIdentifier().value_or(""), record->entitlements())) {
      kept.push_back(record);
    }
  }
  return kept;
}

os::Result<std::shared_ptr<const PlugInRecord>> Workspace::registerPlugIn(const std::string& path,
                                                                          RegisterOptions options) {
  os::Result<PlugInBundle> bundle = BundleReader::readPlugIn(path);
  if (!bundle.ok()) return bundle.error();
  std::shared_ptr<const PlugInRecord> registered;
  os::Status status = change([&](PendingFiles& files) -> os::Status {
    os::Result<std::shared_ptr<const ApplicationRecord>> application =
        containingApplication(bundle.value());
    if (!application.ok()) return application.error();
    os::Result<std::optional<Store::PlugInKey>> earlierKey =
        store_->plugInKeyAtPath(bundle.value().path);
    if (!earlierKey.ok()) return earlierKey.error();
    // Null for a damaged row, which is replaced without a notice: no observer ever saw it.
    os::Result<std::shared_ptr<const PlugInRecord>> earlier =
        store_->plugInByPath(bundle.value().path);
    if (!earlier.ok()) return earlier.error();
    os::Result<std::shared_ptr<const PlugInRecord>> stored = storePlugIn(
        bundle.value(), application.value(), earlierKey.value(), options.dataContainer, files);
    if (!stored.ok()) return stored.error();
    registered = stored.value();
    // Observers that keep what a record said (a cache) hear that the old one went first.
    if (earlier.value()) {
      os::Status replaced = store_->appendChange(Store::ChangeKind::Uninstall, {earlier.value()});
      if (!replaced.ok()) return replaced;
    }
    return store_->appendChange(Store::ChangeKind::Install, {registered});
  });
  if (!status.ok()) return status.error();
  return registered;
}

os::Status Workspace::unregisterPlugIn(const std::string& path) {
  std::string key = lookupKey(path);
  return change([&](PendingFiles& files) -> os::Status {
    os::Result<std::optional<Store::PlugInKey>> row = store_->plugInKeyAtPath(key);
    if (!row.ok()) return row.error();
    if (!row.value()) return os::Error{ENOENT, "no plug-in is registered at " + key};
    // Null for a damaged row: it goes without a notice, as no observer ever saw it.
    os::Result<std::shared_ptr<const PlugInRecord>> record = store_->plugInByPath(key);
    if (!record.ok()) return record.error();
    os::Status removed = store_->deletePlugInAtPath(key);
    if (!removed.ok()) return removed;
    retireContainer(*row.value(), files);
    if (!record.value()) return os::success();
    return store_->appendChange(Store::ChangeKind::Uninstall, {record.value()});
  });
}

os::Result<Installation> Workspace::installApplication(const std::string& path,
                                                       InstallOptions options) {
  os::Result<std::string> directory = BundleReader::bundleDirectory(path);
  if (!directory.ok()) return directory.error();
  if (!endsWith(directory.value(), ".app")) {
    return os::Error{EINVAL,
                     "not an application bundle (its name must end in .app): " + directory.value()};
  }
  os::Result<value::Dictionary> info = BundleReader::readInfo(directory.value());
  if (!info.ok()) return info.error();
  std::vector<SkippedBundle> skipped;
  os::Result<std::vector<PlugInBundle>> bundles = readPlugInsOf(directory.value(), skipped);
  if (!bundles.ok()) return bundles.error();
  auto application = std::make_shared<const ApplicationRecord>(
      RecordFields::application(directory.value(), info.value(), options.placeholder));
  os::Status status = change([&](PendingFiles& files) -> os::Status {
    os::Result<std::shared_ptr<const ApplicationRecord>> existing =
        store_->application(application->path());
    if (!existing.ok()) return existing.error();
    if (existing.value()) {
      return os::Error{EEXIST, "an application is already installed at " + application->path()};
    }
    os::Status put = store_->putApplication(application->fields());
    if (!put.ok()) return put;
    PlugInList installed;
    for (const PlugInBundle& bundle : bundles.value()) {
      os::Result<std::optional<Store::PlugInKey>> earlier = store_->plugInKeyAtPath(bundle.path);
      if (!earlier.ok()) return earlier.error();
      os::Result<std::shared_ptr<const PlugInRecord>> stored =
          storePlugIn(bundle, application, earlier.value(), options.dataContainer, files);
      if (!stored.ok()) return stored.error();
      installed.push_back(stored.value());
    }
    if (installed.empty()) return os::success();
    return store_->appendChange(Store::ChangeKind::Install, installed);
  });
  if (!status.ok()) return status.error();
  for (const SkippedBundle& bundle : skipped) {
    os::Log::write(kLogWarning, "registry: left " + bundle.path + " out of " + application->path() +
                                    ": " + bundle.reason);
  }
  return Installation{application, std::move(skipped)};
}

os::Status Workspace::finishInstallation(const std::string& path) {
  std::string key = lookupKey(path);
  return change([&](PendingFiles&) -> os::Status {
    os::Result<std::shared_ptr<const ApplicationRecord>> application = store_->application(key);
    if (!application.ok()) return application.error();
    if (!application.value()) return os::Error{ENOENT, "no application is installed at " + key};
    if (!application.value()->isPlaceholder()) {
      return os::Error{EINVAL, "the application at " + key + " is not a placeholder"};
    }
    ApplicationRecord::Fields fields = application.value()->fields();
    fields.placeholder = false;
    os::Status put = store_->putApplication(fields);
    if (!put.ok()) return put;
    os::Result<PlugInList> plugIns = store_->plugInsOfApplication(key);
    if (!plugIns.ok()) return plugIns.error();
    if (plugIns.value().empty()) return os::success();
    return store_->appendChange(Store::ChangeKind::Install, plugIns.value());
  });
}

os::Status Workspace::uninstallApplication(const std::string& path) {
  std::string key = lookupKey(path);
  return change([&](PendingFiles& files) -> os::Status {
    os::Result<std::shared_ptr<const ApplicationRecord>> application = store_->application(key);
    if (!application.ok()) return application.error();
    if (!application.value()) return os::Error{ENOENT, "no application is installed at " + key};
    os::Result<PlugInList> plugIns = store_->plugInsOfApplication(key);
    if (!plugIns.ok()) return plugIns.error();
    os::Result<std::vector<Store::PlugInKey>> rows = store_->plugInKeysOfApplication(key);
    if (!rows.ok()) return rows.error();
    os::Status removed = store_->deleteApplication(key);
    if (!removed.ok()) return removed;
    for (const Store::PlugInKey& row : rows.value()) retireContainer(row, files);
    if (plugIns.value().empty()) return os::success();
    return store_->appendChange(Store::ChangeKind::Uninstall, plugIns.value());
  });
}

void Workspace::clearCaches() {
  std::lock_guard lock(storeMutex_);
  store_->database().releaseMemory();
}

std::string Workspace::databasePath() const {
  return root_ + "/var/db/registrum.sqlite";
}

std::string Workspace::notifyFile() const {
  return root_ + "/var/db/registrum.changed";
}

std::string Workspace::containerPath(const value::Uuid& uuid) const {
  return root_ + "/var/containers/" + uuid.string();
}

void Workspace::retireContainer(const Store::PlugInKey& row, PendingFiles& files) const {
  std::optional<value::Uuid> uuid = value::Uuid::parse(row.uuid);
  if (row.dataContainer && uuid) files.retired.push_back(containerPath(*uuid));
}

void Workspace::reclaimContainers() {
  std::string directory = root_ + "/var/containers";
  std::lock_guard lock(storeMutex_);
  // Under the write lock no other process is between making a container and committing its
  // row, so every container without a row is an orphan.
  os::Status status = store_->database().transaction([&]() -> os::Status {
    os::Result<std::vector<std::string>> uuids = store_->plugInUuids();
    if (!uuids.ok()) return uuids.error();
    std::set<std::string> registered;
    for (const std::string& text : uuids.value()) {
      if (std::optional<value::Uuid> uuid = value::Uuid::parse(text)) {
        registered.insert(uuid->string());
      }
    }
    std::error_code error;
    for (const auto& entry : std::filesystem::directory_iterator(directory, error)) {
      std::optional<value::Uuid> uuid = value::Uuid::parse(entry.path().filename().string());
      std::error_code typeError;
      if (!uuid || registered.count(uuid->string()) || !entry.is_directory(typeError) ||
          entry.is_symlink(typeError)) {
        continue;
      }
      os::Log::write(kLogWarning, "registry: removing the orphan data container " +
                                      entry.path().string() + " (no plug-in has its UUID)");
      removeAll({entry.path().string()});
    }
    if (error && error != std::errc::no_such_file_or_directory) {
      return os::Error{error.value(), "cannot list " + directory + ": " + error.message()};
    }
    return os::success();
  });
  if (!status.ok()) {
    os::Log::write(kLogWarning, "registry: orphan data containers stay: " + status.error().message);
  }
}

std::string Workspace::lookupKey(const std::string& path) {
  std::error_code error;
  std::filesystem::path resolved = std::filesystem::weakly_canonical(path, error);
  if (error) resolved = std::filesystem::absolute(path, error).lexically_normal();
  std::string key = resolved.string();
  while (key.size() > 1 && key.back() == '/') key.pop_back();
  return key;
}

os::Status Workspace::change(const std::function<os::Status(PendingFiles&)>& body) {
  PendingFiles files;
  os::Status status = [&] {
    std::lock_guard lock(storeMutex_);
    return store_->database().transaction([&] { return body(files); });
  }();
  if (!status.ok()) {
    removeAll(files.created);
    return status;
  }
  removeAll(files.retired);
  ChangeWatcher::announce(notifyFile());
  std::lock_guard lock(watcherMutex_);
  if (watcher_) watcher_->wake();
  return status;
}

os::Result<std::shared_ptr<const ApplicationRecord>> Workspace::containingApplication(
    const PlugInBundle& bundle) {
  if (!bundle.applicationPath) return std::shared_ptr<const ApplicationRecord>();
  const std::string& path = *bundle.applicationPath;
  os::Result<std::shared_ptr<const ApplicationRecord>> existing = store_->application(path);
  if (!existing.ok() || existing.value()) return existing;
  // An application registered through one of its plug-ins may lack an Info.plist; a broken
  // one is refused.
  os::Result<value::Dictionary> info = BundleReader::readInfo(path);
  if (!info.ok() && info.error().errnum != ENOENT) return info.error();
  ApplicationRecord::Fields fields =
      RecordFields::application(path, info.ok() ? info.value() : value::Dictionary(), false);
  os::Status put = store_->putApplication(fields);
  if (!put.ok()) return put.error();
  return std::make_shared<const ApplicationRecord>(std::move(fields));
}

os::Result<std::vector<PlugInBundle>> Workspace::readPlugInsOf(
    const std::string& application, std::vector<SkippedBundle>& skipped) {
  os::Result<std::vector<std::string>> paths = BundleReader::plugInPathsOf(application);
  if (!paths.ok()) return paths.error();
  std::vector<PlugInBundle> bundles;
  for (const std::string& path : paths.value()) {
    os::Result<PlugInBundle> bundle = BundleReader::readPlugIn(path);
    if (bundle.ok()) {
      bundles.push_back(std::move(bundle.value()));
    } else if (isBundleFault(bundle.error().errnum)) {
      skipped.push_back(SkippedBundle{path, bundle.error().message});
    } else {
      return bundle.error();
    }
  }
  return bundles;
}

os::Result<std::shared_ptr<const PlugInRecord>> Workspace::storePlugIn(
    const PlugInBundle& bundle, std::shared_ptr<const ApplicationRecord> application,
    const std::optional<Store::PlugInKey>& earlier, bool dataContainer, PendingFiles& files) {
  PlugInRecord::Fields fields;
  std::optional<value::Uuid> earlierUuid;
  if (earlier) earlierUuid = value::Uuid::parse(earlier->uuid);
  fields.uuid = earlierUuid ? *earlierUuid : value::Uuid::random();
  fields.bundlePath = bundle.path;
  fields.containingApplication = std::move(application);
  fields.declaredEntitlements = bundle.entitlements;
  fields.signature = signatureOf(bundle);
  fields.registrationDate = now();
  fields.onSystemPartition = bundle.path.starts_with(root_ + "/System/");
  fields.infoDictionary = bundle.info;
  // The bundle's own plug-in dictionary: the stored identifier and extension point follow the
  // manifest, whatever the SDK says later. Reading the row back resolves it.
  fields.plugInDictionary = *bundle.info.find("QSExtension")->asDictionary();
  std::string container = containerPath(fields.uuid);
  if (dataContainer) {
    if (!std::filesystem::exists(container)) files.created.push_back(container);
    os::Status made = os::Paths::ensureDirectory(container, 0700);
    if (!made.ok()) return made.error();
    fields.dataContainerPath = container;
  } else if (earlier) {
    retireContainer(*earlier, files);
  }
  RecordFields::derive(fields);
  os::Status put = store_->putPlugIn(fields);
  if (!put.ok()) return put.error();
  os::Result<std::shared_ptr<const PlugInRecord>> stored = store_->plugInByUuid(fields.uuid);
  if (stored.ok() && !stored.value()) {
    return os::Error{EIO,
                     "registry database: the row just written for " + bundle.path + " is gone"};
  }
  return stored;
}

}  // namespace registrum
