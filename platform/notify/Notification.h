#pragma once

#include <cstdint>
#include <string>

#include "platform/os/Error.h"

namespace notify {

class NotificationWatcher;

// System-wide named notifications without payload. A notification is the file
// "<runtime dir>/notify/<name>" holding its post counter (8 bytes, little-endian); posting
// increments it under an exclusive flock and closes the file, which wakes every watcher through
// inotify. Because the counter only grows, a watcher counts posts exactly even when it wakes
// once for several. Safe to call from any thread and any process without further
// synchronization. A valid name is 1 to 255 bytes long, is neither "." nor "..", and contains
// no '/' and no NUL.
class Notification {
 public:
  // Posts |name|: creates <runtime dir>/notify (0755, with parents) and the file (0644) when
  // missing and increments the counter in it. Fails with EINVAL for an invalid name, or with
  // the system's error number of the file operation that failed.
  static os::Status post(const std::string& name);

  // How often |name| was posted on this device root since its file was created; 0 when it
  // never was (no file). Fails with EINVAL for an invalid name, or with the system's error
  // number of the read.
  static os::Result<std::uint64_t> count(const std::string& name);

  // The file of |name|, "<runtime dir>/notify/<name>". Meaningful only for a valid name.
  static std::string path(const std::string& name);

 private:
  friend class NotificationWatcher;

  // The directory of every notification's file, "<runtime dir>/notify".
  static std::string directory();
  // Makes sure directory() exists (0755, with parents) and returns it.
  static os::Result<std::string> makeDirectory();
  // Succeeds for a valid name, fails with EINVAL otherwise.
  static os::Status validate(const std::string& name);
  // The counter in |file|; 0 when it does not exist or holds fewer than 8 bytes.
  static os::Result<std::uint64_t> countAt(const std::string& file);
};

}  // namespace notify
