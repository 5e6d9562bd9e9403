#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "platform/value/Value.h"
#include "platform/zyn/Frame.h"

// A client that speaks bytes, not the client library: for malformed frames, one-way messages and
// control frames. Blocking, with a timeout on every read.
class RawClient {
 public:
  explicit RawClient(const std::string& socketPath);
  ~RawClient();
  RawClient(const RawClient&) = delete;
  RawClient& operator=(const RawClient&) = delete;

  bool connected() const { return fd_ >= 0; }
  void sendBytes(const std::vector<std::uint8_t>& bytes);
  void sendFrame(zyn::FrameKind kind, std::uint64_t id, const value::Value& body);
  // The next frame from the daemon; nothing when the connection closed or |timeout| passed.
  std::optional<zyn::Frame> receive(std::chrono::milliseconds timeout = std::chrono::seconds(10));
  // True when the daemon closed the connection within |timeout|.
  bool closedByPeer(std::chrono::milliseconds timeout = std::chrono::seconds(10));
  void close();

 private:
  int fd_ = -1;
  zyn::FrameDecoder decoder_;
};
