#include "Annexa/AXSandboxExtension.h"

#include "platform/sandbox/Sandbox.h"

os::Result<std::string> AXSandboxIssueReadExtension(const AXFileURL& url) {
  return sandbox::Sandbox::issueFileExtension(sandbox::kReadExtensionClass, url.path(), true);
}

AXSandboxExtension::~AXSandboxExtension() {
  expel();
}

os::Status AXSandboxExtension::consume() {
  if (handle() != 0) return os::success();
  os::Result<std::int64_t> consumed = sandbox::Sandbox::consume(token());
  if (!consumed.ok()) return consumed.error();
  setHandle(consumed.value());
  return os::success();
}

void AXSandboxExtension::expel() {
  std::int64_t held = handle();
  if (held == 0) return;
  // An unknown handle has nothing left to release; the object forgets it either way.
  sandbox::Sandbox::release(held);
  setHandle(0);
}

std::string AXSandboxExtension::token() const {
  std::lock_guard lock(tokenMutex_);
  return token_;
}

void AXSandboxExtension::setToken(std::string token) {
  std::lock_guard lock(tokenMutex_);
  std::swap(token_, token);
}
