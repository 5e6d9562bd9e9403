#include "platform/zyn/Runtime.h"

#include <pthread.h>
#include <signal.h>

namespace zyn {

Runtime& Runtime::shared() {
  // Never destroyed: connections and queues may still use it while the process exits.
  static Runtime* runtime = new Runtime();
  return *runtime;
}

Runtime::Runtime() : context_(1), guard_(asio::make_work_guard(context_)) {
  // Writes to a peer that went away must fail with EPIPE, not kill the process.
  signal(SIGPIPE, SIG_IGN);
  thread_ = std::thread([this] {
    pthread_setname_np(pthread_self(), "zyn-io");
    context_.run();
  });
  thread_.detach();
}

}  // namespace zyn
