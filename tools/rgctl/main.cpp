// rgctl: install, register and inspect the application registry of a device root.

#include <CLI/CLI.hpp>

#include "tools/rgctl/Rgctl.h"

int main(int argc, char** argv) {
  CLI::App app{
      "rgctl: install and uninstall applications and plug-in bundles in the application "
      "registry of the device root ($ANNEXA_ROOT, default /), list and show its records, and "
      "watch its notices."};
  app.require_subcommand(1);
  Rgctl::Options options;
  app.add_option("--root", options.root, "device root to use instead of $ANNEXA_ROOT");

  std::string path;
  std::string target;
  bool placeholder = false;
  bool noDataContainer = false;
  unsigned count = 0;

  auto* install = app.add_subcommand(
      "install", "install the application at APP_PATH with every bundle in its PlugIns/");
  install->add_flag("--placeholder", placeholder,
                    "install as a placeholder: its plug-ins stay out of listings and queries "
                    "until `rgctl finish`");
  install->add_flag("--no-data-container", noDataContainer, "give its plug-ins no data container");
  install->add_option("APP_PATH", path, "the application bundle (*.app)")->required();
  auto* finish = app.add_subcommand("finish", "finish installing the placeholder at APP_PATH");
  finish->add_option("APP_PATH", path, "the placeholder application")->required();
  auto* uninstall =
      app.add_subcommand("uninstall", "uninstall the application at APP_PATH and its plug-ins");
  uninstall->add_option("APP_PATH", path, "the application bundle")->required();
  auto* registerCommand = app.add_subcommand(
      "register", "register (or re-register) the plug-in bundle at PLUGIN_PATH; prints its UUID");
  registerCommand->add_flag("--no-data-container", noDataContainer,
                            "give the plug-in no data container");
  registerCommand->add_flag("--json", options.json, "print the record's summary as JSON");
  registerCommand->add_option("PLUGIN_PATH", path, "the plug-in bundle")->required();
  auto* unregister =
      app.add_subcommand("unregister", "unregister the plug-in bundle at PLUGIN_PATH");
  unregister->add_option("PLUGIN_PATH", path, "the plug-in bundle")->required();
  auto* list = app.add_subcommand("list", "list applications and plug-ins");
  list->add_flag("--json", options.json, "print JSON");
  auto* show =
      app.add_subcommand("show", "show every field of a plug-in (by UUID or path) or application");
  show->add_option("UUID_OR_PATH", target, "a plug-in UUID, plug-in path or application path")
      ->required();
  show->add_flag("--json", options.json, "print JSON");
  auto* watch = app.add_subcommand("watch", "print install and uninstall notices as they arrive");
  watch->add_flag("--json", options.json, "one JSON object per notice, with full records");
  watch->add_option("--count", count, "exit after this many notices (default: run until killed)");

  CLI11_PARSE(app, argc, argv);

  Rgctl rgctl(options);
  if (*install) {
    return rgctl.install(path, {.placeholder = placeholder, .dataContainer = !noDataContainer});
  }
  if (*finish) return rgctl.finish(path);
  if (*uninstall) return rgctl.uninstall(path);
  if (*registerCommand) return rgctl.registerPlugIn(path, {.dataContainer = !noDataContainer});
  if (*unregister) return rgctl.unregisterPlugIn(path);
  if (*list) return rgctl.list();
  if (*show) return rgctl.show(target);
  return rgctl.watch(count);
}
