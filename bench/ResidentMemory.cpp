#include "bench/ResidentMemory.h"

#include <cerrno>
#include <fstream>
#include <optional>
#include <sstream>
#include <string>

namespace {

// The number of a "Name:   1234 kB" line of |status|.
std::optional<std::size_t> field(const std::string& status, const std::string& name) {
  std::size_t at = status.find("\n" + name + ":");
  if (at == std::string::npos) return std::nullopt;
  std::istringstream line(status.substr(at + name.size() + 2));
  std::size_t kibibytes = 0;
  std::string unit;
  if (!(line >> kibibytes >> unit) || unit != "kB") return std::nullopt;
  return kibibytes;
}

}  // namespace

os::Result<ResidentMemory> ResidentMemory::of(pid_t pid) {
  const std::string path = "/proc/" + std::to_string(pid) + "/status";
  std::ifstream file(path);
  std::stringstream text;
  text << file.rdbuf();
  if (!file) return os::Error{ESRCH, "cannot read " + path};
  std::optional<std::size_t> total = field(text.str(), "VmRSS");
  std::optional<std::size_t> anonymous = field(text.str(), "RssAnon");
  if (!total || !anonymous) return os::Error{EPROTO, "no VmRSS or RssAnon in " + path};
  return ResidentMemory(*total, *anonymous);
}
