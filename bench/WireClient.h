#pragma once

#include <chrono>
#include <cstdint>
#include <memory>
#include <span>
#include <string>
#include <vector>

#include "platform/os/Error.h"

// A bare stream connection to the daemon's socket that sends request frames made beforehand and
// reads each reply frame whole, by its length field, without decoding its item: a round trip
// costs this side only its socket calls, so what it measures is the daemon and the socket. One
// request at a time. Not thread-safe.
class WireClient {
 public:
  // Long enough for the first discovery of a large registry on a loaded machine; only a silent
  // daemon reaches it.
  static constexpr std::chrono::seconds kTimeout{60};

  // Connects to the socket at |path|; fails with the system's error.
  static os::Result<std::unique_ptr<WireClient>> connect(const std::string& path);
  ~WireClient();
  WireClient(const WireClient&) = delete;
  WireClient& operator=(const WireClient&) = delete;

  // Writes |request|, one whole request frame, and reads the frame that answers it. Fails with
  // EPROTO when the next frame is not a reply with |request|'s id or more bytes came after it,
  // with EPIPE when the daemon closed the connection, and with the system's error otherwise
  // (EAGAIN when kTimeout passed).
  os::Status roundTrip(std::span<const std::uint8_t> request);

  // The whole frame of the last reply; valid until the next round trip.
  std::span<const std::uint8_t> reply() const { return {buffer_.data(), replyBytes_}; }

 private:
  explicit WireClient(int fd);

  os::Status send(std::span<const std::uint8_t> bytes);
  // Reads one frame into buffer_ and sets replyBytes_.
  os::Status receive();

  const int fd_;
  // Grows to the largest reply and stays: a long reply is not read into fresh pages each time.
  std::vector<std::uint8_t> buffer_;
  std::size_t replyBytes_ = 0;
};
