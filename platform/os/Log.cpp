#include "platform/os/Log.h"

#include <syslog.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <string>

namespace os {

namespace {

struct Sink {
  bool toStderr;
  std::string prefix;

  Sink() {
    const char* setting = std::getenv("AXD_LOG");
    toStderr = setting && std::strcmp(setting, "stderr") == 0;
    prefix = std::string(program_invocation_short_name) + "[" + std::to_string(getpid()) + "]: ";
    openlog(program_invocation_short_name, LOG_PID | LOG_NDELAY, LOG_DAEMON);
  }
};

// Without a log daemon, glibc's syslog() tries to reconnect to /dev/log on every call, which
// costs more than serving a request. So look for the socket at most once a second and skip
// syslog() while it is missing.
bool syslogListens() {
  static std::atomic<std::int64_t> checkedAt{-1};
  static std::atomic<bool> present{false};
  auto now = std::chrono::duration_cast<std::chrono::seconds>(
                 std::chrono::steady_clock::now().time_since_epoch())
                 .count();
  if (checkedAt.exchange(now) != now) present.store(access("/dev/log", W_OK) == 0);
  return present.load();
}

const Sink& sink() {
  // Never destroyed: threads may still log while the process exits.
  static const Sink* kSink = new Sink();
  return *kSink;
}

// |message| cut to kMaxLine bytes, never inside a UTF-8 sequence, with the count of what was cut.
std::string_view bounded(std::string_view message, std::string& storage) {
  if (message.size() <= Log::kMaxLine) return message;
  std::size_t end = Log::kMaxLine;
  while (end > 0 && (static_cast<unsigned char>(message[end]) & 0xC0) == 0x80) --end;
  storage.assign(message.substr(0, end));
  storage += "... (" + std::to_string(message.size() - end) + " bytes cut)";
  return storage;
}

// Writes |whole| to syslog when |toSyslog|, and to standard error when the sink says so.
void emit(int level, std::string_view whole, bool toSyslog) {
  std::string storage;
  std::string_view message = bounded(whole, storage);
  const Sink& s = sink();
  if (toSyslog) syslog(level, "%.*s", static_cast<int>(message.size()), message.data());
  if (!s.toStderr) return;
  std::string line = s.prefix;
  line.append(message);
  line.push_back('\n');
  // One write() per line keeps lines of concurrent threads whole.
  ssize_t ignored = ::write(STDERR_FILENO, line.data(), line.size());
  (void)ignored;
}

}  // namespace

void Log::write(int level, std::string_view message) {
  emit(level, message, syslogListens());
}

void Log::notice(std::string_view format, std::initializer_list<FormatArg> arguments) {
  bool toSyslog = syslogListens();
  // A line that no sink takes is not formatted: some are written for every request.
  if (!toSyslog && !sink().toStderr) return;
  emit(5, os::format(format, arguments), toSyslog);
}

}  // namespace os
