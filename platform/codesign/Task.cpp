#include "platform/codesign/Task.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "platform/codesign/ApplicationSignature.h"
#include "platform/codesign/EntitlementTable.h"
#include "platform/os/Process.h"

namespace codesign {

namespace {

std::optional<os::FileIdentity> identityOf(pid_t pid, int imageFd) {
  if (imageFd < 0) {
    auto running = os::Process::executableIdentity(pid);
    if (!running.ok()) return std::nullopt;
    return running.value();
  }
  struct stat status {};
  if (fstat(imageFd, &status) != 0) return std::nullopt;
  return os::FileIdentity{status.st_dev, status.st_ino};
}

}  // namespace

Task::Task(std::string executablePath, std::optional<os::FileIdentity> program,
           value::Dictionary entitlements, std::optional<os::Error> tableError)
    : executablePath_(std::move(executablePath)),
      program_(program),
      entitlements_(std::move(entitlements)),
      tableError_(std::move(tableError)) {}

std::unique_ptr<Task> Task::fromAuditToken(pid_t pid, int pidfd) {
  auto path = os::Process::executablePath(pid, pidfd);
  if (!path.ok()) return nullptr;
  // The digest of a "SHA256" entry is taken from the running image, not from the file now at
  // the path, so a replaced file is never trusted.
  auto image = os::Process::openExecutable(pid, pidfd);
  if (!image.ok() && image.error().errnum == ESRCH) return nullptr;
  int imageFd = image.ok() ? image.value() : -1;
  std::optional<os::FileIdentity> program = identityOf(pid, imageFd);
  value::Dictionary entitlements;
  std::optional<os::Error> tableError;
  auto table = EntitlementTable::load();
  if (table.ok()) {
    entitlements = table.value().lookup(path.value(), imageFd).value_or(value::Dictionary());
  } else {
    tableError = table.error();
  }
  // The table's entries win over the bundle's: the device's own settings decide last.
  if (auto granted = ApplicationSignature::entitlementsFor(path.value(), imageFd)) {
    for (const auto& [key, entry] : *granted) {
      if (!entitlements.find(key)) entitlements = entitlements.with(key, entry);
    }
  }
  if (imageFd >= 0) close(imageFd);
  return std::unique_ptr<Task>(
      new Task(std::move(path).value(), program, std::move(entitlements), std::move(tableError)));
}

std::optional<value::Value> Task::entitlementValue(std::string_view key,
                                                   std::optional<os::Error>* error) const {
  if (error) *error = tableError_;
  if (tableError_) return std::nullopt;
  const value::Value* found = entitlements_.find(key);
  if (!found) return std::nullopt;
  return *found;
}

}  // namespace codesign
