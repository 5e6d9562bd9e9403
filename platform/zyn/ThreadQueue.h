#pragma once

#include <condition_variable>
#include <deque>
#include <memory>
#include <mutex>
#include <thread>

#include "platform/zyn/SerialQueue.h"

namespace zyn {

// A serial queue with a thread of its own. Used where work must never wait behind I/O (the
// daemon's service queue). Destruction drains the queue and joins the thread.
class ThreadQueue final : public SerialQueue {
 public:
  // |niceness| below 0 asks for a raised priority; it is dropped silently where not permitted.
  ThreadQueue(std::string label, int niceness = 0);
  ~ThreadQueue() override;
  ThreadQueue(const ThreadQueue&) = delete;
  ThreadQueue& operator=(const ThreadQueue&) = delete;

  void async(Work work) override;
  bool isCurrent() const override;
  const std::string& label() const override { return label_; }

 private:
  void run(int niceness);

  const std::string label_;
  std::mutex mutex_;
  std::condition_variable wake_;
  std::deque<Work> work_;
  bool stopping_ = false;
  std::thread thread_;
};

}  // namespace zyn
