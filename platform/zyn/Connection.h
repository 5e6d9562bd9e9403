#pragma once

#include <sys/types.h>

#include <asio/local/stream_protocol.hpp>
#include <atomic>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "platform/os/Process.h"
#include "platform/zyn/Frame.h"
#include "platform/zyn/FrameSource.h"
#include "platform/zyn/Message.h"
#include "platform/zyn/Reply.h"
#include "platform/zyn/StrandQueue.h"

namespace zyn {

// The identity of the process at the other end of a connection, fixed when it was made.
struct PeerCredentials {
  pid_t pid = 0;
  uid_t uid = static_cast<uid_t>(-1);
  gid_t gid = static_cast<gid_t>(-1);
  // A pidfd for the peer: its audit token. -1 when the kernel could give none.
  int pidfd = -1;
  // The program file the peer ran when the connection was accepted; nothing when unknown.
  std::optional<os::FileIdentity> program;
  // The peer's directory in /proc (os::Process::openProcDirectory), through which its program
  // is checked; -1 when none could be opened, and the check then goes by pid.
  int procDirectory = -1;
};

// One connection of the message service, either end. Events (messages and the two terminal
// errors) are delivered one at a time, in order, on the connection's queue; reply handlers run
// on the same queue, and the connection reads on that queue's I/O thread. Sending is safe from
// any thread and never blocks: what the socket cannot take at once waits in a bounded backlog,
// and a peer that lets the backlog grow past its bound is disconnected. A frame over the
// connection's frame limit is neither read (the connection is closed) nor sent (refused, and the
// connection goes on). On the daemon's side only the process that connected may speak, and only
// as the program it ran then: bytes written by another process (a child that inherited the
// socket) or a request or message that arrives after the peer exec'd another program close the
// connection with a log line, undelivered. A connection stays alive while it is resumed and its
// socket open; the connection-invalid event is its last.
class Connection : public std::enable_shared_from_this<Connection> {
 public:
  using EventHandler = std::function<void(const Event&)>;
  using ReplyHandler = std::function<void(const ReplyOrError&)>;

  // Bytes of unsent replies and messages beyond which the peer is disconnected; one frame alone
  // (at most the frame limit) is always taken.
  static constexpr std::size_t kMaxBacklogBytes = 64u << 20;

  // A connection to the named service; it connects when resumed. Events and reply handlers run
  // on |queue|, and the socket is read on its I/O thread. The frame limits are read from the
  // environment now (FrameLimits::fromEnvironment()).
  static std::shared_ptr<Connection> toService(std::string serviceName,
                                               std::shared_ptr<StrandQueue> queue);

  // The daemon's side of an accepted socket (made by Listener).
  static std::shared_ptr<Connection> accepted(asio::local::stream_protocol::socket socket,
                                              PeerCredentials peer, std::string serviceName,
                                              FrameLimits limits);

  ~Connection();
  Connection(const Connection&) = delete;
  Connection& operator=(const Connection&) = delete;

  // Set before resume(). The handler is dropped after the connection-invalid event.
  void setEventHandler(EventHandler handler);
  // An object the connection keeps alive until it is destroyed (its finalizer is the release).
  void setContext(std::shared_ptr<void> context);
  const std::shared_ptr<void>& context() const { return context_; }

  // Starts delivering events; a client connection connects first. Call once.
  void resume();

  // Sends |reply| when its request expected one and the connection still works. An Error
  // (EMSGSIZE, "reply too large (N bytes, limit M)") when its frame would be over the limit:
  // nothing is sent, and the caller may send a smaller reply instead.
  os::Status send(const Reply& reply);
  // Sends a one-way message; an Error as send() gives, "message too large (...)", sends nothing.
  os::Status sendMessage(const value::Value& body);
  // Sends a request; |handler| runs once on the connection's queue with the reply, or with
  // the connection-invalid error when the connection ends first. A request over the frame limit
  // is not sent: |handler| gets the message-too-large error, "request too large (N bytes,
  // limit M)", and the connection goes on.
  void sendWithReply(const value::Value& body, ReplyHandler handler);
  // Tells the peer that this end is going away (the termination-imminent event on its side)
  // and closes the connection.
  void cancel();

