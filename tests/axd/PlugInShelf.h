#pragma once

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <memory>
#include <string>

#include "axd/AXDServer.h"
#include "platform/registrum/Workspace.h"
#include "platform/value/PropertyList.h"
#include "platform/value/Value.h"
#include "tests/platform/TempDirectory.h"

// Plug-in bundles made on disk for the in-process tests and registered in the in-process
// server's registry. Each shelf has a directory of its own, so identifiers of different tests
// never meet; the bundles go when the shelf does (their registry rows stay).
class PlugInShelf {
 public:
  explicit PlugInShelf(std::shared_ptr<AXDServer> server) : server_(std::move(server)) {}

  // Writes "<app>.app/PlugIns/<id>.appex" for identifier |id| on extension point |point|, with
  // |entitlements| when not empty; returns the bundle's path.
  std::string write(const std::string& app, const std::string& id, const std::string& point,
                    const value::Dictionary& entitlements = {}) {
    std::string bundle = dir_ / (app + ".app/PlugIns/" + id + ".appex");
    std::filesystem::create_directories(bundle);
    value::Dictionary extension{
        {"QSExtensionPointIdentifier", value::Value::string(point)},
        {"QSExtensionProtocol", value::Value::string("TestProtocol")},
        {"QSExtensionAttributes", value::Value::dictionary({})},
    };
    writePlist(bundle + "/Info.plist",
               value::Value::dictionary({
                   {"QFBundleIdentifier", value::Value::string(id)},
                   {"QFBundleShortVersionString", value::Value::string("1.0")},
                   {"QSExtension", value::Value::dictionary(extension)},
               }));
    if (!entitlements.empty()) {
      writePlist(bundle + "/Entitlements.plist", value::Value::dictionary(entitlements));
    }
    return bundle;
  }

  // write() and register the bundle; null (a test failure) when the registry refuses.
  std::shared_ptr<const registrum::PlugInRecord> add(const std::string& app, const std::string& id,
                                                     const std::string& point,
                                                     const value::Dictionary& entitlements = {},
                                                     bool dataContainer = true) {
    auto registered = server_->workspace()->registerPlugIn(write(app, id, point, entitlements),
                                                           {.dataContainer = dataContainer});
    EXPECT_TRUE(registered.ok()) << registered.error().message;
    return registered.ok() ? registered.value() : nullptr;
  }

  std::string operator/(const std::string& relative) const { return dir_ / relative; }

 private:
  static void writePlist(const std::string& path, const value::Value& plist) {
    std::ofstream(path, std::ios::trunc) << value::PropertyList::toXml(plist).value();
  }

  std::shared_ptr<AXDServer> server_;
  TempDirectory dir_;
};
