#include "platform/notify/NotificationWatcher.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <sys/inotify.h>
#include <unistd.h>

#include "platform/notify/Notification.h"
#include "platform/os/Log.h"

namespace notify {

namespace {

constexpr int kLogError = 3;
constexpr int kLogWarning = 4;
constexpr std::uint32_t kEvents = IN_CLOSE_WRITE | IN_MOVED_TO | IN_CREATE;

// An inotify descriptor watching |directory|, or -1 (logged) when inotify is not available.
int watchDirectory(const std::string& directory) {
  int fd = inotify_init1(IN_CLOEXEC | IN_NONBLOCK);
  if (fd >= 0 && inotify_add_watch(fd, directory.c_str(), kEvents) >= 0) return fd;
  os::Error error =
      os::Error::fromErrno(fd < 0 ? "inotify_init1" : "inotify_add_watch " + directory);
  if (fd >= 0) close(fd);
  os::Log::write(kLogWarning, "notifications: " + error.message + "; polling instead");
  return -1;
}

}  // namespace

os::Result<std::unique_ptr<NotificationWatcher>> NotificationWatcher::start(
    const std::string& name, std::function<void()> handler) {
  os::Status valid = Notification::validate(name);
  if (!valid.ok()) return valid.error();
  os::Result<std::string> directory = Notification::makeDirectory();
  if (!directory.ok()) return directory.error();
  int wakeFd = eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK);
  if (wakeFd < 0) return os::Error::fromErrno("eventfd");
  int inotifyFd = watchDirectory(directory.value());
  // Read once the watch is in place, so that no later post goes unseen.
  std::string file = directory.value() + "/" + name;
  os::Result<std::uint64_t> counter = Notification::countAt(file);
  if (!counter.ok()) {
    if (inotifyFd >= 0) close(inotifyFd);
    close(wakeFd);
    return counter.error();
  }
  return std::unique_ptr<NotificationWatcher>(new NotificationWatcher(
      name, std::move(file), std::move(handler), inotifyFd, wakeFd, counter.value()));
}

NotificationWatcher::NotificationWatcher(std::string name, std::string file,
                                         std::function<void()> handler, int inotifyFd, int wakeFd,
                                         std::uint64_t counter)
    : name_(std::move(name)),
      file_(std::move(file)),
      handler_(std::move(handler)),
      inotifyFd_(inotifyFd),
      wakeFd_(wakeFd),
      counter_(counter) {
  thread_ = std::thread([this] { run(); });
}

NotificationWatcher::~NotificationWatcher() {
  stopping_ = true;
  std::uint64_t one = 1;
  // A failed write means the counter is already non-zero: the thread wakes anyway.
  [[maybe_unused]] ssize_t written = write(wakeFd_, &one, sizeof one);
  thread_.join();
  if (inotifyFd_ >= 0) close(inotifyFd_);
  close(wakeFd_);
}

void NotificationWatcher::run() {
  pollfd fds[2] = {{wakeFd_, POLLIN, 0}, {inotifyFd_, POLLIN, 0}};
  nfds_t count = inotifyFd_ >= 0 ? 2 : 1;
  while (!stopping_) {
    int ready = poll(fds, count, kSafetyPollMs);
    if (stopping_) return;
    // A time-out is the safety re-read; an interrupted poll reads too, which costs little.
    if (ready <= 0 || eventsConcernFile()) catchUp();
  }
}

bool NotificationWatcher::eventsConcernFile() {
  if (inotifyFd_ < 0) return false;
  alignas(inotify_event) char buffer[4096];
  bool concerns = false;
  ssize_t got;
  while ((got = read(inotifyFd_, buffer, sizeof buffer)) > 0) {
    for (ssize_t at = 0; at < got;) {
      const auto* event = reinterpret_cast<const inotify_event*>(buffer + at);
      if (event->mask & IN_IGNORED) {
        os::Log::write(kLogWarning, "notifications: " + file_ + ": directory gone, polling");
      }
      concerns = concerns || (event->mask & (IN_Q_OVERFLOW | IN_IGNORED)) ||
                 (event->len > 0 && name_ == event->name);
      at += static_cast<ssize_t>(sizeof(inotify_event) + event->len);
    }
  }
  return concerns;
}

void NotificationWatcher::catchUp() {
  os::Result<std::uint64_t> counter = Notification::countAt(file_);
  if (!counter.ok()) {
    // Logged once per run of failures: the safety re-read would repeat it every second.
    if (!failing_) os::Log::write(kLogError, "notifications: " + counter.error().message);
    failing_ = true;
    return;
  }
  failing_ = false;
  std::uint64_t posts = counter.value() > counter_ ? counter.value() - counter_ : 0;
  counter_ = counter.value();
  for (; posts > 0 && !stopping_; --posts) handler_();
}

}  // namespace notify
