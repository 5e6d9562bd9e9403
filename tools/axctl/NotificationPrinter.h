#pragma once

#include <optional>
#include <string>

// `axctl watch`: prints one line per post of a named notification, "NAME <local time>" in ISO
// 8601, flushed at once. Does not talk to the daemon.
class NotificationPrinter {
 public:
  // Watches |name| until |limit| lines were printed, or without a limit until SIGINT or
  // SIGTERM. Announces "watching NAME" on standard error once the watch is in place. Returns the
  // exit status: 0, or 1 when the watch could not start (the reason is printed on standard
  // error). Call before any other thread exists: it blocks SIGINT and SIGTERM for the process.
  static int watch(const std::string& name, std::optional<unsigned> limit);

 private:
  NotificationPrinter(const std::string& name, std::optional<unsigned> limit)
      : name_(name), limit_(limit) {}

  // Called on the watcher's thread, once per post.
  void print();

  const std::string name_;
  const std::optional<unsigned> limit_;
  unsigned printed_ = 0;
};
