// Decodes arbitrary bytes as the registry's stored forms with registrum::RecordCodec: a change
// log payload (decodeList) and a dictionary (decodeDictionary). What decodes encodes to bytes
// that decode again, to as many records or to the same dictionary. Seeds: fuzz/corpus/record/.

#include <cstdint>
#include <cstdlib>
#include <span>

#include "FuzzInput.h"
#include "platform/registrum/RecordCodec.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  std::span<const std::uint8_t> bytes(data, size);
  if (auto list = registrum::RecordCodec::decodeList(bytes); list.ok()) {
    auto again =
        registrum::RecordCodec::decodeList(registrum::RecordCodec::encodeList(list.value()));
    if (!again.ok() || again.value().size() != list.value().size()) std::abort();
  }
  if (auto dictionary = registrum::RecordCodec::decodeDictionary(bytes); dictionary.ok()) {
    auto again = registrum::RecordCodec::decodeDictionary(
        registrum::RecordCodec::encodeDictionary(dictionary.value()));
    if (!again.ok() || !fuzz::sameValue(value::Value::dictionary(again.value()),
                                        value::Value::dictionary(dictionary.value())))
      std::abort();
  }
  return 0;
}
