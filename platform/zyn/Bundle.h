#pragma once

#include <memory>
#include <optional>
#include <string>

#include "platform/value/Value.h"

namespace zyn {

// A bundle on disk: a directory with Info.plist at its root and its executable beside it (an
// application's plug-ins lie in its PlugIns/ directory). Opening never fails: a path that names
// no bundle gives an object whose properties are absent. Immutable after opening, so safe to
// share between threads; nothing but the paths is cached, so every infoDictionary() reads the
// file again.
class Bundle {
 public:
  enum class Mode {
    // The path names the bundle directory.
    Directory,
    // The path names the executable inside a bundle.
    Executable,
  };

  static std::shared_ptr<Bundle> open(const std::string& path, Mode mode);
  // The bundle of the running program's executable.
  static std::shared_ptr<Bundle> mainBundle();

  // The bundle directory's canonical path; nothing when the path named no bundle.
  const std::optional<std::string>& bundlePath() const { return bundlePath_; }
  // The executable that Info.plist's "QFBundleExecutable" names, or the executable the bundle
  // was opened by; nothing when neither exists.
  std::optional<std::string> executablePath() const;
  // The directory that holds the bundle's support content (PlugIns/ and the like): the bundle
  // directory itself, as bundles are flat. Nothing when the bundle was not resolved.
  std::optional<std::string> supportPath() const { return bundlePath_; }
  // Info.plist as a dictionary value; nothing when it is missing, unreadable or no dictionary.
  std::optional<value::Value> infoDictionary() const;

  std::string description() const;

 private:
  Bundle(std::string requested, std::optional<std::string> bundlePath,
         std::optional<std::string> openedExecutable);

  const std::string requested_;
  const std::optional<std::string> bundlePath_;
  const std::optional<std::string> openedExecutable_;
};

}  // namespace zyn
