#include "platform/os/DirectoryWatch.h"

#include <sys/inotify.h>
#include <unistd.h>

#include <cerrno>

#include "platform/os/Error.h"
#include "platform/os/Log.h"

namespace os {

namespace {

constexpr int kLogWarning = 4;

// Any change of an entry of the directory, or of the directory itself.
constexpr std::uint32_t kDirectoryEvents = IN_CREATE | IN_DELETE | IN_MODIFY | IN_CLOSE_WRITE |
                                           IN_MOVED_FROM | IN_MOVED_TO | IN_ATTRIB |
                                           IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR;
// An ancestor: the next directory on the way there appearing, or the ancestor going away.
constexpr std::uint32_t kAncestorEvents =
    IN_CREATE | IN_MOVED_TO | IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR;
// The watched directory itself is gone or elsewhere: watch by path again.
constexpr std::uint32_t kWatchLost = IN_DELETE_SELF | IN_MOVE_SELF | IN_IGNORED | IN_UNMOUNT;

}  // namespace

DirectoryWatch::DirectoryWatch(std::string directory, std::string what, std::string consequence)
    : directory_(std::move(directory)),
      what_(std::move(what)),
      consequence_(std::move(consequence)) {
  std::lock_guard lock(mutex_);
  fd_ = inotify_init1(IN_CLOEXEC | IN_NONBLOCK);
  if (fd_ < 0) {
    giveUp(Error::fromErrno("inotify_init1").message);
    return;
  }
  std::string why;
  if (!watch(why)) giveUp(why);
}

DirectoryWatch::~DirectoryWatch() {
  if (fd_ >= 0) close(fd_);
}

bool DirectoryWatch::changed() {
  std::lock_guard lock(mutex_);
  bool changed = fd_ < 0;
  bool rewatch = false;
  alignas(struct inotify_event) char buffer[4096];
  while (fd_ >= 0) {
    ssize_t got = read(fd_, buffer, sizeof buffer);
    if (got < 0 && errno == EINTR) continue;
    if (got <= 0) break;
    for (ssize_t at = 0; at < got;) {
      const auto* event = reinterpret_cast<const struct inotify_event*>(buffer + at);
      std::string_view name = event->len > 0 ? std::string_view(event->name) : std::string_view();
      classify(event->wd, event->mask, name, changed, rewatch);
      at += static_cast<ssize_t>(sizeof(struct inotify_event) + event->len);
    }
  }
  std::string why;
  if (rewatch && !watch(why)) giveUp(why);
  return changed;
}

bool DirectoryWatch::watching() {
  std::lock_guard lock(mutex_);
  return fd_ >= 0;
}

bool DirectoryWatch::watch(std::string& why) {
  std::string path = directory_;
  std::string next;
  for (;;) {
    int wd =
        inotify_add_watch(fd_, path.c_str(), next.empty() ? kDirectoryEvents : kAncestorEvents);
    if (wd >= 0) {
      if (watch_ >= 0 && watch_ != wd) inotify_rm_watch(fd_, watch_);
      watch_ = wd;
      nextName_ = next;
      return true;
    }
    std::size_t slash = path.rfind('/');
    if ((errno != ENOENT && errno != ENOTDIR) || path == "/" || slash == std::string::npos) {
      why = Error::fromErrno("inotify_add_watch " + path).message;
      return false;
    }
    next = path.substr(slash + 1);
    path = slash == 0 ? "/" : path.substr(0, slash);
  }
}

void DirectoryWatch::classify(int wd, std::uint32_t mask, std::string_view name, bool& changed,
                              bool& rewatch) const {
  if (mask & IN_Q_OVERFLOW) {
    changed = rewatch = true;
    return;
  }
  if (wd != watch_) return;  // a watch replaced before
  bool lost = (mask & kWatchLost) != 0;
  if (nextName_.empty()) {
    changed = true;
    rewatch = rewatch || lost;
  } else if (lost || name == nextName_) {
    changed = rewatch = true;
  }
}

void DirectoryWatch::giveUp(const std::string& why) {
  if (fd_ >= 0) close(fd_);
  fd_ = -1;
  watch_ = -1;
  Log::write(kLogWarning,
             what_ + ": cannot watch " + directory_ + " (" + why + "): " + consequence_);
}

}  // namespace os
