#pragma once

#include <sys/types.h>

#include <cstdint>
#include <string>
#include <string_view>

#include "platform/os/Error.h"

namespace sandbox {

// The class of a read-only file extension.
inline constexpr const char* kReadExtensionClass = AXD_VENDOR_PREFIX ".sandbox.read";

// Whether a process is confined, and the extensions that let a confined process reach a file.
// An extension is a signed token (ExtensionToken) naming a class and a path, issued under the
// per-boot key (BootKey): any process of the same device root and boot can consume it. A
// consumed extension is a handle in the process's grant table (GrantTable) until it is
// released. This layer records grants and does not confine anything itself. Stateless apart
// from the grant table; safe to call from any thread.
class Sandbox {
 public:
  // True when |pid| runs under a seccomp filter (the "Seccomp:" field of /proc/<pid>/status is
  // not 0) or in another mount or user namespace than the calling process. Fails with ESRCH
  // when there is no such process, EACCES when its namespaces may not be inspected.
  static os::Result<bool> isSandboxed(pid_t pid);

  // A token for |path| in |extensionClass|. With |canonicalize| the token names the canonical
  // path (symbolic links, "." and ".." resolved) and issuing fails with the error number of
  // realpath (ENOENT for a missing file); without it the path is taken as given and must be
  // absolute (else EINVAL) and exist (else the error number of stat). Fails with EINVAL for an
  // empty class or one containing ';', and with the key's error when the key cannot be loaded.
  static os::Result<std::string> issueFileExtension(std::string_view extensionClass,
                                                    const std::string& path, bool canonicalize);
  // A read-extension token for |path|, taken as given, signed with |key| (BootKey::load()).
  // Touches no file: for callers that resolved the path and loaded the key once for many
  // tokens.
  static std::string sealReadExtension(const std::string& path, const std::string& key);

  // Verifies |token| and records the grant; returns its handle, always greater than 0. Fails
  // with EINVAL for text that is not a token, EPERM for a token whose signature does not verify
  // under this boot's key (forged, altered, or from another root or boot), and the error number
  // of stat when the token's path no longer exists (ENOENT).
  static os::Result<std::int64_t> consume(std::string_view token);

  // Ends the grant of |handle|. Fails with EBADF when no grant has that handle (0, never
  // issued, or already released).
  static os::Status release(std::int64_t handle);
};

}  // namespace sandbox
