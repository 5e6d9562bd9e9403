#include "platform/zyn/Connection.h"

#include <sys/socket.h>
#include <unistd.h>

#include <asio/post.hpp>
#include <cerrno>
#include <cstring>

#include "platform/os/Format.h"
#include "platform/os/Log.h"
#include "platform/os/Paths.h"
#include "platform/os/Process.h"
#include "platform/value/CborCodec.h"

namespace zyn {

namespace {

constexpr std::size_t kReadChunk = 64 * 1024;
// The largest frame buffer a writing thread or a connection keeps between frames.
constexpr std::size_t kKeptWriteBuffer = 1u << 20;
// How much of a streamed frame is put together at a time.
constexpr std::size_t kPieceBytes = 256u << 10;

ServiceError invalidError(const std::string& why) {
  return ServiceError{ErrorKind::ConnectionInvalid, "Connection invalid: " + why};
}

const char* kindName(FrameKind kind) {
  switch (kind) {
    case FrameKind::Request:
      return "request";
    case FrameKind::Reply:
      return "reply";
    case FrameKind::OneWay:
      return "message";
    case FrameKind::Control:
      break;
  }
  return "control message";
}

}  // namespace

std::shared_ptr<Connection> Connection::toService(std::string serviceName,
                                                  std::shared_ptr<StrandQueue> queue) {
  asio::local::stream_protocol::socket socket(queue->context());
  return std::shared_ptr<Connection>(new Connection(std::move(socket), PeerCredentials{}, false,
                                                    std::move(serviceName), std::move(queue),
                                                    FrameLimits::fromEnvironment()));
}

std::shared_ptr<Connection> Connection::accepted(asio::local::stream_protocol::socket socket,
                                                 PeerCredentials peer, std::string serviceName,
                                                 FrameLimits limits) {
  auto queue = std::make_shared<StrandQueue>("zyn.connection");
  return std::shared_ptr<Connection>(new Connection(
      std::move(socket), peer, true, std::move(serviceName), std::move(queue), limits));
}

Connection::Connection(asio::local::stream_protocol::socket socket, PeerCredentials peer,
                       bool checksPeer, std::string serviceName, std::shared_ptr<StrandQueue> queue,
                       FrameLimits limits)
    : queue_(std::move(queue)),
      socket_(std::move(socket)),
      peer_(peer),
      checksPeer_(checksPeer),
      serviceName_(std::move(serviceName)),
      limits_(limits),
      decoder_(limits_) {}

Connection::~Connection() {
  if (peer_.pidfd >= 0) close(peer_.pidfd);
  if (peer_.procDirectory >= 0) close(peer_.procDirectory);
}

void Connection::setEventHandler(EventHandler handler) {
  handler_ = std::move(handler);
}

void Connection::setContext(std::shared_ptr<void> context) {
  context_ = std::move(context);
}

void Connection::resume() {
  if (!socket_.is_open()) connectToService();
  auto self = shared_from_this();
  asio::post(queue_->context(), [self] { self->readMore(); });
}

void Connection::connectToService() {
  std::string path = os::Paths::zynSocketDir() + "/" + serviceName_;
  std::error_code ec;
  // Opened here, not by asio, which would leave it open across an exec: a child of the client
  // must not inherit its connection.
  int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (fd < 0) {
    ec = std::error_code(errno, std::system_category());
  } else {
    socket_.assign(asio::local::stream_protocol(), fd, ec);
    if (ec) close(fd);
  }
  if (!ec) socket_.connect(asio::local::stream_protocol::endpoint(path), ec);
  if (ec) {
    std::lock_guard lock(writeMutex_);
    closed_ = true;
    connectError_ = os::format("cannot connect to %s: %s", {path, ec.message()});
  }
}

void Connection::readMore() {
  if (!connectError_.empty()) {
    invalidate(connectError_);
    return;
  }
  auto self = shared_from_this();
  socket_.async_wait(asio::socket_base::wait_read, [self](std::error_code ec) {
    if (ec) {
      self->invalidate(ec.message());
      return;
    }
    self->readAvailable();
  });
}

void Connection::readAvailable() {
  auto n = receive();
  if (!n.ok() && n.error().errnum == EAGAIN) {
    readMore();
    return;
  }
  if (!n.ok() || n.value() == 0) {
    std::string why = n.ok() ? "the peer closed the connection" : n.error().message;
    if (!n.ok() && n.error().errnum == EPERM) {
      os::Log::write(4, os::format("closing connection %@: %s", {description(), why}));
    }
    invalidate(why);
    return;
  }
  decoder_.commit(n.value());
  // Every frame of this read was written before it, so one check covers them all.
  std::optional<bool> sameProgram;
  for (;;) {
    auto next = decoder_.next();
    if (!next.ok()) {
      os::Log::write(
          4, os::format("closing connection %@: %s", {description(), next.error().message}));
      invalidate(next.error().message);
      return;
    }
    if (!next.value()) break;
    // Only work is checked: a goodbye from a client that has exited since is no harm.
    bool work = next.value()->kind == FrameKind::Request || next.value()->kind == FrameKind::OneWay;
    if (work && !sameProgram) sameProgram = peerRunsSameProgram();
    if (work && !*sameProgram) {
      std::string why = "the peer is gone or runs another program than when it connected";
      os::Log::write(4, os::format("closing connection %@: %s", {description(), why}));
      invalidate(why);
      return;
    }
    received(std::move(*next.value()));
  }
  readMore();
}

os::Result<std::size_t> Connection::receive() {
  iovec space{decoder_.prepare(kReadChunk), kReadChunk};
  alignas(cmsghdr) char control[CMSG_SPACE(sizeof(ucred))];
  msghdr message{};
  message.msg_iov = &space;
  message.msg_iovlen = 1;
  message.msg_control = control;
  message.msg_controllen = sizeof control;
  ssize_t n;
  do {
    n = recvmsg(socket_.native_handle(), &message, MSG_DONTWAIT | MSG_CMSG_CLOEXEC);
  } while (n < 0 && errno == EINTR);
  if (n < 0) return os::Error::fromErrno("read");
  if (n == 0 || !checksPeer_) return static_cast<std::size_t>(n);
  // The kernel never joins bytes of different writers in one read, so one check covers them.
  ucred writer{};
  cmsghdr* header = CMSG_FIRSTHDR(&message);
  if (header && header->cmsg_level == SOL_SOCKET && header->cmsg_type == SCM_CREDENTIALS) {
    std::memcpy(&writer, CMSG_DATA(header), sizeof writer);
  }
  if (writer.pid != peer_.pid || writer.uid != peer_.uid) {
    return os::Error{EPERM, os::format("bytes written by pid %d uid %u, not by the peer",
                                       {writer.pid, writer.uid})};
  }
  return static_cast<std::size_t>(n);
}

bool Connection::peerRunsSameProgram() const {
  if (!checksPeer_) return true;
  auto now = peer_.procDirectory >= 0 ? os::Process::executableIdentityAt(peer_.procDirectory)
                                      : os::Process::executableIdentity(peer_.pid);
  return peer_.program && now.ok() && now.value() == *peer_.program;
}

void Connection::received(Frame frame) {
  switch (frame.kind) {
    case FrameKind::Request:
    case FrameKind::OneWay:
      deliver(Message{std::move(frame.body), frame.id, frame.kind == FrameKind::Request});
      return;
    case FrameKind::Reply:
      receivedReply(std::move(frame));
      return;
    case FrameKind::Control: {
      auto* body = frame.body.asDictionary();
      auto* control = body ? body->find("control") : nullptr;
      if (control && control->asString() && *control->asString() == "goodbye") {
        deliver(ServiceError{ErrorKind::TerminationImminent, "Termination imminent"});
      } else {
        os::Log::write(4, os::format("ignoring unknown control message %@ on connection %@",
                                     {frame.body.description(), description()}));
      }
      return;
    }
  }
}

void Connection::receivedReply(Frame frame) {
  ReplyHandler handler = takePending(frame.id);
  if (!handler) {
    os::Log::write(4, os::format("ignoring reply %llu without a request on connection %@",
                                 {frame.id, description()}));
    return;
  }
  queue_->dispatch([handler = std::move(handler), body = std::move(frame.body)] { handler(body); });
}

Connection::ReplyHandler Connection::takePending(std::uint64_t id) {
  std::lock_guard lock(pendingMutex_);
  auto it = pending_.find(id);
  if (it == pending_.end()) return nullptr;
  ReplyHandler handler = std::move(it->second);
  pending_.erase(it);
  return handler;
}

void Connection::invalidate(std::string why) {
  {
    std::lock_guard lock(writeMutex_);
    closed_ = true;
    std::error_code ignored;
    socket_.close(ignored);
  }
  std::unordered_map<std::uint64_t, ReplyHandler> pending;
  {
    std::lock_guard lock(pendingMutex_);
    invalid_ = true;
    pending.swap(pending_);
  }
  ServiceError error = invalidError(why);
  for (auto& entry : pending) {
    queue_->dispatch([handler = std::move(entry.second), error] { handler(error); });
  }
  auto self = shared_from_this();
  queue_->dispatch([self, error] {
    if (self->handler_) self->handler_(error);
    self->handler_ = nullptr;
  });
}

void Connection::deliver(Event event) {
  auto self = shared_from_this();
  queue_->dispatch([self, event = std::move(event)] {
    if (self->handler_) self->handler_(event);
  });
}

os::Status Connection::send(const Reply& reply) {
  if (!reply.expected()) return os::success();
  if (reply.streamed()) {
    return write(FrameKind::Reply,
                 std::make_unique<FrameSource>(FrameKind::Reply, reply.id(), reply.segments()));
  }
  return write(FrameKind::Reply, reply.id(),
               [&reply](std::vector<std::uint8_t>& item) { reply.encode(item); });
}

os::Status Connection::sendMessage(const value::Value& body) {
  return write(FrameKind::OneWay, 0, body);
}

void Connection::sendWithReply(const value::Value& body, ReplyHandler handler) {
  std::uint64_t id = nextId_.fetch_add(1, std::memory_order_relaxed);
  {
    std::lock_guard lock(pendingMutex_);
    if (invalid_) {
      queue_->async([handler = std::move(handler)] { handler(invalidError("closed")); });
      return;
    }
    pending_.emplace(id, std::move(handler));
  }
  os::Status sent = write(FrameKind::Request, id, body);
  if (sent.ok()) return;
  // Unless the connection ended meanwhile and answered it already.
  if (ReplyHandler refused = takePending(id)) {
    ServiceError error{ErrorKind::MessageTooLarge, sent.error().message};
    queue_->async([refused = std::move(refused), error] { refused(error); });
  }
}

void Connection::cancel() {
  static_cast<void>(
      write(FrameKind::Control, 0,
            value::Value::dictionary({{"control", value::Value::string("goodbye")}})));
  std::lock_guard lock(writeMutex_);
  shutdownSocket();
}

os::Status Connection::write(FrameKind kind, std::uint64_t id, const value::Value& body) {
  return write(kind, id,
               [&body](std::vector<std::uint8_t>& item) { value::CborCodec::encode(body, item); });
}

os::Status Connection::write(FrameKind kind, std::uint64_t id, const ItemWriter& writeItem) {
  // Frames are encoded into a buffer kept by the writing thread, so a large reply neither grows
  // a new vector step by step nor faults in fresh pages each time.
  thread_local std::vector<std::uint8_t> bytes;
  bytes.clear();
  struct Trim {
    ~Trim() {
      if (bytes.capacity() > kKeptWriteBuffer) std::vector<std::uint8_t>().swap(bytes);
    }
  } trim;
  if (!encodeFrame(kind, id, writeItem, bytes)) {
    return os::Error{EMSGSIZE, os::format("%s too large (4 GiB or more, limit %zu)",
                                          {kindName(kind), limits_.maxFrameBytes})};
  }
  // The length field counts what follows its own 4 bytes; the peer refuses more than the limit.
  std::size_t length = bytes.size() - 4;
  if (length > limits_.maxFrameBytes) {
    return os::Error{EMSGSIZE, os::format("%s too large (%zu bytes, limit %zu)",
                                          {kindName(kind), length, limits_.maxFrameBytes})};
  }
  std::lock_guard lock(writeMutex_);
  if (closed_) return os::success();
  std::size_t offset = 0;
  if (backlog_.empty() && sendNow(bytes, offset)) return os::success();
  // The frame's buffer goes to the backlog as it is, and this thread takes the connection's
  // spare in its place: nothing is copied.
  std::size_t size = bytes.size();
  enqueue(Pending{std::exchange(bytes, std::move(spare_)), nullptr, size}, offset);
  return os::success();
}

os::Status Connection::write(FrameKind kind, std::unique_ptr<FrameSource> source) {
  if (!source->valid() || source->size() - 4 > limits_.maxFrameBytes) {
    std::string size = source->valid() ? os::format("%zu bytes", {source->size() - 4})
                                       : std::string("4 GiB or more");
    return os::Error{EMSGSIZE, os::format("%s too large (%s, limit %zu)",
                                          {kindName(kind), size, limits_.maxFrameBytes})};
  }
  std::lock_guard lock(writeMutex_);
  if (closed_) return os::success();
  const std::size_t size = source->size();
  Pending pending{std::move(spare_), std::move(source), size};
  std::size_t offset = 0;
  // Pieces go out while the socket takes them; the one it does not take waits in the backlog
  // with the rest of the frame.
  while (backlog_.empty()) {
    pending.bytes.clear();
    pending.more->fill(pending.bytes, kPieceBytes);
    offset = 0;
    if (!sendNow(pending.bytes, offset)) break;
    if (pending.more->done()) {
      spare_ = std::move(pending.bytes);
      return os::success();
    }
  }
  enqueue(std::move(pending), offset);
  return os::success();
}

void Connection::enqueue(Pending pending, std::size_t offset) {
  if (backlog_.empty()) backlogOffset_ = offset;
  backlogBytes_ += pending.accounted;
  backlog_.push_back(std::move(pending));
  if (backlog_.size() > 1 && backlogBytes_ > kMaxBacklogBytes) {
    os::Log::write(4, os::format("disconnecting %@: more than %zu bytes wait to be sent",
                                 {description(), kMaxBacklogBytes}));
    shutdownSocket();
    return;
  }
  if (!flushing_) {
    flushing_ = true;
    flushLater();
  }
}

void Connection::flushLater() {
  auto self = shared_from_this();
  asio::post(queue_->context(), [self] {
    self->socket_.async_wait(asio::socket_base::wait_write,
                             [self](std::error_code) { self->flush(); });
  });
}

void Connection::flush() {
  std::lock_guard lock(writeMutex_);
  while (!closed_ && !backlog_.empty()) {
    Pending& front = backlog_.front();
    if (!sendNow(front.bytes, backlogOffset_)) {
      flushLater();
      return;
    }
    backlogOffset_ = 0;
    if (front.more && !front.more->done()) {
      front.bytes.clear();
      front.more->fill(front.bytes, kPieceBytes);
      continue;
    }
    backlogBytes_ -= front.accounted;
    if (front.bytes.capacity() <= kKeptWriteBuffer) spare_ = std::move(front.bytes);
    backlog_.pop_front();
  }
  flushing_ = false;
}

bool Connection::sendNow(std::vector<std::uint8_t>& bytes, std::size_t& offset) {
  while (offset < bytes.size()) {
    ssize_t n = ::send(socket_.native_handle(), bytes.data() + offset, bytes.size() - offset,
                       MSG_DONTWAIT | MSG_NOSIGNAL);
    if (n > 0) {
      offset += static_cast<std::size_t>(n);
    } else if (n < 0 && errno == EINTR) {
      continue;
    } else if (n < 0 && (errno == EAGAIN || errno == EWOULDBLOCK)) {
      return false;
    } else {
      // The peer is gone; the reader sees the end of the stream and invalidates.
      offset = bytes.size();
    }
  }
  return true;
}

void Connection::shutdownSocket() {
  if (!closed_) ::shutdown(socket_.native_handle(), SHUT_RDWR);
}

std::optional<std::string> Connection::peerExecutablePath() const {
  auto path = os::Process::executablePath(peer_.pid, peer_.pidfd);
  if (!path.ok()) return std::nullopt;
  return path.value();
}

std::string Connection::description() const {
  return os::format("<zyn connection %p service=%s pid=%d>",
                    {static_cast<const void*>(this), serviceName_, peer_.pid});
}

}  // namespace zyn
