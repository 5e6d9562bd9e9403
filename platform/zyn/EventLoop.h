#pragma once

#include <asio/executor_work_guard.hpp>
#include <asio/io_context.hpp>
#include <memory>
#include <string>

namespace zyn {

// An event loop on an I/O thread of its own, for connections whose handlers must neither wait
// behind the handlers of other connections nor hold them up: each client proxy has one. The
// thread runs while the loop exists and, after that, until the work already under way is done
// (a connection's last events and the errors of its unanswered requests). It is never joined, so
// the last reference may be dropped on the loop's own thread, inside one of its handlers. Safe to
// use from any thread.
class EventLoop {
 public:
  // Starts the thread, named |threadName| (the first 15 characters).
  explicit EventLoop(const std::string& threadName);
  // Lets the thread end once it has no work left; returns at once.
  ~EventLoop();
  EventLoop(const EventLoop&) = delete;
  EventLoop& operator=(const EventLoop&) = delete;

  asio::io_context& context() { return *context_; }

 private:
  // Shared with the thread, which lets go of it after its last handler.
  std::shared_ptr<asio::io_context> context_;
  asio::executor_work_guard<asio::io_context::executor_type> guard_;
};

}  // namespace zyn
