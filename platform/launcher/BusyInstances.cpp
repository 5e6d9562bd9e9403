#include "platform/launcher/BusyInstances.h"

#include <dirent.h>
#include <unistd.h>

#include <algorithm>
#include <charconv>
#include <climits>
#include <memory>
#include <optional>
#include <string_view>

#include "platform/os/Paths.h"

namespace launcher {

namespace {

constexpr std::string_view kDeleted = " (deleted)";

// The process of a /proc entry named |name|, or nothing for the entries that are not processes.
std::optional<pid_t> pidOf(std::string_view name) {
  pid_t pid = 0;
  auto [end, error] = std::from_chars(name.data(), name.data() + name.size(), pid);
  if (error != std::errc() || end != name.data() + name.size() || pid <= 0) return std::nullopt;
  return pid;
}

// The target of /proc/<pid>/exe, or nothing when it cannot be read.
std::optional<std::string> executableOf(pid_t pid) {
  const std::string link = "/proc/" + std::to_string(pid) + "/exe";
  char buffer[PATH_MAX];
  ssize_t n = readlink(link.c_str(), buffer, sizeof buffer);
  if (n <= 0 || static_cast<std::size_t>(n) == sizeof buffer) return std::nullopt;
  return std::string(buffer, static_cast<std::size_t>(n));
}

bool liesBelow(std::string_view path, const std::string& prefix) {
  if (path.ends_with(kDeleted)) path.remove_suffix(kDeleted.size());
  return path.starts_with(prefix);
}

}  // namespace

std::vector<BusyInstances::Instance> BusyInstances::find(const std::string& bundlePath) {
  std::vector<Instance> found;
  os::Result<std::string> bundle = os::Paths::canonical(bundlePath);
  if (!bundle.ok()) return found;
  const std::string prefix = bundle.value().ends_with('/') ? bundle.value() : bundle.value() + "/";
  struct CloseDir {
    void operator()(DIR* stream) const { closedir(stream); }
  };
  std::unique_ptr<DIR, CloseDir> proc(opendir("/proc"));
  if (!proc) return found;
  while (const dirent* entry = readdir(proc.get())) {
    std::optional<pid_t> pid = pidOf(entry->d_name);
    if (!pid) continue;
    std::optional<std::string> executable = executableOf(*pid);
    if (executable && liesBelow(*executable, prefix)) found.push_back({*pid, *executable});
  }
  std::sort(found.begin(), found.end(),
            [](const Instance& a, const Instance& b) { return a.pid < b.pid; });
  return found;
}

}  // namespace launcher
