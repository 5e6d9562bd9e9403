// Feeds arbitrary bytes, read as a property list, to the two parsers of signing files: a bundle's
// signature file (BundleSignature::parse, then the text it signs and the check of its signature)
// and a trust-store file (TrustStore::keyFrom). A trust file accepted names a key by 64
// lower-case hexadecimal digits; a signature file accepted signs a text of one line per file
// after the header. Seeds: fuzz/corpus/signing/.

#include <algorithm>
#include <cctype>
#include <cstdint>
#include <cstdlib>
#include <span>

#include "platform/codesign/BundleSignature.h"
#include "platform/codesign/TrustStore.h"
#include "platform/value/PropertyList.h"

namespace {

void checkTrustFile(const value::Value& file) {
  auto key = codesign::TrustStore::keyFrom("fuzz.plist", file);
  if (!key.ok()) return;
  const std::string& id = key.value().keyId;
  if (id.size() != 64 || !std::all_of(id.begin(), id.end(), [](unsigned char c) {
        return std::isxdigit(c) && !std::isupper(c);
      })) {
    std::abort();
  }
}

void checkSignatureFile(const value::Value& file) {
  auto parsed = codesign::BundleSignature::parse(file);
  if (!parsed.ok()) return;
  std::string text = codesign::BundleSignature::message(parsed.value().files);
  if (!text.starts_with(codesign::BundleSignature::kHeader)) std::abort();
  if (static_cast<std::size_t>(std::count(text.begin(), text.end(), '\n')) <
      parsed.value().files.size() + 1) {
    std::abort();
  }
  parsed.value().key.verify(text, parsed.value().signature);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  auto file = value::PropertyList::read(std::span(data, size));
  if (!file.ok()) return 0;
  checkTrustFile(file.value());
  checkSignatureFile(file.value());
  return 0;
}
