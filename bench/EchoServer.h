#pragma once

#include <sys/types.h>

#include <cstdint>
#include <memory>
#include <vector>

#include "platform/os/Error.h"

// The raw baseline's far end: a forked child process that serves a fixed set of socket pairs,
// one thread per socket, answering each fixed-size request with a fixed reply. Different
// sockets may be used from different threads at once; one socket by one thread at a time.
// Destruction closes the sockets, which ends the child, and reaps it.
class EchoServer {
 public:
  // Forks the child with |sockets| sockets. The child answers every |request|.size() bytes
  // read with the bytes of |reply|. Call it while the process has one thread: the child starts
  // threads of its own. Fails with the error of socketpair() or fork().
  static os::Result<std::unique_ptr<EchoServer>> start(std::size_t sockets,
                                                       std::vector<std::uint8_t> request,
                                                       std::vector<std::uint8_t> reply);
  ~EchoServer();
  EchoServer(const EchoServer&) = delete;
  EchoServer& operator=(const EchoServer&) = delete;

  // Writes the request on socket |index| and reads the whole reply. Fails with EINVAL for an
  // index out of range, with EPIPE when the child has gone, or with the system's error.
  os::Status roundTrip(std::size_t index);

  pid_t pid() const { return child_; }

 private:
  EchoServer(pid_t child, std::vector<int> fds, std::vector<std::uint8_t> request,
             std::size_t replyBytes);

  const pid_t child_;
  const std::vector<int> fds_;
  const std::vector<std::uint8_t> request_;
  std::vector<std::vector<std::uint8_t>> replies_;  // one buffer per socket
};
