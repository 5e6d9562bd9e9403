#pragma once

#include <sys/stat.h>
#include <sys/types.h>
#include <time.h>

#include <memory>
#include <string>
#include <unordered_map>
#include <utility>
#include <vector>

namespace types {

// One reading of a shared-mime-info directory (<root>/usr/share/mime): its "subclasses" file
// (lines "child parent") and its "aliases" file (lines "alias canonical"). Blank lines and lines
// starting with '#' are skipped; a line that is not two media types (MediaType::concrete) is
// ignored, and each file read logs how many it ignored. A missing file reads as empty; one that
// exists but cannot be read also reads as empty, with a log line.
//
// Immutable once read: safe for concurrent access from multiple threads without any external
// synchronization. Every name it holds or returns is lower case and canonical (aliases resolved).
class MimeDatabase {
 public:
  // Reads the files of |directory| (the "usr/share/mime" of a device root). Never fails.
  static std::shared_ptr<const MimeDatabase> read(const std::string& directory);

  MimeDatabase(const MimeDatabase&) = delete;
  MimeDatabase& operator=(const MimeDatabase&) = delete;

  // True when neither file changed since this reading: same presence, device, inode, size and
  // modification time. Costs two stat calls.
  bool isCurrent() const;

  // The canonical name of the lower-case media type |type|: its alias target, or |type| itself
  // when it is no alias. Aliases resolve one step, as the file lists them.
  std::string canonical(const std::string& type) const;

  // The declared parents of the canonical lower-case type |type|, in file order; empty when it
  // has none.
  const std::vector<std::string>& parents(const std::string& type) const;

  // The aliases whose canonical name is the lower-case type |type|, in file order; empty when it
  // has none.
  const std::vector<std::string>& aliases(const std::string& type) const;

 private:
  // What identifies one version of a file; all zero for a file that is missing.
  struct FileStamp {
    bool exists = false;
    dev_t device = 0;
    ino_t inode = 0;
    off_t size = 0;
    timespec modified{};

    bool operator==(const FileStamp& other) const;
    static FileStamp of(const std::string& path);
    static FileStamp of(const struct stat& status);
  };

  using Pairs = std::vector<std::pair<std::string, std::string>>;

  explicit MimeDatabase(std::string directory) : directory_(std::move(directory)) {}

  // Appends the media-type pairs of the file |path| to |pairs|; returns the stamp of what it read.
  static FileStamp readPairs(const std::string& path, Pairs& pairs);

  std::string directory_;
  FileStamp aliasesStamp_;
  FileStamp subclassesStamp_;
  std::unordered_map<std::string, std::string> aliases_;
  std::unordered_map<std::string, std::vector<std::string>> aliasesOf_;
  std::unordered_map<std::string, std::vector<std::string>> parents_;
};

}  // namespace types
