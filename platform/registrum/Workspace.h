#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "platform/os/Error.h"
#include "platform/registrum/ApplicationRecord.h"
#include "platform/registrum/Observer.h"
#include "platform/registrum/PlugInRecord.h"
#include "platform/registrum/Sources.h"
#include "platform/registrum/Store.h"
#include "platform/value/Value.h"

namespace registrum {

struct RegisterOptions {
  // False: the plug-in gets no data container (its dataContainerPath() is nothing). Stored
  // per plug-in; a re-registration applies the new choice.
  bool dataContainer = true;
};

struct InstallOptions {
  bool placeholder = false;
  bool dataContainer = true;  // for every plug-in of the application
};

// A bundle of an application's "PlugIns/" that installApplication left out, and why.
struct SkippedBundle {
  std::string path;
  std::string reason;
};

// What installApplication installed.
struct Installation {
  std::shared_ptr<const ApplicationRecord> application;
  std::vector<SkippedBundle> skipped;  // in name order; empty when every bundle is installed
};

class ChangeWatcher;
struct PlugInBundle;

// The application registry of one device root: the SQLite database
// "<root>/var/db/registrum.sqlite" that every process of that root shares. Changes are made in
// one transaction each, so a failed change leaves the registry as it was; every committed
// change is appended to a change log, from which each Workspace with observers delivers install
// and uninstall notices, whichever process made the change.
//
// A plug-in row keeps the bundle's own Info.plist; its plug-in dictionary is resolved against the
// SDKs of the root each time it is read (sdk::SdkCache, which reads an SDK file once and keeps
// it until the SDK directory changes), so an SDK added, changed or removed counts from the next
// read, in every process, without registering anything again.
//
// Safe for concurrent use from any thread without external synchronisation. Records returned
// are snapshots; they do not change when the registry or an SDK does.
//
// Errors are os::Error values: EINVAL for a bundle that is not a valid plug-in or application
// (malformed Info.plist, missing or mistyped "QSExtension"), ENOTDIR for a path that is no
// directory, ENOENT for a missing path or an unregistered one, EEXIST for a duplicate, EACCES and
// the like for unreadable files, and EIO for a database failure; the message says what and where.
class Workspace {
 public:
  // Called once per query candidate; the candidate is kept when it returns true.
  using Filter = std::function<bool(const std::string& plugInIdentifier,
                                    const value::Dictionary& entitlements)>;

  using RegisterOptions = registrum::RegisterOptions;
  using InstallOptions = registrum::InstallOptions;

  // The workspace of the current device root (os::Paths::root()): one instance per root in a
  // process while anyone holds it. Fails when the database cannot be opened or created.
  static os::Result<std::shared_ptr<Workspace>> defaultWorkspace();

  // A workspace of the device root |root|, separate from the default one (its own connection
  // and notice thread). Creates "<root>/var/db" and the database when missing. A database file
  // that is no SQLite database, holds another program's tables or has a later schema version is
  // renamed to "registrum.sqlite.damaged-<seconds>" (with its -wal and -shm, and
  // "var/containers", whose containers belong to its records), logged, and replaced by an empty
  // registry. Then reclaims orphan data containers (reclaimContainers).
  // Fails with the error of the directory or database that could not be opened.
  static os::Result<std::shared_ptr<Workspace>> open(const std::string& root);

  ~Workspace();
  Workspace(const Workspace&) = delete;
  Workspace& operator=(const Workspace&) = delete;

  const std::string& root() const { return root_; }

  // --- Notices ---

  // Starts delivering notices of changes committed after this call to |observer|, which is
  // held weakly: a destroyed observer is dropped. The first observer starts the notice thread.
  // Adding an observer twice has no further effect. Fails only when the notice thread cannot
  // be started (its database connection or descriptors); the observer is then not added.
  // A notice must not destroy the last reference to this Workspace.
  os::Status addObserver(const std::shared_ptr<Observer>& observer);
  // Stops delivering to |observer|. A notice being delivered at that moment may still arrive.
  void removeObserver(const Observer* observer);

  // --- Lookups (null pointer: not found) ---

  // A number that grows whenever an SDK of this root, or its trust store of signing keys, is
  // added, changed or removed (Sources::refresh); 0 until the first change. Takes the changes queued so far first (one system call), so a change whose
  // write returned before this call counts. A caller that keeps something built from records
  // drops it when the number has grown since it last looked.
  std::uint64_t sdkGeneration() const;

  // The plug-in with |uuid|, a placeholder's included.
  os::Result<std::shared_ptr<const PlugInRecord>> plugInForUuid(const value::Uuid& uuid) const;
  // The plug-in registered for the bundle at |path| (resolved like registration resolves it),
  // a placeholder's included.
  os::Result<std::shared_ptr<const PlugInRecord>> plugInAtPath(const std::string& path) const;
  // The application at |path|, a placeholder included.
  os::Result<std::shared_ptr<const ApplicationRecord>> applicationAtPath(
      const std::string& path) const;
  // The plug-ins of the application at |path| in path order, a placeholder's included; empty
  // when the application is unknown or has none.
  os::Result<PlugInList> plugInsWithinApplication(const std::string& path) const;
  // Every application, in path order.
  os::Result<std::vector<std::shared_ptr<const ApplicationRecord>>> listApplications() const;
  // Every installed plug-in in path order, except those of placeholder applications.
  os::Result<PlugInList> listPlugIns() const;
  // The plug-in rows that every lookup, list and query leaves out because they no longer decode
  // (each logged once), in path order. unregisterPlugIn and uninstallApplication remove them,
  // and registering the bundle at their path again replaces them, keeping their UUID.
  os::Result<std::vector<Store::PlugInKey>> listDamagedPlugIns() const;

