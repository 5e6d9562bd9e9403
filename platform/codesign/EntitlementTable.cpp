#include "platform/codesign/EntitlementTable.h"

#include <cctype>
#include <cerrno>
#include <cstring>
#include <string_view>
#include <vector>

#include "platform/codesign/DigestCache.h"
#include "platform/codesign/TrustedDirectory.h"
#include "platform/os/Format.h"
#include "platform/os/Log.h"
#include "platform/os/Paths.h"
#include "platform/value/Value.h"

namespace codesign {

namespace {

constexpr std::string_view kTableDir = "etc/annexa/entitlements.d";
constexpr std::string_view kWhat = "entitlement table";

// 64 hexadecimal digits in lower case, or nothing when |text| is not a SHA-256 digest.
std::optional<std::string> normalizedDigest(const std::string& text) {
  if (text.size() != 64) return std::nullopt;
  std::string digest;
  for (unsigned char c : text) {
    if (!std::isxdigit(c)) return std::nullopt;
    digest.push_back(static_cast<char>(std::tolower(c)));
  }
  return digest;
}

// The executable as the kernel would name it; a path that does not resolve stays as written.
std::string canonicalExecutable(const std::string& path) {
  auto resolved = os::Paths::canonical(path);
  return resolved.ok() ? resolved.value() : path;
}

}  // namespace

os::Result<EntitlementTable> EntitlementTable::load() {
  auto entries = TrustedDirectory::parseEach<Entry>(os::Paths::underRoot(kTableDir), kWhat,
                                                    &EntitlementTable::entryFrom);
  if (!entries.ok()) return entries.error();
  EntitlementTable table;
  table.entries_ = std::move(entries).value();
  return table;
}

os::Result<EntitlementTable::Entry> EntitlementTable::entryFrom(const std::string& source,
                                                                const value::Value& file) {
  const value::Dictionary* dict = file.asDictionary();
  if (!dict) return os::Error{EINVAL, "not a dictionary"};
  const value::Value* executable = dict->find("Executable");
  const std::string* executablePath = executable ? executable->asString() : nullptr;
  if (!executablePath || !executablePath->starts_with('/')) {
    return os::Error{EINVAL, "\"Executable\" is missing or not an absolute path"};
  }
  Entry entry{source, canonicalExecutable(*executablePath), std::nullopt, {}};
  if (const value::Value* digest = dict->find("SHA256")) {
    const std::string* text = digest->asString();
    entry.sha256 = text ? normalizedDigest(*text) : std::nullopt;
    if (!entry.sha256) return os::Error{EINVAL, "\"SHA256\" is not 64 hexadecimal digits"};
  }
  if (const value::Value* entitlements = dict->find("Entitlements")) {
    if (!entitlements->asDictionary()) {
      return os::Error{EINVAL, "\"Entitlements\" is not a dictionary"};
    }
    entry.entitlements = *entitlements->asDictionary();
  }
  return entry;
}

std::optional<value::Dictionary> EntitlementTable::lookup(const std::string& path,
                                                          int executableFd) const {
  std::optional<std::string> imageDigest;
  bool digested = false;
  for (const Entry& entry : entries_) {
    if (entry.executable != path) continue;
    if (!entry.sha256) return entry.entitlements;
    if (!digested && executableFd >= 0) {
      auto digest = DigestCache::shared().sha256(executableFd, path);
      if (digest.ok()) imageDigest = digest.value();
    }
    digested = true;
    if (imageDigest == entry.sha256) return entry.entitlements;
    os::Log::write(5, os::format("entitlement table: %s does not match the SHA256 in %s",
                                 {path, entry.source}));
  }
  return std::nullopt;
}

}  // namespace codesign
