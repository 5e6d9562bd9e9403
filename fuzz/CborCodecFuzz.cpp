// Feeds arbitrary bytes to CborCodec::decode. Whatever it accepts must encode to bytes that
// decode again and encode to the same bytes. A dictionary it accepts is also kept encoded
// around each of its keys and around a key it lacks (EncodedDictionary): written with any
// value there, it must give exactly the bytes of the dictionary with that value encoded whole.
// Seeds: fuzz/corpus/cbor/.

#include <cstdint>
#include <cstdlib>
#include <span>
#include <string>
#include <vector>

#include "platform/value/CborCodec.h"
#include "platform/value/EncodedDictionary.h"

namespace {

void checkSplice(const value::Dictionary& dictionary, const std::string& key,
                 const value::Value& value) {
  std::vector<std::uint8_t> spliced;
  value::EncodedDictionary(dictionary, key).encodeWith(value, spliced);
  std::vector<std::uint8_t> whole;
  value::CborCodec::encode(value::Value::dictionary(dictionary.with(key, value)), whole);
  if (spliced != whole) std::abort();
}

}  // namespace

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
  if (const value::Dictionary* dictionary = value.value().asDictionary()) {
    std::string absent = "annotations";
    while (dictionary->find(absent)) absent += "~";
    checkSplice(*dictionary, absent, value.value());
    for (const auto& entry : *dictionary) checkSplice(*dictionary, entry.first, value::Value());
  }
  return 0;
}
