#include "bench/ReplyWaiter.h"

AXDaemonClient::ReplyHandler ReplyWaiter::handler() {
  return [this](const zyn::ReplyOrError& reply) {
    bool success = false;
    try {
      success = !AXDaemonClient::errorInReply(reply);
    } catch (const AXInternalInconsistency&) {
      // An error without a code: a failed round trip, not a reason to stop the process.
    }
    arrived(success);
  };
}

bool ReplyWaiter::wait() {
  std::unique_lock lock(mutex_);
  arrived_.wait(lock, [this] { return result_.has_value(); });
  bool success = *result_;
  result_.reset();
  return success;
}

void ReplyWaiter::arrived(bool success) {
  // Notified under the lock: once wait() returns, the waiter may be gone.
  std::lock_guard lock(mutex_);
  result_ = success;
  arrived_.notify_one();
}
