// Feeds arbitrary bytes to FrameDecoder in chunks of varying size and checks that every frame it
// yields survives encoding and decoding again. The first input byte seeds the chunk sizes; the
// rest is the stream. Seeds: fuzz/corpus/frame/.

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <random>
#include <vector>

#include "platform/zyn/Frame.h"

namespace {

// The frame's encoding after one more trip through a fresh decoder, which must succeed.
std::vector<std::uint8_t> reencoded(const std::vector<std::uint8_t>& bytes) {
  zyn::FrameDecoder decoder;
  std::memcpy(decoder.prepare(bytes.size()), bytes.data(), bytes.size());
  decoder.commit(bytes.size());
  auto again = decoder.next();
  if (!again.ok() || !again.value()) std::abort();
  std::vector<std::uint8_t> out;
  zyn::encodeFrame(*again.value(), out);
  return out;
}

// Equal encodings mean equal frames, NaN payloads included, which Value's == cannot say.
void checkRoundTrip(const zyn::Frame& frame) {
  std::vector<std::uint8_t> bytes;
  zyn::encodeFrame(frame, bytes);
  if (reencoded(bytes) != bytes) std::abort();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size == 0) return 0;
  std::minstd_rand chunks(data[0]);
  zyn::FrameDecoder decoder({.maxFrameBytes = 1u << 20, .maxDepth = 128});
  for (std::size_t at = 1; at < size;) {
    std::size_t n = std::min<std::size_t>(1 + chunks() % 97, size - at);
    std::memcpy(decoder.prepare(n), data + at, n);
    decoder.commit(n);
    at += n;
    for (;;) {
      auto next = decoder.next();
      if (!next.ok()) return 0;
      if (!next.value()) break;
      checkRoundTrip(*next.value());
    }
  }
  return 0;
}
