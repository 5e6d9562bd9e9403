#pragma once

#include <asio/local/stream_protocol.hpp>
#include <asio/steady_timer.hpp>
#include <functional>
#include <memory>
#include <string>

#include "platform/os/Error.h"
#include "platform/zyn/Connection.h"
#include "platform/zyn/SerialQueue.h"

namespace zyn {

// A named service's listening end: a Unix stream socket at <runtime dir>/zyn/<name> (directory
// 0700, socket 0600), or the listening socket that the service manager handed over through
// LISTEN_FDS. Each accepted connection is delivered, with its peer's credentials and audit token
// taken at accept, to the event handler on the listener's queue. The kernel tags every write with
// its writer's credentials (SO_PASSCRED), so that a connection can tell who wrote its bytes.
// A socket it binds itself listens from resume() on: until then a client's connect is refused,
// so a process that is not ready to serve does not look as if it were. The frame limits of its
// connections are read from the environment when it is created.
class Listener : public std::enable_shared_from_this<Listener> {
 public:
  using EventHandler = std::function<void(std::shared_ptr<Connection>)>;

  // Binds the service's socket, or adopts an inherited one. Fails when another live process
  // serves the name (it holds the lock "<socket>.lock" beside the socket, or listens there), or
  // the socket cannot be made; a stale socket file is replaced.
  static os::Result<std::shared_ptr<Listener>> create(const std::string& serviceName,
                                                      std::shared_ptr<SerialQueue> queue);

  // Set before resume().
  void setEventHandler(EventHandler handler) { handler_ = std::move(handler); }
  ~Listener();
  Listener(const Listener&) = delete;
  Listener& operator=(const Listener&) = delete;

  // Listens and starts accepting; the system's error when the socket cannot listen.
  os::Status resume();

  // The socket's path; empty for an inherited socket.
  const std::string& path() const { return path_; }

 private:
  Listener(asio::local::stream_protocol::acceptor acceptor, std::string serviceName,
           std::string path, std::shared_ptr<SerialQueue> queue, int lock);

  static os::Result<int> inheritedSocket();
  // The descriptor of the locked "<path>.lock", which the listener holds while it lives.
  static os::Result<int> lockService(const std::string& path);
  static os::Result<int> bindSocket(const std::string& path);
  void acceptNext();
  // Accepts one waiting connection; false when none waited.
  bool acceptOne();
  void accepted(int fd);

  const int lock_;  // -1 for an inherited socket
  asio::local::stream_protocol::acceptor acceptor_;
  asio::steady_timer retry_;
  const std::string serviceName_;
  const std::string path_;
  const std::shared_ptr<SerialQueue> queue_;
  const FrameLimits limits_;
  EventHandler handler_;
};

}  // namespace zyn
