#include "platform/zyn/ThreadQueue.h"

#include <pthread.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace zyn {

ThreadQueue::ThreadQueue(std::string label, int niceness)
    : label_(std::move(label)), thread_([this, niceness] { run(niceness); }) {}

ThreadQueue::~ThreadQueue() {
  {
    std::lock_guard lock(mutex_);
    stopping_ = true;
  }
  wake_.notify_one();
  thread_.join();
}

void ThreadQueue::async(Work work) {
  {
    std::lock_guard lock(mutex_);
    work_.push_back(std::move(work));
  }
  wake_.notify_one();
}

bool ThreadQueue::isCurrent() const {
  return std::this_thread::get_id() == thread_.get_id();
}

void ThreadQueue::run(int niceness) {
  pthread_setname_np(pthread_self(), label_.substr(0, 15).c_str());
  if (niceness < 0) setpriority(PRIO_PROCESS, static_cast<id_t>(syscall(SYS_gettid)), niceness);
  std::unique_lock lock(mutex_);
  for (;;) {
    wake_.wait(lock, [this] { return stopping_ || !work_.empty(); });
    if (work_.empty()) return;
    Work work = std::move(work_.front());
    work_.pop_front();
    lock.unlock();
    work();
    lock.lock();
  }
}

}  // namespace zyn
