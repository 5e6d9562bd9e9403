#pragma once

#include <string>

#include "platform/value/PropertyList.h"
#include "platform/value/Value.h"
#include "tests/platform/TempDirectory.h"

// A device root for registry tests, with helpers that lay out bundles and SDK dictionaries.
class RegistryFixture : public TempDirectory {
 public:
  const std::string& root() const { return path(); }

  // Writes |plist| as XML to |relative|, creating its directories; returns the path.
  std::string writePlist(const std::string& relative, const value::Value& plist) const {
    return write(relative, value::PropertyList::toXml(plist).value());
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
    return *this / relative;
  }

  // An application bundle at |relative| with identifier |id|; returns its path.
  std::string application(const std::string& relative, const std::string& id) const {
    value::Dictionary info{{"QFBundleIdentifier", value::Value::string(id)},
                           {"QFBundleName", value::Value::string("App")}};
    writePlist(relative + "/Info.plist", value::Value::dictionary(info));
    return *this / relative;
  }
};
