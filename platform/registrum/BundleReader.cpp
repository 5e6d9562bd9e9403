#include "platform/registrum/BundleReader.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <filesystem>

#include "platform/os/Paths.h"
#include "platform/value/PropertyList.h"

namespace registrum {

namespace {

bool endsWith(std::string_view text, std::string_view suffix) {
  return text.size() > suffix.size() && text.substr(text.size() - suffix.size()) == suffix;
}

}  // namespace

os::Result<PlugInBundle> BundleReader::readPlugIn(const std::string& path) {
  os::Result<std::string> directory = bundleDirectory(path);
  if (!directory.ok()) return directory.error();
  os::Result<value::Dictionary> info = readInfo(directory.value());
  if (!info.ok()) return info.error();
  const value::Value* plugIn = info.value().find("QSExtension");
  if (!plugIn || !plugIn->asDictionary()) {
    return os::Error{EINVAL, "not a plug-in bundle: the Info.plist of " + directory.value() +
                                 " has no \"QSExtension\" dictionary"};
  }
  PlugInBundle bundle{directory.value(), info.value(), {}, std::nullopt};
  std::string entitlementsFile = bundle.path + "/Entitlements.plist";
  os::Result<value::Dictionary> entitlements = readDictionary(entitlementsFile);
  if (entitlements.ok()) {
    bundle.entitlements = entitlements.value();
  } else if (entitlements.error().errnum != ENOENT) {
    return entitlements.error();
  }
  bundle.applicationPath = enclosingApplication(bundle.path);
  return bundle;
}

os::Result<std::vector<std::string>> BundleReader::plugInPathsOf(
    const std::string& applicationPath) {
  std::string directory = applicationPath + "/PlugIns";
  std::error_code error;
  std::vector<std::string> paths;
  for (std::filesystem::directory_iterator it(directory, error), end; !error && it != end;
       it.increment(error)) {
    std::error_code typeError;
    if (it->is_directory(typeError) && !it->path().filename().string().starts_with(".")) {
      paths.push_back(it->path());
    }
  }
  if (error && error != std::errc::no_such_file_or_directory) {
    return os::Error{error.value(), "cannot list " + directory + ": " + error.message()};
  }
  std::sort(paths.begin(), paths.end());
  return paths;
}

os::Result<std::string> BundleReader::bundleDirectory(const std::string& path) {
  os::Result<std::string> canonical = os::Paths::canonical(path);
  if (!canonical.ok()) {
    int errnum = canonical.error().errnum;
    return os::Error{errnum, "no bundle at " + path + ": " + std::strerror(errnum)};
  }
  struct stat status;
  if (stat(canonical.value().c_str(), &status) != 0) {
    return os::Error::fromErrno("stat " + canonical.value());
  }
  if (!S_ISDIR(status.st_mode)) {
    return os::Error{ENOTDIR, "not a bundle directory: " + canonical.value()};
  }
  return canonical;
}

os::Result<value::Dictionary> BundleReader::readInfo(const std::string& bundlePath) {
  return readDictionary(bundlePath + "/Info.plist");
}

std::optional<std::string> BundleReader::enclosingApplication(const std::string& canonicalPath) {
  std::string path = canonicalPath;
  for (;;) {
    std::size_t slash = path.rfind('/');
    if (slash == std::string::npos || slash == 0) return std::nullopt;
    path.resize(slash);
    if (endsWith(path, ".app")) return path;
  }
}

os::Result<value::Dictionary> BundleReader::readDictionary(const std::string& file) {
  os::Result<value::Value> contents = value::PropertyList::readFile(file);
  if (!contents.ok()) return contents.error();
  const value::Dictionary* dictionary = contents.value().asDictionary();
  if (!dictionary) return os::Error{EINVAL, file + " does not hold a dictionary"};
  return *dictionary;
}

}  // namespace registrum
