#pragma once

#include <chrono>
#include <cstdint>
#include <memory>
#include <span>
#include <string>

#include "platform/os/Error.h"
#include "platform/value/Value.h"
#include "platform/zyn/Frame.h"

// A bare stream connection to a daemon's socket, for the bytes and frames that the client
// library never sends. Every read waits at most kTimeout. Not thread-safe.
class RawClient {
 public:
  // Long enough for a loaded machine under sanitizers; only a silent daemon reaches it.
  static constexpr std::chrono::seconds kTimeout{30};

  // Connects to the socket at |path|; fails with the system's error.
  static os::Result<std::unique_ptr<RawClient>> connect(const std::string& path);
  ~RawClient();
  RawClient(const RawClient&) = delete;
  RawClient& operator=(const RawClient&) = delete;

  // A bulk request with |flags| in protocol version 3, as the client library builds it.
  static value::Value bulkRequest(std::uint64_t flags);

  // Writes all of |bytes|; false when the socket refused them.
  bool send(std::span<const std::uint8_t> bytes);
  // Encodes the frame and writes it.
  bool sendFrame(zyn::FrameKind kind, std::uint64_t id, const value::Value& body);

  // Sends |body| as request |id| and describes the next frame as BlockingClient::describe()
  // does when it is the reply to |id|; "no reply" when it is another frame, a bad one or none
  // came.
  std::string request(std::uint64_t id, const value::Value& body);
  // Reads the next frame and describes it as request() does.
  std::string reply(std::uint64_t id);
  // The socket, for a child process that is to use the connection.
  int fd() const { return fd_; }
  // True when the daemon closed the connection. Frames that come first are read and dropped.
  bool closedByPeer();

 private:
  explicit RawClient(int fd) : fd_(fd) {}

  // Reads what the socket has into the decoder; false at the end of the stream (then ended_ is
  // set), on an error or on timeout.
  bool fill();

  int fd_;
  bool ended_ = false;
  zyn::FrameDecoder decoder_;
};
