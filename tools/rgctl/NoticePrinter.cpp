#include "tools/rgctl/NoticePrinter.h"

#include <signal.h>
#include <unistd.h>

#include <iostream>

#include "tools/rgctl/RecordJson.h"
#include "tools/rgctl/RecordText.h"

void NoticePrinter::pluginsDidInstall(const registrum::PlugInList& plugIns) {
  print("install", "INSTALLED", plugIns);
}

void NoticePrinter::pluginsWillUninstall(const registrum::PlugInList& plugIns) {
  print("uninstall", "UNINSTALLED", plugIns);
}

void NoticePrinter::print(const char* notice, const char* event,
                          const registrum::PlugInList& plugIns) {
  if (json_) {
    nlohmann::ordered_json records = nlohmann::ordered_json::array();
    for (const auto& record : plugIns) records.push_back(RecordJson::full(*record));
    std::cout << nlohmann::ordered_json{{"notice", notice}, {"plugins", records}}.dump() << "\n";
  } else {
    for (const auto& record : plugIns) std::cout << RecordText::noticeLine(event, *record) << "\n";
  }
  std::cout.flush();
  if (limit_ != 0 && ++printed_ == limit_) kill(getpid(), SIGTERM);
}
