#pragma once

#include <filesystem>
#include <fstream>
#include <string>

#include "platform/value/PropertyList.h"
#include "platform/value/Value.h"

// Plug-in bundles written to disk for the end-to-end tests.
namespace bundles {

inline void writePlist(const std::string& path, const value::Value& plist) {
  std::filesystem::create_directories(std::filesystem::path(path).parent_path());
  std::ofstream(path, std::ios::trunc) << value::PropertyList::toXml(plist).value();
}

// "<directory>/<app>.app/PlugIns/<id>.appex": a well-formed plug-in with identifier |id|, inside
// an application of that name; returns the plug-in's path.
inline std::string plugIn(const std::string& directory, const std::string& app,
                          const std::string& id) {
  using value::Value;
  writePlist(directory + "/" + app + ".app/Info.plist",
             Value::dictionary({{"QFBundleIdentifier", Value::string("app." + app)}}));
  std::string bundle = directory + "/" + app + ".app/PlugIns/" + id + ".appex";
  writePlist(bundle + "/Info.plist",
             Value::dictionary({
                 {"QFBundleIdentifier", Value::string(id)},
                 {"QFBundleShortVersionString", Value::string("1.0")},
                 {"QSExtension", Value::dictionary({
                                     {"QSExtensionPointIdentifier", Value::string("test.point")},
                                     {"QSExtensionProtocol", Value::string("TestProtocol")},
                                     {"QSExtensionAttributes", Value::dictionary({})},
                                 })},
             }));
  return bundle;
}

// Grants the running test program |entitlements| in the entitlement table of device |root|.
inline void grantThisProgram(const std::string& root, const value::Dictionary& entitlements) {
  using value::Value;
  writePlist(
      root + "/etc/annexa/entitlements.d/e2e_tests.plist",
      Value::dictionary({
          {"Executable", Value::string(std::filesystem::canonical("/proc/self/exe").string())},
          {"Entitlements", Value::dictionary(entitlements)},
      }));
  std::filesystem::permissions(root + "/etc/annexa/entitlements.d/e2e_tests.plist",
                               std::filesystem::perms(0644));
}

}  // namespace bundles
