#pragma once

#include <asio/io_context_strand.hpp>

#include "platform/zyn/SerialQueue.h"

namespace zyn {

// A serial queue that runs on the runtime's I/O thread. Cheap to create; its work must not block.
// dispatch() runs the work at once when called on the I/O thread while the queue is idle, which
// saves a hand-off on the path of every reply.
class StrandQueue final : public SerialQueue {
 public:
  explicit StrandQueue(std::string label);

  void async(Work work) override;
  // Runs |work| now when that keeps the queue's order, otherwise schedules it.
  void dispatch(Work work);
  bool isCurrent() const override { return strand_.running_in_this_thread(); }
  const std::string& label() const override { return label_; }

 private:
  const std::string label_;
  asio::io_context::strand strand_;
};

}  // namespace zyn
