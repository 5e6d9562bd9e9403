// Feeds arbitrary bytes to CborCodec::decode. Whatever it accepts must encode to bytes that
// decode again and encode to the same bytes. Seeds: fuzz/corpus/cbor/.

#include <cstdint>
#include <cstdlib>
#include <span>
#include <vector>

#include "platform/value/CborCodec.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  auto value = value::CborCodec::decode(std::span(data, size));
  if (!value.ok()) return 0;
  std::vector<std::uint8_t> once;
  value::CborCodec::encode(value.value(), once);
  auto again = value::CborCodec::decode(once);
  if (!again.ok()) std::abort();
  std::vector<std::uint8_t> twice;
  value::CborCodec::encode(again.value(), twice);
  if (twice != once) std::abort();
  return 0;
}
