#pragma once

#include <sys/types.h>

#include <chrono>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/os/Error.h"

// The real daemon on a fresh device root: a temporary directory that becomes ANNEXA_ROOT of
// this process (so its clients find the daemon) and of the daemon. Destruction stops the daemon
// (SIGTERM, SIGKILL when it lingers), reaps it, removes the root and puts ANNEXA_ROOT back.
// Not thread-safe, and it changes the environment: make it before the process starts threads.
class DaemonProcess {
 public:
  struct Options {
    std::vector<std::string> arguments;
    // The service to wait for; the default service when empty.
    std::string serviceName;
    // Sets AXD_LOG=stderr and sends standard error to log(). Off, the daemon's log is dropped.
    bool captureLog = false;
    // Variables set in the daemon's environment over those it inherits from this process.
    std::map<std::string, std::string> environment;
  };

  // Starts |executable| and waits up to |timeout| until its service socket accepts
  // connections. Fails when the root cannot be made, the program cannot be started or exits
  // first, or the socket does not accept in time; nothing is left running then.
  static os::Result<std::unique_ptr<DaemonProcess>> start(
      const std::string& executable, const Options& options,
      std::chrono::milliseconds timeout = std::chrono::seconds(10));
  static os::Result<std::unique_ptr<DaemonProcess>> start(const std::string& executable) {
    return start(executable, Options{});
  }
  ~DaemonProcess();
  DaemonProcess(const DaemonProcess&) = delete;
  DaemonProcess& operator=(const DaemonProcess&) = delete;

  // Stops the daemon and starts |executable| again on the same root with the same options, as
  // start() does; the root and what it holds stay.
  os::Status restart(const std::string& executable,
                     std::chrono::milliseconds timeout = std::chrono::seconds(10));

  pid_t pid() const { return pid_; }
  const std::string& root() const { return root_; }
  // True while the daemon runs (it has not exited or been killed).
  bool running();
  // The path of the default service's socket under the root.
  static std::string socketPath();
  // The service socket this daemon listens on.
  std::string servicePath() const;

  // Everything the daemon logged so far (with Options::captureLog).
  std::string log() const;
  // Waits until the log holds |text|; false when |timeout| passes first.
  bool waitForLog(const std::string& text,
                  std::chrono::milliseconds timeout = std::chrono::seconds(10)) const;

 private:
  DaemonProcess(std::string root, Options options);

  os::Status spawn(const std::string& executable);
  os::Status waitUntilListening(std::chrono::milliseconds timeout);
  void stop();

  const std::string root_;
  const Options options_;
  const std::optional<std::string> previousRoot_;
  pid_t pid_ = 0;
};
