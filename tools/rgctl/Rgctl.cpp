#include "tools/rgctl/Rgctl.h"

#include <csignal>
#include <cstdio>
#include <iostream>

#include "tools/rgctl/NoticePrinter.h"
#include "tools/rgctl/RecordJson.h"
#include "tools/rgctl/RecordText.h"

using nlohmann::ordered_json;

int Rgctl::install(const std::string& path, registrum::InstallOptions options) {
  if (!open()) return 1;
  auto installed = workspace_->installApplication(path, options);
  if (!installed.ok()) return fail(installed.error());
  for (const registrum::SkippedBundle& skipped : installed.value().skipped) {
    std::cerr << "rgctl: left out " << skipped.path << ": " << skipped.reason << "\n";
  }
  return done(os::success());
}

int Rgctl::finish(const std::string& path) {
  if (!open()) return 1;
  return done(workspace_->finishInstallation(path));
}

int Rgctl::uninstall(const std::string& path) {
  if (!open()) return 1;
  return done(workspace_->uninstallApplication(path));
}

int Rgctl::registerPlugIn(const std::string& path, registrum::RegisterOptions options) {
  if (!open()) return 1;
  auto registered = workspace_->registerPlugIn(path, options);
  if (!registered.ok()) return fail(registered.error());
  if (options_.json) {
    std::cout << RecordJson::brief(*registered.value()).dump() << "\n";
  } else {
    std::cout << registered.value()->uuid().string() << "\n";
  }
  return 0;
}

int Rgctl::unregisterPlugIn(const std::string& path) {
  if (!open()) return 1;
  return done(workspace_->unregisterPlugIn(path));
}

int Rgctl::list() {
  if (!open()) return 1;
  auto applications = workspace_->listApplications();
  if (!applications.ok()) return fail(applications.error());
  auto listed = workspace_->listPlugIns();
  if (!listed.ok()) return fail(listed.error());
  ordered_json json = {{"applications", ordered_json::array()}, {"plugins", ordered_json::array()}};
  for (const auto& application : applications.value()) {
    auto plugIns = workspace_->plugInsWithinApplication(application->path());
    if (!plugIns.ok()) return fail(plugIns.error());
    ordered_json entry = RecordJson::application(*application);
    entry["plugins"] = ordered_json::array();
    if (!options_.json) std::cout << RecordText::applicationLine(*application) << "\n";
    for (const auto& plugIn : plugIns.value()) {
      entry["plugins"].push_back(RecordJson::brief(*plugIn));
      if (!options_.json) std::cout << "  " << RecordText::plugInLine(*plugIn) << "\n";
    }
    json["applications"].push_back(std::move(entry));
  }
  for (const auto& plugIn : listed.value()) {
    if (plugIn->containingApplication()) continue;
    json["plugins"].push_back(RecordJson::brief(*plugIn));
    if (!options_.json) std::cout << RecordText::plugInLine(*plugIn) << "\n";
  }
  auto damaged = workspace_->listDamagedPlugIns();
  if (!damaged.ok()) return fail(damaged.error());
  json["damaged"] = ordered_json::array();
  for (const registrum::Store::PlugInKey& row : damaged.value()) {
    json["damaged"].push_back({{"path", row.path}, {"uuid", row.uuid}});
    if (!options_.json) std::cout << "damaged " << row.path << " " << row.uuid << "\n";
  }
  if (options_.json) std::cout << json.dump(2) << "\n";
  return 0;
}

int Rgctl::show(const std::string& uuidOrPath) {
  if (!open()) return 1;
  if (std::optional<value::Uuid> uuid = value::Uuid::parse(uuidOrPath)) {
    auto found = workspace_->plugInForUuid(*uuid);
    if (!found.ok()) return fail(found.error());
    if (!found.value()) return fail(os::Error{ENOENT, "no plug-in has UUID " + uuid->string()});
    return showPlugIn(*found.value());
  }
  auto plugIn = workspace_->plugInAtPath(uuidOrPath);
  if (!plugIn.ok()) return fail(plugIn.error());
  if (plugIn.value()) return showPlugIn(*plugIn.value());
  auto application = workspace_->applicationAtPath(uuidOrPath);
  if (!application.ok()) return fail(application.error());
  if (application.value()) return showApplication(*application.value());
  return fail(os::Error{ENOENT, "nothing is registered at " + uuidOrPath});
}

int Rgctl::watch(unsigned count) {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGINT);
  sigaddset(&signals, SIGTERM);
  // Blocked before the notice thread starts, so only sigwait below receives them.
  pthread_sigmask(SIG_BLOCK, &signals, nullptr);
  if (!open()) return 1;
  auto printer = std::make_shared<NoticePrinter>(options_.json, count);
  os::Status added = workspace_->addObserver(printer);
  if (!added.ok()) return fail(added.error());
  if (options_.json) {
    std::cout << ordered_json{{"watching", workspace_->root()}}.dump() << std::endl;
  } else {
    std::cout << "watching " << workspace_->root() << std::endl;
  }
  int received = 0;
  sigwait(&signals, &received);
  workspace_->removeObserver(printer.get());
  return 0;
}

bool Rgctl::open() {
  auto opened = options_.root ? registrum::Workspace::open(*options_.root)
                              : registrum::Workspace::defaultWorkspace();
  if (!opened.ok()) {
    fail(opened.error());
    return false;
  }
  workspace_ = opened.value();
  return true;
}

int Rgctl::fail(const os::Error& error) const {
  std::cerr << "rgctl: " << error.message << std::endl;
  return 1;
}

int Rgctl::done(const os::Status& status) const {
  if (!status.ok()) return fail(status.error());
  std::cout << "ok\n";
  return 0;
}

int Rgctl::showPlugIn(const registrum::PlugInRecord& record) const {
  if (options_.json) {
    std::cout << RecordJson::full(record).dump(2) << "\n";
  } else {
    std::cout << RecordText::plugInDetails(record);
  }
  return 0;
}

int Rgctl::showApplication(const registrum::ApplicationRecord& application) const {
  auto plugIns = workspace_->plugInsWithinApplication(application.path());
  if (!plugIns.ok()) return fail(plugIns.error());
  ordered_json json = RecordJson::application(application);
  json["plugins"] = ordered_json::array();
  for (const auto& plugIn : plugIns.value()) json["plugins"].push_back(RecordJson::brief(*plugIn));
  if (options_.json) {
    std::cout << json.dump(2) << "\n";
    return 0;
  }
  std::cout << RecordText::applicationDetails(application);
  for (const auto& plugIn : plugIns.value()) {
    std::cout << "  " << RecordText::plugInLine(*plugIn) << "\n";
  }
  return 0;
}
