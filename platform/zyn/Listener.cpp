#include "platform/zyn/Listener.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <asio/post.hpp>
#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "platform/os/Format.h"
#include "platform/os/Log.h"
#include "platform/os/Paths.h"
#include "platform/os/Process.h"
#include "platform/zyn/Runtime.h"

namespace zyn {

namespace {

// Debian's kernel headers predate it; the kernel has had it since 6.5.
constexpr int kSoPeerPidfd = 77;
constexpr int kFirstInheritedFd = 3;

os::Result<sockaddr_un> socketAddress(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (path.size() >= sizeof address.sun_path) {
    return os::Error{ENAMETOOLONG, "socket path too long: " + path};
  }
  std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
  return address;
}

bool somebodyListens(const sockaddr_un& address) {
  int probe = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (probe < 0) return false;
  bool live = connect(probe, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
  close(probe);
  return live;
}

PeerCredentials credentialsOf(int fd) {
  PeerCredentials peer;
  ucred cred{};
  socklen_t length = sizeof cred;
  if (getsockopt(fd, SOL_SOCKET, SO_PEERCRED, &cred, &length) == 0) {
    peer.pid = cred.pid;
    peer.uid = cred.uid;
    peer.gid = cred.gid;
  }
  int pidfd = -1;
  length = sizeof pidfd;
  if (getsockopt(fd, SOL_SOCKET, kSoPeerPidfd, &pidfd, &length) == 0 && pidfd >= 0) {
    peer.pidfd = pidfd;
  } else if (peer.pid > 0) {
    auto opened = os::Process::openPidfd(peer.pid);
    if (opened.ok()) peer.pidfd = opened.value();
  }
  auto directory = os::Process::openProcDirectory(peer.pid, peer.pidfd);
  if (peer.pid > 0 && directory.ok()) peer.procDirectory = directory.value();
  auto program = peer.procDirectory >= 0 ? os::Process::executableIdentityAt(peer.procDirectory)
                                         : os::Process::executableIdentity(peer.pid);
  if (peer.pid > 0 && program.ok()) peer.program = program.value();
  return peer;
}

}  // namespace

os::Result<std::shared_ptr<Listener>> Listener::create(const std::string& serviceName,
                                                       std::shared_ptr<SerialQueue> queue) {
  auto inherited = inheritedSocket();
  if (!inherited.ok()) return inherited.error();
  std::string path;
  int fd = inherited.value();
  int lock = -1;
  if (fd < 0) {
    path = os::Paths::zynSocketDir() + "/" + serviceName;
    auto locked = lockService(path);
    if (!locked.ok()) return locked.error();
    lock = locked.value();
    auto bound = bindSocket(path);
    if (!bound.ok()) {
      close(lock);
      return bound.error();
    }
    fd = bound.value();
  }
  // Connections made from now on inherit SO_PASSCRED, so even their first bytes carry the
  // writer's credentials; the listening socket is non-blocking for accept4.
  int on = 1;
  if (setsockopt(fd, SOL_SOCKET, SO_PASSCRED, &on, sizeof on) != 0 ||
      fcntl(fd, F_SETFL, fcntl(fd, F_GETFL) | O_NONBLOCK) != 0) {
    os::Error error = os::Error::fromErrno("cannot set up the listening socket");
    close(fd);
    if (lock >= 0) close(lock);
    return error;
  }
  asio::local::stream_protocol::acceptor acceptor(Runtime::shared().context());
  std::error_code ec;
  acceptor.assign(asio::local::stream_protocol(), fd, ec);
  if (ec) {
    close(fd);
    if (lock >= 0) close(lock);
    return os::Error{ec.value(), "cannot adopt the listening socket: " + ec.message()};
  }
  return std::shared_ptr<Listener>(
      new Listener(std::move(acceptor), serviceName, std::move(path), std::move(queue), lock));
}

os::Result<int> Listener::inheritedSocket() {
  const char* pid = std::getenv("LISTEN_PID");
  const char* fds = std::getenv("LISTEN_FDS");
  if (!pid || !fds || std::atol(pid) != getpid() || std::atoi(fds) < 1) return -1;
  unsetenv("LISTEN_PID");
  unsetenv("LISTEN_FDS");
  unsetenv("LISTEN_FDNAMES");
  int listening = 0;
  socklen_t length = sizeof listening;
  if (getsockopt(kFirstInheritedFd, SOL_SOCKET, SO_ACCEPTCONN, &listening, &length) != 0 ||
      !listening) {
    return os::Error{ENOTSOCK, "LISTEN_FDS names no listening socket at descriptor 3"};
  }
  fcntl(kFirstInheritedFd, F_SETFD, FD_CLOEXEC);
  return kFirstInheritedFd;
}

os::Result<int> Listener::lockService(const std::string& path) {
  // Another user who could write here could put a socket of theirs in the daemon's place.
  auto made = os::Paths::ensureRuntimeDirectory(os::Paths::zynSocketDir(), 0700);
  if (!made.ok()) return made.error();
  const std::string lockPath = path + ".lock";
  int fd = open(lockPath.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600);
  if (fd < 0) return os::Error::fromErrno("cannot open " + lockPath);
  if (flock(fd, LOCK_EX | LOCK_NB) != 0) {
    os::Error error = errno == EWOULDBLOCK
                          ? os::Error{EADDRINUSE, "another process already serves " + path}
                          : os::Error::fromErrno("cannot lock " + lockPath);
    close(fd);
    return error;
  }
  return fd;
}

os::Result<int> Listener::bindSocket(const std::string& path) {
  auto address = socketAddress(path);
  if (!address.ok()) return address.error();
  if (somebodyListens(address.value())) {
    return os::Error{EADDRINUSE, "another process already serves " + path};
  }
  unlink(path.c_str());
  int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (fd < 0) return os::Error::fromErrno("socket");
  const auto* raw = reinterpret_cast<const sockaddr*>(&address.value());
  if (bind(fd, raw, sizeof address.value()) != 0 || chmod(path.c_str(), 0600) != 0) {
    os::Error error = os::Error::fromErrno("cannot bind " + path);
    close(fd);
    return error;
  }
  return fd;
}

Listener::Listener(asio::local::stream_protocol::acceptor acceptor, std::string serviceName,
                   std::string path, std::shared_ptr<SerialQueue> queue, int lock)
    : lock_(lock),
      acceptor_(std::move(acceptor)),
      retry_(Runtime::shared().context()),
      serviceName_(std::move(serviceName)),
      path_(std::move(path)),
      queue_(std::move(queue)),
      limits_(FrameLimits::fromEnvironment()) {}

Listener::~Listener() {
  if (lock_ >= 0) close(lock_);
}

os::Status Listener::resume() {
  // Listening again on an inherited socket only sets its backlog.
  if (listen(acceptor_.native_handle(), SOMAXCONN) != 0) {
    return os::Error::fromErrno("cannot listen on " + serviceName_);
  }
  auto self = shared_from_this();
  asio::post(Runtime::shared().context(), [self] { self->acceptNext(); });
  return os::success();
}

void Listener::acceptNext() {
  auto self = shared_from_this();
  acceptor_.async_wait(asio::socket_base::wait_read, [self](std::error_code ec) {
    if (!ec) {
      while (self->acceptOne()) {
      }
      if (errno == EAGAIN || errno == EWOULDBLOCK || errno == EINTR || errno == ECONNABORTED) {
        self->acceptNext();
        return;
      }
      ec = std::error_code(errno, std::system_category());
    }
    // Out of descriptors or memory: retrying at once would only spin, so pause a little.
    os::Log::write(4, "accept on " + self->serviceName_ + " failed: " + ec.message());
    self->retry_.expires_after(std::chrono::milliseconds(100));
    self->retry_.async_wait([self](std::error_code) { self->acceptNext(); });
  });
}

bool Listener::acceptOne() {
  int fd = accept4(acceptor_.native_handle(), nullptr, nullptr, SOCK_CLOEXEC);
  if (fd < 0) return false;
  accepted(fd);
  return true;
}

void Listener::accepted(int fd) {
  // Only connections made after the listening socket got SO_PASSCRED inherit it; one made before
  // (while a service manager held the socket) gets it now. Its bytes written before the accept
  // carry credentials anyway, those written between the accept and now carry none and are
  // refused.
  int on = 1;
  setsockopt(fd, SOL_SOCKET, SO_PASSCRED, &on, sizeof on);
  PeerCredentials peer = credentialsOf(fd);
  asio::local::stream_protocol::socket socket(acceptor_.get_executor());
  std::error_code ec;
  socket.assign(asio::local::stream_protocol(), fd, ec);
  if (ec) {
    os::Log::write(4, "cannot adopt a connection to " + serviceName_ + ": " + ec.message());
    close(fd);
    if (peer.pidfd >= 0) close(peer.pidfd);
    if (peer.procDirectory >= 0) close(peer.procDirectory);
    return;
  }
  auto connection = Connection::accepted(std::move(socket), peer, serviceName_, limits_);
  auto self = shared_from_this();
  queue_->async([self, connection] {
    if (self->handler_) self->handler_(connection);
  });
}

}  // namespace zyn
