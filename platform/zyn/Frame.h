#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <vector>

#include "platform/os/Error.h"
#include "platform/value/Value.h"

namespace zyn {

// What a frame is for. The numbers are the kind byte on the wire.
enum class FrameKind : std::uint8_t { Request = 1, Reply = 2, OneWay = 3, Control = 4 };

// One message on a connection: a reply carries its request's id; ids are the sender's choice.
struct Frame {
  FrameKind kind;
  std::uint64_t id;
  value::Value body;
};

struct FrameLimits {
  // The environment variable that sets maxFrameBytes for the connections of a process.
  static constexpr const char* kMaxFrameBytesVariable = "AXD_MAX_FRAME_BYTES";
  // The range a setting of kMaxFrameBytesVariable must fall in: room for any error reply, and
  // what the 4-byte length field can say.
  static constexpr std::size_t kLeastMaxFrameBytes = 4096;
  static constexpr std::size_t kMostMaxFrameBytes = UINT32_MAX;

  // The defaults, with maxFrameBytes from kMaxFrameBytesVariable when that holds a decimal
  // number in range; any other setting is logged and the default kept.
  static FrameLimits fromEnvironment();

  // Largest length field accepted: the bytes after the 4-byte length (kind, id and item).
  std::size_t maxFrameBytes = 64u << 20;
  // Deepest nesting of arrays, maps and envelopes in an item.
  std::size_t maxDepth = 128;
  // An item may hold at most one value per kItemBytes bytes of its encoding, plus kSmallItems,
  // so what a frame decodes to stays in proportion to its size: a value costs some 32 bytes in
  // memory, and a run of one-byte items would otherwise turn 64 MiB into gigabytes.
  static constexpr std::size_t kItemBytes = 4;
  static constexpr std::size_t kSmallItems = 64;
};

// Appends the whole encoded frame to |out|: 4-byte big-endian length N of what follows, the kind
// byte, the 8-byte big-endian id and the CBOR item (N - 9 bytes). The caller keeps bodies under
// the peer's limit. False, with |out| as it was, when the frame would be 4 GiB or more, which the
// length field cannot say.
bool encodeFrame(const Frame& frame, std::vector<std::uint8_t>& out);
// The same for a frame whose item |writeItem| appends to the vector it is given.
bool encodeFrame(FrameKind kind, std::uint64_t id,
                 const std::function<void(std::vector<std::uint8_t>&)>& writeItem,
                 std::vector<std::uint8_t>& out);
// Appends the 13 bytes that come before an item of |itemBytes| bytes in a frame of |kind| and
// |id|. False, with |out| as it was, when the frame would be 4 GiB or more.
bool encodeFrameHeader(FrameKind kind, std::uint64_t id, std::size_t itemBytes,
                       std::vector<std::uint8_t>& out);

// Incremental decoder over one connection's byte stream: the reader writes into prepare()'s
// space, commits what it read, then takes frames with next() until it yields nothing. Bytes are
// decoded where they were read; the buffer is compacted only when space runs out at its end.
// One per connection; not thread-safe.
class FrameDecoder {
 public:
  explicit FrameDecoder(FrameLimits limits = {});

  FrameDecoder(const FrameDecoder&) = delete;
  FrameDecoder& operator=(const FrameDecoder&) = delete;

  // Space for at least |n| more bytes, valid until the next call on this decoder. The buffer
  // grows geometrically and is released when a large frame has been consumed.
  std::uint8_t* prepare(std::size_t n);
  // Marks |n| bytes of the last prepare()'s space as read; |n| is at most what was asked for.
  void commit(std::size_t n);

  // The next complete frame, or nothing when more bytes are needed. An Error when the stream is
  // broken: a length under 9 or over the limit (errnum EMSGSIZE, reported as soon as the
  // 4 length bytes are in), an unknown kind, or an item that fails to decode, nests too deeply
  // or leaves bytes over inside the frame (errnum EBADMSG). After an error every call returns
  // the same error; the caller closes the stream.
  os::Result<std::optional<Frame>> next();

 private:
  std::size_t buffered() const { return end_ - begin_; }
  // The length field of the frame at the front, when its 4 bytes are in.
  std::optional<std::uint32_t> frameLength() const;
  os::Error broken(int errnum, std::string message);

  FrameLimits limits_;
  std::unique_ptr<std::uint8_t[]> buffer_;
  std::size_t capacity_ = 0;
  std::size_t begin_ = 0;  // First unconsumed byte.
  std::size_t end_ = 0;    // One past the last committed byte.
  std::optional<os::Error> error_;
};

}  // namespace zyn
