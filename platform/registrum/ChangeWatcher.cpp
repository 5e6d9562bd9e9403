#include "platform/registrum/ChangeWatcher.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/inotify.h>
#include <unistd.h>

#include <algorithm>

#include "platform/os/Log.h"
#include "platform/registrum/RecordCodec.h"

namespace registrum {

namespace {

constexpr int kLogError = 3;
constexpr int kLogWarning = 4;

std::string directoryOf(const std::string& file) {
  std::size_t slash = file.rfind('/');
  return slash == std::string::npos ? "." : file.substr(0, slash);
}

void drain(int fd) {
  char buffer[4096];
  while (read(fd, buffer, sizeof buffer) > 0) {
  }
}

}  // namespace

os::Result<std::unique_ptr<ChangeWatcher>> ChangeWatcher::start(const std::string& databasePath,
                                                                const std::string& notifyFile,
                                                                std::shared_ptr<Sources> sources) {
  os::Result<std::unique_ptr<Store>> store = Store::open(databasePath, std::move(sources));
  if (!store.ok()) return store.error();
  int wakeFd = eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK);
  if (wakeFd < 0) return os::Error::fromErrno("eventfd");
  int inotifyFd = inotify_init1(IN_CLOEXEC | IN_NONBLOCK);
  if (inotifyFd >= 0 && inotify_add_watch(inotifyFd, directoryOf(notifyFile).c_str(),
                                          IN_CLOSE_WRITE | IN_MOVED_TO | IN_ATTRIB) < 0) {
    close(inotifyFd);
    inotifyFd = -1;
  }
  if (inotifyFd < 0) {
    os::Log::write(kLogWarning, "registry notices: no inotify, polling the change log");
  }
  return std::unique_ptr<ChangeWatcher>(
      new ChangeWatcher(std::move(store.value()), inotifyFd, wakeFd));
}

void ChangeWatcher::announce(const std::string& notifyFile) {
  int fd = open(notifyFile.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
  if (fd < 0) {
    os::Log::write(kLogWarning, "registry notices: cannot touch " + notifyFile + ": " +
                                    os::Error::fromErrno("open").message);
    return;
  }
  close(fd);
}

ChangeWatcher::ChangeWatcher(std::unique_ptr<Store> store, int inotifyFd, int wakeFd)
    : store_(std::move(store)), inotifyFd_(inotifyFd), wakeFd_(wakeFd) {
  thread_ = std::thread([this] { run(); });
}

ChangeWatcher::~ChangeWatcher() {
  stopping_ = true;
  wake();
  thread_.join();
  if (inotifyFd_ >= 0) close(inotifyFd_);
  close(wakeFd_);
}

void ChangeWatcher::add(const std::shared_ptr<Observer>& observer, std::int64_t sequence) {
  {
    std::lock_guard lock(mutex_);
    for (const auto& entry : entries_) {
      if (entry->key == observer.get()) return;
    }
    auto entry = std::make_shared<Entry>();
    entry->observer = observer;
    entry->key = observer.get();
    entry->cursor = sequence;
    entries_.push_back(std::move(entry));
  }
  wake();
}

void ChangeWatcher::remove(const Observer* observer) {
  std::lock_guard lock(mutex_);
  auto found = std::find_if(entries_.begin(), entries_.end(),
                            [&](const auto& entry) { return entry->key == observer; });
  if (found == entries_.end()) return;
  (*found)->removed = true;
  entries_.erase(found);
}

void ChangeWatcher::wake() {
  std::uint64_t one = 1;
  // A failed write means the counter is already non-zero: the thread wakes anyway.
  [[maybe_unused]] ssize_t written = write(wakeFd_, &one, sizeof one);
}

void ChangeWatcher::run() {
  pollfd fds[2] = {{wakeFd_, POLLIN, 0}, {inotifyFd_, POLLIN, 0}};
  int count = inotifyFd_ >= 0 ? 2 : 1;
  while (!stopping_) {
    poll(fds, count, kSafetyPollMs);
    drain(wakeFd_);
    if (inotifyFd_ >= 0) drain(inotifyFd_);
    while (!stopping_ && deliverBatch()) {
    }
  }
}

bool ChangeWatcher::deliverBatch() {
  std::vector<std::shared_ptr<Entry>> entries = snapshot();
  if (entries.empty()) return false;
  std::int64_t from = entries.front()->cursor;
  for (const auto& entry : entries) from = std::min(from, entry->cursor);
  os::Result<std::vector<Store::Change>> changes = store_->changesAfter(from, kBatch);
  if (!changes.ok()) {
    os::Log::write(kLogError, "registry notices: " + changes.error().message);
    return false;
  }
  if (!changes.value().empty() && changes.value().front().sequence > from + 1) {
    os::Log::write(kLogWarning, "registry notices: changes after " + std::to_string(from) +
                                    " were trimmed from the log before delivery");
  }
  for (const Store::Change& change : changes.value()) {
    os::Result<PlugInList> records = RecordCodec::decodeList(change.records);
    if (!records.ok()) {
      os::Log::write(kLogError, "registry notices: change " + std::to_string(change.sequence) +
                                    " skipped: " + records.error().message);
    }
    for (const auto& entry : entries) {
      if (entry->cursor >= change.sequence) continue;
      entry->cursor = change.sequence;
      if (records.ok()) deliver(*entry, change, records.value());
    }
  }
  return changes.value().size() == static_cast<std::size_t>(kBatch);
}

void ChangeWatcher::deliver(Entry& entry, const Store::Change& change, const PlugInList& records) {
  std::shared_ptr<Observer> observer = entry.observer.lock();
  if (!observer || entry.removed || records.empty()) return;
  if (change.kind == Store::ChangeKind::Install) {
    observer->pluginsDidInstall(records);
  } else {
    observer->pluginsWillUninstall(records);
  }
}

std::vector<std::shared_ptr<ChangeWatcher::Entry>> ChangeWatcher::snapshot() {
  std::lock_guard lock(mutex_);
  std::erase_if(entries_, [](const auto& entry) { return entry->observer.expired(); });
  return entries_;
}

}  // namespace registrum
