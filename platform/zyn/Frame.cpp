#include "platform/zyn/Frame.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cstdlib>
#include <cstring>
#include <string_view>

#include "platform/os/Format.h"
#include "platform/os/Log.h"
#include "platform/value/CborCodec.h"

namespace zyn {

namespace {

constexpr std::size_t kLengthBytes = 4;
constexpr std::size_t kHeaderBytes = kLengthBytes + 1 + 8;
constexpr std::size_t kMinLength = kHeaderBytes - kLengthBytes;
// A buffer larger than this is given back once it holds nothing, so one large frame does not
// pin its memory for the life of the connection.
constexpr std::size_t kKeptCapacity = 1u << 20;
constexpr std::size_t kMinCapacity = 4096;

void putBigEndian(std::uint8_t* at, std::uint64_t v, std::size_t bytes) {
  for (std::size_t i = bytes; i-- > 0; v >>= 8) at[i] = static_cast<std::uint8_t>(v);
}

std::uint64_t getBigEndian(const std::uint8_t* at, std::size_t bytes) {
  std::uint64_t v = 0;
  for (std::size_t i = 0; i < bytes; ++i) v = (v << 8) | at[i];
  return v;
}

bool knownKind(std::uint8_t kind) {
  return kind >= static_cast<std::uint8_t>(FrameKind::Request) &&
         kind <= static_cast<std::uint8_t>(FrameKind::Control);
}

}  // namespace

bool encodeFrame(const Frame& frame, std::vector<std::uint8_t>& out) {
  return encodeFrame(
      frame.kind, frame.id,
      [&frame](std::vector<std::uint8_t>& item) { value::CborCodec::encode(frame.body, item); },
      out);
}

bool encodeFrame(FrameKind kind, std::uint64_t id,
                 const std::function<void(std::vector<std::uint8_t>&)>& writeItem,
                 std::vector<std::uint8_t>& out) {
  std::size_t start = out.size();
  encodeFrameHeader(kind, id, 0, out);
  writeItem(out);
  std::size_t length = out.size() - start - kLengthBytes;
  if (length > UINT32_MAX) {
    out.resize(start);
    return false;
  }
  putBigEndian(&out[start], length, kLengthBytes);
  return true;
}

bool encodeFrameHeader(FrameKind kind, std::uint64_t id, std::size_t itemBytes,
                       std::vector<std::uint8_t>& out) {
  std::size_t length = kMinLength + itemBytes;
  if (length > UINT32_MAX) return false;
  std::size_t start = out.size();
  out.resize(start + kHeaderBytes);
  putBigEndian(&out[start], length, kLengthBytes);
  out[start + kLengthBytes] = static_cast<std::uint8_t>(kind);
  putBigEndian(&out[start + kLengthBytes + 1], id, 8);
  return true;
}

FrameLimits FrameLimits::fromEnvironment() {
  FrameLimits limits;
  const char* setting = std::getenv(kMaxFrameBytesVariable);
  if (!setting) return limits;
  std::string_view text(setting);
  std::size_t bytes = 0;
  auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), bytes);
  if (error != std::errc() || end != text.data() + text.size() || bytes < kLeastMaxFrameBytes ||
      bytes > kMostMaxFrameBytes) {
    os::Log::write(
        4, os::format("ignoring %s=%s: not a number of bytes from %zu to %zu",
                      {kMaxFrameBytesVariable, text, kLeastMaxFrameBytes, kMostMaxFrameBytes}));
    return limits;
  }
  limits.maxFrameBytes = bytes;
  return limits;
}

FrameDecoder::FrameDecoder(FrameLimits limits) : limits_(limits) {}

std::uint8_t* FrameDecoder::prepare(std::size_t n) {
  if (buffer_ && capacity_ - end_ >= n) return buffer_.get() + end_;
  std::size_t live = buffered();
  if (buffer_ && capacity_ - live >= n) {
    std::memmove(buffer_.get(), buffer_.get() + begin_, live);
  } else {
    std::size_t capacity = std::max({capacity_ * 2, live + n, kMinCapacity});
    auto bigger = std::make_unique_for_overwrite<std::uint8_t[]>(capacity);
    if (live) std::memcpy(bigger.get(), buffer_.get() + begin_, live);
    buffer_ = std::move(bigger);
    capacity_ = capacity;
  }
  begin_ = 0;
  end_ = live;
  return buffer_.get() + end_;
}

void FrameDecoder::commit(std::size_t n) {
  end_ = std::min(end_ + n, capacity_);
}

std::optional<std::uint32_t> FrameDecoder::frameLength() const {
  if (buffered() < kLengthBytes) return std::nullopt;
  return static_cast<std::uint32_t>(getBigEndian(buffer_.get() + begin_, kLengthBytes));
}

os::Result<std::optional<Frame>> FrameDecoder::next() {
  if (error_) return *error_;
  auto length = frameLength();
  if (!length) return std::optional<Frame>();
  if (*length < kMinLength || *length > limits_.maxFrameBytes) {
    return broken(EMSGSIZE, os::format("frame length %u is outside 9...%u",
                                       {*length, limits_.maxFrameBytes}));
  }
  const std::uint8_t* frame = buffer_.get() + begin_;
  if (buffered() > kLengthBytes && !knownKind(frame[kLengthBytes])) {
    return broken(EBADMSG, os::format("unknown frame kind %u", {frame[kLengthBytes]}));
  }
  if (buffered() < kLengthBytes + *length) return std::optional<Frame>();
  auto kind = static_cast<FrameKind>(frame[kLengthBytes]);
  std::uint64_t id = getBigEndian(frame + kLengthBytes + 1, 8);
  std::size_t itemBytes = *length - kMinLength;
  auto body =
      value::CborCodec::decode({frame + kHeaderBytes, itemBytes}, limits_.maxDepth,
                               itemBytes / FrameLimits::kItemBytes + FrameLimits::kSmallItems);
  if (!body.ok()) return broken(EBADMSG, os::format("frame %u: %s", {id, body.error().message}));
  begin_ += kLengthBytes + *length;
  if (begin_ == end_) {
    begin_ = end_ = 0;
    if (capacity_ > kKeptCapacity) {
      buffer_.reset();
      capacity_ = 0;
    }
  }
  return std::optional<Frame>(Frame{kind, id, std::move(body).value()});
}

os::Error FrameDecoder::broken(int errnum, std::string message) {
  error_ = os::Error{errnum, std::move(message)};
  return *error_;
}

}  // namespace zyn
