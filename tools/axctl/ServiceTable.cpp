#include "tools/axctl/ServiceTable.h"

#include <cstdio>
#include <string>
#include <vector>

#include "Annexa/AXProtocol.h"
#include "platform/launcher/ServiceLauncher.h"
#include "tools/axctl/ValueJson.h"

namespace {

using Service = launcher::ServiceLauncher::Service;

constexpr const char* kRow = "%-8s %-40s %-10s %-16s %s\n";

std::string profileOf(const value::Dictionary& description) {
  const value::Dictionary* service = AXProtocol::getDictionary(description, "ZynService");
  const value::Value* profile = service ? service->find("_SandboxProfile") : nullptr;
  const std::string* name = profile ? profile->asString() : nullptr;
  return name ? *name : "-";
}

void printTable(const std::vector<Service>& services) {
  std::printf(kRow, "HOST", "IDENTIFIER", "VERSION", "PROFILE", "EXECUTABLE");
  for (const Service& s : services) {
    std::printf(kRow, std::to_string(s.host).c_str(), s.bundleIdentifier.c_str(), s.version.c_str(),
                profileOf(s.description).c_str(), s.executablePath.c_str());
  }
}

void printJson(const std::vector<Service>& services) {
  nlohmann::ordered_json entries = nlohmann::ordered_json::array();
  for (const Service& s : services) {
    entries.push_back({{"host", s.host},
                       {"bundleIdentifier", s.bundleIdentifier},
                       {"version", s.version},
                       {"executable", s.executablePath},
                       {"description", toJson(value::Value::dictionary(s.description))}});
  }
  std::printf("%s\n", entries.dump(2).c_str());
}

}  // namespace

int ServiceTable::print(bool json) {
  auto services = launcher::ServiceLauncher::services();
  if (!services.ok()) {
    std::fprintf(stderr, "axctl: cannot read the service table: %s\n",
                 services.error().message.c_str());
    return 1;
  }
  if (json) {
    printJson(services.value());
  } else {
    printTable(services.value());
  }
  return 0;
}
