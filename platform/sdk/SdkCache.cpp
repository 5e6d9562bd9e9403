#include "platform/sdk/SdkCache.h"

#include <sys/inotify.h>
#include <unistd.h>

#include <cerrno>

#include "platform/os/Error.h"
#include "platform/os/Log.h"
#include "platform/sdk/SdkMerge.h"

namespace sdk {

namespace {

constexpr int kLogWarning = 4;
constexpr int kLogNotice = 5;

// Any change of an entry of the SDK directory, or of the directory itself.
constexpr std::uint32_t kDirectoryEvents = IN_CREATE | IN_DELETE | IN_MODIFY | IN_CLOSE_WRITE |
                                           IN_MOVED_FROM | IN_MOVED_TO | IN_ATTRIB |
                                           IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR;
// An ancestor: the next directory on the way there appearing, or the ancestor going away.
constexpr std::uint32_t kAncestorEvents =
    IN_CREATE | IN_MOVED_TO | IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR;
// The watched directory itself is gone or elsewhere: watch by path again.
constexpr std::uint32_t kWatchLost = IN_DELETE_SELF | IN_MOVE_SELF | IN_IGNORED | IN_UNMOUNT;

}  // namespace

SdkCache::SdkCache(std::string root) : files_(std::move(root)), directory_(files_.directory()) {
  std::lock_guard lock(mutex_);
  fd_ = inotify_init1(IN_CLOEXEC | IN_NONBLOCK);
  if (fd_ < 0) {
    giveUp(os::Error::fromErrno("inotify_init1").message);
    return;
  }
  os::Status watched = watch();
  if (!watched.ok()) giveUp(watched.error().message);
}

SdkCache::~SdkCache() {
  if (fd_ >= 0) close(fd_);
}

std::uint64_t SdkCache::refresh() {
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
  if (rewatch) {
    os::Status watched = watch();
    if (!watched.ok()) giveUp(watched.error().message);
  }
  if (changed) {
    kept_.clear();
    ++generation_;
  }
  return generation_;
}

value::Dictionary SdkCache::resolve(const value::Dictionary& info) {
  const value::Value* plugIn = info.find("QSExtension");
  const value::Dictionary* plugInDictionary = plugIn ? plugIn->asDictionary() : nullptr;
  if (!plugInDictionary) return info;
  const value::Value* point = plugInDictionary->find("QSExtensionPointIdentifier");
  if (!point) return canonicalize(info);
  const std::string* name = point->asString();
  if (!name) return info;
  std::optional<value::Dictionary> sdk = sdkFor(*name);
  return canonicalize(sdk ? mergeDictionary(*sdk, info) : info);
}

os::Status SdkCache::watch() {
  std::string path = directory_;
  std::string next;
  for (;;) {
    int wd =
        inotify_add_watch(fd_, path.c_str(), next.empty() ? kDirectoryEvents : kAncestorEvents);
    if (wd >= 0) {
      if (watch_ >= 0 && watch_ != wd) inotify_rm_watch(fd_, watch_);
      watch_ = wd;
      nextName_ = next;
      return os::success();
    }
    std::size_t slash = path.rfind('/');
    if ((errno != ENOENT && errno != ENOTDIR) || path == "/" || slash == std::string::npos) {
      return os::Error::fromErrno("inotify_add_watch " + path);
    }
    next = path.substr(slash + 1);
    path = slash == 0 ? "/" : path.substr(0, slash);
  }
}

void SdkCache::classify(int wd, std::uint32_t mask, std::string_view name, bool& changed,
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

void SdkCache::giveUp(const std::string& why) {
  if (fd_ >= 0) close(fd_);
  fd_ = -1;
  watch_ = -1;
  os::Log::write(kLogWarning, "SDK registry: cannot watch " + directory_ + " (" + why +
                                  "): SDK files are read at every lookup");
}

std::optional<value::Dictionary> SdkCache::sdkFor(const std::string& point) {
  std::lock_guard lock(mutex_);
  auto kept = kept_.find(point);
  if (kept != kept_.end()) return kept->second;
  std::optional<value::Dictionary> sdk = files_.lookup(point);
  if (!sdk) os::Log::write(kLogNotice, "plug-in sdk \"" + point + "\" not registered");
  if (fd_ >= 0) kept_.emplace(point, sdk);
  return sdk;
}

}  // namespace sdk
