#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <utility>

#include "platform/os/Error.h"
#include "platform/value/Dictionary.h"

namespace prefs {

// One preference domain's file as this process last read it.
//
// A version of the file is known by its stamp: device, inode, size, and modification and
// status-change times with nanoseconds. A rename over the file (new inode), a rewrite in place
// (new times, maybe size) and a removal all change it. File systems stamp times from a clock
// that advances in ticks (a few milliseconds, a second on some), so a rewrite within the tick
// of the last read could keep the stamp: a file whose status changed less than kSettleSeconds
// before it was read is read again at the next synchronize, until a read finds it settled.
//
// Not thread-safe: Preferences guards every DomainFile with its lock.
class DomainFile {
 public:
  static constexpr std::int64_t kSettleSeconds = 2;

  explicit DomainFile(std::string path) : path_(std::move(path)) {}

  // Re-reads the file unless its stamp is the one of the last read and that read found it
  // settled. A file that cannot be read as a dictionary leaves contents() nothing; the reason is
  // logged when the stamp changed (so once per change), except for a missing file.
  void synchronize();

  // Whether synchronize ran at least once.
  bool synchronized() const { return stamp_.has_value(); }

  // The dictionary as of the last synchronize; nothing before it, or when the file was missing,
  // unreadable, not a property list or not a dictionary.
  const std::optional<value::Dictionary>& contents() const { return contents_; }

  // The dictionary in the file at |path|. ENOENT for a missing file, EINVAL when it is not a
  // property list or not a dictionary, otherwise the errno of the read; messages name the path.
  static os::Result<value::Dictionary> read(const std::string& path);

  // Replaces the file at |path| (its directory must exist) with |contents| as an XML property
  // list: written to a hidden temporary file beside it (mode 0600, the user's own settings),
  // flushed, renamed over |path|, and the directory flushed. A reader sees the old file or the
  // new one, never a part. EINVAL when a property list cannot hold |contents|, otherwise the
  // errno of the failed step; the temporary file is removed and |path| left unchanged.
  static os::Status write(const std::string& path, const value::Dictionary& contents);

 private:
  struct Stamp {
    int error = 0;  // The errno of a failed stat; the other fields are then zero.
    std::uint64_t device = 0, inode = 0;
    std::int64_t size = 0, modified = 0, changed = 0;  // Times in nanoseconds since 1970.
    bool operator==(const Stamp&) const = default;
  };

  static Stamp stampOf(const std::string& path);

  std::string path_;
  std::optional<Stamp> stamp_;
  bool settled_ = false;
  std::optional<value::Dictionary> contents_;
};

}  // namespace prefs
