#pragma once

#include <cstdint>
#include <string>
#include <vector>

// A listening socket at a named service's path under the root in force, which reads what a
// client sends as raw bytes, with no decoding: what the client library puts on the wire. For
// tests: a socket that cannot be made fails the test. Not thread-safe.
class RawService {
 public:
  explicit RawService(const std::string& name);
  ~RawService();
  RawService(const RawService&) = delete;
  RawService& operator=(const RawService&) = delete;

  // The first frame of the next connection, or what arrived of it within ten seconds.
  std::vector<std::uint8_t> firstFrame();
  // The message id in the header of |frame|; what there is of it when the header is cut short.
  static std::uint64_t idOf(const std::vector<std::uint8_t>& frame);

 private:
  int fd_ = -1;
};
