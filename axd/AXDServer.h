#pragma once

#include <asio/thread_pool.hpp>
#include <atomic>
#include <cstdint>
#include <functional>
#include <initializer_list>
#include <memory>
#include <string_view>
#include <vector>

#include "axd/AXDPlugInHold.h"
#include "axd/AXDUserPrefs.h"
#include "axd/AXDatabase.h"
#include "axd/AXDatabaseDelegate.h"
#include "platform/os/Format.h"
#include "platform/zyn/Listener.h"
#include "platform/zyn/StrandQueue.h"
#include "platform/zyn/SyncQueue.h"
#include "platform/zyn/ThreadQueue.h"

// The daemon's one service object: the plug-in database, the listener on the named service, and
// the queues that order the daemon's work. New connections arrive on "zyn"; each is set up (its
// executable, bundle and entitlements read) on a small pool of set-up threads, so a slow one
// holds up no other client; every request is worked on "service", one at a time; "serverSync"
// guards the holds. Exactly one exists per process; it lives until the process ends. log(),
// debug() and the hold operations may be called from any thread; each hold operation enters
// serverSync synchronously and nothing else.
class AXDZynClient;

class AXDServer : public AXDatabase, public AXDatabaseDelegate {
 public:
  // Builds the server for |serviceName| with the annotation file |databasePath| (null for the
  // default). Nothing when the database or the listener cannot be set up (logged). The listener
  // is not resumed: no client is accepted before run().
  static std::shared_ptr<AXDServer> initForService(const char* serviceName,
                                                   const char* databasePath);

  // Builds the record and discovery form of every installed plug-in (as many as the cache
  // holds), then listens, accepts clients and keeps the process alive. Returns only when the
  // socket cannot listen (logged).
  void run();
  // The first step of run(): the records and forms that the first discovery would otherwise
  // build while its host waits. Logs how many and how long.
  void warmUp();

  // The shared server: the one built by initForService(), never cleared.
  static std::shared_ptr<AXDServer> server();

  // Writes the formatted message to the system log; the level does not change the output.
  void log(int level, std::string_view format,
           std::initializer_list<os::FormatArg> arguments) const;
  // log() at level 5: always written.
  void log(std::string_view format, std::initializer_list<os::FormatArg> arguments) const;
  // log() at level 6, only when verbose() is at least 1.
  void debug(std::string_view format, std::initializer_list<os::FormatArg> arguments) const;

  // Schedules |work| on the service queue and returns at once.
  void submitWork(std::function<void()> work);
  // Schedules the set-up of a new client, |work|, on a set-up thread and returns at once.
  void submitSetUp(std::function<void()> work);

  // ---- Holds ----------------------------------------------------------------------------------

  // True when an active hold covers |plugIn| (AXDPlugInHold::blocks).
  bool holdOnPlugIn(const AXDPlugIn& plugIn);
  // Appends |hold| to the active holds (no check for overlaps), then posts the notification;
  // true. False, and nothing added, when the client that placed it has stopped accepting work:
  // its connection died while the request was worked, and no one could release the hold.
  bool addHold(std::shared_ptr<AXDPlugInHold> hold);
  // Releases the hold with token |token| (logged, notification posted); nothing when none has it.
  void unholdToken(const value::Uuid& token);
  // Releases every hold placed by |client|, in list order, each logged and notified.
  void unholdClient(const AXDZynClient& client);
  // The active holds, in the order they were added.
  std::vector<std::shared_ptr<AXDPlugInHold>> holds();

  // |key| as the one shared object that every discovery with this key hands the records
  // (AXDPlugIn::SealingKey). Runs on the service queue.
  AXDPlugIn::SealingKey sealingKey(std::string key);

  // Withdraws the launcher services of |plugIns| without waiting; failures other than "none
  // registered" are logged from the service queue.
  void removedPlugIns(const registrum::PlugInList& plugIns) override;

  // The user's settings of the plug-in framework (the exclusions that discovery applies).
  const AXDUserPrefs& userPrefs() const { return userPrefs_; }

  std::uint32_t verbose() const { return verbose_.load(std::memory_order_relaxed); }
  void setVerbose(std::uint32_t verbose) { verbose_.store(verbose, std::memory_order_relaxed); }

  const std::shared_ptr<zyn::StrandQueue>& zynQueue() const { return zynQueue_; }
  const std::shared_ptr<zyn::ThreadQueue>& mainQueue() const { return mainQueue_; }
  const std::shared_ptr<zyn::Listener>& service() const { return service_; }
  zyn::SyncQueue& syncQueue() { return *syncQueue_; }

 private:
  AXDServer() = default;

  // Removes and returns the first hold that |matches|; null when none does. On serverSync.
  std::shared_ptr<AXDPlugInHold> takeHold(const std::function<bool(const AXDPlugInHold&)>& matches);

  std::atomic<std::uint32_t> verbose_{0};
  const AXDUserPrefs userPrefs_;
  std::shared_ptr<zyn::StrandQueue> zynQueue_;
  std::shared_ptr<zyn::ThreadQueue> mainQueue_;
  std::unique_ptr<asio::thread_pool> setUpPool_;
  std::shared_ptr<zyn::Listener> service_;
  std::unique_ptr<zyn::SyncQueue> syncQueue_;
  std::vector<std::shared_ptr<AXDPlugInHold>> holds_;  // guarded by syncQueue_
  AXDPlugIn::SealingKey sealingKey_;                   // on the service queue
};
