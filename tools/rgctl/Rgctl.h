#pragma once

#include <memory>
#include <optional>
#include <string>

#include "platform/registrum/Workspace.h"

// The command-line front of the application registry: each command runs one registry operation
// on the workspace of the device root, prints its outcome and returns the exit status, 0 on
// success and 1 on failure (the message goes to standard error as "rgctl: MESSAGE"). An install
// that left bundles out succeeds and says so on standard error, one line per bundle.
class Rgctl {
 public:
  struct Options {
    std::optional<std::string> root;  // the device root; ANNEXA_ROOT (or "/") when absent
    bool json = false;
  };

  explicit Rgctl(Options options) : options_(std::move(options)) {}

  int install(const std::string& path, registrum::InstallOptions options);
  int finish(const std::string& path);
  int uninstall(const std::string& path);
  int registerPlugIn(const std::string& path, registrum::RegisterOptions options);
  int unregisterPlugIn(const std::string& path);
  int list();
  int show(const std::string& uuidOrPath);
  // Prints every notice until interrupted (SIGINT, SIGTERM) or until |count| notices (when
  // non-zero) have arrived. The first line says that the observer is in place.
  int watch(unsigned count);

 private:
  // Opens the workspace into workspace_; false (with the message printed) on failure.
  bool open();
  int fail(const os::Error& error) const;
  int done(const os::Status& status) const;
  int showPlugIn(const registrum::PlugInRecord& record) const;
  int showApplication(const registrum::ApplicationRecord& application) const;

  Options options_;
  std::shared_ptr<registrum::Workspace> workspace_;
};