  const PeerCredentials& peer() const { return peer_; }
  pid_t peerPid() const { return peer_.pid; }
  // The audit token: a pidfd of the peer, or -1.
  int auditToken() const { return peer_.pidfd; }
  // The peer's executable path, checked against the audit token; nothing when it cannot be
  // read or the peer has gone.
  std::optional<std::string> peerExecutablePath() const;

  std::string description() const;

 private:
  Connection(asio::local::stream_protocol::socket socket, PeerCredentials peer, bool checksPeer,
             std::string serviceName, std::shared_ptr<StrandQueue> queue, FrameLimits limits);

  void connectToService();
  void readMore();
  void readAvailable();
  // Reads what the socket has into the decoder: the byte count (0 at the end of the stream), an
  // EAGAIN error when there was nothing yet, or the error of the read. On the daemon's side an
  // EPERM error when the bytes were written by another process than the peer.
  os::Result<std::size_t> receive();
  // True when the peer still runs the program it ran at accept (always on the client's side).
  bool peerRunsSameProgram() const;
  void received(Frame frame);
  void receivedReply(Frame frame);
  // Takes the handler of request |id| out of pending_; null when it is not there.
  ReplyHandler takePending(std::uint64_t id);
  void invalidate(std::string why);
  void deliver(Event event);
  using ItemWriter = std::function<void(std::vector<std::uint8_t>&)>;
  os::Status write(FrameKind kind, std::uint64_t id, const value::Value& body);
  os::Status write(FrameKind kind, std::uint64_t id, const ItemWriter& writeItem);
  // Sends the frame of |source| a piece at a time.
  os::Status write(FrameKind kind, std::unique_ptr<FrameSource> source);
  // A frame waiting to be sent: |bytes| from backlogOffset_ on, then, for a streamed frame, the
  // pieces |more| has not written yet. |accounted| is what it counts in backlogBytes_: the whole
  // frame, as if it were held encoded.
  struct Pending {
    std::vector<std::uint8_t> bytes;
    std::unique_ptr<FrameSource> more;
    std::size_t accounted = 0;
  };
  // Queues |pending|, of which |offset| bytes were sent, behind the backlog and has it flushed;
  // disconnects a peer whose backlog grows past kMaxBacklogBytes. Under writeMutex_.
  void enqueue(Pending pending, std::size_t offset);
  void flushLater();
  void flush();
  bool sendNow(std::vector<std::uint8_t>& bytes, std::size_t& offset);
  void shutdownSocket();

  // Before socket_: the queue may keep the socket's event loop alive, so it must go last.
  const std::shared_ptr<StrandQueue> queue_;
  asio::local::stream_protocol::socket socket_;
  const PeerCredentials peer_;
  // Set on the daemon's side, where the writer of every read and the peer's program are checked.
  const bool checksPeer_;
  const std::string serviceName_;
  EventHandler handler_;
  std::shared_ptr<void> context_;
  const FrameLimits limits_;
  FrameDecoder decoder_;

  std::mutex pendingMutex_;  // guards pending_ and invalid_
  std::unordered_map<std::uint64_t, ReplyHandler> pending_;
  bool invalid_ = false;
  std::atomic<std::uint64_t> nextId_{1};

  std::mutex writeMutex_;  // guards the socket's descriptor for writing and everything below
  std::deque<Pending> backlog_;
  std::size_t backlogOffset_ = 0;
  // The last sent backlog buffer, reused for the next one so that a client that takes large
  // replies does not cost fresh pages for each.
  std::vector<std::uint8_t> spare_;
  std::size_t backlogBytes_ = 0;
  bool flushing_ = false;
  bool closed_ = false;
  std::string connectError_;  // written before the first read, then only read
};

}  // namespace zyn
