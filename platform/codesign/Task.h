#pragma once

#include <sys/types.h>

#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/os/Error.h"
#include "platform/os/Process.h"
#include "platform/value/Dictionary.h"
#include "platform/value/Value.h"

namespace codesign {

// The code-signing identity of one process: its executable and the entitlements the device
// root's entitlement table grants that executable, with those of the signed application bundle
// it lies in (ApplicationSignature) where the table says nothing of the same key. The table is read
// once, when the task is made, so a changed table takes effect for the next connection. Immutable;
// safe to read from several threads at once.
class Task {
 public:
  // The task of process |pid|, checked against |pidfd| (its audit token) so a reused pid is
  // never mistaken for it. Nothing when the process is gone or its executable cannot be read.
  // A table that cannot be read does not prevent the task: its lookups report the error.
  static std::unique_ptr<Task> fromAuditToken(pid_t pid, int pidfd);

  Task(const Task&) = delete;
  Task& operator=(const Task&) = delete;

  // The value of entitlement |key|, or nothing when the process does not have it. When the
  // table could not be read the result is nothing and |*error| (if |error| is not null) holds
  // the reason; otherwise |*error| is reset.
  std::optional<value::Value> entitlementValue(std::string_view key,
                                               std::optional<os::Error>* error) const;

  // The executable's path as the kernel names it (see os::Process::executablePath).
  const std::string& executablePath() const { return executablePath_; }
  // The program file whose entitlements these are: the image as opened for its digest, or, when
  // it could not be opened, the file the process ran just after its path was read. Nothing when
  // neither could be examined. A connection compares it with the file its peer ran at accept.
  const std::optional<os::FileIdentity>& program() const { return program_; }

 private:
  Task(std::string executablePath, std::optional<os::FileIdentity> program,
       value::Dictionary entitlements, std::optional<os::Error> tableError);

  std::string executablePath_;
  std::optional<os::FileIdentity> program_;
  value::Dictionary entitlements_;
  std::optional<os::Error> tableError_;
};

}  // namespace codesign
