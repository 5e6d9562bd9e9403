#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "platform/os/Error.h"
#include "platform/registrum/Observer.h"
#include "platform/registrum/Store.h"

namespace registrum {

// The notice thread of a Workspace: follows the change log of one database and hands each new
// entry to every observer exactly once, in sequence order. It wakes when the notify file's
// directory changes (inotify), when wake() is called, and at the latest every kSafetyPollMs, so
// a lost event only delays a notice. Methods are safe to call from any thread; observers are
// called on the notice thread with no lock held.
class ChangeWatcher {
 public:
  static constexpr int kSafetyPollMs = 2000;
  static constexpr int kBatch = 64;

  // Starts the thread with its own connection to |databasePath| (sharing the workspace's
  // |sources|), watching the directory of |notifyFile|. Fails when the database cannot be opened or
  // the thread's descriptors made.
  static os::Result<std::unique_ptr<ChangeWatcher>> start(const std::string& databasePath,
                                                          const std::string& notifyFile,
                                                          std::shared_ptr<Sources> sources);

  // Tells every watcher of |notifyFile|'s database, in any process, that a change was
  // committed. Failures are logged: the safety poll still finds the change.
  static void announce(const std::string& notifyFile);

  // Stops and joins the thread. Must not run on the notice thread.
  ~ChangeWatcher();
  ChangeWatcher(const ChangeWatcher&) = delete;
  ChangeWatcher& operator=(const ChangeWatcher&) = delete;

  // Delivers changes after |sequence| to |observer| (held weakly). Already added: no effect.
  void add(const std::shared_ptr<Observer>& observer, std::int64_t sequence);
  void remove(const Observer* observer);
  // Makes the thread look at the change log now.
  void wake();

 private:
  struct Entry {
    std::weak_ptr<Observer> observer;
    const Observer* key;
    std::int64_t cursor;  // the last sequence delivered; only the notice thread changes it
    std::atomic<bool> removed{false};
  };

  ChangeWatcher(std::unique_ptr<Store> store, int inotifyFd, int wakeFd);

  void run();
  // Delivers one batch; returns false when there is nothing more to deliver.
  bool deliverBatch();
  void deliver(Entry& entry, const Store::Change& change, const PlugInList& records);
  std::vector<std::shared_ptr<Entry>> snapshot();

  const std::unique_ptr<Store> store_;
  const int inotifyFd_;
  const int wakeFd_;
  std::atomic<bool> stopping_{false};
  std::mutex mutex_;
  std::vector<std::shared_ptr<Entry>> entries_;
  std::thread thread_;
};

}  // namespace registrum
