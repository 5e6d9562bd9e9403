#pragma once

#include <optional>
#include <string>

#include "platform/os/Error.h"
#include "platform/value/Value.h"

namespace prefs {

// Per-user preference domains. A domain is the property-list file
//   <per-user directory>/Preferences/<domain>.plist
// (per-user directory: os::Paths::perUserDir of the effective user), a dictionary from key to
// value, written by any program of the user and read here on demand.
//
// This process keeps the last read contents of each domain file, keyed by the file's path as the
// device root gives it at the call, so switching ANNEXA_ROOT switches caches too; entries are
// never dropped (a process reads a handful of domains). Safe for concurrent access from multiple
// threads without any external synchronization: one lock guards the cache and the file reads.
//
// A domain name is valid unless it is empty, is "." or "..", or holds a '/' or a NUL byte.
class Preferences {
 public:
  // Re-reads |domain| when its file changed since the last read (DomainFile says how a change
  // is recognised): a change made by another program is seen at the next call. A missing,
  // unreadable or broken file is not a failure: the domain is then empty. Fails only for an
  // invalid domain name, with EINVAL.
  static os::Status synchronize(const std::string& domain);

  // The value of |key| in |domain| as last synchronized; a domain never read before is
  // synchronized first. Nothing when the domain name is invalid, the file is missing,
  // unreadable, not a property list or not a dictionary (each such change of the file is
  // logged once, a missing file never), or the key is absent.
  static std::optional<value::Value> copyValue(const std::string& key, const std::string& domain);

  // Stores |value| under |key| in |domain|'s file, or removes the key when |value| is nothing,
  // and synchronizes the domain, so copyValue in this process sees the change at once. The file
  // is read afresh and replaced atomically (DomainFile::write), creating the Preferences
  // directory with mode 0700 when needed. Fails with EINVAL for an invalid domain name, a
  // present file that is not a dictionary property list (it is left as it is) or a value a
  // property list cannot hold; otherwise with the errno of the failed file operation. Writers
  // in different processes are not serialized: the last rename wins. For tools and tests; the
  // daemon only reads.
  static os::Status setValue(const std::string& key, const std::optional<value::Value>& value,
                             const std::string& domain);
};

}  // namespace prefs
