#pragma once

#include <atomic>

#include "platform/registrum/Observer.h"

// The observer of `rgctl watch`: prints each notice as it arrives, one line per plug-in
// (RecordText::noticeLine) or one JSON object per notice ({"notice": "install" or "uninstall",
// "plugins": [full records]}), flushing after each. After |limit| notices (0: no limit) it
// sends the process SIGTERM, which ends the watch. Called on the registry's notice thread only.
class NoticePrinter : public registrum::Observer {
 public:
  NoticePrinter(bool json, unsigned limit) : json_(json), limit_(limit) {}

  void pluginsDidInstall(const registrum::PlugInList& plugIns) override;
  void pluginsWillUninstall(const registrum::PlugInList& plugIns) override;

 private:
  void print(const char* notice, const char* event, const registrum::PlugInList& plugIns);

  const bool json_;
  const unsigned limit_;
  unsigned printed_ = 0;
};
