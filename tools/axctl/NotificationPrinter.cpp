#include "tools/axctl/NotificationPrinter.h"

#include <signal.h>
#include <unistd.h>

#include <cstdio>
#include <ctime>

#include "platform/notify/NotificationWatcher.h"

namespace {

// Now as local time, e.g. "2026-11-23T10:11:12".
std::string localTime() {
  std::time_t now = std::time(nullptr);
  std::tm local{};
  localtime_r(&now, &local);
  char text[32];
  std::strftime(text, sizeof text, "%Y-%m-%dT%H:%M:%S", &local);
  return text;
}

}  // namespace

int NotificationPrinter::watch(const std::string& name, std::optional<unsigned> limit) {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGINT);
  sigaddset(&signals, SIGTERM);
  // Blocked before the watcher's thread starts, so that only sigwait below receives them.
  pthread_sigmask(SIG_BLOCK, &signals, nullptr);
  NotificationPrinter printer(name, limit);
  auto watcher = notify::NotificationWatcher::start(name, [&printer] { printer.print(); });
  if (!watcher.ok()) {
    std::fprintf(stderr, "axctl: cannot watch: %s\n", watcher.error().message.c_str());
    return 1;
  }
  std::fprintf(stderr, "watching %s\n", name.c_str());
  int received = 0;
  sigwait(&signals, &received);
  return 0;
}

void NotificationPrinter::print() {
  if (limit_ && printed_ == *limit_) return;
  std::printf("%s %s\n", name_.c_str(), localTime().c_str());
  std::fflush(stdout);
  // The main thread waits in sigwait; a signal of our own ends the watch like a user's would.
  if (limit_ && ++printed_ == *limit_) kill(getpid(), SIGTERM);
}
