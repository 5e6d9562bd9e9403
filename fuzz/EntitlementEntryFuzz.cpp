// Feeds arbitrary bytes, read as a property list, to EntitlementTable::entryFrom, the parser of
// one entitlement table file. An entry it accepts names an absolute executable and, when it has
// one, a 64-digit lower-case digest. Seeds: fuzz/corpus/entitlements/.

#include <cctype>
#include <cstdint>
#include <cstdlib>
#include <span>

#include "platform/codesign/EntitlementTable.h"
#include "platform/value/PropertyList.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  auto file = value::PropertyList::read(std::span(data, size));
  if (!file.ok()) return 0;
  auto entry = codesign::EntitlementTable::entryFrom("fuzz.plist", file.value());
  if (!entry.ok()) return 0;
  if (!entry.value().executable.starts_with('/')) std::abort();
  if (const auto& digest = entry.value().sha256) {
    if (digest->size() != 64) std::abort();
    for (unsigned char c : *digest) {
      if (!std::isxdigit(c) || std::isupper(c)) std::abort();
    }
  }
  return 0;
}
