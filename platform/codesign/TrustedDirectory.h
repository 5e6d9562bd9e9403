#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "platform/os/Error.h"
#include "platform/value/Value.h"

namespace codesign {

// The property-list files of a configuration directory that decide who may do what (the
// entitlement table, the trusted signing keys): "<directory>/*.plist",
// hidden files excluded, in name order. Only a regular file that root or the daemon's user owns
// and that neither group nor others may write counts, opened without following a link and
// without blocking (a FIFO cannot stall the reader); any other file, and one that is no property
// list, is skipped with a log line "<what>: ignoring <path>: <why>".
class TrustedDirectory {
 public:
  struct File {
    std::string path;
    value::Value contents;
  };

  // The files of |directory| (a path) that count, with their contents. A missing directory has
  // none. Fails with the
  // system's error number only when the directory exists and cannot be listed.
  static os::Result<std::vector<File>> load(std::string_view directory, std::string_view what);

  // The entries that |parse| (path, contents -> an entry or the error saying why not) makes of
  // the files that load() gives; a file it refuses is skipped with a log line, as load() skips.
  template <typename Entry, typename Parse>
  static os::Result<std::vector<Entry>> parseEach(std::string_view directory, std::string_view what,
                                                  Parse parse) {
    os::Result<std::vector<File>> files = load(directory, what);
    if (!files.ok()) return files.error();
    std::vector<Entry> entries;
    for (const File& file : files.value()) {
      os::Result<Entry> entry = parse(file.path, file.contents);
      if (entry.ok()) {
        entries.push_back(std::move(entry).value());
      } else {
        skip(what, file.path, entry.error().message);
      }
    }
    return entries;
  }

  // Logs that |path| is skipped, as load() does.
  static void skip(std::string_view what, const std::string& path, std::string_view why);
};

}  // namespace codesign
