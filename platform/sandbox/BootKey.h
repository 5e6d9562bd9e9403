#pragma once

#include <string>

#include "platform/os/Error.h"

namespace sandbox {

// The key that signs extension tokens: 32 random bytes bound to the current boot, kept in
// "<runtime dir>/sandbox/key" (directory 0700, file 0600) as two lines: the boot id
// (/proc/sys/kernel/random/boot_id) and the key in lower-case hexadecimal. Every process of one
// device root and one boot reads the same key, so a token issued by one is accepted by another.
// Stateless (the file is read at every call); safe to call from any thread and from several
// processes at once.
class BootKey {
 public:
  // The 32 key bytes of the current boot. When the file is missing, belongs to an earlier boot,
  // is malformed, or is not a regular file of this user closed to others, a new key replaces it
  // (tokens signed with the old one stop verifying); creation is serialised between processes
  // by a lock on "<runtime dir>/sandbox/key.lock", so one boot has one key. Fails with the
  // system's error number when the boot id, the directory or the file cannot be read or made.
  static os::Result<std::string> load();

  // "<runtime dir>/sandbox/key".
  static std::string path();
};

}  // namespace sandbox