  // The installed plug-ins (placeholders' excluded) that may satisfy |rule|, for which
  // |filter| (when set) returns true. The filter runs on the calling thread with no registry
  // lock held, in path order, with "" for a plug-in that has no identifier. Only two rule entries
  // narrow the candidates, and only when their value is a plain string (no leading '?', '<' or '>';
  // a leading '=' is dropped): "QSExtensionIdentifier" (the plug-in identifier) and
  // "QSExtensionPointIdentifier" (the extension point; plug-ins without one always stay
  // candidates). Every other entry and every other pattern leave the candidates as they are: the
  // caller applies the full rule.
  os::Result<PlugInList> query(const value::Dictionary& rule, const Filter& filter) const;

  // --- Changes (each one transaction, followed by its notice) ---

  // Registers the plug-in bundle at |path|: reads its Info.plist (any property-list encoding;
  // it needs a dictionary "QSExtension") and its Entitlements.plist when present, registers the
  // nearest enclosing ".app" directory as a complete application when it is not yet known, and
  // stores the record. A path already
  // registered keeps its UUID and data container and has every other field refreshed. Returns
  // the new record; observers get an install notice, preceded for a path already registered by
  // an uninstall notice with the record as it was.
  os::Result<std::shared_ptr<const PlugInRecord>> registerPlugIn(const std::string& path,
                                                                 RegisterOptions options = {});
  // Removes the plug-in registered for |path| and its data container; ENOENT when none is.
  // Observers get an uninstall notice with its record.
  os::Status unregisterPlugIn(const std::string& path);

  // Installs the application at |path| (a directory named "*.app" with an Info.plist
  // dictionary) with the plug-in bundles among the directories of its "PlugIns/". A bundle that
  // is no usable plug-in is left out: its Info.plist missing, malformed, too large, unreadable or
  // without a "QSExtension" dictionary, its Entitlements.plist unreadable or malformed. It is
  // named in the result's skipped list with the reason, and logged once the install committed.
  // Anything else installs nothing: an application that cannot be read (its Info.plist, the
  // listing of "PlugIns/"), a bundle that cannot be read for a reason of the system rather than
  // of the bundle (EIO, ENOMEM, EMFILE, ...), a database error; EEXIST when the application is
  // already registered. Observers get an install notice for its plug-ins (none when it has no
  // plug-ins).
  os::Result<Installation> installApplication(const std::string& path, InstallOptions options = {});
  // Marks the placeholder application at |path| complete; ENOENT when unknown, EINVAL when
  // it is not a placeholder. Observers get an install notice for its plug-ins.
  os::Status finishInstallation(const std::string& path);
  // Removes the application at |path| with all its plug-ins and their data containers; ENOENT
  // when unknown. Observers get an uninstall notice for its plug-ins.
  os::Status uninstallApplication(const std::string& path);

  // Frees the memory the database connection keeps for its schema and statements; the next
  // call prepares again. Records already returned stay valid.
  void clearCaches();

 private:
  struct PendingFiles;

  Workspace(std::string root, std::shared_ptr<Sources> sources, std::unique_ptr<Store> store);

  std::string databasePath() const;
  std::string notifyFile() const;
  std::string containerPath(const value::Uuid& uuid) const;
  // The key under which |path| is stored: canonical when it exists, else the canonical form of
  // its longest existing prefix with the rest normalised (a removed bundle is still found).
  static std::string lookupKey(const std::string& path);

  // Runs |body| as one transaction under storeMutex_, then announces the change; files the
  // body created are removed when it fails, files it retired are removed when it succeeds.
  os::Status change(const std::function<os::Status(PendingFiles&)>& body);
  // The application of |bundle| (registered now when unknown); null outside any application.
  os::Result<std::shared_ptr<const ApplicationRecord>> containingApplication(
      const PlugInBundle& bundle);
  // The plug-in bundles of the application directory |application|, with those left out.
  static os::Result<std::vector<PlugInBundle>> readPlugInsOf(const std::string& application,
                                                             std::vector<SkippedBundle>& skipped);
  // Writes the plug-in row of |bundle|, keeping the UUID and data container of |earlier|, the
  // row registered at its path before (nothing when none was), damaged or not.
  os::Result<std::shared_ptr<const PlugInRecord>> storePlugIn(
      const PlugInBundle& bundle, std::shared_ptr<const ApplicationRecord> application,
      const std::optional<Store::PlugInKey>& earlier, bool dataContainer, PendingFiles& files);
  // Queues the data container of |row| for removal once the change commits. Only the container
  // named by its UUID is touched: a damaged row's stored path is not trusted.
  void retireContainer(const Store::PlugInKey& row, PendingFiles& files) const;
  // Removes the directories of "var/containers" named by a UUID that no plug-in row has (left by
  // a process killed between making a container and committing its row). Symbolic links and
  // other names are left alone. Logs each removal, and a failure, which is not fatal.
  void reclaimContainers();

  const std::string root_;
  const std::shared_ptr<Sources> sources_;
  const std::unique_ptr<Store> store_;
  mutable std::mutex storeMutex_;
  std::mutex watcherMutex_;
  std::unique_ptr<ChangeWatcher> watcher_;
};

}  // namespace registrum
