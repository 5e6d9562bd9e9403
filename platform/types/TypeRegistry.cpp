#include "platform/types/TypeRegistry.h"

#include <deque>
#include <optional>
#include <string_view>
#include <unordered_set>
#include <vector>

#include "platform/os/Paths.h"
#include "platform/types/MediaType.h"
#include "platform/types/MimeDatabaseCache.h"

namespace types {

namespace {

constexpr std::string_view kPlainText = "text/plain";
constexpr std::string_view kAnyData = "application/octet-stream";

MimeDatabaseCache& cache() {
  // Never destroyed: other threads may still ask while the process exits.
  static MimeDatabaseCache* shared = new MimeDatabaseCache(std::chrono::seconds(1));
  return *shared;
}

bool equalIgnoringCase(std::string_view a, std::string_view b) {
  auto lower = [](char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c; };
  if (a.size() != b.size()) return false;
  for (std::size_t i = 0; i < a.size(); ++i) {
    if (lower(a[i]) != lower(b[i])) return false;
  }
  return true;
}

// What a type must reach: a canonical concrete type, or every type of one major name.
struct Target {
  std::string type;
  bool isWildcard = false;

  bool reachedBy(std::string_view node) const {
    return isWildcard ? MediaType::major(node) == MediaType::major(type) : node == type;
  }
};

std::optional<Target> targetFor(const std::string& to, const MimeDatabase& database) {
  if (auto wildcard = MediaType::wildcard(to)) return Target{std::move(*wildcard), true};
  if (auto concrete = MediaType::concrete(to)) return Target{database.canonical(*concrete), false};
  return std::nullopt;
}

// The types |node| conforms to directly: its declared parents and the built-in ones.
std::vector<std::string> directParents(const MimeDatabase& database, const std::string& node) {
  std::vector<std::string> parents = database.parents(node);
  if (MediaType::major(node) == MediaType::major(kPlainText)) parents.emplace_back(kPlainText);
  parents.emplace_back(kAnyData);
  return parents;
}

// Breadth-first over everything |start| conforms to; the visited set ends cycles in the file.
bool reaches(const MimeDatabase& database, std::string start, const Target& target) {
  std::unordered_set<std::string> visited{start};
  std::deque<std::string> pending{std::move(start)};
  while (!pending.empty()) {
    std::string node = std::move(pending.front());
    pending.pop_front();
    if (target.reachedBy(node)) return true;
    for (std::string& parent : directParents(database, node)) {
      if (visited.insert(parent).second) pending.push_back(std::move(parent));
    }
  }
  return false;
}

}  // namespace

bool TypeRegistry::conforms(const std::string& type, const std::string& to) {
  if (equalIgnoringCase(type, to)) return true;
  std::optional<std::string> from = MediaType::concrete(type);
  if (!from) return false;
  std::shared_ptr<const MimeDatabase> database =
      cache().databaseFor(os::Paths::underRoot("usr/share/mime"));
  std::optional<Target> target = targetFor(to, *database);
  return target && reaches(*database, database->canonical(*from), *target);
}

}  // namespace types
