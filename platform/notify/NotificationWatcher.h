#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <thread>

#include "platform/os/Error.h"

namespace notify {

// Follows the posts of one named notification (see Notification) on a thread of its own. It
// wakes when the notification directory changes (inotify), and at the latest every
// kSafetyPollMs, so a lost event only delays the handler. The counter in the file makes the
// count exact: k posts give k calls, several of them at once after one wake-up. A counter that
// went backwards (the file was removed and made again) is taken as the new start, without calls.
class NotificationWatcher {
 public:
  static constexpr int kSafetyPollMs = 1000;

  // Calls |handler| once per post of |name| made after start() returned, on the watcher's
  // thread, one call at a time, with no lock held. |handler| must not be empty. Creates the
  // notification directory when missing. Without inotify (e.g. the per-user limit is reached) it
  // logs a warning and only polls. Fails with EINVAL for an invalid name, or with the system's
  // error number when the directory cannot be made or the counter not read.
  static os::Result<std::unique_ptr<NotificationWatcher>> start(const std::string& name,
                                                                std::function<void()> handler);

  // Stops and joins the thread; a burst of calls under way ends after the current call. Must
  // not run on the watcher's thread (e.g. inside the handler).
  ~NotificationWatcher();
  NotificationWatcher(const NotificationWatcher&) = delete;
  NotificationWatcher& operator=(const NotificationWatcher&) = delete;

 private:
  NotificationWatcher(std::string name, std::string file, std::function<void()> handler,
                      int inotifyFd, int wakeFd, std::uint64_t counter);

  void run();
  // Reads the inotify events that came; true when one may concern the file.
  bool eventsConcernFile();
  // Reads the counter and calls the handler once per post since the last read.
  void catchUp();

  const std::string name_;
  const std::string file_;
  const std::function<void()> handler_;
  const int inotifyFd_;  // -1 when polling only
  const int wakeFd_;
  std::uint64_t counter_;  // the last counter read; only the thread changes it after start
  bool failing_ = false;   // the last read failed and was logged
  std::atomic<bool> stopping_{false};
  std::thread thread_;
};

}  // namespace notify
