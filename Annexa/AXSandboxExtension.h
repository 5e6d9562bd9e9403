#pragma once

#include <atomic>
#include <cstdint>
#include <mutex>
#include <string>

#include "Annexa/AXFileURL.h"
#include "platform/os/Error.h"

// Issues a read-only sandbox extension for the path of |url|, canonicalised, and returns its
// token. Fails with the sandbox's error number: that of realpath when the path cannot be
// resolved (ENOENT for a missing file), so a caller can log strerror of it.
os::Result<std::string> AXSandboxIssueReadExtension(const AXFileURL& url);

// One sandbox extension held by this process: its token and, once consumed, the sandbox's
// handle of it (0 while nothing is consumed). Destroying the object expels the extension, so a
// consumed extension lives exactly as long as its object. The accessors are atomic and may be
// used from any thread, but consume and expel each read and then write the handle: one object
// must not be consumed or expelled from two threads at once.
class AXSandboxExtension {
 public:
  // initWithExtension: an unconsumed extension of |token|.
  explicit AXSandboxExtension(std::string token) : token_(std::move(token)) {}
  // Expels the extension.
  ~AXSandboxExtension();

  AXSandboxExtension(const AXSandboxExtension&) = delete;
  AXSandboxExtension& operator=(const AXSandboxExtension&) = delete;

  // When nothing is consumed, consumes the token and stores the sandbox's handle; when a handle
  // is already held, does nothing and succeeds. A token the sandbox refuses leaves the handle 0,
  // so a refused token counts as not consumed and a later call tries again; the refusal is
  // returned (see sandbox::Sandbox::consume for its error numbers).
  os::Status consume();

  // When a handle is held, releases it and sets the handle to 0; otherwise does nothing. A
  // handle the sandbox does not know (one set by hand) is dropped all the same.
  void expel();

  std::string token() const;
  void setToken(std::string token);
  std::int64_t handle() const { return handle_.load(); }
  void setHandle(std::int64_t handle) { handle_.store(handle); }

 private:
  mutable std::mutex tokenMutex_;
  std::string token_;
  std::atomic<std::int64_t> handle_{0};
};
