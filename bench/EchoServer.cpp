#include "bench/EchoServer.h"

#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <thread>

namespace {

os::Status readFully(int fd, std::uint8_t* data, std::size_t size) {
  while (size > 0) {
    ssize_t n = ::recv(fd, data, size, 0);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return os::Error::fromErrno("recv");
    if (n == 0) return os::Error{EPIPE, "the echo process closed the socket"};
    data += n;
    size -= static_cast<std::size_t>(n);
  }
  return os::success();
}

os::Status writeFully(int fd, const std::uint8_t* data, std::size_t size) {
  while (size > 0) {
    ssize_t n = ::send(fd, data, size, MSG_NOSIGNAL);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return os::Error::fromErrno("send");
    data += n;
    size -= static_cast<std::size_t>(n);
  }
  return os::success();
}

void closeAll(const std::vector<int>& fds) {
  for (int fd : fds) close(fd);
}

// The child's whole life: answer on every socket until each reaches its end.
[[noreturn]] void serve(const std::vector<int>& fds, std::size_t requestBytes,
                        const std::vector<std::uint8_t>& reply) {
  std::vector<std::thread> threads;
  for (int fd : fds) {
    threads.emplace_back([fd, requestBytes, &reply] {
      std::vector<std::uint8_t> request(requestBytes);
      while (readFully(fd, request.data(), request.size()).ok() &&
             writeFully(fd, reply.data(), reply.size()).ok()) {
      }
    });
  }
  for (auto& thread : threads) thread.join();
  _exit(0);
}

}  // namespace

os::Result<std::unique_ptr<EchoServer>> EchoServer::start(std::size_t sockets,
                                                          std::vector<std::uint8_t> request,
                                                          std::vector<std::uint8_t> reply) {
  std::vector<int> ours;
  std::vector<int> theirs;
  for (std::size_t i = 0; i < sockets; ++i) {
    int pair[2];
    if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, pair) != 0) {
      os::Error error = os::Error::fromErrno("socketpair");
      closeAll(ours);
      closeAll(theirs);
      return error;
    }
    ours.push_back(pair[0]);
    theirs.push_back(pair[1]);
  }
  pid_t child = fork();
  if (child < 0) {
    os::Error error = os::Error::fromErrno("fork");
    closeAll(ours);
    closeAll(theirs);
    return error;
  }
  if (child == 0) {
    closeAll(ours);
    serve(theirs, request.size(), reply);
  }
  closeAll(theirs);
  return std::unique_ptr<EchoServer>(
      new EchoServer(child, std::move(ours), std::move(request), reply.size()));
}

EchoServer::EchoServer(pid_t child, std::vector<int> fds, std::vector<std::uint8_t> request,
                       std::size_t replyBytes)
    : child_(child),
      fds_(std::move(fds)),
      request_(std::move(request)),
      replies_(fds_.size(), std::vector<std::uint8_t>(replyBytes)) {}

EchoServer::~EchoServer() {
  closeAll(fds_);
  waitpid(child_, nullptr, 0);
}

os::Status EchoServer::roundTrip(std::size_t index) {
  if (index >= fds_.size()) return os::Error{EINVAL, "no echo socket " + std::to_string(index)};
  os::Status sent = writeFully(fds_[index], request_.data(), request_.size());
  if (!sent.ok()) return sent;
  return readFully(fds_[index], replies_[index].data(), replies_[index].size());
}
