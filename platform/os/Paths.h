#pragma once

#include <sys/types.h>

#include <string>
#include <string_view>

#include "platform/os/Error.h"

namespace os {

// Where the platform layer keeps its files. Everything lives under one device root, the
// environment variable ANNEXA_ROOT (default "/"), so a test, the demo and a developer's machine
// never share state. The environment is read at every call: tests and tools switch roots within
// one process, and a lookup costs a getenv. Safe to call from any thread as long as no thread
// changes the environment at the same time.
class Paths {
 public:
  // $ANNEXA_ROOT without trailing slashes, or "/" when it is unset or empty.
  static std::string root();

  // The runtime directory: "<root>/run" when ANNEXA_ROOT is set; otherwise $XDG_RUNTIME_DIR
  // when it is an absolute path, else "/run/user/<effective uid>" (where systemd would put it).
  static std::string runtimeDir();

  // The per-user directory of user |uid|: "<root>/var/users/<uid>" when ANNEXA_ROOT is set.
  // Otherwise, for the effective user, $XDG_STATE_HOME when absolute, else
  // "<home>/.local/state" with home from $HOME or the password database; for another user,
  // that user's home from the password database plus "/.local/state". A user without a home
  // falls back to "/var/users/<uid>", the device-root layout.
  static std::string perUserDir(uid_t uid);

  // |relative| (e.g. "etc/annexa/entitlements.d", "var/db/registrum.sqlite") under the root.
  // Leading slashes of |relative| are ignored: the result never escapes upward by a "/".
  static std::string underRoot(std::string_view relative);

  // The directory of the message service's sockets: "<runtime dir>/zyn".
  static std::string zynSocketDir();

  // |path| made absolute with every symbolic link, "." and ".." resolved. Fails with the
  // system's error number (ENOENT when a component does not exist).
  static Result<std::string> canonical(const std::string& path);

  // Makes sure |path| is a directory, creating it and any missing parents with |mode| (less
  // the umask). An existing directory keeps its mode. Fails with ENOTDIR when |path| or a
  // parent is something else, or with the error of the mkdir that failed.
  static Status ensureDirectory(const std::string& path, mode_t mode);
  // Makes sure |path| is a directory that only its owner may use: creates it and any missing
  // parents (as ensureDirectory, mode 0700) and sets its mode to 0700. A symbolic link at
  // |path| is refused (ELOOP), never followed: the directory may be another process's to change.
  static Status ensurePrivateDirectory(const std::string& path);
  // Makes sure |path| is a directory of this process's effective user with exactly |mode|, as the
  // runtime directories must be: another user who could write in one could replace what the
  // daemon puts there. Creates it (and missing parents, as ensureDirectory) with |mode| exactly,
  // whatever the umask. An existing one is used only when it is a directory, not a symbolic link,
  // owned by this user and of exactly |mode|; otherwise EPERM, with a message that names what is
  // wrong, and nothing is changed.
  static Status ensureRuntimeDirectory(const std::string& path, mode_t mode);
};

}  // namespace os
