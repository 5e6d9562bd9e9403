#include "platform/zyn/ThreadQueue.h"

#include <linux/futex.h>
#include <pthread.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <utility>

namespace zyn {

ThreadQueue::ThreadQueue(std::string label, int niceness)
    : label_(std::move(label)), thread_([this, niceness] { run(niceness); }) {}

ThreadQueue::~ThreadQueue() {
  bool sleeping;
  {
    std::lock_guard lock(mutex_);
    stopping_ = true;
    sleeping = std::exchange(sleeping_, false);
  }
  if (sleeping) wake();
  thread_.join();
}

void ThreadQueue::async(Work work) {
  bool sleeping;
  {
    std::lock_guard lock(mutex_);
    queued_.push_back(std::move(work));
    sleeping = std::exchange(sleeping_, false);
  }
  if (sleeping) wake();
}

bool ThreadQueue::isCurrent() const {
  return std::this_thread::get_id() == thread_.get_id();
}

void ThreadQueue::run(int niceness) {
  pthread_setname_np(pthread_self(), label_.substr(0, 15).c_str());
  if (niceness < 0) setpriority(PRIO_PROCESS, static_cast<id_t>(syscall(SYS_gettid)), niceness);
  std::vector<Work> batch;
  while (take(batch)) {
    for (Work& work : batch) {
      work();
      // Released at once, as if it had run alone: it may hold the last reference to something.
      work = nullptr;
    }
    batch.clear();
  }
}

bool ThreadQueue::take(std::vector<Work>& batch) {
  std::unique_lock lock(mutex_);
  while (queued_.empty()) {
    if (stopping_) return false;
    sleeping_ = true;
    // Read under the lock: a submitter that finds sleeping_ set moves the word after this, so
    // the wait below returns at once rather than miss its wake-up.
    std::uint32_t seen = wakeups_.load(std::memory_order_relaxed);
    lock.unlock();
    syscall(SYS_futex, &wakeups_, FUTEX_WAIT_PRIVATE, seen, nullptr, nullptr, 0);
    lock.lock();
  }
  batch.swap(queued_);
  return true;
}

void ThreadQueue::wake() {
  wakeups_.fetch_add(1, std::memory_order_relaxed);
  syscall(SYS_futex, &wakeups_, FUTEX_WAKE_PRIVATE, 1, nullptr, nullptr, 0);
}

}  // namespace zyn
