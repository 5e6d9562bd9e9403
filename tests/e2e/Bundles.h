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

inline void writeFile(const std::string& path, const std::string& contents) {
  std::filesystem::create_directories(std::filesystem::path(path).parent_path());
  std::ofstream(path, std::ios::trunc) << contents;
}

// What a plug-in bundle declares beyond a well-formed minimum.
struct PlugInContents {
  std::string id;
  std::string version = "1.0";
  // "QSExtensionAttributes" of the plug-in dictionary.
  value::Dictionary attributes;
  // Further keys of the plug-in dictionary ("Dedicated", "QSExtensionHostEntitlement", ...).
  value::Dictionary extension;
  // The plug-in's Entitlements.plist; none is written when empty.
  value::Dictionary entitlements;
  // Further keys of Info.plist ("ZynService", "QFBundleExecutable", ...).
  value::Dictionary info;
  // A program copied into the bundle and named as its executable; none when empty.
  std::string executable;
};

// Writes the plug-in bundle |bundle| (a ".appex" directory) as |contents| says; returns |bundle|.
// "extension" entries win over the default extension point and protocol.
// Where it lies decides the rest: inside "<x>.app/PlugIns" it has a containing application (which
// the caller writes), under "<root>/System/" it is on the system volume.
inline std::string writePlugIn(const std::string& bundle, const PlugInContents& contents) {
  using value::Value;
  value::Dictionary extension{{"QSExtensionPointIdentifier", Value::string("test.point")},
                              {"QSExtensionProtocol", Value::string("TestProtocol")}};
  for (const auto& [key, entry] : contents.extension) extension = extension.with(key, entry);
  extension = extension.with("QSExtensionAttributes", Value::dictionary(contents.attributes));
  value::Dictionary info = contents.info.with("QFBundleIdentifier", Value::string(contents.id))
                               .with("QFBundleShortVersionString", Value::string(contents.version))
                               .with("QSExtension", Value::dictionary(extension));
  if (!contents.executable.empty()) {
    std::string name = std::filesystem::path(contents.executable).filename();
    std::filesystem::create_directories(bundle);
    std::filesystem::copy_file(contents.executable, bundle + "/" + name,
                               std::filesystem::copy_options::overwrite_existing);
    info = info.with("QFBundleExecutable", Value::string(name));
  }
  writePlist(bundle + "/Info.plist", Value::dictionary(info));
  if (!contents.entitlements.empty()) {
    writePlist(bundle + "/Entitlements.plist", Value::dictionary(contents.entitlements));
  }
  return bundle;
}

// "<directory>/<app>.app/PlugIns/<id>.appex": the plug-in that |contents| describes, inside the
// application "<app>.app", which is made with identifier "app.<app>" when missing; returns the
// plug-in's path.
inline std::string plugIn(const std::string& directory, const std::string& app,
                          const PlugInContents& contents) {
  using value::Value;
  const std::string info = directory + "/" + app + ".app/Info.plist";
  if (!std::filesystem::exists(info)) {
    writePlist(info, Value::dictionary({{"QFBundleIdentifier", Value::string("app." + app)}}));
  }
  return writePlugIn(directory + "/" + app + ".app/PlugIns/" + contents.id + ".appex", contents);
}

// Makes |app| (a ".app" directory) an application whose executable is a copy of |program|, so
// that the process started from the copy belongs to |app|; returns the copy's path.
inline std::string hostApplication(const std::string& app, const std::string& program) {
  using value::Value;
  std::string name = std::filesystem::path(program).filename();
  writePlist(app + "/Info.plist", Value::dictionary({
                                      {"QFBundleIdentifier", Value::string("host." + name)},
                                      {"QFBundleExecutable", Value::string(name)},
                                  }));
  std::filesystem::copy_file(program, app + "/" + name,
                             std::filesystem::copy_options::overwrite_existing);
  return app + "/" + name;
}

// Grants the program at |executable| |entitlements| in the entitlement table of device |root|,
// through the table file "<name>.plist", which a later grant of the same name replaces.
inline void grantProgram(const std::string& root, const std::string& name,
                         const std::string& executable, const value::Dictionary& entitlements) {
  using value::Value;
  std::string file = root + "/etc/annexa/entitlements.d/" + name + ".plist";
  writePlist(file,
             Value::dictionary({
                 {"Executable", Value::string(std::filesystem::canonical(executable).string())},
                 {"Entitlements", Value::dictionary(entitlements)},
             }));
  std::filesystem::permissions(file, std::filesystem::perms(0644));
}

}  // namespace bundles
