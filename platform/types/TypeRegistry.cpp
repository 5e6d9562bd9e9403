#include "platform/types/TypeRegistry.h"

#include <algorithm>
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
constexpr std::string_view kAnyType = "*/*";

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

// Breadth-first over |start| and, transitively, the types |parentsOf| gives, until |found| holds
// for one; the visited set ends cycles in the file.
template <typename Parents, typename Found>
bool anyReached(std::string start, const Parents& parentsOf, const Found& found) {
  std::unordered_set<std::string> visited{start};
  std::deque<std::string> pending{std::move(start)};
  while (!pending.empty()) {
    std::string node = std::move(pending.front());
    pending.pop_front();
    if (found(node)) return true;
    for (std::string& parent : parentsOf(node)) {
      if (visited.insert(parent).second) pending.push_back(std::move(parent));
    }
  }
  return false;
}

// True when the canonical |type| conforms to the canonical concrete |target|: through declared
// parents and the built-in ones, "text/plain" for every "text/..." type and
// "application/octet-stream" for every type.
bool reachesType(const MimeDatabase& database, const std::string& type, const std::string& target) {
  auto parents = [&](const std::string& node) {
    std::vector<std::string> all = database.parents(node);
    if (MediaType::major(node) == MediaType::major(kPlainText)) all.emplace_back(kPlainText);
    all.emplace_back(kAnyData);
    return all;
  };
  return anyReached(type, parents, [&](const std::string& node) { return node == target; });
}

// True when the canonical |type|, one of its aliases, or a declared parent (transitively, with
// its aliases) has the major name |major|. The universal parents are not followed: every type
// reaches them, so they would put every type under "application/*" and "text/*".
bool underMajor(const MimeDatabase& database, const std::string& type, std::string_view major) {
  auto parents = [&](const std::string& node) {
    std::vector<std::string> declared;
    for (const std::string& parent : database.parents(node)) {
      if (parent != kPlainText && parent != kAnyData) declared.push_back(parent);
    }
    return declared;
  };
  auto named = [&](const std::string& node) {
    if (MediaType::major(node) == major) return true;
    const std::vector<std::string>& aliases = database.aliases(node);
    return std::any_of(aliases.begin(), aliases.end(),
                       [&](const std::string& alias) { return MediaType::major(alias) == major; });
  };
  return anyReached(type, parents, named);
}

}  // namespace

bool TypeRegistry::conforms(const std::string& type, const std::string& to) {
  if (equalIgnoringCase(type, to)) return true;
  std::optional<std::string> from = MediaType::concrete(type);
  if (!from) return false;
  if (to == kAnyType) return true;
  std::shared_ptr<const MimeDatabase> database =
      cache().databaseFor(os::Paths::underRoot("usr/share/mime"));
  std::string canonical = database->canonical(*from);
  if (std::optional<std::string> wildcard = MediaType::wildcard(to)) {
    return underMajor(*database, canonical, MediaType::major(*wildcard));
  }
  std::optional<std::string> target = MediaType::concrete(to);
  return target && reachesType(*database, canonical, database->canonical(*target));
}

}  // namespace types
