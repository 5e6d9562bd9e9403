#pragma once

#include <cstddef>
#include <initializer_list>
#include <string_view>

#include "platform/os/Format.h"

namespace os {

// The system log. Lines go to syslog under the program's name (so the daemon's ident is "axd")
// and, when the environment variable AXD_LOG is "stderr", also to standard error as
// "<ident>[<pid>]: <message>". Safe to call from any thread; each call writes one whole line.
// A message longer than kMaxLine bytes is cut there (at a character boundary) and ends in
// "... (<n> bytes cut)": one client's oversized message must not flood the log.
class Log {
 public:
  static constexpr std::size_t kMaxLine = 8192;

  // Syslog priorities: 3 error, 4 warning, 5 notice, 6 info, 7 debug.
  static void write(int level, std::string_view message);
  // write() at level 5 of |format| filled with |arguments| (os::format).
  static void notice(std::string_view format, std::initializer_list<FormatArg> arguments);
};

}  // namespace os
