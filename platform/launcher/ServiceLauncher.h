#pragma once

#include <sys/types.h>

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "platform/os/Error.h"
#include "platform/value/Dictionary.h"
#include "platform/zyn/SerialQueue.h"

namespace launcher {

// The service launcher's table: which host process may start which plug-in, from which
// executable and under which description. A service is the triple (host pid, bundle identifier,
// version); its executable, its description and when the host started (so that a record
// outlives no process: a later process that gets the same pid is not the host) live in
//   <runtime dir>/launcher/<escaped identifier>/<escaped version>/<host pid>.plist
// (format in ServiceFile, escaping in ServiceName). The table is the files: every process on the
// same device root sees the same services.
//
// A description is a dictionary whose "ZynService" dictionary may hold "EnvironmentVariables"
// (the plug-in's whole environment), "_SandboxProfile" (the name of its sandbox profile,
// recorded here but not yet applied at start) and, for a signed bundle, kExecutableDigestKey.
//
// Stateless; safe to call from any thread and any number of processes at once. Additions,
// listings and starts hold the table lock shared, removals exclusive (TableLock): an addition and
// a removal of the same service take effect in the order they took the lock, so whichever comes
// last wins, and a listing or start sees each removal whole or not at all. Files are written to
// a temporary name and renamed into place, so a reader never sees half a record.
class ServiceLauncher {
 public:
  // The result removeService reports when no host had the service (ESRCH's number).
  static constexpr int kNoSuchService = 3;

  struct Service {
    pid_t host;
    std::string bundleIdentifier;
    std::string version;
    std::string executablePath;
    value::Dictionary description;
  };

  // Records |executablePath| and |description| for |host|. Fails with ESRCH when no process
  // |host| exists; EINVAL for an empty identifier or version, an executable path that is not
  // absolute, or a description that a property list cannot hold; the errno of stat when the
  // executable cannot be found (ENOENT, ENOTDIR...); EACCES when it is not a regular file that
  // this process may execute; else the errno of the file operation (ENAMETOOLONG when an
  // escaped identifier or version exceeds a file name). Replaces an earlier record of the same
  // triple.
  static os::Status addService(pid_t host, const std::string& bundleIdentifier,
                               const std::string& version, const std::string& executablePath,
                               const value::Dictionary& description);

  // Starts the plug-in recorded for (this process, |bundleIdentifier|, |version|): its
  // executable, with argv[0] the executable's path and as its whole environment the string
  // entries of the description's "ZynService" "EnvironmentVariables" (none when absent; entries
  // that are not strings, or whose name is empty or holds '=', are skipped with a log line).
  // Nothing else of this process is passed on (see CleanSpawn). Returns the child's pid; the
  // caller reaps it. Fails with EPERM when this process was not made ready for the plug-in (a
  // record for an earlier process that had this pid does not count),
  // EINVAL for an empty identifier or version or a broken record, or the errno of reading the
  // record or of posix_spawn (ENOENT when the executable has gone since).
  // When the description's "ZynService" holds kExecutableDigestKey, the executable is opened
  // once, checked to have that SHA-256 and run from that descriptor (CleanSpawn::runOpened); one
  // with another digest is not started (EPERM, logged).
  static os::Result<pid_t> start(const std::string& bundleIdentifier, const std::string& version);

  // The key under "ZynService" of the SHA-256 (hex) that the executable must have to be started.
  static constexpr const char* kExecutableDigestKey = "_ExecutableSHA256";

  // Deletes the service of |bundleIdentifier| and |version| for every host. 0 when at least one
  // was removed, kNoSuchService when none existed, EINVAL for an empty identifier or version,
  // else the errno of the failure (also written to the system log).
  static int removeService(const std::string& bundleIdentifier, const std::string& version);

  // removeService done on |queue|; |completion| (which may be empty) receives the result on
  // |queue|. Returns at once. With a null |queue| both run on the calling thread instead.
  static void removeService(const std::string& bundleIdentifier, const std::string& version,
                            const std::shared_ptr<zyn::SerialQueue>& queue,
                            std::function<void(int)> completion);

  // Every recorded service, sorted by host, identifier, version; empty when none was ever
  // recorded. Files and directories that do not read as a service are skipped with a log line.
  // Fails with the errno of taking the table lock or reading the table directory.
  static os::Result<std::vector<Service>> services();

 private:
  // Starts |executable| only when it has the SHA-256 |digest|, from the descriptor it was
  // checked through.
  static os::Result<pid_t> startChecked(const std::string& executable, const std::string& digest,
                                        const std::vector<std::string>& environment);
};

}  // namespace launcher
