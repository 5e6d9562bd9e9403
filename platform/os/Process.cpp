#include "platform/os/Process.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <csignal>
#include <cstdlib>
#include <sstream>
#include <vector>

// Both numbers are the same on every architecture that has the calls (Linux 5.1 and 5.3).
#ifndef SYS_pidfd_send_signal
#define SYS_pidfd_send_signal 424
#endif
#ifndef SYS_pidfd_open
#define SYS_pidfd_open 434
#endif

namespace os {

namespace {

std::string exeLink(pid_t pid) {
  return "/proc/" + std::to_string(pid) + "/exe";
}

// The fields of a stat line after the command name, which is in parentheses and may hold
// anything, ")" and blanks included; the first is field 3, the state.
std::vector<std::string> fieldsAfterCommand(const std::string& line) {
  std::vector<std::string> fields;
  std::size_t end = line.rfind(')');
  if (end == std::string::npos) return fields;
  std::istringstream rest(line.substr(end + 1));
  for (std::string field; rest >> field;) fields.push_back(field);
  return fields;
}

// The first line of a small /proc file; empty when it cannot be read. Not through a stream,
// which would leave the descriptor open across a concurrent exec.
std::string firstLine(const std::string& path) {
  int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) return std::string();
  char buffer[4096];
  ssize_t n = read(fd, buffer, sizeof buffer);
  close(fd);
  if (n <= 0) return std::string();
  std::string text(buffer, static_cast<std::size_t>(n));
  return text.substr(0, text.find('\n'));
}

Error noPidfd() {
  return Error{EBADF, "no pidfd to check the process against"};
}

}  // namespace

Result<int> Process::openPidfd(pid_t pid) {
  long fd = syscall(SYS_pidfd_open, pid, 0);
  if (fd < 0) return Error::fromErrno("pidfd_open " + std::to_string(pid));
  return static_cast<int>(fd);
}

Status Process::checkAlive(int pidfd) {
  if (syscall(SYS_pidfd_send_signal, pidfd, 0, nullptr, 0) != 0) {
    return Error::fromErrno("pidfd_send_signal");
  }
  return success();
}

Result<std::string> Process::executablePath(pid_t pid, int pidfd) {
  if (pidfd < 0) return noPidfd();
  std::string link = exeLink(pid);
  char buffer[PATH_MAX];
  ssize_t n = readlink(link.c_str(), buffer, sizeof buffer);
  if (n < 0) return Error::fromErrno("readlink " + link);
  if (static_cast<std::size_t>(n) == sizeof buffer) {
    return Error{ENAMETOOLONG, "readlink " + link + ": path too long"};
  }
  // Checked after the read: had the process died and its pid been reused before the read, the
  // pidfd (which names the old process) now reports it gone.
  Status alive = checkAlive(pidfd);
  if (!alive.ok()) return alive.error();
  return std::string(buffer, static_cast<std::size_t>(n));
}

Result<std::uint64_t> Process::startTime(pid_t pid) {
  const std::string path = "/proc/" + std::to_string(pid) + "/stat";
  std::string line = pid > 0 ? firstLine(path) : std::string();
  if (line.empty()) return Error{ESRCH, "no process " + std::to_string(pid)};
  constexpr std::size_t kStartTime = 22 - 3;
  std::vector<std::string> fields = fieldsAfterCommand(line);
  char* end = nullptr;
  errno = 0;
  unsigned long long ticks =
      fields.size() > kStartTime ? std::strtoull(fields[kStartTime].c_str(), &end, 10) : 0;
  if (!end || *end != '\0' || errno != 0) return Error{EINVAL, path + ": no start time"};
  return static_cast<std::uint64_t>(ticks);
}

Result<int> Process::openExecutable(pid_t pid, int pidfd) {
  if (pidfd < 0) return noPidfd();
  std::string link = exeLink(pid);
  int fd = open(link.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) return Error::fromErrno("open " + link);
  Status alive = checkAlive(pidfd);
  if (!alive.ok()) {
    close(fd);
    return alive.error();
  }
  return fd;
}

Result<FileIdentity> Process::executableIdentity(pid_t pid) {
  std::string link = exeLink(pid);
  struct stat status {};
  if (stat(link.c_str(), &status) != 0) return Error::fromErrno("stat " + link);
  return FileIdentity{status.st_dev, status.st_ino};
}

Result<int> Process::openProcDirectory(pid_t pid, int pidfd) {
  if (pidfd < 0) return noPidfd();
  const std::string path = "/proc/" + std::to_string(pid);
  int fd = open(path.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC);
  if (fd < 0) return Error::fromErrno("open " + path);
  Status alive = checkAlive(pidfd);
  if (!alive.ok()) {
    close(fd);
    return alive.error();
  }
  return fd;
}

Result<FileIdentity> Process::executableIdentityAt(int procDirectory) {
  struct stat status {};
  if (fstatat(procDirectory, "exe", &status, 0) != 0) return Error::fromErrno("stat exe");
  return FileIdentity{status.st_dev, status.st_ino};
}

}  // namespace os
