#pragma once

#include <asio/io_context_strand.hpp>
#include <memory>

#include "platform/zyn/EventLoop.h"
#include "platform/zyn/SerialQueue.h"

namespace zyn {

// A serial queue that runs on an I/O thread: the runtime's shared one, or an event loop's own.
// Cheap to create; its work must not block, since it holds up everything else on that thread.
// dispatch() runs the work at once when called on the queue's I/O thread while the queue is
// idle, which saves a hand-off on the path of every reply.
class StrandQueue final : public SerialQueue {
 public:
  // A queue on the runtime's shared I/O thread.
  explicit StrandQueue(std::string label);
  // A queue on |loop|'s thread; the queue keeps the loop alive.
  StrandQueue(std::string label, std::shared_ptr<EventLoop> loop);

  void async(Work work) override;
  // Runs |work| now when that keeps the queue's order, otherwise schedules it.
  void dispatch(Work work);
  bool isCurrent() const override { return strand_.running_in_this_thread(); }
  const std::string& label() const override { return label_; }

  // The event loop the queue runs on; I/O objects of the queue's connection belong to it.
  asio::io_context& context() const { return strand_.context(); }

 private:
  const std::string label_;
  const std::shared_ptr<EventLoop> loop_;  // null on the shared I/O thread
  asio::io_context::strand strand_;
};

}  // namespace zyn
