#pragma once

#include <atomic>
#include <cstdint>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "platform/zyn/SerialQueue.h"

namespace zyn {

// A serial queue with a thread of its own. Used where work must never wait behind I/O: the
// daemon's service queue. Submitting wakes the thread only when it sleeps, with one futex call;
// the thread takes everything queued at once and sleeps only when nothing is left. Destruction
// runs the work already queued (and what that work queues), then joins the thread; it must not
// happen on the queue's own thread.
class ThreadQueue final : public SerialQueue {
 public:
  // |niceness| below 0 asks for a raised priority; it is dropped silently where not permitted.
  explicit ThreadQueue(std::string label, int niceness = 0);
  ~ThreadQueue() override;
  ThreadQueue(const ThreadQueue&) = delete;
  ThreadQueue& operator=(const ThreadQueue&) = delete;

  void async(Work work) override;
  bool isCurrent() const override;
  const std::string& label() const override { return label_; }

 private:
  void run(int niceness);
  // Moves the queued work into |batch|, sleeping while there is none; false once the queue is
  // being destroyed and nothing is left.
  bool take(std::vector<Work>& batch);
  void wake();

  const std::string label_;
  std::mutex mutex_;
  std::vector<Work> queued_;  // guarded by mutex_
  bool sleeping_ = false;     // guarded by mutex_: the thread waits on wakeups_, or is about to
  bool stopping_ = false;     // guarded by mutex_
  // The futex word the thread sleeps on; each wake-up moves it.
  std::atomic<std::uint32_t> wakeups_{0};
  // Last: it starts running once everything above exists.
  std::thread thread_;
};

}  // namespace zyn
