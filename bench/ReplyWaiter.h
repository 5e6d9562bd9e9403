#pragma once

#include <condition_variable>
#include <mutex>
#include <optional>

#include "Annexa/AXDaemonClient.h"

// Turns the client's reply handler into a wait on the caller's thread: a host that calls the
// daemon synchronously. One request at a time per waiter; handler() and wait() may run on
// different threads. The waiter must outlive the reply of every handler it gave out.
class ReplyWaiter {
 public:
  // A handler for the next request; it records whether the reply was a success.
  AXDaemonClient::ReplyHandler handler();
  // Waits for the reply of the request sent with the last handler. True for a success; false
  // for an error reply, a broken connection or a reply that breaks the protocol.
  bool wait();

 private:
  void arrived(bool success);

  std::mutex mutex_;
  std::condition_variable arrived_;
  std::optional<bool> result_;
};
