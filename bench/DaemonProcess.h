#pragma once

#include <sys/types.h>

#include <chrono>
#include <memory>
#include <optional>
#include <string>

#include "platform/os/Error.h"

// The real daemon on a fresh device root: a temporary directory that becomes ANNEXA_ROOT of
// this process (so its clients find the daemon) and of the daemon. Destruction stops the daemon
// (SIGTERM, SIGKILL when it lingers), reaps it, removes the root and puts ANNEXA_ROOT back.
// Not thread-safe, and it changes the environment: make it before the process starts threads.
class DaemonProcess {
 public:
  // Starts |executable| and waits up to |timeout| until its service socket accepts
  // connections. Fails when the root cannot be made, the program cannot be started or exits
  // first, or the socket does not accept in time; nothing is left running then.
  static os::Result<std::unique_ptr<DaemonProcess>> start(
      const std::string& executable, std::chrono::milliseconds timeout = std::chrono::seconds(10));
  ~DaemonProcess();
  DaemonProcess(const DaemonProcess&) = delete;
  DaemonProcess& operator=(const DaemonProcess&) = delete;

  pid_t pid() const { return pid_; }
  const std::string& root() const { return root_; }
  // The path of the daemon's service socket under the root.
  static std::string socketPath();

 private:
  explicit DaemonProcess(std::string root);

  os::Status spawn(const std::string& executable);
  os::Status waitUntilListening(std::chrono::milliseconds timeout);
  void stop();

  const std::string root_;
  const std::optional<std::string> previousRoot_;
  pid_t pid_ = 0;
};
