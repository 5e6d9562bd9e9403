#pragma once

#include <asio/io_context.hpp>
#include <thread>

namespace zyn {

// The process's message-service runtime: one I/O thread running an event loop on which every
// connection reads, listeners accept and strand queues run. Created on first use; the thread is
// stopped when the process exits. Safe to use from any thread.
class Runtime {
 public:
  static Runtime& shared();

  asio::io_context& context() { return context_; }

  // True on the I/O thread.
  bool isCurrent() const { return std::this_thread::get_id() == thread_.get_id(); }

  // Stops the event loop and joins the I/O thread (at exit; nothing runs on it afterwards).
  void stop();

 private:
  Runtime();

  asio::io_context context_;
  asio::executor_work_guard<asio::io_context::executor_type> guard_;
  std::thread thread_;
};

}  // namespace zyn
