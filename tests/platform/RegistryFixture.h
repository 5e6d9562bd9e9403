#pragma once

#include <filesystem>
#include <fstream>
#include <string>

#include "platform/value/PropertyList.h"
#include "platform/value/Value.h"
#include "tests/platform/TempDirectory.h"

// A device root for registry tests, with helpers that lay out bundles and SDK dictionaries.
class RegistryFixture {
 public:
  const std::string& root() const { return dir_.path(); }
  std::string operator/(const std::string& relative) const { return dir_ / relative; }

  // Writes |plist| as XML to |relative|, creating its directories; returns the path.
  std::string writePlist(const std::string& relative, const value::Value& plist) const {
    return writeFile(relative, value::PropertyList::toXml(plist).value());
  }

  // Writes raw |contents| to |relative|, creating its directories; returns the path.
  std::string writeFile(const std::string& relative, const std::string& contents) const {
    std::string path = dir_ / relative;
    std::filesystem::create_directories(std::filesystem::path(path).parent_path());
    std::ofstream(path, std::ios::binary | std::ios::trunc) << contents;
    return path;
  }

  // A plug-in bundle at |relative| with identifier |id| serving |point|; returns its path.
  std::string plugIn(const std::string& relative, const std::string& id,
                     const std::string& point = "com.example.point",
                     value::Dictionary extraPlugIn = {}) const {
    value::Dictionary plugInDictionary =
        extraPlugIn.with("QSExtensionPointIdentifier", value::Value::string(point));
    value::Dictionary info{{"QFBundleIdentifier", value::Value::string(id)},
                           {"QFBundleShortVersionString", value::Value::string("1.0")},
                           {"QFBundleName", value::Value::string("Short")},
                           {"QFBundleDisplayName", value::Value::string("Display")},
                           {"QSExtension", value::Value::dictionary(plugInDictionary)}};
    writePlist(relative + "/Info.plist", value::Value::dictionary(info));
    return dir_ / relative;
  }

  // An application bundle at |relative| with identifier |id|; returns its path.
  std::string application(const std::string& relative, const std::string& id) const {
    value::Dictionary info{{"QFBundleIdentifier", value::Value::string(id)},
                           {"QFBundleName", value::Value::string("App")}};
    writePlist(relative + "/Info.plist", value::Value::dictionary(info));
    return dir_ / relative;
  }

 private:
  TempDirectory dir_;
};
