#include "platform/consent/ConsentStore.h"

#include <cerrno>

#include "platform/os/Log.h"
#include "platform/os/Paths.h"
#include "platform/value/PropertyList.h"
#include "platform/value/Value.h"

namespace consent {

namespace {

constexpr int kLogWarning = 4;

using Entries = std::vector<ConsentStore::Entry>;

std::optional<Entries> failure(const std::string& why) {
  os::Log::write(kLogWarning, "consent: " + why);
  return std::nullopt;
}

Entries entriesOf(const value::Array& elements) {
  Entries entries;
  for (const value::Value& element : elements) {
    const value::Dictionary* fields = element.asDictionary();
    const value::Value* service = fields ? fields->find("Service") : nullptr;
    if (!service || !service->asString()) continue;
    const value::Value* granted = fields->find("Granted");
    entries.push_back({*service->asString(), granted ? granted->asBool() : std::nullopt});
  }
  return entries;
}

}  // namespace

std::optional<Entries> ConsentStore::informationForBundle(const std::string& bundleIdentifier) {
  std::string path = os::Paths::underRoot("var/db/consent.plist");
  os::Result<value::Value> read = value::PropertyList::readFile(path);
  if (!read.ok()) {
    if (read.error().errnum == ENOENT) return Entries();
    return failure(read.error().message);
  }
  const value::Dictionary* bundles = read.value().asDictionary();
  if (!bundles) return failure(path + ": not a dictionary");
  const value::Value* bundle = bundles->find(bundleIdentifier);
  if (!bundle) return Entries();
  if (!bundle->asArray())
    return failure(path + ": the entry of " + bundleIdentifier + " is not an array");
  return entriesOf(*bundle->asArray());
}

}  // namespace consent
