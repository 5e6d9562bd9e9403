#pragma once

#include <optional>
#include <string>
#include <vector>

#include "platform/os/Error.h"
#include "platform/value/Dictionary.h"

namespace registrum {

// What registration reads of a plug-in bundle on disk.
struct PlugInBundle {
  std::string path;  // canonical path of the bundle directory
  value::Dictionary info;
  value::Dictionary entitlements;              // empty without Entitlements.plist
  std::optional<std::string> applicationPath;  // the nearest enclosing ".app" directory
};

// Reads bundles for registration: a directory with "Info.plist" (XML or binary) at its root and,
// for a plug-in, "Entitlements.plist" beside it. Stateless; safe to call from any thread.
// Errors name the path: ENOENT for a missing path or Info.plist, ENOTDIR for a path that is no
// directory, EINVAL for a property list that is malformed or not a dictionary, or a plug-in
// without a "QSExtension" dictionary; other file errors keep their errno.
class BundleReader {
 public:
  // The plug-in bundle at |path|.
  static os::Result<PlugInBundle> readPlugIn(const std::string& path);

  // The bundle paths of the application directory |applicationPath|: every directory in its
  // "PlugIns/" whose name does not start with '.', in name order. No "PlugIns/" is none; fails
  // when "PlugIns/" cannot be listed.
  static os::Result<std::vector<std::string>> plugInPathsOf(const std::string& applicationPath);

  // The canonical path of the bundle directory at |path|.
  static os::Result<std::string> bundleDirectory(const std::string& path);

  // The Info.plist dictionary of the bundle directory |bundlePath|.
  static os::Result<value::Dictionary> readInfo(const std::string& bundlePath);

  // The nearest directory above |canonicalPath| whose name ends in ".app"; nothing when none.
  static std::optional<std::string> enclosingApplication(const std::string& canonicalPath);

 private:
  static os::Result<value::Dictionary> readDictionary(const std::string& file);
};

}  // namespace registrum
