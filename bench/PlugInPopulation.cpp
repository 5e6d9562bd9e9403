#include "bench/PlugInPopulation.h"

#include <cerrno>
#include <cstdio>
#include <fstream>

#include "platform/os/Paths.h"
#include "platform/registrum/Workspace.h"
#include "platform/value/PropertyList.h"

using value::Dictionary;
using value::Value;

namespace {

os::Status writePlist(const std::string& directory, const Dictionary& contents) {
  os::Status made = os::Paths::ensureDirectory(directory, 0755);
  if (!made.ok()) return made;
  os::Result<std::string> xml = value::PropertyList::toXml(Value::dictionary(contents));
  if (!xml.ok()) return xml.error();
  const std::string path = directory + "/Info.plist";
  std::ofstream file(path, std::ios::trunc);
  file << xml.value();
  file.close();
  if (!file) return os::Error{EIO, "cannot write " + path};
  return os::success();
}

os::Status writePlugIn(const std::string& application, const std::string& id) {
  Dictionary extension{
      {"QSExtensionPointIdentifier", Value::string(PlugInPopulation::kExtensionPoint)},
      {"QSExtensionProtocol", Value::string("BenchProtocol")},
  };
  return writePlist(application + "/PlugIns/" + id + ".appex",
                    Dictionary{
                        {"QFBundleIdentifier", Value::string(id)},
                        {"QFBundleShortVersionString", Value::string("1.0")},
                        {"QSExtension", Value::dictionary(extension)},
                    });
}

}  // namespace

std::string PlugInPopulation::identifier(std::size_t index) {
  char text[40];
  std::snprintf(text, sizeof text, "bench.plugin.%05zu", index);
  return text;
}

os::Result<std::vector<std::string>> PlugInPopulation::write(const std::string& root,
                                                             std::size_t count,
                                                             std::size_t perApplication) {
  if (perApplication == 0) return os::Error{EINVAL, "an application needs at least one plug-in"};
  std::vector<std::string> applications;
  for (std::size_t index = 0; index < count; ++index) {
    if (index % perApplication == 0) {
      std::string name = "Bench" + std::to_string(applications.size());
      applications.push_back(root + "/Applications/" + name + ".app");
      os::Status written =
          writePlist(applications.back(), Dictionary{{"QFBundleIdentifier", Value::string(name)}});
      if (!written.ok()) return written.error();
    }
    os::Status written = writePlugIn(applications.back(), identifier(index));
    if (!written.ok()) return written.error();
  }
  return applications;
}

os::Status PlugInPopulation::install(const std::string& root,
                                     const std::vector<std::string>& applications) {
  os::Result<std::shared_ptr<registrum::Workspace>> registry = registrum::Workspace::open(root);
  if (!registry.ok()) return registry.error();
  for (const std::string& application : applications) {
    auto installed = registry.value()->installApplication(application);
    if (!installed.ok()) return installed.error();
  }
  return os::success();
}
