#include "platform/types/MimeDatabase.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <optional>
#include <sstream>

#include "platform/os/Error.h"
#include "platform/os/Log.h"
#include "platform/types/MediaType.h"

namespace types {

namespace {

constexpr int kLogWarning = 4;

// Far above the few tens of kilobytes of a full shared-mime-info database; a bigger file is not
// one, and reading it whole would only cost memory.
constexpr std::size_t kMaxFileSize = 4 << 20;

// All of |fd| from its current offset, or nothing when it holds more than kMaxFileSize bytes.
os::Result<std::optional<std::string>> readAll(int fd) {
  std::string contents;
  char buffer[16384];
  for (;;) {
    ssize_t got = ::read(fd, buffer, sizeof buffer);
    if (got < 0 && errno == EINTR) continue;
    if (got < 0) return os::Error::fromErrno("read");
    if (got == 0) return std::optional<std::string>(std::move(contents));
    if (contents.size() + static_cast<std::size_t>(got) > kMaxFileSize) {
      return std::optional<std::string>();
    }
    contents.append(buffer, static_cast<std::size_t>(got));
  }
}

// The pair of media types on |line|, or nothing when it holds anything else.
std::optional<std::pair<std::string, std::string>> pairOn(const std::string& line) {
  std::istringstream fields(line);
  std::string first, second, extra;
  if (!(fields >> first >> second) || (fields >> extra)) return std::nullopt;
  std::optional<std::string> left = MediaType::concrete(first);
  std::optional<std::string> right = MediaType::concrete(second);
  if (!left || !right) return std::nullopt;
  return std::make_pair(std::move(*left), std::move(*right));
}

bool isBlankOrComment(const std::string& line) {
  std::size_t start = line.find_first_not_of(" \t\r");
  return start == std::string::npos || line[start] == '#';
}

// Appends the pairs of |contents| to |pairs| and logs how many lines it ignored.
void parsePairs(const std::string& path, const std::string& contents,
                std::vector<std::pair<std::string, std::string>>& pairs) {
  std::istringstream lines(contents);
  std::size_t ignored = 0;
  for (std::string line; std::getline(lines, line);) {
    if (isBlankOrComment(line)) continue;
    if (auto pair = pairOn(line)) {
      pairs.push_back(std::move(*pair));
    } else {
      ++ignored;
    }
  }
  if (ignored > 0) {
    os::Log::write(kLogWarning,
                   "types: ignored " + std::to_string(ignored) + " malformed line(s) of " + path);
  }
}

// The list under |type|, or an empty one.
const std::vector<std::string>& listAt(
    const std::unordered_map<std::string, std::vector<std::string>>& lists,
    const std::string& type) {
  static const std::vector<std::string> kNone;
  auto found = lists.find(type);
  return found == lists.end() ? kNone : found->second;
}

}  // namespace

bool MimeDatabase::FileStamp::operator==(const FileStamp& other) const {
  return exists == other.exists && device == other.device && inode == other.inode &&
         size == other.size && modified.tv_sec == other.modified.tv_sec &&
         modified.tv_nsec == other.modified.tv_nsec;
}

MimeDatabase::FileStamp MimeDatabase::FileStamp::of(const struct stat& status) {
  return FileStamp{true, status.st_dev, status.st_ino, status.st_size, status.st_mtim};
}

MimeDatabase::FileStamp MimeDatabase::FileStamp::of(const std::string& path) {
  struct stat status {};
  if (::stat(path.c_str(), &status) != 0) return FileStamp{};
  return of(status);
}

MimeDatabase::FileStamp MimeDatabase::readPairs(const std::string& path, Pairs& pairs) {
  int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) {
    if (errno != ENOENT) {
      os::Log::write(kLogWarning, "types: ignoring " + os::Error::fromErrno(path).message);
    }
    return FileStamp::of(path);
  }
  struct stat status {};
  os::Result<std::optional<std::string>> contents =
      ::fstat(fd, &status) == 0 ? readAll(fd) : os::Error::fromErrno("fstat");
  ::close(fd);
  if (!contents.ok()) {
    os::Log::write(kLogWarning, "types: ignoring " + path + ": " + contents.error().message);
    return FileStamp::of(path);
  }
  if (!contents.value()) {
    os::Log::write(kLogWarning, "types: ignoring " + path + ": larger than " +
                                    std::to_string(kMaxFileSize) + " bytes");
    return FileStamp::of(status);
  }
  parsePairs(path, *contents.value(), pairs);
  return FileStamp::of(status);
}

std::shared_ptr<const MimeDatabase> MimeDatabase::read(const std::string& directory) {
  std::shared_ptr<MimeDatabase> database(new MimeDatabase(directory));
  Pairs aliases;
  database->aliasesStamp_ = readPairs(directory + "/aliases", aliases);
  for (auto& [alias, canonical] : aliases) {
    if (database->aliases_.emplace(alias, canonical).second) {
      database->aliasesOf_[canonical].push_back(alias);
    }
  }
  Pairs subclasses;
  database->subclassesStamp_ = readPairs(directory + "/subclasses", subclasses);
  for (const auto& [child, parent] : subclasses) {
    database->parents_[database->canonical(child)].push_back(database->canonical(parent));
  }
  return database;
}

bool MimeDatabase::isCurrent() const {
  return FileStamp::of(directory_ + "/aliases") == aliasesStamp_ &&
         FileStamp::of(directory_ + "/subclasses") == subclassesStamp_;
}

std::string MimeDatabase::canonical(const std::string& type) const {
  auto found = aliases_.find(type);
  return found == aliases_.end() ? type : found->second;
}

const std::vector<std::string>& MimeDatabase::parents(const std::string& type) const {
  return listAt(parents_, type);
}

const std::vector<std::string>& MimeDatabase::aliases(const std::string& type) const {
  return listAt(aliasesOf_, type);
}

}  // namespace types
