#pragma once

#include <asio/thread_pool.hpp>
#include <string>

#include "platform/zyn/SerialQueue.h"

namespace zyn {

// A serial queue with a thread of its own (a one-thread asio pool). Used where work must never
// wait behind I/O: the daemon's service queue. Destruction runs the work already queued, then
// joins the thread.
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
  const std::string label_;
  mutable asio::thread_pool pool_;  // mutable: asking for its executor is not const
};

}  // namespace zyn
