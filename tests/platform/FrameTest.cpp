#include <gtest/gtest.h>

#include <cerrno>
#include <cstring>

#include "platform/zyn/Frame.h"

namespace {

using value::Value;
using zyn::Frame;
using zyn::FrameDecoder;
using zyn::FrameKind;

Frame bulkRequest(std::uint64_t id) {
  return Frame{FrameKind::Request, id,
               Value::dictionary({{"request", Value::string("bulk")},
                                  {"version", Value::unsignedInteger(3)},
                                  {"flags", Value::unsignedInteger(0)}})};
}

std::vector<std::uint8_t> encoded(const Frame& frame) {
  std::vector<std::uint8_t> out;
  zyn::encodeFrame(frame, out);
  return out;
}

void feed(FrameDecoder& decoder, const std::uint8_t* bytes, std::size_t n) {
  std::memcpy(decoder.prepare(n), bytes, n);
  decoder.commit(n);
}

std::vector<std::uint8_t> header(std::uint32_t length, std::uint8_t kind) {
  return {static_cast<std::uint8_t>(length >> 24),
          static_cast<std::uint8_t>(length >> 16),
          static_cast<std::uint8_t>(length >> 8),
          static_cast<std::uint8_t>(length),
          kind,
          0,
          0,
          0,
          0,
          0,
          0,
          0,
          7};
}

os::Error errorAfter(const std::vector<std::uint8_t>& bytes, zyn::FrameLimits limits = {}) {
  FrameDecoder decoder(limits);
  feed(decoder, bytes.data(), bytes.size());
  auto next = decoder.next();
  EXPECT_FALSE(next.ok());
  return next.ok() ? os::Error{} : next.error();
}

TEST(FrameTest, BrokenFramesAreRefusedAndStayBroken) {
  // A length is refused before the body arrives: too long, or too short for kind and id.
  std::vector<std::uint8_t> oversized = header(1001, 1);
  oversized.resize(4);
  EXPECT_EQ(errorAfter(oversized, {.maxFrameBytes = 1000}).errnum, EMSGSIZE);
  EXPECT_EQ(errorAfter(header(8, 1)).errnum, EMSGSIZE);
  EXPECT_NE(errorAfter({0, 0, 0, 10, 5}).message.find("kind 5"), std::string::npos);
  EXPECT_NE(errorAfter({0, 0, 0, 10, 0}).message.find("kind 0"), std::string::npos);
  std::vector<std::uint8_t> leftover = header(11, 3);
  leftover.insert(leftover.end(), {0x05, 0x05});
  EXPECT_NE(errorAfter(leftover).message.find("follow"), std::string::npos);
  EXPECT_EQ(errorAfter(header(9, 2)).errnum, EBADMSG);  // no item at all
  std::vector<std::uint8_t> deep = header(9 + 3, 2);
  deep.insert(deep.end(), {0x81, 0x81, 0x80});
  EXPECT_NE(errorAfter(deep, {.maxDepth = 2}).message.find("frame 7"), std::string::npos);

  FrameDecoder decoder;
  feed(decoder, leftover.data(), leftover.size());
  std::vector<std::uint8_t> good = encoded(bulkRequest(2));
  feed(decoder, good.data(), good.size());
  EXPECT_FALSE(decoder.next().ok());
  EXPECT_FALSE(decoder.next().ok());
}

}  // namespace
