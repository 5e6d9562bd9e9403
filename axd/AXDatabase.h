#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "Annexa/AXError.h"
#include "axd/AXDAnnotationStore.h"
#include "axd/AXDPlugIn.h"
#include "axd/AXDatabaseDelegate.h"
#include "platform/registrum/Observer.h"
#include "platform/registrum/Workspace.h"
#include "platform/value/Dictionary.h"
#include "platform/value/Uuid.h"
#include "platform/zyn/SyncQueue.h"

// The daemon's view of the installed plug-ins: a bounded cache of plug-in records built from the
// application registry, the user's annotations, and the registry's install and uninstall
// notices. The server is a subclass and its own delegate.
//
// Thread safety: every method may be called from any thread. The cache and the annotation store
// are touched only on the serial queue _sync, which the methods marked "takes _sync" enter
// synchronously; nothing running on _sync enters it again. Records handed out are shared: the
// cache drops only its own reference on a purge or an uninstall, so a caller's record stays
// valid. cacheLimit is set once at start-up, before any request.
class AXDatabase : public registrum::Observer, public std::enable_shared_from_this<AXDatabase> {
 public:
  using PlugIns = std::vector<std::shared_ptr<AXDPlugIn>>;

  ~AXDatabase() override = default;
  AXDatabase(const AXDatabase&) = delete;
  AXDatabase& operator=(const AXDatabase&) = delete;

  std::uint32_t cacheLimit() const { return cacheLimit_; }
  void setCacheLimit(std::uint32_t limit) { cacheLimit_ = limit; }
  void setDelegate(std::weak_ptr<AXDatabaseDelegate> delegate) { delegate_ = std::move(delegate); }
  const std::shared_ptr<registrum::Workspace>& workspace() const { return workspace_; }

  // ---- Lookups (null: nothing) ----------------------------------------------------------------

  // Empties the cache when an SDK was added, changed or removed since the last call: a cached
  // record keeps the plug-in dictionary it was built with. Costs one system call (the registry
  // takes its queued SDK changes); called once at the start of each request that reads records.
  // Takes _sync.
  void noteSdkChanges();

  // The cached record of |rgData|, else a new one (createPlugInForProxy). Takes _sync.
  std::shared_ptr<AXDPlugIn> plugInForProxy(
      const std::shared_ptr<const registrum::PlugInRecord>& rgData);
  // Builds, auto-elects and caches the record of |rgData|; null (nothing cached) when it cannot
  // be built. A registry record read before the last SDK change noticed is served but not cached.
  // The caller must be on _sync: anywhere else it is an internal-consistency failure.
  std::shared_ptr<AXDPlugIn> createPlugInForProxy(
      const std::shared_ptr<const registrum::PlugInRecord>& rgData);
  // Empties the whole cache when it holds more than |limit| records (logged). Runs on _sync.
  void purgeCachesToLimit(std::uint32_t limit);
  // The record with |uuid|, from the cache or the registry; null (logged) when the registry has
  // no such plug-in. Takes _sync.
  std::shared_ptr<AXDPlugIn> findPlugIn(const value::Uuid& uuid);
  // The record of the plug-in bundle at |path|; null (logged) when none is registered there.
  std::shared_ptr<AXDPlugIn> findPlugInAtPath(const std::string& path);
  // The records of the application at |path|, in the registry's order, leaving out those that
  // cannot be built (possibly none). Nothing when the application is unknown or has no plug-ins.
  std::optional<PlugIns> plugInsWithinApplication(const std::string& path);
  // The records that may satisfy |rule|: every installed plug-in (outside placeholders, with a
  // known bundle) for an absent or empty rule; otherwise the registry's pre-selection restricted
  // by the rule's "QSUserElection" entry. Each record once, in the registry's order. Nothing
  // when the registry fails.
  // Null when the registry fails. The list is shared and never changed: the same list object
  // serves every discovery while the registry and the cache stay as they are.
  std::shared_ptr<const PlugIns> findPlugIns(const std::optional<value::Dictionary>& rule);

  // ---- Registration (an error of code 2 when the registry refuses) ----------------------------

  std::optional<AXError> addPlugIn(const std::string& path);
  std::optional<AXError> removePlugIn(const std::string& path);

  // ---- Annotations and elections --------------------------------------------------------------

  // Every annotation by annotation key (AXDAnnotationStore::annotations), as it stands now: a
  // request that needs many takes them at once. Takes _sync.
  value::Dictionary annotationTable();
  // The annotation of |plugIn|, or nothing. Takes _sync.
  std::optional<value::Dictionary> annotationForPlugIn(const AXDPlugIn& plugIn);
  // Merges |annotation| into the plug-in's annotation (nothing removes it), saves the file, and
  // posts the annotation-change notification. The save's error, with nothing changed and nothing
  // posted, when the file cannot be written (AXDAnnotationStore::setAnnotation). Takes _sync.
  std::optional<AXError> setAnnotation(const std::optional<value::Dictionary>& annotation,
                                       const AXDPlugIn& plugIn);
  // Stores election 1 for |plugIn| unless it has a non-zero election. No notification. The
  // caller must be on _sync.
  void autoElect(const AXDPlugIn& plugIn);

  // ---- Registry notices (on the registry's notice thread) -------------------------------------

  // Logs one "INSTALLED" line per plug-in; records are built at their first lookup.
  void pluginsDidInstall(const registrum::PlugInList& plugIns) override;
  // Logs one "UNINSTALLED" line per plug-in and drops it from the cache, then tells the
  // delegate once with the whole list.
  void pluginsWillUninstall(const registrum::PlugInList& plugIns) override;

  // The number of cached records. Takes _sync.
  std::size_t cachedCount();
  // Posts the annotation-change notification (logged when it cannot be posted).
  static void postAnnotationChange();

 protected:
  AXDatabase() : _sync("AXDatabase") {}

  // Sets up the database with the annotation file |path| (null: the default file), in this
  // order: registry handle, annotation store (loaded now), cache, observation of the registry.
  // False (logged) when the registry cannot be opened or observed.
  bool initWithDatabase(const char* path);

  zyn::SyncQueue _sync;

 private:
  using Cache = std::unordered_map<value::Uuid, std::shared_ptr<AXDPlugIn>, value::UuidHash>;

  // Whether the registry candidate belongs in a query result; logs an inconsistent registry.
  static bool isQueryCandidate(const registrum::PlugInRecord& candidate);
  // The records of the registry's |candidates| that belong in a query result, each once, in
  // order; from the cache, else built. On _sync.
  std::shared_ptr<const PlugIns> resolve(registrum::PlugInList candidates);
  registrum::Workspace::Filter electionFilter(const value::Dictionary& rule);

  std::uint32_t cacheLimit_ = 0;
  std::uint64_t sdkGeneration_ = 0;  // the registry's, when last noted; on _sync
  std::weak_ptr<AXDatabaseDelegate> delegate_;
  std::shared_ptr<registrum::Workspace> workspace_;
  std::unique_ptr<AXDAnnotationStore> annotations_;
  Cache cache_;
  // The lists resolve() made lately, with the registry lists they were made from: while the
  // registry hands out the same records (it keeps its lists while nothing changed) and the cache
  // stays as it was, a discovery takes its list as it is, without a lookup per record. Emptied
  // whenever the cache changes; on _sync.
  struct Resolved {
    registrum::PlugInList candidates;
    std::shared_ptr<const PlugIns> plugIns;
  };
  static constexpr std::size_t kResolvedLists = 8;
  std::vector<Resolved> resolved_;
};
