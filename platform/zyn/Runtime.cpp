#include "platform/zyn/Runtime.h"

#include <pthread.h>
#include <signal.h>

#include <asio/error.hpp>
#include <cstdlib>
#include <system_error>

namespace zyn {

Runtime& Runtime::shared() {
  // Never destroyed: connections and queues may use it until the process ends.
  static Runtime* runtime = new Runtime();
  return *runtime;
}

Runtime::Runtime() : context_(1), guard_(asio::make_work_guard(context_)) {
  // Writes to a peer that went away must fail with EPIPE, not kill the process.
  signal(SIGPIPE, SIG_IGN);
  // The I/O thread must be gone before exit() destroys statics it uses (asio's error categories
  // among them): making those first means their destructors run after our exit handler.
  static_cast<void>(asio::error::get_misc_category());
  static_cast<void>(asio::error::get_netdb_category());
  static_cast<void>(asio::error::get_addrinfo_category());
  static_cast<void>(std::system_category());
  thread_ = std::thread([this] {
    pthread_setname_np(pthread_self(), "zyn-io");
    context_.run();
  });
  std::atexit([] { shared().stop(); });
}

void Runtime::stop() {
  if (isCurrent() || !thread_.joinable()) return;
  context_.stop();
  thread_.join();
}

}  // namespace zyn
