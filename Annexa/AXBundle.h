#pragma once

#include <memory>
#include <mutex>
#include <optional>
#include <string>

#include "Annexa/AXFileURL.h"
#include "platform/value/Value.h"
#include "platform/zyn/Bundle.h"

// Read access to one bundle directory: its path, executable, information dictionary and
// identifier, and its support directory with PlugIns/ inside it. A path that names no bundle
// still gives an object; its properties are then absent. Nothing is cached but the support path,
// so every call reads the bundle again. Safe to share between threads.
class AXBundle {
 public:
  // The running program's own bundle.
  static std::shared_ptr<AXBundle> initForMainBundle();
  // The bundle whose directory |url| or |path| names.
  static std::shared_ptr<AXBundle> initWithURL(const AXFileURL& url);
  static std::shared_ptr<AXBundle> initWithPath(const std::string& path);
  // The bundle of the executable that |url| or |path| names; a path that names a bundle
  // directory instead gives that bundle.
  static std::shared_ptr<AXBundle> initWithExecutableURL(const AXFileURL& url);
  static std::shared_ptr<AXBundle> initWithExecutablePath(const std::string& path);

  explicit AXBundle(std::shared_ptr<zyn::Bundle> bundle) : _bundle(std::move(bundle)) {}

  // The bundle directory; nothing when the bundle could not be resolved.
  std::optional<std::string> path() const { return _bundle->bundlePath(); }
  std::optional<AXFileURL> url() const;
  // The executable, or the bundle's own path when it has none.
  std::optional<std::string> executablePath() const;
  // The support directory (for our flat bundles, the bundle directory); nothing when the bundle
  // could not be resolved. Computed once.
  std::optional<std::string> supportPath() const;
  // |name| inside the support directory; nothing when there is none.
  std::optional<std::string> bundleDirectory(const std::string& name) const;
  std::optional<std::string> plugInsPath() const { return bundleDirectory("PlugIns"); }
  // Info.plist as a property-list dictionary; nothing (after two log lines) when it is missing.
  std::optional<value::Dictionary> infoDictionary() const;
  // Info.plist's "QFBundleIdentifier" when it is a string; nothing otherwise.
  std::optional<std::string> bundleIdentifier() const;

  const std::shared_ptr<zyn::Bundle>& bundle() const { return _bundle; }

 private:
  const std::shared_ptr<zyn::Bundle> _bundle;
  mutable std::once_flag supportOnce_;
  mutable std::optional<std::string> supportPath_;
};
