// Feeds arbitrary bytes to PropertyList::read, binary and XML alike. Whatever it accepts and can
// write as XML must read back from that XML. Seeds: fuzz/corpus/plist/.

#include <cstdint>
#include <cstdlib>
#include <span>

#include "platform/value/PropertyList.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  auto value = value::PropertyList::read(std::span(data, size));
  if (!value.ok()) return 0;
  auto xml = value::PropertyList::toXml(value.value());
  if (!xml.ok()) return 0;
  auto text = reinterpret_cast<const std::uint8_t*>(xml.value().data());
  if (!value::PropertyList::read(std::span(text, xml.value().size())).ok()) std::abort();
  return 0;
}
