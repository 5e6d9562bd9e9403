#include <gtest/gtest.h>

#include <cerrno>
#include <cstring>

#include "platform/zyn/Frame.h"

namespace {

using value::Dictionary;
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

// Every frame the decoder yields until it needs more bytes; fails the test on an error.
std::vector<Frame> drain(FrameDecoder& decoder) {
  std::vector<Frame> frames;
  for (;;) {
    auto next = decoder.next();
    EXPECT_TRUE(next.ok()) << next.error().message;
    if (!next.ok() || !next.value()) return frames;
    frames.push_back(std::move(*next.value()));
  }
}

void expectSame(const Frame& a, const Frame& b) {
  EXPECT_EQ(a.kind, b.kind);
  EXPECT_EQ(a.id, b.id);
  EXPECT_EQ(a.body, b.body);
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

TEST(FrameTest, LayoutIsLengthKindIdItem) {
  std::vector<std::uint8_t> bytes = encoded(bulkRequest(0x0102030405060708));
  ASSERT_GE(bytes.size(), 13u);
  std::uint32_t length = bytes[0] << 24 | bytes[1] << 16 | bytes[2] << 8 | bytes[3];
  EXPECT_EQ(length, bytes.size() - 4);
  EXPECT_EQ(bytes[4], 1);
  EXPECT_EQ(std::vector<std::uint8_t>(bytes.begin() + 5, bytes.begin() + 13),
            (std::vector<std::uint8_t>{1, 2, 3, 4, 5, 6, 7, 8}));
  EXPECT_EQ(bytes[13], 0xA3);  // a map of three entries
}

TEST(FrameTest, FramesSplitAtEveryByteBoundaryDecode) {
  std::vector<std::uint8_t> stream = encoded(bulkRequest(1));
  Frame reply{FrameKind::Reply, UINT64_MAX, Value::dictionary({})};
  zyn::encodeFrame(reply, stream);
  for (std::size_t split = 0; split <= stream.size(); ++split) {
    FrameDecoder decoder;
    feed(decoder, stream.data(), split);
    std::vector<Frame> frames = drain(decoder);
    feed(decoder, stream.data() + split, stream.size() - split);
    for (Frame& f : drain(decoder)) frames.push_back(std::move(f));
    ASSERT_EQ(frames.size(), 2u) << "split at " << split;
    expectSame(frames[0], bulkRequest(1));
    expectSame(frames[1], reply);
  }
}

TEST(FrameTest, LargeFramesArriveInChunks) {
  Frame big{FrameKind::OneWay, 9, Value::data(value::Data(3u << 20, 0xAB))};
  std::vector<std::uint8_t> stream = encoded(big);
  zyn::encodeFrame(bulkRequest(10), stream);
  FrameDecoder decoder;
  std::vector<Frame> frames;
  for (std::size_t at = 0; at < stream.size(); at += 65536) {
    feed(decoder, stream.data() + at, std::min<std::size_t>(65536, stream.size() - at));
    for (Frame& f : drain(decoder)) frames.push_back(std::move(f));
  }
  ASSERT_EQ(frames.size(), 2u);
  expectSame(frames[0], big);
  expectSame(frames[1], bulkRequest(10));
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
