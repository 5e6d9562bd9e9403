#pragma once

#include <optional>
#include <string>
#include <vector>

#include "platform/os/Error.h"
#include "platform/value/Dictionary.h"

namespace codesign {

// The entitlement table of a device root: every "<root>/etc/annexa/entitlements.d/*.plist" that
// counts (TrustedDirectory), each a dictionary with "Executable" (absolute path), optionally
// "SHA256" (the hex digest the executable must have) and "Entitlements" (a dictionary). A
// malformed file is skipped with a log line naming it. Immutable once loaded; safe to read from
// several threads at once.
class EntitlementTable {
 public:
  // Reads the table of the current device root (os::Paths::root()), files in name order. A
  // missing directory is an empty table. Fails with the system's error number only when the
  // directory exists and cannot be listed; a file that cannot be read is skipped.
  static os::Result<EntitlementTable> load();

  // The entitlements of the executable at |path| (as /proc/<pid>/exe names it), whose image
  // can be read through |executableFd| (-1 when it cannot). The first entry in file-name order
  // whose "Executable" is |path| and, when it has a "SHA256", whose digest equals the image's
  // wins. An entry without "Entitlements" gives an empty dictionary. Nothing when no entry
  // matches; a "SHA256" entry never matches without a readable image. The image's digest comes
  // from DigestCache::shared(), so an image already hashed is not read again.
  std::optional<value::Dictionary> lookup(const std::string& path, int executableFd) const;

  // The number of entries taken from the table files.
  std::size_t size() const { return entries_.size(); }

  // One file's entry, as entryFrom reads it.
  struct Entry {
    std::string source;  // the table file, for log lines
    std::string executable;
    std::optional<std::string> sha256;  // lower-case hex
    value::Dictionary entitlements;
  };

  // The entry that the table file |source| holding |file| describes, its executable path made
  // canonical when it resolves. Fails with EINVAL, saying why, when |file| is not a dictionary
  // of the shape above. Logs nothing: the caller decides what a bad file costs.
  static os::Result<Entry> entryFrom(const std::string& source, const value::Value& file);

 private:
  std::vector<Entry> entries_;
};

}  // namespace codesign
