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

// The service launcher's table: which host process may use which plug-in service, and the
// description the plug-in is run under. A service is the triple (host pid, bundle identifier,
// version); its description lives in
//   <runtime dir>/launcher/<escaped identifier>/<escaped version>/<host pid>.plist
// as an XML property list (escaping as in ServiceName). The table is the files: every process
// on the same device root sees the same services.
//
// Stateless; safe to call from any thread and any number of processes at once. Additions and
// listings hold the table lock shared, removals exclusive (TableLock): an addition and a removal
// of the same service take effect in the order they took the lock, so whichever comes last
// wins, and a listing sees each removal whole or not at all. Files are written to a temporary
// name and renamed into place, so a reader never sees half a description.
class ServiceLauncher {
 public:
  // The result removeService reports when no host had the service (ESRCH's number).
  static constexpr int kNoSuchService = 3;

  struct Service {
    pid_t host;
    std::string bundleIdentifier;
    std::string version;
    value::Dictionary description;
  };

  // Records |description| (written as an XML property list) for |host|. Fails with ESRCH when
  // no process |host| exists, EINVAL for an empty identifier or version or a description that a
  // property list cannot hold, or the errno of the file operation (ENAMETOOLONG when an escaped
  // identifier or version exceeds a file name). Replaces an earlier description of the same
  // triple.
  static os::Status addService(pid_t host, const std::string& bundleIdentifier,
                               const std::string& version, const value::Dictionary& description);

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
};

}  // namespace launcher
