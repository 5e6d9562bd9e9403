#pragma once

#include <atomic>
#include <mutex>
#include <string>
#include <thread>

namespace zyn {

// A serial queue that is only ever entered synchronously: sync() runs the work on the calling
// thread while holding the queue, so work of two threads never overlaps. Work must not enter
// the same queue again (that is a programming error and deadlocks). Safe to use from any thread.
class SyncQueue {
 public:
  explicit SyncQueue(std::string label) : label_(std::move(label)) {}
  SyncQueue(const SyncQueue&) = delete;
  SyncQueue& operator=(const SyncQueue&) = delete;

  // Runs |work| on the queue and returns what it returns.
  template <typename Work>
  auto sync(Work&& work) -> decltype(work()) {
    std::lock_guard lock(mutex_);
    Holder holder(owner_);
    return work();
  }

  // True while the calling thread runs work on this queue.
  bool isCurrent() const { return owner_.load() == std::this_thread::get_id(); }

  const std::string& label() const { return label_; }

 private:
  struct Holder {
    explicit Holder(std::atomic<std::thread::id>& owner) : owner_(owner) {
      owner_.store(std::this_thread::get_id());
    }
    ~Holder() { owner_.store(std::thread::id()); }
    std::atomic<std::thread::id>& owner_;
  };

  const std::string label_;
  std::mutex mutex_;
  std::atomic<std::thread::id> owner_{};
};

}  // namespace zyn
